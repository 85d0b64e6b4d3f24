// The service protocol: what the service's stub reads from each request and
// writes back, and its one-way callbacks to a client that stops reading, over
// the socket transport.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <cstring>
#include <string>
#include <variant>
#include <vector>

#include "platform/binder/BBinder.h"
#include "platform/binder/IServiceManager.h"
#include "platform/binder/Parcel.h"
#include "service/BnCTavoPlayer.h"
#include "support/Recorded.h"
#include "support/RunCommand.h"

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

// One service for the whole program, served on a socket in a folder of its own that
// goes with the program.
class ServiceProtocolTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        sDir = test::tempPath("binder");
        setenv("TAVOPLAYER_SERVICE_DIR", sDir.c_str(), 1);
        sService = new RecordingService();
        ASSERT_EQ(0,
                  android::defaultServiceManager()->addService(String16("TavoPlayer"), sService));
    }

    static inline std::string sDir;
    static inline sp<RecordingService> sService;
};

// One request: arguments after the token, the call the service saw, the reply. A
// bool argument is a binder: present or null.
using Arg = std::variant<int32_t, uint32_t, const char*, bool>;

// The reply's kind is its size in bytes.
enum ReplyKind { NONE = 0, INT32 = 4, INT64 = 8 };

struct Request {
    uint32_t code;
    std::vector<Arg> args;
    const char* call;  // null: the service must not be called
    android::status_t status;
    ReplyKind reply;
    int64_t value;
    bool token = true;
};

template <typename... Writers>
struct Overloaded : Writers... {
    using Writers::operator()...;
};

TEST_F(ServiceProtocolTest, EveryCodeReadsItsArgumentsInOrderAndReplies) {
    sp<IBinder> token = new android::BBinder();
    const android::status_t unknown = android::UNKNOWN_TRANSACTION;
    const std::vector<Request> table = {
        {1, {true}, "registerClient(client)", 0, NONE, 0},
        {2, {}, "start()", 0, NONE, 0},
        {3, {}, "stop()", 0, NONE, 0},
        {4, {}, "pause()", 0, NONE, 0},
        {5, {}, "resume()", 0, NONE, 0},
        {6, {1500}, "seek(1500)", 0, NONE, 0},
        {7, {5, "MTV://a?pcr=256"}, "openUri(MTV://a?pcr=256,5)", 0, NONE, 0},
        {8, {}, "close()", 0, NONE, 0},
        {9, {"sf", "", 3, 0xffffffffu, false}, "setSurface(null)", 0, INT32, 109},
        {9, {"sf", "x", 0, 0u, true}, "setSurface(surface)", 0, INT32, 109},
        {10, {320, 240}, "getFrame(320,240)", 0, NONE, 0},
        {11, {2, -5}, "setSoundEffect(2,-5)", 0, INT32, 111},
        {12, {1}, nullptr, unknown, NONE, 0},
        {13, {"MTV://rec"}, "startRecorder(MTV://rec)", 0, INT32, 113},
        {14, {1}, "stopRecorder(1)", 0, INT32, 114},
        {15, {}, nullptr, unknown, NONE, 0},
        {16, {}, nullptr, unknown, NONE, 0},
        {17, {150}, "setAVSync(150)", 0, INT32, 117},
        {18, {-3}, "setCaptionSync(-3)", 0, INT32, 118},
        {19, {2}, "setCaptionLanguage(2)", 0, NONE, 0},
        {20, {0}, "setAudioEnable(0)", 0, NONE, 0},
        {21, {0x111}, "setAudioPID(273)", 0, NONE, 0},
        {22, {1}, "setAudioPathForce(1)", 0, NONE, 0},
        {23, {0x130}, "setCCPID(304)", 0, NONE, 0},
        {24, {}, "getFrameRate()", 0, INT32, 124},
        {25, {}, "getState()", 0, INT32, 125},
        {26, {1, 2, 3, 4, 5}, "setCropRect(1,2,3,4,5)", 0, INT32, 126},
        {27, {1}, "setAudioOnlyMode(1)", 0, INT32, 127},
        {28, {}, "getPCRValue()", 0, INT64, 0x123456789ABLL},
        {29, {}, nullptr, unknown, NONE, 0},
        // A request too short for its arguments is refused without a call.
        {26, {1, 2}, nullptr, android::BAD_VALUE, NONE, 0},
        {2, {}, nullptr, -1, NONE, 0, false},
        // The last row calls, so no stray call from the rows above goes unseen.
        {2, {}, "start()", 0, NONE, 0},
    };
    for (const Request& row : table) {
        SCOPED_TRACE("code " + std::to_string(row.code));
        Parcel data, reply;
        data.writeInterfaceToken(String16(row.token ? "TavoPlayer" : "TavoPlayerX"));
        const Overloaded write{
            [&](int32_t v) { data.writeInt32(v); }, [&](uint32_t v) { data.writeUint32(v); },
            [&](const char* text) { data.writeString16(String16(text)); },
            [&](bool binder) { data.writeStrongBinder(binder ? token : nullptr); }};
        for (const Arg& arg : row.args)
            std::visit(write, arg);
        EXPECT_EQ(row.status, sService->transact(row.code, data, &reply));
        if (row.call != nullptr) {
            EXPECT_EQ(row.call, sService->next());
        }
        EXPECT_EQ(static_cast<size_t>(row.reply), reply.dataSize());
        if (row.reply != NONE) {
            EXPECT_EQ(row.value, row.reply == INT32 ? reply.readInt32() : reply.readInt64());
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
    // Sends one frame in the layout of docs/protocol.md, built without the library.
    auto send = [fd](uint32_t code, uint32_t tid, const Parcel& body, bool withBinder) {
        const uint32_t size = static_cast<uint32_t>(body.dataSize());
        std::vector<uint8_t> f(40 + size + (withBinder ? 4 : 0), 0);
        const uint32_t header[] = {0x31425654, 1,   0, code, 1,
                                   0,          tid, 0, size, withBinder ? 1u : 0u};
        memcpy(f.data(), header, sizeof header);
        memcpy(f.data() + 40, body.data(), size);
        if (withBinder) {
            const uint32_t offset = size - 24;
            const uint32_t flat[] = {0x73622a85, 0, 2, 0, 0, 0};  // our object, id 2
            memcpy(f.data() + 40 + offset, flat, sizeof flat);
            memcpy(f.data() + 40 + size, &offset, 4);
        }
        return ::send(fd, f.data(), f.size(), 0) == static_cast<ssize_t>(f.size());
    };
    Parcel reg;
    reg.writeInterfaceToken(String16("TavoPlayer"));
    reg.write(std::vector<uint8_t>(24, 0).data(), 24);
    ASSERT_TRUE(send(1, 1, reg, true));
    EXPECT_EQ("registerClient(client)", sService->next());
    Parcel flood;
    flood.writeInterfaceToken(String16("TavoPlayer"));
    flood.writeInt32(5000);
    ASSERT_TRUE(send(19, 2, flood, false));
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
