// IInterface: the base of every binder interface, with the platform's helpers to
// declare one (DECLARE_META_INTERFACE / IMPLEMENT_META_INTERFACE) and to turn a
// binder into the interface (interface_cast): a null binder gives null, a local
// object that answers the descriptor gives itself, anything else a new proxy.
#pragma once

#include "platform/binder/IBinder.h"

namespace android {

class IInterface : public virtual RefBase {
public:
    IInterface() = default;
    static sp<IBinder> asBinder(const IInterface* iface);
    static sp<IBinder> asBinder(const sp<IInterface>& iface);

protected:
    ~IInterface() override = default;
    virtual IBinder* onAsBinder() = 0;
};

template <typename INTERFACE>
inline sp<INTERFACE> interface_cast(const sp<IBinder>& obj) {
    return INTERFACE::asInterface(obj);
}

}  // namespace android

#define DECLARE_META_INTERFACE(INTERFACE)                                                         \
public:                                                                                           \
    static const ::android::String16 descriptor;                                                  \
    static ::android::sp<I##INTERFACE> asInterface(const ::android::sp<::android::IBinder>& obj); \
    virtual const ::android::String16& getInterfaceDescriptor() const;                            \
    I##INTERFACE();                                                                               \
    ~I##INTERFACE() override;

#define IMPLEMENT_META_INTERFACE(INTERFACE, NAME)                             \
    const ::android::String16 I##INTERFACE::descriptor(NAME);                 \
    const ::android::String16& I##INTERFACE::getInterfaceDescriptor() const { \
        return I##INTERFACE::descriptor;                                      \
    }                                                                         \
    ::android::sp<I##INTERFACE> I##INTERFACE::asInterface(                    \
        const ::android::sp<::android::IBinder>& obj) {                       \
        ::android::sp<I##INTERFACE> intr;                                     \
        if (obj != nullptr) {                                                 \
            intr = static_cast<I##INTERFACE*>(                                \
                obj->queryLocalInterface(I##INTERFACE::descriptor).get());    \
            if (intr == nullptr)                                              \
                intr = new Bp##INTERFACE(obj);                                \
        }                                                                     \
        return intr;                                                          \
    }                                                                         \
    I##INTERFACE::I##INTERFACE() = default;                                   \
    I##INTERFACE::~I##INTERFACE() = default;
