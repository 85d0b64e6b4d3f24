// BBinder: the local side of a binder object. A transaction, from this process or
// from a peer over a connection, ends in onTransact, whose default answers the
// platform's own codes (ping, interface query, dump) and refuses every other.
#pragma once

#include "platform/binder/IBinder.h"

namespace android {

class BBinder : public IBinder {
public:
    BBinder() = default;

    const String16& getInterfaceDescriptor() const override;
    bool isBinderAlive() const override { return true; }
    status_t pingBinder() override { return OK; }
    status_t dump(int fd, const Vector<String16>& args) override;
    status_t transact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags = 0) final;
    status_t linkToDeath(const sp<DeathRecipient>& recipient, void* cookie = nullptr,
                         uint32_t flags = 0) override;
    status_t unlinkToDeath(const wp<DeathRecipient>& recipient, void* cookie = nullptr,
                           uint32_t flags = 0, wp<DeathRecipient>* outRecipient = nullptr) override;
    BBinder* localBinder() override { return this; }

protected:
    ~BBinder() override = default;
    // The default handling: PING_TRANSACTION answers OK; INTERFACE_TRANSACTION
    // replies the descriptor; DUMP_TRANSACTION reads a descriptor, an argument count
    // and that many 16-bit strings and calls dump(); any other code gives
    // UNKNOWN_TRANSACTION.
    virtual status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply,
                                uint32_t flags = 0);
};

}  // namespace android
