#include "servicecontroller/ServiceController.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>
#include <tuple>
#include <vector>

#include "support/Recorded.h"

namespace TavoPlayer {
namespace {

using Event = std::tuple<unsigned int, unsigned int, unsigned int>;  // event, a, b
using SC = ServiceController;

struct RecordingListener : SC::ServiceControllerListener, test::Recorded<Event> {
    void onServiceControllerEvent(SC::event_t event, unsigned int a, unsigned int b) override {
        push({event, a, b});
    }
    // How many `event`s have come, once at least `atLeast` have (or the generous
    // deadline passed: behaviour, never timing, is asserted).
    size_t count(unsigned int event, size_t atLeast = 0) {
        auto n = [&](const std::vector<Event>& all) {
            return static_cast<size_t>(
                std::ranges::count(all, event, [](const Event& e) { return std::get<0>(e); }));
        };
        waitFor([&](auto& all) { return n(all) >= atLeast; });
        return n(snapshot());
    }
};

class ServiceControllerTest : public ::testing::Test {
protected:
    void SetUp() override {
        controller = new SC([this](timespec* ts) {
            ts->tv_sec = static_cast<time_t>(nowMs / 1000);
            ts->tv_nsec = static_cast<long>((nowMs % 1000) * 1'000'000);
            return true;
        });
        controller->setListener(&listener);
    }
    uint64_t nowMs = 0;
    RecordingListener listener;
    android::sp<SC> controller;
};

enum class Do { Check, Frame, Audio };

TEST_F(ServiceControllerTest, SignalGoesLateThenLostAndRecovers) {
    const Event late{SC::SIGNAL_UPDATE_EVENT, 0, 1}, lost{SC::SIGNAL_UPDATE_EVENT, 1, 2},
        again{SC::SIGNAL_UPDATE_EVENT, 2, 2};
    const Event picture{SC::START_VIDEO_TASK_EVENT, 720, 480};
    const struct {
        uint64_t atMs;
        Do action;
        std::vector<Event> expected;
        uint8_t statusAfter;
    } steps[] = {
        {0, Do::Frame, {picture}, 0},
        {2999, Do::Check, {}, 0},
        {3000, Do::Check, {late}, 1},
        // Late restarted the clock: 3 s later it is still only late...
        {7999, Do::Check, {}, 1},
        // ...and lost 5 s after being declared late, then re-announced every 3 s.
        {8000, Do::Check, {lost}, 2},
        {10999, Do::Check, {}, 2},
        {11000, Do::Check, {again}, 2},
        {14000, Do::Check, {again}, 2},
        // The next picture brings the signal back and announces itself again.
        {14100, Do::Frame, {{SC::SIGNAL_UPDATE_EVENT, 2, 0}, picture}, 0},
        {14200, Do::Frame, {}, 0},
        {17199, Do::Check, {}, 0},
        // Audio readiness alone also keeps the signal good.
        {17200, Do::Audio, {}, 0},
        {20200, Do::Check, {late}, 1},
        {20300, Do::Audio, {{SC::SIGNAL_UPDATE_EVENT, 1, 0}}, 0},
    };
    for (const auto& step : steps) {
        SCOPED_TRACE(step.atMs);
        nowMs = step.atMs;
        if (step.action == Do::Check)
            controller->checkSignalStrength();
        else if (step.action == Do::Frame)
            controller->onFrameRendered(720, 480, 0);
        else
            controller->onAudioReady(100);
        EXPECT_EQ(listener.take(), step.expected);
        EXPECT_EQ(controller->getSignalStatus(), step.statusAfter);
    }
}

TEST_F(ServiceControllerTest, BufferingProgressOnlyGrows) {
    const struct {
        std::vector<long> waits;  // one buffering pass after each
        std::vector<Event> sent;
    } cases[] = {
        {{200}, {{SC::BUFFERING_EVENT, 25, 0}}},
        {{40}, {{SC::BUFFERING_EVENT, 100, 0}}},
        {{51}, {{SC::BUFFERING_EVENT, 98, 0}}},
        {{0, -5}, {}},
        {{166, 250}, {{SC::BUFFERING_EVENT, 30, 0}}},
        {{5001, 4000, 1000, 1000, 10},
         {{SC::BUFFERING_EVENT, 1, 0}, {SC::BUFFERING_EVENT, 5, 0}, {SC::BUFFERING_EVENT, 100, 0}}},
    };
    for (const auto& c : cases) {
        controller->startBuffering();  // resets progress and wait to render
        controller->stopBuffering();
        listener.take();
        for (long wait : c.waits) {
            controller->onAudioReady(wait);
            controller->bufferingProcess();
        }
        EXPECT_EQ(listener.take(), c.sent) << "first wait " << c.waits.front();
    }
}

TEST_F(ServiceControllerTest, FrameRateReadsMinusOneFromTheFifthEmptySecond) {
    EXPECT_EQ(controller->getFrameRate(), -1);  // before the first tick
    const int frames[] = {30, 0, 0, 0, 0, 0, 0, 1, 0, 29};
    const int rates[] = {30, 0, 0, 0, 0, -1, -1, 1, 0, 29};
    for (size_t second = 0; second < std::size(frames); ++second) {
        for (int i = 0; i < frames[second]; ++i)
            controller->onFrameRendered(16, 16, 0);
        controller->updateFrameRate();
        EXPECT_EQ(controller->getFrameRate(), rates[second]) << "second " << second;
    }
}

// Threads named "PollingThread" in this process, once the count stops changing
// towards `expected` (libutils threads are detached: a joined one may linger in
// /proc for a moment).
size_t pollingThreads(size_t expected) {
    size_t n = 0;
    for (int tries = 0; tries < 500; ++tries) {
        n = 0;
        for (const auto& task : std::filesystem::directory_iterator("/proc/self/task")) {
            std::string name;
            std::getline(std::ifstream(task.path() / "comm"), name);
            n += name == "PollingThread" ? 1 : 0;
        }
        if (n == expected)
            break;
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return n;
}

// Real threads and the real clock.
TEST(ServiceControllerThreadsTest, CheckersRunAsPollingThreadsAndStopWithoutLeftovers) {
    RecordingListener listener;
    android::sp<SC> controller = new SC();
    controller->setListener(&listener);
    const size_t before = pollingThreads(0);
    controller->startBuffering();
    controller->startCheckSignal();
    controller->startCheckSignal();  // a restart must not leave the first one polling
    controller->startCheckFrameRate();
    controller->startCheckEndOfContent();
    EXPECT_EQ(pollingThreads(before + 4), before + 4);

    // No frames: end of content comes once and that checker ends itself.
    EXPECT_EQ(listener.count(SC::EOC_EVENT, 1), 1u);
    EXPECT_EQ(pollingThreads(before + 3), before + 3);
    controller->onAudioReady(40);
    EXPECT_GE(listener.count(SC::BUFFERING_EVENT, 1), 1u);

    controller->stopAll();
    EXPECT_EQ(pollingThreads(before), before);
    EXPECT_EQ(listener.count(SC::BUFFERING_END_EVENT), 1u);
    controller->stopAll();  // no buffering check left to end: nothing sent
    EXPECT_EQ(listener.count(SC::BUFFERING_END_EVENT), 1u);
    EXPECT_EQ(listener.count(SC::EOC_EVENT), 1u);

    controller->startCheckSignal();
    controller->startCheckFrameRate();
    controller.clear();  // destruction stops what still runs
    EXPECT_EQ(pollingThreads(before), before);
}

}  // namespace
}  // namespace TavoPlayer
