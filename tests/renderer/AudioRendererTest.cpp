#include "renderer/AudioRenderer.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cstring>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "common/RingBuffer.h"
#include "common/data/AudioFragmentData.h"
#include "platform/audio/AudioTrack.h"
#include "support/CaptionTestDoubles.h"
#include "support/NamedRow.h"
#include "support/Recorded.h"
#include "support/RunCommand.h"
#include "support/Sanitizers.h"
#include "support/TraceCapture.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

using test::PrintTo;

using test::TraceCapture;
using test::waitUntil;

constexpr Uint33 kAnchor = 1'000'000;  // the clock's PCR while the test runs

struct Listener : AudioRenderer::AudioRenderedListener, ErrorListener {
    void onAudioRendered() override { ++rendered; }
    void onAudioReady(long waitMs) override { ready.push(waitMs); }
    void onAudioSessionId(int id) override { sessions.push(id); }
    void onError(unsigned int code, const Module*) const override { errors.push(code); }
    std::atomic<int> rendered{0};
    test::Recorded<long> ready;
    test::Recorded<int> sessions;
    mutable test::Recorded<unsigned int> errors;
};

// The renderer against the real clock (on a monotonic time the test holds still),
// a real ring, and the WAV sink, whose file shows exactly what reached the device.
class AudioRendererTest : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_FALSE(mDir.path().empty());
        setSink("wav:" + mDir / "out.wav");
        ASSERT_EQ(0u, mRing->configure("AudioRaw", 19));
    }
    void setSink(const std::string& sink) {
        mSink.emplace("TAVOPLAYER_PROP_tavoplayer_audio_sink", sink);
    }
    // Builds, configures and enables the renderer, and anchors the clock.
    unsigned int build(Uint33 anchor = kAnchor) {
        mRenderer = new AudioRenderer(mClock);
        mRenderer->addErrorListener(mListener);
        mRenderer->setAudioRenderedListener(&mListener);
        mRenderer->setInput(mRing);
        const unsigned int status = mRenderer->configure();
        mRenderer->setOutputEnable(true);
        mClock->setBasePCR(anchor, Synchronization::RealPCR);
        return status;
    }
    void writeRecord(Uint33 pts, uint8_t channels, uint32_t rate, const std::vector<uint8_t>& pcm,
                     uint8_t bits = 16, uint32_t type = 1) {
        const uint32_t size = 32 + static_cast<uint32_t>(pcm.size());
        AudioFragmentData header;
        header.mType = type;
        header.mSize = size;
        header.mPTS = pts;
        header.mNumberChannels = channels;
        header.mBitsPerSample = bits;
        header.mSamplingRate = rate;
        ASSERT_TRUE(mRing->waitForSpace(RingBuffer::roundUp4(size)));
        memcpy(mRing->writePointer(), static_cast<const void*>(&header), 32);
        memcpy(mRing->writePointer() + 32, pcm.data(), pcm.size());
        mRing->commitWrite(size);
    }
    // Render passes until the ring is empty; the number of passes, or -1.
    int drain() {
        for (int pass = 1; pass <= 20; ++pass) {
            mRenderer->render();
            if (mRing->usedSpace() == 0)
                return pass;
        }
        return -1;
    }
    std::vector<uint8_t> wavData() const {
        const std::vector<uint8_t> bytes = test::fileBytes(mDir / "out.wav");
        return bytes.size() > 44 ? std::vector<uint8_t>(bytes.begin() + 44, bytes.end())
                                 : std::vector<uint8_t>();
    }
    static std::vector<uint8_t> pcm(size_t bytes, uint8_t seed = 1) {
        std::vector<uint8_t> v(bytes);
        for (size_t i = 0; i < bytes; ++i)
            v[i] = static_cast<uint8_t>(seed + i * 13 + i / 256);
        return v;
    }

    test::ManualClock mManual;
    android::sp<Synchronization> mClock = mManual.make();
    android::sp<RingBuffer> mRing = new RingBuffer();
    Listener mListener;
    TraceCapture mTrace;
    test::TempDir mDir{"tavo-arend"};
    test::ScopedEnv mProperties{"TAVOPLAYER_PROPERTIES", mDir / "none.prop"};
    std::optional<test::ScopedEnv> mSink, mDevices;
    // Declared last, so destroyed first: its threads use everything above.
    android::sp<AudioRenderer> mRenderer;
};

// --- The place of a fragment against the audio clock --------------------------------

struct TimingCase {
    const char* name;
    Uint33 anchor;
    int64_t ptsOffsetTicks;  // the fragment's PTS minus the clock
    size_t payloadBytes;     // 48 kHz stereo
    bool bluetooth;
    size_t silenceBytes;  // silence written before the fragment
    int64_t skipBytes;    // cut from its head; -1 dropped whole, -2 clock reset
    long firstReadyMs;
};

