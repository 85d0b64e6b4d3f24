// IServiceManager: registers this process's services by name and finds those of
// others. defaultServiceManager() is the socket-directory service manager
// (SocketServiceManager).
#pragma once

#include <utils/Errors.h>
#include <utils/RefBase.h>
#include <utils/String16.h>
#include <utils/StrongPointer.h>
#include <utils/Vector.h>

#include "platform/binder/IBinder.h"

namespace android {

class IServiceManager : public virtual RefBase {
public:
    // Dump priority flags, as the platform defines them.
    static constexpr int DUMP_FLAG_PRIORITY_CRITICAL = 1 << 0;
    static constexpr int DUMP_FLAG_PRIORITY_HIGH = 1 << 1;
    static constexpr int DUMP_FLAG_PRIORITY_NORMAL = 1 << 2;
    static constexpr int DUMP_FLAG_PRIORITY_DEFAULT = 1 << 3;
    static constexpr int DUMP_FLAG_PRIORITY_ALL = 0xf;

    // Waits up to 5 s for the service to appear, as the platform does.
    virtual sp<IBinder> getService(const String16& name) const = 0;
    // Does not wait.
    virtual sp<IBinder> checkService(const String16& name) const = 0;
    virtual status_t addService(const String16& name, const sp<IBinder>& service,
                                bool allowIsolated = false,
                                int dumpsysPriority = DUMP_FLAG_PRIORITY_DEFAULT) = 0;
    virtual Vector<String16> listServices(int dumpsysPriority = DUMP_FLAG_PRIORITY_ALL) = 0;

protected:
    ~IServiceManager() override = default;
};

sp<IServiceManager> defaultServiceManager();

}  // namespace android
