// BpBinder: a proxy for an object of another process, reached through the socket
// connection it arrived on. It is created by the connection (when a parcel brings
// the object, or by the service manager for a service's root object) and tells the
// connection when it goes, so the peer can drop its reference.
#pragma once

#include <atomic>
#include <mutex>
#include <vector>

#include "platform/binder/IBinder.h"

namespace android {

class Connection;

class BpBinder : public IBinder {
public:
    BpBinder(const sp<Connection>& connection, uint64_t handle);

    const String16& getInterfaceDescriptor() const override;
    bool isBinderAlive() const override;
    status_t pingBinder() override;
    status_t dump(int fd, const Vector<String16>& args) override;
    status_t transact(uint32_t code, const Parcel& data, Parcel* reply,
                      uint32_t flags = 0) override;
    status_t linkToDeath(const sp<DeathRecipient>& recipient, void* cookie = nullptr,
                         uint32_t flags = 0) override;
    status_t unlinkToDeath(const wp<DeathRecipient>& recipient, void* cookie = nullptr,
                           uint32_t flags = 0, wp<DeathRecipient>* outRecipient = nullptr) override;
    BpBinder* remoteBinder() override { return this; }

    uint64_t handle() const { return mHandle; }
    const sp<Connection>& connection() const { return mConnection; }

    // Called by the connection, which holds its lock: one more reference to this
    // object arrived from the peer.
    void addRemoteRef() { mRemoteRefs.fetch_add(1, std::memory_order_relaxed); }
    // Called once by the connection when the peer has gone: tells every recipient.
    void sendObituary();

protected:
    ~BpBinder() override;

private:
    struct Obituary {
        wp<DeathRecipient> recipient;
        void* cookie;
    };

    const sp<Connection> mConnection;
    const uint64_t mHandle;
    std::atomic<uint32_t> mRemoteRefs{0};
    mutable std::mutex mLock;  // guards the fields below
    mutable String16 mDescriptor;
    mutable bool mDescriptorKnown = false;
    std::vector<Obituary> mObituaries;
    bool mObitsSent = false;
};

}  // namespace android
