// SocketServiceManager: the service manager over a directory of sockets. A service
// is an AF_UNIX SOCK_SEQPACKET socket named after it in the service directory:
// TAVOPLAYER_SERVICE_DIR, else /run/tavoplayer for root, else
// $XDG_RUNTIME_DIR/tavoplayer, else /tmp/tavoplayer-<uid>. Finding a service is
// connecting to its socket: the connection's root object is the service.
//
// A service of this process is found as the local object itself, as the platform
// does. Each registered service has a listener thread that accepts connections
// (waiting 100 ms at a time) until stopServing().
#pragma once

#include <atomic>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

#include "platform/binder/IServiceManager.h"

namespace android {

class SocketServiceManager : public IServiceManager {
public:
    static sp<SocketServiceManager> self();
    // The directory services are looked up and registered in (not created here).
    static std::string serviceDirectory();

    sp<IBinder> getService(const String16& name) const override;
    sp<IBinder> checkService(const String16& name) const override;
    status_t addService(const String16& name, const sp<IBinder>& service,
                        bool allowIsolated = false,
                        int dumpsysPriority = DUMP_FLAG_PRIORITY_DEFAULT) override;
    Vector<String16> listServices(int dumpsysPriority = DUMP_FLAG_PRIORITY_ALL) override;

    // Closes every listening socket and removes its file. Connections already made
    // stay until ProcessState::shutdown() or a hang-up.
    void stopServing();

private:
    struct Listener {
        std::string path;
        int fd = -1;
        sp<IBinder> service;
        std::atomic<bool> stop{false};
        std::thread thread;
    };

    SocketServiceManager() = default;
    static void acceptLoop(Listener* listener);

    mutable std::mutex mLock;  // guards mListeners
    std::map<std::string, std::unique_ptr<Listener>> mListeners;
};

}  // namespace android
