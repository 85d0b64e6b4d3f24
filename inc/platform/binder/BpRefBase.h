// BpRefBase: the base of every interface proxy; holds the remote object.
#pragma once

#include "platform/binder/IBinder.h"

namespace android {

class BpRefBase : public virtual RefBase {
protected:
    explicit BpRefBase(const sp<IBinder>& remote) : mRemote(remote) {}
    ~BpRefBase() override = default;

    IBinder* remote() const { return mRemote.get(); }
    const sp<IBinder>& remoteStrong() const { return mRemote; }

private:
    const sp<IBinder> mRemote;
};

}  // namespace android
