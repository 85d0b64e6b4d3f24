#include "platform/binder/BpBinder.h"

#include "platform/binder/Connection.h"
#include "platform/binder/Parcel.h"

namespace android {

BpBinder::BpBinder(const sp<Connection>& connection, uint64_t handle)
    : mConnection(connection), mHandle(handle) {}

BpBinder::~BpBinder() {
    mConnection->proxyDestroyed(mHandle, this, mRemoteRefs.load(std::memory_order_relaxed));
}

const String16& BpBinder::getInterfaceDescriptor() const {
    std::lock_guard<std::mutex> lock(mLock);
    if (!mDescriptorKnown) {
        Parcel data;
        Parcel reply;
        // The call is made under the lock: a second caller waits for the answer.
        if (mConnection->transact(mHandle, INTERFACE_TRANSACTION, data, &reply, 0) == OK &&
            reply.readString16(&mDescriptor) == OK)
            mDescriptorKnown = true;
    }
    return mDescriptor;
}

bool BpBinder::isBinderAlive() const {
    return mConnection->isAlive();
}

status_t BpBinder::pingBinder() {
    Parcel data;
    Parcel reply;
    return mConnection->transact(mHandle, PING_TRANSACTION, data, &reply, 0);
}

status_t BpBinder::dump(int fd, const Vector<String16>& args) {
    Parcel data;
    Parcel reply;
    status_t err = data.writeFileDescriptor(fd);
    if (err == OK)
        err = data.writeInt32(static_cast<int32_t>(args.size()));
    for (size_t i = 0; err == OK && i < args.size(); ++i)
        err = data.writeString16(args[i]);
    return err == OK ? mConnection->transact(mHandle, DUMP_TRANSACTION, data, &reply, 0) : err;
}

status_t BpBinder::transact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) {
    const status_t err = mConnection->transact(mHandle, code, data, reply, flags);
    if (reply != nullptr)
        reply->setDataPosition(0);
    return err;
}

status_t BpBinder::linkToDeath(const sp<DeathRecipient>& recipient, void* cookie,
                               uint32_t /*flags*/) {
    if (recipient == nullptr)
        return BAD_VALUE;
    std::lock_guard<std::mutex> lock(mLock);
    if (mObitsSent || !mConnection->isAlive())
        return DEAD_OBJECT;
    mObituaries.push_back(Obituary{recipient, cookie});
    return OK;
}

status_t BpBinder::unlinkToDeath(const wp<DeathRecipient>& recipient, void* cookie,
                                 uint32_t /*flags*/, wp<DeathRecipient>* outRecipient) {
    std::lock_guard<std::mutex> lock(mLock);
    if (mObitsSent)
        return DEAD_OBJECT;
    for (auto it = mObituaries.begin(); it != mObituaries.end(); ++it) {
        if (it->recipient == recipient && (cookie == nullptr || it->cookie == cookie)) {
            if (outRecipient != nullptr)
                *outRecipient = it->recipient;
            mObituaries.erase(it);
            return OK;
        }
    }
    return NAME_NOT_FOUND;
}

void BpBinder::sendObituary() {
    std::vector<Obituary> obituaries;
    {
        std::lock_guard<std::mutex> lock(mLock);
        if (mObitsSent)
            return;
        mObitsSent = true;
        obituaries.swap(mObituaries);
    }
    const wp<IBinder> who(this);
    for (const Obituary& obituary : obituaries) {
        sp<DeathRecipient> recipient = obituary.recipient.promote();
        if (recipient != nullptr)
            recipient->binderDied(who);
        recipient.clear();
    }
}

}  // namespace android
