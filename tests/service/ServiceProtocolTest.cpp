// The service protocol: what the service's stub reads from each request and
// writes back, and its one-way callbacks to a client that stops reading, over
// the socket transport.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "platform/binder/BBinder.h"
#include "platform/binder/IServiceManager.h"
#include "platform/binder/Parcel.h"
#include "service/BnCTavoPlayer.h"
#include "support/Recorded.h"

namespace TavoPlayer {
namespace {

using android::IBinder;
using android::Parcel;
using android::sp;
using android::String16;
using namespace std::chrono_literals;

// setCaptionLanguage with a value from here up makes the fake send that many
// one-way callbacks at once and report how many the transport took.
constexpr int32_t kFloodTrigger = 1000;

// Records each call as a line of text; the binder threads of the socket
// transport call it too.
class RecordingService : public BnCTavoPlayer {
public:
    uint32_t registerClient(const sp<ICTavoPlayerClient>& client) override {
        mClient = client;
        return call("registerClient(%s)", 0, client != nullptr ? "client" : "null");
    }
    uint32_t start() override { return call("start()", 0); }
    uint32_t stop() override { return call("stop()", 0); }
    uint32_t getState() override { return call("getState()", 125); }
    uint32_t pause() override { return call("pause()", 0); }
    uint32_t resume() override { return call("resume()", 0); }
    uint32_t seek(int32_t ms) override { return call("seek(%d)", 0, ms); }
    uint32_t openUri(const char* uri, int32_t type) override {
        return call("openUri(%s,%d)", 0, uri, type);
    }
    uint32_t close() override { return call("close()", 0); }
    uint32_t setSurface(const sp<android::Surface>& surface) override {
        return call("setSurface(%s)", 109, surface != nullptr ? "surface" : "null");
    }
    uint32_t getFrame(int32_t w, int32_t h) override { return call("getFrame(%d,%d)", 0, w, h); }
    uint32_t setSoundEffect(int32_t e, int32_t o) override {
        return call("setSoundEffect(%d,%d)", 111, e, o);
    }
    uint32_t startRecorder(const char* uri) override { return call("startRecorder(%s)", 113, uri); }
    uint32_t stopRecorder(int32_t flag) override { return call("stopRecorder(%d)", 114, flag); }
    uint32_t setAVSync(int32_t v) override { return call("setAVSync(%d)", 117, v); }
    uint32_t setCaptionSync(int32_t v) override { return call("setCaptionSync(%d)", 118, v); }
    uint32_t setAudioEnable(int32_t on) override { return call("setAudioEnable(%d)", 0, on); }
    uint32_t setCaptionLanguage(int32_t language) override {
        if (language >= kFloodTrigger)
            return flood(language);
        return call("setCaptionLanguage(%d)", 0, language);
    }
    uint32_t setAudioPID(int32_t pid) override { return call("setAudioPID(%d)", 0, pid); }
    int32_t setAudioPathForce(int32_t mode) override {
        return call("setAudioPathForce(%d)", 0, mode);
    }
    uint32_t setCCPID(int32_t pid) override { return call("setCCPID(%d)", 0, pid); }
    int32_t getFrameRate() override { return call("getFrameRate()", 124); }
    uint32_t setCropRect(int32_t a, int32_t b, int32_t c, int32_t d, int32_t e) override {
        return call("setCropRect(%d,%d,%d,%d,%d)", 126, a, b, c, d, e);
    }
    uint32_t setAudioOnlyMode(int32_t on) override { return call("setAudioOnlyMode(%d)", 127, on); }
    int64_t getPCRValue() override {
        call("getPCRValue()", 0);
        return 0x123456789ABLL;
    }

    // The next call not taken yet, or "" when none comes within the deadline. Only the
    // test's thread takes.
    std::string next() {
        if (!mCalls.waitFor([&](auto& all) { return mTaken < all.size(); }, 30s))
            return "";
        return mCalls.snapshot()[mTaken++];
    }

private:
    template <typename... Args>
    uint32_t call(const char* format, uint32_t result, Args... args) {
        char text[128];
        snprintf(text, sizeof text, format, args...);
        mCalls.push(text);
        return result;
    }
    uint32_t flood(int32_t count) {
        int sent = 0;
        int dropped = 0;
        const sp<IBinder> client = android::IInterface::asBinder(mClient);
        for (int32_t i = 0; client != nullptr && i < count; ++i) {
            Parcel data;
            data.writeInterfaceToken(ICTavoPlayerClient::descriptor);
            data.writeInt32(i);
            const auto err = client->transact(ICTavoPlayerClient::ON_SEEKED, data, nullptr,
                                              IBinder::FLAG_ONEWAY);
            (err == android::OK ? sent : dropped)++;
        }
        return call("flood sent=%d dropped=%d", 0, sent, dropped);
    }
    sp<ICTavoPlayerClient> mClient;
    test::Recorded<std::string> mCalls;
    size_t mTaken = 0;
};

// One service for the whole program, served on a socket in a folder of its own.
class ServiceProtocolTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        char dir[] = "/tmp/tavo-binder-XXXXXX";
        ASSERT_NE(nullptr, mkdtemp(dir));
        sDir = dir;
        setenv("TAVOPLAYER_SERVICE_DIR", dir, 1);
        sService = new RecordingService();
        ASSERT_EQ(0,
                  android::defaultServiceManager()->addService(String16("TavoPlayer"), sService));
    }
    static void TearDownTestSuite() { std::filesystem::remove_all(sDir); }