class AudioTimingTest : public AudioRendererTest,
                        public ::testing::WithParamInterface<TimingCase> {};

TEST_P(AudioTimingTest, EarlyGetsSilenceLateLosesItsHead) {
    const TimingCase& c = GetParam();
    if (c.bluetooth)
        mDevices.emplace("TAVOPLAYER_PROP_tavoplayer_audio_devices", "0x80");
    ASSERT_EQ(0u, build(c.anchor));
    // The output device thread has seen the Bluetooth output once the change is flagged.
    if (c.bluetooth) {
        ASSERT_TRUE(waitUntil([&] { return mRenderer->checkOutputDevice(); }));
    }
    const std::vector<uint8_t> payload = pcm(c.payloadBytes);
    writeRecord(mask33(c.anchor + static_cast<uint64_t>(c.ptsOffsetTicks)), 2, 48000, payload);
    ASSERT_GT(drain(), 0);

    std::vector<uint8_t> expected(c.silenceBytes, 0);
    if (c.skipBytes >= 0)
        expected.insert(expected.end(), payload.begin() + c.skipBytes, payload.end());
    EXPECT_EQ(expected, wavData());
    if (c.skipBytes == -2) {
        EXPECT_EQ(0u, mClock->getPCR());
        EXPECT_FALSE(mRenderer->isSynced());
        EXPECT_TRUE(mListener.ready.snapshot().empty());
    } else {
        ASSERT_FALSE(mListener.ready.snapshot().empty());
        EXPECT_EQ(c.firstReadyMs, mListener.ready.snapshot().front());
        EXPECT_EQ(c.skipBytes == -1 ? 0 : 1, mListener.rendered.load());
    }
}

INSTANTIATE_TEST_SUITE_P(
    Cases, AudioTimingTest,
    ::testing::Values(
        TimingCase{"Early150msPlaysAtOnce", kAnchor, 13500, 9600, false, 0, 0, 150},
        TimingCase{"Early250msWaitsBehindSilence", kAnchor, 22500, 9600, false, 16384, 0, 250},
        TimingCase{"TenSecondsEarlyIsNoLongerEarly", kAnchor, 900000, 9600, false, 0, 0, 10000},
        TimingCase{"Late300msLoses57600Bytes", kAnchor, -27000, 96000, false, 0, 57600, -300},
        TimingCase{"LateAndShorterThanTheCutIsDropped", kAnchor, -27000, 57600, false, 0, -1, -300},
        TimingCase{"Early10001msResetsTheClock", kAnchor, 900090, 9600, false, 0, -2, 0},
        TimingCase{"Late10001msResetsTheClock", kAnchor, -900090, 9600, false, 0, -2, 0},
        TimingCase{"EarlyAcrossThe33BitWrap", 0x1FFFFFFFFull - 6000, 13500, 9600, false, 0, 0, 150},
        TimingCase{"BluetoothMakes360msEarlyPlayAtOnce", kAnchor, 32400, 9600, true, 0, 0, 190},
        TimingCase{"BluetoothStillInsertsSilence400msEarly", kAnchor, 36000, 9600, true, 8192, 0,
                   230}),
    [](const ::testing::TestParamInfo<TimingCase>& info) { return info.param.name; });

// --- Output between fragments, format changes, bad input ----------------------------

TEST_F(AudioRendererTest, SilenceFlowsIn8192ByteWritesOnlyWhileSynced) {
    ASSERT_EQ(0u, build());
    mRenderer->render();  // nothing to read and not synced: nothing written
    EXPECT_TRUE(wavData().empty());

    const std::vector<uint8_t> fragment = pcm(3840);
    writeRecord(kAnchor, 2, 48000, fragment);
    ASSERT_EQ(1, drain());
    const Uint33 clockAfterFragment = mRenderer->audioClock();
    EXPECT_EQ(kAnchor + 1800, clockAfterFragment);  // 20 ms
    for (int i = 0; i < 3; ++i)
        EXPECT_EQ(0u, mRenderer->render());
    std::vector<uint8_t> expected = fragment;
    expected.resize(3840 + 3 * 8192, 0);
    EXPECT_EQ(expected, wavData());
    EXPECT_EQ(clockAfterFragment + 3 * 3840, mRenderer->audioClock());
}

