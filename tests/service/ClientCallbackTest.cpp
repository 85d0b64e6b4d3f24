#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <functional>
#include <vector>

#include "platform/binder/BBinder.h"
#include "platform/binder/Parcel.h"
#include "service/BpCTavoPlayerClient.h"
#include "support/NamedRow.h"

namespace TavoPlayer {
namespace {

using android::Parcel;
using android::sp;

// Stands in for the client's binder and keeps what each callback sent.
class RawClient : public android::BBinder {
public:
    struct Call {
        uint32_t code;
        uint32_t flags;
        std::vector<int32_t> ints;  // every integer after the token
        int fd = -1;                // a dup of the descriptor sent, if any
    };
    ~RawClient() override {
        for (const Call& c : calls) {
            if (c.fd >= 0)
                close(c.fd);
        }
    }
    std::vector<Call> calls;

protected:
    android::status_t onTransact(uint32_t code, const Parcel& data, Parcel*,
                                 uint32_t flags) override {
        Call call{code, flags, {}};
        if (!data.enforceInterface(android::String16("TavoPlayerClient")))
            return -1;
        if (code == ICTavoPlayerClient::ON_CAPTURE_FRAME) {
            for (int i = 0; i < 3; ++i)
                call.ints.push_back(data.readInt32());
            call.fd = dup(data.readFileDescriptor());
        } else {
            int32_t v;
            while (data.readInt32(&v) == android::OK)
                call.ints.push_back(v);
        }
        calls.push_back(call);
        return android::OK;
    }
};

struct CallbackCase {
    const char* name;
    std::function<void(ICTavoPlayerClient&)> send;
    uint32_t code;
    std::vector<int32_t> ints;
};
using test::PrintTo;

class ClientCallbackTest : public ::testing::TestWithParam<CallbackCase> {
protected:
    sp<RawClient> raw = new RawClient();
    sp<ICTavoPlayerClient> client = new BpCTavoPlayerClient(raw);
};

// Each callback: its code, the one-way flag, and its integers in order.
TEST_P(ClientCallbackTest, SendsOneWayWithItsCodeAndIntegers) {
    const CallbackCase& c = GetParam();
    c.send(*client);
    ASSERT_EQ(1u, raw->calls.size());
    EXPECT_EQ(c.code, raw->calls[0].code);
    EXPECT_EQ(android::IBinder::FLAG_ONEWAY, raw->calls[0].flags);
    EXPECT_EQ(c.ints, raw->calls[0].ints);
}

const uint8_t kText[] = {'A', 0, 0, 0, 'b', 0};

INSTANTIATE_TEST_SUITE_P(
    Callbacks, ClientCallbackTest,
    ::testing::Values(
        CallbackCase{"openUriComplete", [](auto& c) { c.openUriComplete(-7); }, 1, {-7}},
        CallbackCase{"startComplete", [](auto& c) { c.startComplete(1); }, 2, {1}},
        // The length twice, then the bytes padded to 4: 'A',0,0,0 and 'b',0,0,0.
        CallbackCase{"closedCaptionText",
                     [](auto& c) { c.closedCaptionText(kText, 6); },
                     3,
                     {6, 6, 'A', 'b'}},
        CallbackCase{
            "closedCaptionText_empty", [](auto& c) { c.closedCaptionText(nullptr, 0); }, 3, {0, 0}},
        CallbackCase{
            "onSignalStatusChanged", [](auto& c) { c.onSignalStatusChanged(2, 5); }, 5, {2, 5}},
        CallbackCase{"onStopComplete", [](auto& c) { c.onStopComplete(0); }, 6, {0}},
        CallbackCase{"onError", [](auto& c) { c.onError(0x41001); }, 7, {0x41001}},
        CallbackCase{"onBufferingBegin", [](auto& c) { c.onBufferingBegin(); }, 8, {}},
        CallbackCase{"onBufferingEnd", [](auto& c) { c.onBufferingEnd(); }, 9, {}},
        CallbackCase{"onBuffering", [](auto& c) { c.onBuffering(40); }, 10, {40}},
        CallbackCase{"onAudioSessionId", [](auto& c) { c.onAudioSessionId(33); }, 11, {33}},
        CallbackCase{
            "onStartVideoTask", [](auto& c) { c.onStartVideoTask(1920, 1080); }, 12, {1920, 1080}},
        CallbackCase{"onTimeUpdate", [](auto& c) { c.onTimeUpdate(61); }, 13, {61}},
        CallbackCase{"onEndOfContent", [](auto& c) { c.onEndOfContent(); }, 14, {}},
        CallbackCase{"onRecorderStarted", [](auto& c) { c.onRecorderStarted(0); }, 15, {0}},
        CallbackCase{"onRecorderStopped", [](auto& c) { c.onRecorderStopped(3); }, 16, {3}},
        CallbackCase{"onPaused", [](auto& c) { c.onPaused(1); }, 17, {1}},
        CallbackCase{"onResumed", [](auto& c) { c.onResumed(0); }, 18, {0}},
        CallbackCase{"onSeeked", [](auto& c) { c.onSeeked(90000); }, 19, {90000}}),
    [](const ::testing::TestParamInfo<CallbackCase>& info) { return info.param.name; });

// The capture region is sized by the flag (2- or 4-byte pixels), holds the pixels,
// and reaches the client as a descriptor it can only map read-only.
TEST(CaptureFrameRegionTest, SizedByTheFlagAndReadOnly) {
    struct Size {
        int32_t flag;
        off_t bytes;
    };
    for (const Size& size : {Size{1, 153600}, Size{0, 307200}, Size{7, 153600}}) {
        SCOPED_TRACE(size.flag);
        sp<RawClient> raw = new RawClient();
        sp<ICTavoPlayerClient> client = new BpCTavoPlayerClient(raw);
        std::vector<uint8_t> pixels(static_cast<size_t>(size.bytes));
        for (size_t i = 0; i < pixels.size(); ++i)
            pixels[i] = static_cast<uint8_t>(i ^ (i >> 8));
        client->onCaptureFrame(pixels.data(), 320, 240, size.flag);
        ASSERT_EQ(1u, raw->calls.size());
        const RawClient::Call& call = raw->calls[0];
        EXPECT_EQ((std::vector<int32_t>{320, 240, size.flag != 0 ? 1 : 0}), call.ints);
        ASSERT_GE(call.fd, 0);
        struct stat st {};
        ASSERT_EQ(0, fstat(call.fd, &st));
        EXPECT_EQ(size.bytes, st.st_size);
        EXPECT_EQ(MAP_FAILED, mmap(nullptr, 4096, PROT_READ | PROT_WRITE, MAP_SHARED, call.fd, 0));
        void* map =
            mmap(nullptr, static_cast<size_t>(size.bytes), PROT_READ, MAP_SHARED, call.fd, 0);
        ASSERT_NE(MAP_FAILED, map);
        EXPECT_EQ(0, memcmp(map, pixels.data(), pixels.size()));
        munmap(map, static_cast<size_t>(size.bytes));
    }
    // Nothing to send: no region, no transaction.
    sp<RawClient> raw = new RawClient();
    sp<ICTavoPlayerClient> client = new BpCTavoPlayerClient(raw);
    client->onCaptureFrame(nullptr, 320, 240, 0);
    uint8_t one = 0;
    client->onCaptureFrame(&one, 0, 240, 0);
    EXPECT_TRUE(raw->calls.empty());
}

}  // namespace
}  // namespace TavoPlayer
