// BnInterface: the local (stub) side of an interface: the object is its own binder.
#pragma once

#include "platform/binder/BBinder.h"
#include "platform/binder/IInterface.h"

namespace android {

template <typename INTERFACE>
class BnInterface : public INTERFACE, public BBinder {
public:
    sp<IInterface> queryLocalInterface(const String16& descriptor) override {
        if (descriptor == INTERFACE::descriptor)
            return sp<IInterface>(this);
        return nullptr;
    }
    const String16& getInterfaceDescriptor() const override { return INTERFACE::descriptor; }

protected:
    ~BnInterface() override = default;
    IBinder* onAsBinder() override { return this; }
};

}  // namespace android