TEST_F(AudioRendererTest, FormatChangeRecreatesTheTrackAndResyncsOnce) {
    ASSERT_EQ(0u, build());
    EXPECT_EQ(1u, mListener.sessions.snapshot().size());  // configure: 48 kHz mono, the default
    writeRecord(kAnchor, 2, 48000, pcm(3840, 1));
    writeRecord(kAnchor + 1800, 2, 48000, pcm(3840, 2));
    ASSERT_GT(drain(), 0);
    const int resyncs = mRenderer->resyncCount();
    const std::vector<uint8_t> mono1 = pcm(1280, 3);
    const std::vector<uint8_t> mono2 = pcm(1280, 4);
    writeRecord(kAnchor + 3600, 1, 32000, mono1);
    writeRecord(kAnchor + 5400, 1, 32000, mono2);
    ASSERT_GT(drain(), 0);

    EXPECT_EQ(resyncs + 1, mRenderer->resyncCount());
    ASSERT_EQ(3u, mListener.sessions.snapshot().size());
    EXPECT_EQ(mListener.sessions.snapshot().back(), mRenderer->audioTrack()->getSessionId());
    EXPECT_EQ(32000u, mRenderer->audioTrack()->getSampleRate());
    EXPECT_EQ(1u, mRenderer->audioTrack()->channelCount());
    std::vector<uint8_t> expected = mono1;
    expected.insert(expected.end(), mono2.begin(), mono2.end());
    EXPECT_EQ(expected, wavData());  // a new file for the new format
}

TEST_F(AudioRendererTest, BadRecordsAreReportedOrDiscardedAndTheNextOnePlays) {
    ASSERT_EQ(0u, build());
    writeRecord(kAnchor, 2, 48000, std::vector<uint8_t>(48), 16, Data::TYPE_VIDEO_FRAME);
    writeRecord(kAnchor, 2, 0, pcm(64));
    writeRecord(kAnchor, 0, 48000, pcm(64));
    writeRecord(kAnchor, 2, 48000, pcm(64), 0);
    writeRecord(kAnchor, 2, 48000, pcm(64), 4);  // a sample of zero bytes
    const std::vector<uint8_t> good = pcm(1920, 7);
    writeRecord(kAnchor, 2, 48000, good);
    ASSERT_GT(drain(), 0);

    EXPECT_EQ(std::vector<unsigned int>{ERROR_RENDERER_WRONG_RECORD}, mListener.errors.snapshot());
    EXPECT_EQ(good, wavData());
}

TEST_F(AudioRendererTest, AnOutputThatCannotOpenOrFailsLeavesTheRendererRunning) {
    setSink("wav:/nonexistent-dir/out.wav");
    EXPECT_EQ(ERROR_RENDERER_NO_OUTPUT, build());
    EXPECT_EQ(0u, mRenderer->start());
    writeRecord(kAnchor, 2, 48000, pcm(1920));
    EXPECT_TRUE(waitUntil([&] { return mRing->usedSpace() == 0; }));
    EXPECT_EQ(0u, mRenderer->stop());
    mRenderer.clear();
    mListener.errors.take();

    // /dev/full opens and then refuses every byte, like a device that went away.
    setSink("wav:/dev/full");
    ASSERT_EQ(0u, build());
    ASSERT_EQ(0u, mRenderer->start());
    writeRecord(kAnchor, 2, 48000, pcm(1920));
    ASSERT_TRUE(waitUntil([&] { return mTrace.count("Could not write") >= 4; }));
    // Reported when the output starts failing, not on every pass.
    EXPECT_EQ(std::vector<unsigned int>{ERROR_RENDERER_SHORT_WRITE}, mListener.errors.snapshot());
    writeRecord(kAnchor + 1800, 2, 48000, pcm(1920));
    EXPECT_TRUE(waitUntil([&] { return mRing->usedSpace() == 0; }));
    EXPECT_EQ(0u, mRenderer->stop());
    EXPECT_EQ(-1, mListener.sessions.snapshot().back());
}

TEST_F(AudioRendererTest, EveryResyncPathFlushesAndDropsSynchronisation) {
    ASSERT_EQ(0u, build());
    auto resyncedBy = [&](const std::function<void()>& cause) {
        writeRecord(kAnchor, 2, 48000, pcm(64));
        drain();
        EXPECT_TRUE(mRenderer->isSynced());
        const int before = mRenderer->resyncCount();
        cause();
        return waitUntil([&] { return !mRenderer->isSynced(); }) &&
               mRenderer->resyncCount() == before + 1;
    };
    EXPECT_TRUE(resyncedBy([&] { mRenderer->setOutputEnable(false); }));
    EXPECT_EQ(0.0f, mRenderer->volume());
    EXPECT_TRUE(resyncedBy([&] {
        mManual.nowMs += 20;  // a re-base of the driving source reaches its listeners
        mClock->setBasePCR(kAnchor + 500'000, Synchronization::RealPCR);
    }));
    mClock->resetPCR();
    mClock->setBasePCR(kAnchor, Synchronization::RealPCR);
    if (!test::kThreadSanitizer) {  // its expiry crashes that runtime (support/Sanitizers.h)
        EXPECT_TRUE(resyncedBy([&] { mRenderer->startResyncTimer(); }));
    }
}

}  // namespace
}  // namespace TavoPlayer
