#include <gtest/gtest.h>
#include <unistd.h>

#include <chrono>
#include <cstdint>
#include <fstream>
#include <optional>
#include <string>
#include <vector>

#include "platform/audio/AudioSystem.h"
#include "platform/audio/AudioTrack.h"
#include "support/ScopedEnv.h"
#include "support/TsTestUtil.h"

namespace android {
namespace {

using TavoPlayer::test::ScopedEnv;

// A scratch folder and the audio properties, set through the environment so that
// the machine's property file plays no part.
class AudioPlatformTest : public ::testing::Test {
protected:
    void setSink(const std::string& sink) {
        mSink.emplace("TAVOPLAYER_PROP_tavoplayer_audio_sink", sink);
    }
    // (leave ns, bytes) per logged write.
    std::vector<std::pair<int64_t, size_t>> logLines() const {
        std::ifstream in(mDir / "audio.log");
        std::vector<std::pair<int64_t, size_t>> lines;
        int64_t ns;
        size_t bytes;
        while (in >> ns >> bytes)
            lines.emplace_back(ns, bytes);
        return lines;
    }
    static std::vector<uint8_t> pattern(size_t bytes, uint8_t seed) {
        std::vector<uint8_t> v(bytes);
        for (size_t i = 0; i < bytes; ++i)
            v[i] = static_cast<uint8_t>(seed + i * 7 + i / 251);
        return v;
    }
    static sp<AudioTrack> stereoTrack(uint32_t rate = 48000) {
        return new AudioTrack(AUDIO_STREAM_MUSIC, rate, AUDIO_FORMAT_DEFAULT,
                              AUDIO_CHANNEL_OUT_STEREO);
    }
    TavoPlayer::test::TempDir mDir{"tavo-audio"};
    ScopedEnv mProperties{"TAVOPLAYER_PROPERTIES", mDir / "none.prop"};
    ScopedEnv mLog{"TAVOPLAYER_PROP_tavoplayer_audio_log", mDir / "audio.log"};
    std::optional<ScopedEnv> mSink;
};

TEST_F(AudioPlatformTest, CreationParametersDecideTheInitStatus) {
    const struct {
        const char* sink;
        uint32_t rate;
        audio_format_t format;
        audio_channel_mask_t mask;
        status_t expected;
    } cases[] = {
        {"null", 48000, AUDIO_FORMAT_DEFAULT, 0x3, NO_ERROR},
        {"null", 32000, AUDIO_FORMAT_PCM_16_BIT, 0x63F, NO_ERROR},  // eight channels
        {"null", 0, AUDIO_FORMAT_DEFAULT, 0x3, BAD_VALUE},
        {"null", 48000, AUDIO_FORMAT_DEFAULT, 0x0, BAD_VALUE},
        {"null", 48000, AUDIO_FORMAT_DEFAULT, 0xC0000000u, BAD_VALUE},  // nine or more
        {"bogus", 48000, AUDIO_FORMAT_DEFAULT, 0x3, NO_INIT},
        {"alsa:tavo_no_such_device", 48000, AUDIO_FORMAT_DEFAULT, 0x3, NO_INIT},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(std::string(c.sink) + " " + std::to_string(c.rate) + " mask " +
                     std::to_string(c.mask));
        setSink(c.sink);
        sp<AudioTrack> track = new AudioTrack(AUDIO_STREAM_MUSIC, c.rate, c.format, c.mask);
        EXPECT_EQ(c.expected, track->initCheck());
        if (c.expected != NO_ERROR) {
            uint8_t pcm[16] = {};
            EXPECT_EQ(NO_INIT, track->write(pcm, sizeof(pcm)));
        }
    }
}

TEST_F(AudioPlatformTest, WavSinkKeepsThePcmWrittenWithItsVolumeAndAHeader) {
    const std::string path = mDir / "out.wav";
    setSink("wav:" + path);
    const std::vector<uint8_t> first = pattern(4800, 1);
    const std::vector<uint8_t> second = pattern(1202, 9);  // not a whole frame: 1200 taken
    {
        sp<AudioTrack> track = stereoTrack(32000);
        ASSERT_EQ(NO_ERROR, track->initCheck());
        EXPECT_EQ(INVALID_OPERATION, track->write(first.data(), first.size()));
        ASSERT_EQ(NO_ERROR, track->start());
        EXPECT_EQ(4800, track->write(first.data(), first.size()));
        EXPECT_EQ(1200, track->write(second.data(), second.size()));
        ASSERT_EQ(NO_ERROR, track->setVolume(0.0f, 0.0f));
        EXPECT_EQ(4800, track->write(first.data(), first.size()));
    }
    const std::vector<uint8_t> file = TavoPlayer::test::fileBytes(path);
    ASSERT_EQ(44u + 4800 + 1200 + 4800, file.size());
    auto le32 = [&](size_t at) {
        return file[at] | file[at + 1] << 8 | file[at + 2] << 16 | uint32_t(file[at + 3]) << 24;
    };
    EXPECT_EQ(0, memcmp(file.data(), "RIFF", 4));
    EXPECT_EQ(file.size() - 8, le32(4));
    EXPECT_EQ(2, file[22]);           // channels
    EXPECT_EQ(32000u, le32(24));      // rate
    EXPECT_EQ(32000u * 4, le32(28));  // bytes per second
    EXPECT_EQ(10800u, le32(40));      // data bytes
    std::vector<uint8_t> expected = first;
    expected.insert(expected.end(), second.begin(), second.begin() + 1200);
    expected.insert(expected.end(), 4800, 0);
    EXPECT_EQ(expected, std::vector<uint8_t>(file.begin() + 44, file.end()));
}

TEST_F(AudioPlatformTest, PacedSinksReportWhenEachWriteLeavesTheDevice) {
    for (const std::string& sink : {std::string("null"), "wav:" + mDir / "paced.wav"}) {
        SCOPED_TRACE(sink);
        unlink((mDir / "audio.log").c_str());
        setSink(sink);
        sp<AudioTrack> track = stereoTrack();
        ASSERT_EQ(NO_ERROR, track->start());
        EXPECT_EQ(AudioTrack::kSimulatedLatencyMs, track->latency());
        const std::vector<uint8_t> pcm = pattern(1920, 0);  // 10 ms
        // The log's times are on the monotonic clock, which steady_clock reads.
        const int64_t beforeNs =
            std::chrono::nanoseconds(std::chrono::steady_clock::now().time_since_epoch()).count();
        for (int i = 0; i < 3; ++i)
            ASSERT_EQ(1920, track->write(pcm.data(), pcm.size()));
        AudioTimestamp ts{};
        ASSERT_EQ(NO_ERROR, track->getTimestamp(ts));
        EXPECT_EQ(960u, ts.mPosition);  // the last write's first frame
        const auto lines = logLines();
        ASSERT_EQ(3u, lines.size());
        // An idle device plays a latency after the write; later writes never
        // overlap what is ahead of them.
        EXPECT_GE(lines[0].first, beforeNs + AudioTrack::kSimulatedLatencyMs * 1'000'000ll);
        for (size_t i = 1; i < lines.size(); ++i) {
            EXPECT_EQ(1920u, lines[i].second);
            EXPECT_GE(lines[i].first, lines[i - 1].first + 10'000'000);
        }
        EXPECT_EQ(ts.mTime.tv_sec * 1'000'000'000ll + ts.mTime.tv_nsec, lines[2].first);
    }
}

// ALSA without a sound card: ALSA's own file plugin, defined in a configuration
// written here, keeps what reaches the device in a raw file.
TEST_F(AudioPlatformTest, AlsaSinkDeliversThePcmInOrderThroughTheFilePlugin) {
    const std::string raw = mDir / "alsa.raw";
    const std::string conf = mDir / "asoundrc";
    std::ofstream(conf) << "pcm.tavo_test_file {\n  type file\n  slave.pcm \"null\"\n  file \""
                        << raw << "\"\n  format \"raw\"\n}\n";
    const std::string global = "/usr/share/alsa/alsa.conf";
    const ScopedEnv alsa("ALSA_CONFIG_PATH",
                         access(global.c_str(), R_OK) == 0 ? global + ":" + conf : conf);
    setSink("alsa:tavo_test_file");
    std::vector<uint8_t> written;
    {
        sp<AudioTrack> track = stereoTrack();
        ASSERT_EQ(NO_ERROR, track->initCheck());
        EXPECT_EQ("alsa:tavo_test_file", track->sinkName());
        ASSERT_EQ(NO_ERROR, track->start());
        for (int i = 0; i < 12; ++i) {
            const std::vector<uint8_t> chunk = pattern(4096 + 4 * i, static_cast<uint8_t>(i));
            ASSERT_EQ(static_cast<ssize_t>(chunk.size()), track->write(chunk.data(), chunk.size()));
            written.insert(written.end(), chunk.begin(), chunk.end());
        }
    }
    EXPECT_EQ(written, TavoPlayer::test::fileBytes(raw));
    EXPECT_EQ(12u, logLines().size());
}

// The renderer asks about each device with no address.
TEST_F(AudioPlatformTest, DeviceConnectionStatesFollowThePropertyOnEveryQuery) {
    const struct {
        const char* devices;
        audio_devices_t device;
        bool connected;
    } cases[] = {
        {"", AUDIO_DEVICE_OUT_WIRED_HEADSET, false},
        {"0x8", AUDIO_DEVICE_OUT_WIRED_HEADPHONE, true},
        {"0x8", AUDIO_DEVICE_OUT_WIRED_HEADSET, false},
        {"4, 0x80@00:11:22:33:44:55", AUDIO_DEVICE_OUT_WIRED_HEADSET, true},
        {"4, 0x80@00:11:22:33:44:55", AUDIO_DEVICE_OUT_BLUETOOTH_A2DP, true},
        {"0x180", AUDIO_DEVICE_OUT_BLUETOOTH_A2DP_HEADPHONES, true},  // a mask of two
        {"junk 0x10", AUDIO_DEVICE_OUT_BLUETOOTH_SCO, true},
    };
    for (const auto& c : cases) {
        const ScopedEnv devices("TAVOPLAYER_PROP_tavoplayer_audio_devices", c.devices);
        EXPECT_EQ(c.connected ? AUDIO_POLICY_DEVICE_STATE_AVAILABLE
                              : AUDIO_POLICY_DEVICE_STATE_UNAVAILABLE,
                  AudioSystem::getDeviceConnectionState(c.device, ""))
            << c.devices << " device " << c.device;
    }
}

}  // namespace
}  // namespace android
