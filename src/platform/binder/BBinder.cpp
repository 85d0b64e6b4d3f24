#include "platform/binder/BBinder.h"

#include "platform/binder/Parcel.h"

namespace android {

namespace {
// Bounds the argument count of a dump request, which comes from the peer.
constexpr int32_t kMaxDumpArgs = 1024;
}  // namespace

const String16& BBinder::getInterfaceDescriptor() const {
    static const String16 empty;
    return empty;
}

status_t BBinder::dump(int /*fd*/, const Vector<String16>& /*args*/) {
    return OK;
}

status_t BBinder::transact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) {
    data.setDataPosition(0);
    status_t err = OK;
    if (code == PING_TRANSACTION) {
        err = pingBinder();
    } else {
        err = onTransact(code, data, reply, flags);
    }
    if (reply != nullptr)
        reply->setDataPosition(0);
    return err;
}

status_t BBinder::linkToDeath(const sp<DeathRecipient>&, void*, uint32_t) {
    return INVALID_OPERATION;
}

status_t BBinder::unlinkToDeath(const wp<DeathRecipient>&, void*, uint32_t, wp<DeathRecipient>*) {
    return INVALID_OPERATION;
}

status_t BBinder::onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t /*flags*/) {
    switch (code) {
        case INTERFACE_TRANSACTION:
            if (reply == nullptr)
                return BAD_VALUE;
            return reply->writeString16(getInterfaceDescriptor());
        case DUMP_TRANSACTION: {
            const int fd = data.readFileDescriptor();
            if (fd < 0)
                return BAD_VALUE;
            int32_t argc = 0;
            if (data.readInt32(&argc) != OK || argc < 0 || argc > kMaxDumpArgs)
                return BAD_VALUE;
            Vector<String16> args;
            for (int32_t i = 0; i < argc; ++i) {
                String16 arg;
                if (data.readString16(&arg) != OK)
                    return BAD_VALUE;
                args.add(arg);
            }
            return dump(fd, args);
        }
        default:
            return UNKNOWN_TRANSACTION;
    }
}

}  // namespace android
