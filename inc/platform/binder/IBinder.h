// IBinder: an object that can be called by transaction, in this process (BBinder)
// or in another one (BpBinder, a proxy on a socket connection).
#pragma once

#include <cstdint>

#include <utils/Errors.h>
#include <utils/RefBase.h>
#include <utils/String16.h>
#include <utils/StrongPointer.h>
#include <utils/Vector.h>

namespace android {

class BBinder;
class BpBinder;
class IInterface;
class Parcel;

#define B_PACK_CHARS(c1, c2, c3, c4) \
    ((static_cast<uint32_t>(c1) << 24) | ((c2) << 16) | ((c3) << 8) | (c4))

class IBinder : public virtual RefBase {
public:
    enum : uint32_t {
        FIRST_CALL_TRANSACTION = 0x00000001,
        LAST_CALL_TRANSACTION = 0x00ffffff,
        PING_TRANSACTION = B_PACK_CHARS('_', 'P', 'N', 'G'),
        DUMP_TRANSACTION = B_PACK_CHARS('_', 'D', 'M', 'P'),
        INTERFACE_TRANSACTION = B_PACK_CHARS('_', 'N', 'T', 'F'),
        // One-way: the caller does not wait and gets no reply.
        FLAG_ONEWAY = 0x00000001,
    };

    class DeathRecipient : public virtual RefBase {
    public:
        // Called on a binder thread once the object's process has gone.
        virtual void binderDied(const wp<IBinder>& who) = 0;
    };

    virtual sp<IInterface> queryLocalInterface(const String16& descriptor);
    virtual const String16& getInterfaceDescriptor() const = 0;
    virtual bool isBinderAlive() const = 0;
    virtual status_t pingBinder() = 0;
    virtual status_t dump(int fd, const Vector<String16>& args) = 0;
    virtual status_t transact(uint32_t code, const Parcel& data, Parcel* reply,
                              uint32_t flags = 0) = 0;
    // Only proxies die; a local object answers INVALID_OPERATION.
    virtual status_t linkToDeath(const sp<DeathRecipient>& recipient, void* cookie = nullptr,
                                 uint32_t flags = 0) = 0;
    virtual status_t unlinkToDeath(const wp<DeathRecipient>& recipient, void* cookie = nullptr,
                                   uint32_t flags = 0,
                                   wp<DeathRecipient>* outRecipient = nullptr) = 0;

    virtual BBinder* localBinder() { return nullptr; }
    virtual BpBinder* remoteBinder() { return nullptr; }

protected:
    ~IBinder() override = default;
};

}  // namespace android
