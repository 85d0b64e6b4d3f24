// BpInterface: the proxy side of an interface: calls become transactions on the
// remote binder.
#pragma once

#include "platform/binder/BpRefBase.h"
#include "platform/binder/IInterface.h"

namespace android {

template <typename INTERFACE>
class BpInterface : public INTERFACE, public BpRefBase {
public:
    explicit BpInterface(const sp<IBinder>& remote) : BpRefBase(remote) {}

protected:
    ~BpInterface() override = default;
    IBinder* onAsBinder() override { return remote(); }
};

}  // namespace android