    static std::string sDir;
    static sp<RecordingService> sService;
};
std::string ServiceProtocolTest::sDir;
sp<RecordingService> ServiceProtocolTest::sService;

// One request: arguments after the token, the call the service saw, the reply.
struct Arg {
    enum Kind { INT, UINT, TEXT, BINDER } kind;
    int32_t value = 0;
    const char* text = nullptr;
};
const auto I = [](int32_t v) { return Arg{Arg::INT, v}; };
const auto U = [](uint32_t v) { return Arg{Arg::UINT, static_cast<int32_t>(v)}; };
const auto S = [](const char* t) { return Arg{Arg::TEXT, 0, t}; };
const auto B = [](bool present) { return Arg{Arg::BINDER, present ? 1 : 0}; };

enum ReplyKind { NONE, INT32, INT64 };

struct Request {
    uint32_t code;
    std::vector<Arg> args;
    const char* call;  // null: the service must not be called
    android::status_t status;
    ReplyKind reply;
    int64_t value;
    bool token = true;
};

TEST_F(ServiceProtocolTest, EveryCodeReadsItsArgumentsInOrderAndReplies) {
    sp<IBinder> token = new android::BBinder();
    const android::status_t unknown = android::UNKNOWN_TRANSACTION;
    const std::vector<Request> table = {
        {1, {B(true)}, "registerClient(client)", 0, NONE, 0},
        {2, {}, "start()", 0, NONE, 0},
        {3, {}, "stop()", 0, NONE, 0},
        {4, {}, "pause()", 0, NONE, 0},
        {5, {}, "resume()", 0, NONE, 0},
        {6, {I(1500)}, "seek(1500)", 0, NONE, 0},
        {7, {I(5), S("MTV://a?pcr=256")}, "openUri(MTV://a?pcr=256,5)", 0, NONE, 0},
        {8, {}, "close()", 0, NONE, 0},
        {9, {S("sf"), S(""), I(3), U(0xffffffffu), B(false)}, "setSurface(null)", 0, INT32, 109},
        {9, {S("sf"), S("x"), I(0), U(0), B(true)}, "setSurface(surface)", 0, INT32, 109},
        {10, {I(320), I(240)}, "getFrame(320,240)", 0, NONE, 0},
        {11, {I(2), I(-5)}, "setSoundEffect(2,-5)", 0, INT32, 111},
        {12, {I(1)}, nullptr, unknown, NONE, 0},
        {13, {S("MTV://rec")}, "startRecorder(MTV://rec)", 0, INT32, 113},
        {14, {I(1)}, "stopRecorder(1)", 0, INT32, 114},
        {15, {}, nullptr, unknown, NONE, 0},
        {16, {}, nullptr, unknown, NONE, 0},
        {17, {I(150)}, "setAVSync(150)", 0, INT32, 117},
        {18, {I(-3)}, "setCaptionSync(-3)", 0, INT32, 118},
        {19, {I(2)}, "setCaptionLanguage(2)", 0, NONE, 0},
        {20, {I(0)}, "setAudioEnable(0)", 0, NONE, 0},
        {21, {I(0x111)}, "setAudioPID(273)", 0, NONE, 0},
        {22, {I(1)}, "setAudioPathForce(1)", 0, NONE, 0},
        {23, {I(0x130)}, "setCCPID(304)", 0, NONE, 0},
        {24, {}, "getFrameRate()", 0, INT32, 124},
        {25, {}, "getState()", 0, INT32, 125},
        {26, {I(1), I(2), I(3), I(4), I(5)}, "setCropRect(1,2,3,4,5)", 0, INT32, 126},
        {27, {I(1)}, "setAudioOnlyMode(1)", 0, INT32, 127},
        {28, {}, "getPCRValue()", 0, INT64, 0x123456789ABLL},
        {29, {}, nullptr, unknown, NONE, 0},
        // A request too short for its arguments is refused without a call.
        {26, {I(1), I(2)}, nullptr, android::BAD_VALUE, NONE, 0},
        {2, {}, nullptr, -1, NONE, 0, false},
        // The last row calls, so no stray call from the rows above goes unseen.
        {2, {}, "start()", 0, NONE, 0},
    };
    for (const Request& row : table) {
        SCOPED_TRACE("code " + std::to_string(row.code));
        Parcel data, reply;
        data.writeInterfaceToken(String16(row.token ? "TavoPlayer" : "TavoPlayerX"));
        for (const Arg& arg : row.args) {
            if (arg.kind == Arg::INT)
                data.writeInt32(arg.value);
            else if (arg.kind == Arg::UINT)
                data.writeUint32(static_cast<uint32_t>(arg.value));
            else if (arg.kind == Arg::TEXT)
                data.writeString16(String16(arg.text));
            else
                data.writeStrongBinder(arg.value != 0 ? token : nullptr);
        }
        EXPECT_EQ(row.status, sService->transact(row.code, data, &reply));
        if (row.call != nullptr) {
            EXPECT_EQ(row.call, sService->next());
        }
        const size_t replyBytes = row.reply == NONE ? 0 : row.reply == INT32 ? 4 : 8;
        EXPECT_EQ(replyBytes, reply.dataSize());
        if (row.reply == INT32) {
            EXPECT_EQ(row.value, reply.readInt32());
        } else if (row.reply == INT64) {
            EXPECT_EQ(row.value, reply.readInt64());
        }
    }
}

