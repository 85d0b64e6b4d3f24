#include "service/MainController.h"

#include <gtest/gtest.h>

#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "support/ScopedEnv.h"
#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

using Config = std::map<std::string, std::string>;

Config liveConfig() {
    return {{"sourceType", "0"}, {"pcrPid", "273"},    {"videoPid", "273"},
            {"audioPid", "274"}, {"IsLATMAudio", "1"}, {"subtitlePid", "304"}};
}

TEST(MainControllerTest, BuildsTenRingsAndElevenModulesAndWiresThemOnce) {
    android::sp<MainController> controller = new MainController();
    Config config = liveConfig();
    ASSERT_EQ(controller->configure(config), 0u);

    std::vector<std::pair<std::string, uint32_t>> rings;
    for (const auto& ring : controller->rings())
        rings.emplace_back(ring->name(), ring->size());
    EXPECT_EQ(rings, (std::vector<std::pair<std::string, uint32_t>>{{"PCRTS", 1u << 12},
                                                                    {"VideoTS", 1u << 20},
                                                                    {"VideoPES", 6291456},
                                                                    {"VideoRaw", 1u << 13},
                                                                    {"AudioTS", 1u << 16},
                                                                    {"AudioPES", 1u << 16},
                                                                    {"AudioRaw", 1u << 19},
                                                                    {"CCTS", 1u << 12},
                                                                    {"CCPES", 1u << 13},
                                                                    {"CCRaw", 1u << 12}}));
    std::vector<std::string> modules;
    for (const auto& module : controller->modules())
        modules.push_back(module->getModuleName());
    EXPECT_EQ(modules.size(), 11u);
    EXPECT_EQ(modules.front(), "TS Receiver");
    EXPECT_EQ(modules.back(), "ClosedCaptionRenderer");
    // The rings refuse a second configuration.
    test::TraceCapture trace;
    EXPECT_EQ(controller->configure(config), 1u);
}

TEST(MainControllerTest, ConfigurationKeysAndAudioCodingType) {
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
        // Every key is read with the subscript: missing ones stay behind, empty.
        EXPECT_EQ(config.count("sourceType"), 1u);
        EXPECT_EQ(config.count("subtitlePid"), 1u);
        EXPECT_EQ(controller->getSourceType(), 0);
    }
}

template <typename T>
T* moduleOf(MainController& controller) {
    for (const auto& module : controller.modules()) {
        if (auto* found = dynamic_cast<T*>(module.get()))
            return found;
    }
    return nullptr;
}

// Outputs open together once a frame has been shown and audio rendered, in either
// order.
TEST(MainControllerTest, OutputsOpenWhenVideoAndAudioAreBothReady) {
    const struct {
        std::vector<char> reports;  // 'v' a shown frame, 'a' rendered audio
        bool enabled;
    } cases[] = {{{'v'}, false}, {{'a'}, false}, {{'v', 'a'}, true}, {{'a', 'v', 'v'}, true}};
    for (const auto& c : cases) {
        android::sp<MainController> controller = new MainController();
        Config config = liveConfig();
        ASSERT_EQ(controller->configure(config), 0u);
        for (char report : c.reports) {
            if (report == 'v')
                controller->onFrameRendered(320, 240, 90000);
            else
                controller->onAudioRendered();
        }
        EXPECT_EQ(moduleOf<VideoRenderer>(*controller)->isOutputEnabled(), c.enabled);
        EXPECT_EQ(moduleOf<ClosedCaptionRenderer>(*controller)->isEnabled(), c.enabled ? 1u : 0u);
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
