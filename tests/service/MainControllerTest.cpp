#include "service/MainController.h"

#include <gtest/gtest.h>

#include <map>
#include <memory>
#include <string>

#include "support/ScopedEnv.h"
#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

using Config = std::map<std::string, std::string>;

Config liveConfig() {
    return {{"sourceType", "0"}, {"pcrPid", "273"},    {"videoPid", "273"},
            {"audioPid", "274"}, {"IsLATMAudio", "1"}, {"subtitlePid", "304"}};
}

// The rings are made once: a second configuration of the same controller is refused.
TEST(MainControllerTest, RefusesASecondConfiguration) {
    android::sp<MainController> controller = new MainController();
    Config config = liveConfig();
    ASSERT_EQ(controller->configure(config), 0u);
    test::TraceCapture trace;
    EXPECT_EQ(controller->configure(config), 1u);
}

TEST(MainControllerTest, AudioCodingTypeFromTheConfiguration) {
    const struct {
        Config given;
        int codingType;
    } cases[] = {
        {{{"IsLATMAudio", "1"}, {"isMPEG2Audio", "1"}}, Decoder::CODING_AAC_LATM},
        {{{"IsLATMAudio", "1x"}}, Decoder::CODING_AAC_LATM},
        {{{"IsLATMAudio", "0"}, {"isMPEG2Audio", "10"}}, Decoder::CODING_MPEG_AUDIO},
        {{{"IsLATMAudio", " 1"}, {"isMPEG2Audio", "0"}}, Decoder::CODING_AAC_ADTS},
        {{}, Decoder::CODING_AAC_ADTS},
    };
    for (const auto& c : cases) {
        android::sp<MainController> controller = new MainController();
        Config config = c.given;
        EXPECT_EQ(controller->configure(config), 0u);
        EXPECT_EQ(controller->getAudioCodingType(), c.codingType);
    }
}

TEST(MainControllerTest, RecordingAndSeekingRefuseWhatCannotBeDone) {
    // No demux source: the recording service refuses, the controller still counts
    // the recording as started (the recorder reports through its listener).
    test::ScopedRecordingsDir recordings;
    android::sp<MainController> controller = new MainController();
    Config config = liveConfig();
    ASSERT_EQ(controller->configure(config), 0u);
    EXPECT_EQ(controller->stopRecord(true), 1u);  // not recording
    std::unique_ptr<Uri> uri(Uri::parse("MTV://rec/x?recType=1;"));
    EXPECT_EQ(controller->startRecord(uri.get()), 0u);
    EXPECT_EQ(controller->startRecord(uri.get()), 1u);
    EXPECT_EQ(controller->stopRecord(false), 0u);
    EXPECT_EQ(controller->stopRecord(false), 1u);
    EXPECT_EQ(controller->seek(1000), 1u);  // a live source has no clip to seek in
}

}  // namespace
}  // namespace TavoPlayer