// A client that registers by hand and then never reads its socket: the
// service's one-way callbacks fill the bounded queue and the rest are refused,
// and the service's thread carries on.
TEST_F(ServiceProtocolTest, ClientThatNeverReadsDoesNotBlockTheService) {
    const int fd = socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0);
    sockaddr_un addr{};
    addr.sun_family = AF_UNIX;
    snprintf(addr.sun_path, sizeof addr.sun_path, "%s/TavoPlayer", sDir.c_str());
    ASSERT_EQ(0, connect(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr));
    auto frame = [](uint32_t code, uint64_t tid, const Parcel& body, bool withBinder) {
        // The frame layout of docs/protocol.md, built without the library.
        std::vector<uint8_t> f(40 + body.dataSize() + (withBinder ? 4 : 0), 0);
        const uint32_t header[] = {0x31425654,
                                   1,
                                   0,
                                   code,
                                   1,
                                   0,
                                   static_cast<uint32_t>(tid),
                                   0,
                                   static_cast<uint32_t>(body.dataSize()),
                                   withBinder ? 1u : 0u};
        memcpy(f.data(), header, sizeof header);
        memcpy(f.data() + 40, body.data(), body.dataSize());
        if (withBinder) {
            const uint32_t offset = static_cast<uint32_t>(body.dataSize() - 24);
            const uint32_t flat[] = {0x73622a85, 0, 2, 0, 0, 0};  // our object, id 2
            memcpy(f.data() + 40 + offset, flat, sizeof flat);
            memcpy(f.data() + 40 + body.dataSize(), &offset, 4);
        }
        return f;
    };
    Parcel reg;
    reg.writeInterfaceToken(String16("TavoPlayer"));
    reg.write(std::vector<uint8_t>(24, 0).data(), 24);
    const std::vector<uint8_t> f1 = frame(1, 1, reg, true);
    ASSERT_EQ(static_cast<ssize_t>(f1.size()), send(fd, f1.data(), f1.size(), 0));
    EXPECT_EQ("registerClient(client)", sService->next());
    Parcel flood;
    flood.writeInterfaceToken(String16("TavoPlayer"));
    flood.writeInt32(5000);
    const std::vector<uint8_t> f2 = frame(19, 2, flood, false);
    ASSERT_EQ(static_cast<ssize_t>(f2.size()), send(fd, f2.data(), f2.size(), 0));
    const std::string result = sService->next();
    int sent = -1, dropped = -1;
    ASSERT_EQ(2, sscanf(result.c_str(), "flood sent=%d dropped=%d", &sent, &dropped)) << result;
    EXPECT_EQ(5000, sent + dropped);
    EXPECT_GT(dropped, 0);
    EXPECT_GE(sent, 256);  // at least the queue's worth was taken
    ::close(fd);
}

}  // namespace
}  // namespace TavoPlayer
