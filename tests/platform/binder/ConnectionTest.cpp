#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <vector>

#include "platform/binder/BBinder.h"
#include "platform/binder/BpBinder.h"
#include "platform/binder/Connection.h"
#include "platform/binder/IPCThreadState.h"
#include "platform/binder/Parcel.h"
#include "platform/binder/ProcessState.h"
#include "support/Recorded.h"

namespace android {
namespace {

// An object that echoes what it is sent and remembers who called it.
class Echo : public BBinder {
public:
    enum : uint32_t { ECHO = 1, CALL_BACK = 2 };

    pid_t callerPid = 0;
    uid_t callerUid = 0;

protected:
    status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) override {
        callerPid = IPCThreadState::self()->getCallingPid();
        callerUid = IPCThreadState::self()->getCallingUid();
        switch (code) {
            case ECHO: {
                // int32, binder, descriptor in; the same binder and descriptor's first byte out.
                reply->writeInt32(data.readInt32() + 1);
                reply->writeStrongBinder(data.readStrongBinder());
                const int fd = data.readFileDescriptor();
                char byte = 0;
                reply->writeInt32(fd >= 0 && read(fd, &byte, 1) == 1 ? byte : -1);
                return OK;
            }
            case CALL_BACK: {
                // Calls the binder it is given, two-way, while its own caller waits.
                sp<IBinder> target = data.readStrongBinder();
                Parcel in, out;
                in.writeInt32(41);
                in.writeStrongBinder(nullptr);
                const status_t err =
                    target != nullptr ? target->transact(ECHO, in, &out) : BAD_VALUE;
                reply->writeInt32(err == OK ? out.readInt32() : err);
                return OK;
            }
            default:
                return BBinder::onTransact(code, data, reply, flags);
        }
    }
};

// Two connections joined by a socket pair: `server` serves `service` as its root.
class ConnectionTest : public ::testing::Test {
protected:
    void SetUp() override {
        int fds[2];
        ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, fds));
        server = Connection::create(fds[0], service);
        client = Connection::create(fds[1], nullptr);
        ASSERT_EQ(OK, server->start());
        ASSERT_EQ(OK, client->start());
        proxy = client->rootProxy();
    }
    void TearDown() override {
        proxy.clear();
        server->hangUp();
        client->hangUp();
        server->join();
        client->join();
    }

    sp<Echo> service = new Echo();
    sp<Connection> server;
    sp<Connection> client;
    sp<IBinder> proxy;
};

TEST_F(ConnectionTest, ObjectsAndDescriptorsCrossComeBackAsThemselvesAndCallBack) {
    sp<IBinder> mine = new Echo();
    int pipeFds[2];
    ASSERT_EQ(0, pipe(pipeFds));
    ASSERT_EQ(1, write(pipeFds[1], "Z", 1));
    Parcel data, reply;
    data.writeInt32(9);
    data.writeStrongBinder(mine);
    data.writeFileDescriptor(pipeFds[0]);
    ASSERT_EQ(OK, proxy->transact(Echo::ECHO, data, &reply));
    close(pipeFds[0]);
    close(pipeFds[1]);
    EXPECT_EQ(10, reply.readInt32());
    // Our object went out as a proxy and came back as the object itself.
    EXPECT_EQ(mine, reply.readStrongBinder());
    EXPECT_EQ('Z', reply.readInt32());
    EXPECT_EQ(getpid(), service->callerPid);
    EXPECT_EQ(getuid(), service->callerUid);

    // The service calls our object, two-way, while this call waits for its answer.
    Parcel callBack, answer;
    callBack.writeStrongBinder(mine);
    ASSERT_EQ(OK, proxy->transact(Echo::CALL_BACK, callBack, &answer));
    EXPECT_EQ(42, answer.readInt32());
}

TEST_F(ConnectionTest, HangUpFailsCallsAndTellsDeathRecipients) {
    struct Recipient : IBinder::DeathRecipient, TavoPlayer::test::Recorded<wp<IBinder>> {
        void binderDied(const wp<IBinder>& who) override { push(who); }
    };
    sp<Recipient> recipient = new Recipient();
    ASSERT_EQ(OK, proxy->linkToDeath(recipient));
    server->hangUp();
    ASSERT_TRUE(recipient->waitFor([](auto& all) { return !all.empty(); }));
    EXPECT_EQ(proxy.get(), recipient->snapshot().front().unsafe_get());
    Parcel data, reply;
    EXPECT_EQ(DEAD_OBJECT, proxy->transact(Echo::ECHO, data, &reply));
    EXPECT_FALSE(proxy->isBinderAlive());
    EXPECT_EQ(DEAD_OBJECT, proxy->linkToDeath(recipient));
}

}  // namespace
}  // namespace android
