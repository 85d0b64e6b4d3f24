#include "servicecontroller/ServiceController.h"

#include <gtest/gtest.h>

#include <dirent.h>

#include <chrono>
#include <condition_variable>
#include <fstream>
#include <mutex>
#include <string>
#include <thread>
#include <tuple>
#include <vector>

#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

using Event = std::tuple<unsigned int, unsigned int, unsigned int>;  // event, a, b
using SC = ServiceController;

class RecordingListener : public SC::ServiceControllerListener {
public:
    void onServiceControllerEvent(SC::event_t event, unsigned int a, unsigned int b) override {
        std::lock_guard<std::mutex> lock(mMutex);
        mEvents.emplace_back(event, a, b);
        mChanged.notify_all();
    }
    std::vector<Event> take() {
        std::lock_guard<std::mutex> lock(mMutex);
        std::vector<Event> out;
        out.swap(mEvents);
        return out;
    }
    // Generous deadline on behaviour, never on timing.
    bool waitFor(unsigned int event, size_t count) {
        std::unique_lock<std::mutex> lock(mMutex);
        return mChanged.wait_for(lock, std::chrono::seconds(10),
                                 [&] { return countLocked(event) >= count; });
    }
    size_t count(unsigned int event) {
        std::lock_guard<std::mutex> lock(mMutex);
        return countLocked(event);
    }

private:
    size_t countLocked(unsigned int event) const {
        size_t n = 0;
        for (const Event& e : mEvents)
            n += std::get<0>(e) == event ? 1 : 0;
        return n;
    }
    std::mutex mMutex;
    std::condition_variable mChanged;
    std::vector<Event> mEvents;
};

struct FakeClock {
    uint64_t nowMs = 0;
    bool readable = true;
    SC::MonotonicClock reader() {
        return [this](timespec* ts) {
            if (!readable)
                return false;
            ts->tv_sec = static_cast<time_t>(nowMs / 1000);
            ts->tv_nsec = static_cast<long>((nowMs % 1000) * 1'000'000);
            return true;
        };
    }
};

class ServiceControllerTest : public ::testing::Test {
protected:
    void SetUp() override {
        controller = new SC(clock.reader());
        controller->setListener(&listener);
    }
    void TearDown() override { controller.clear(); }

    FakeClock clock;
    RecordingListener listener;
    android::sp<SC> controller;
};

// --- signal status --------------------------------------------------------------

enum class Do { Check, Frame, Audio };
struct SignalStep {
    uint64_t atMs;
    Do action;
    std::vector<Event> expected;
    uint8_t statusAfter;
};

TEST_F(ServiceControllerTest, SignalGoesLateThenLostAndRecovers) {
    const Event late{SC::SIGNAL_UPDATE_EVENT, 0, 1};
    const Event lost{SC::SIGNAL_UPDATE_EVENT, 1, 2};
    const Event again{SC::SIGNAL_UPDATE_EVENT, 2, 2};
    const Event back{SC::SIGNAL_UPDATE_EVENT, 2, 0};
    const SignalStep steps[] = {
        {0, Do::Frame, {{SC::START_VIDEO_TASK_EVENT, 1920, 1080}}, 0},
        {2999, Do::Check, {}, 0},
        {3000, Do::Check, {late}, 1},
        // Late restarted the clock: 3 s later it is still only late...
        {6000, Do::Check, {}, 1},
        {7999, Do::Check, {}, 1},
        // ...and lost 5 s after being declared late.
        {8000, Do::Check, {lost}, 2},
        {10999, Do::Check, {}, 2},
        {11000, Do::Check, {again}, 2},
        {14000, Do::Check, {again}, 2},
        // The next picture brings the signal back and announces itself again.
        {14100, Do::Frame, {back, {SC::START_VIDEO_TASK_EVENT, 720, 480}}, 0},
        {14200, Do::Frame, {}, 0},
        {17199, Do::Check, {}, 0},
        // Audio readiness alone also keeps the signal good.
        {17200, Do::Audio, {}, 0},
        {20199, Do::Check, {}, 0},
        {20200, Do::Check, {late}, 1},
        {20300, Do::Audio, {{SC::SIGNAL_UPDATE_EVENT, 1, 0}}, 0},
    };
    unsigned int width = 1920, height = 1080;
    for (const SignalStep& step : steps) {
        SCOPED_TRACE(step.atMs);
        clock.nowMs = step.atMs;
        switch (step.action) {
            case Do::Check:
                controller->checkSignalStrength();
                break;
            case Do::Frame:
                controller->onFrameRendered(static_cast<int>(width), static_cast<int>(height), 0);
                width = 720;
                height = 480;
                break;
            case Do::Audio:
                controller->onAudioReady(100);
                break;
        }
        EXPECT_EQ(listener.take(), step.expected);
        EXPECT_EQ(controller->getSignalStatus(), step.statusAfter);
    }
}

TEST_F(ServiceControllerTest, ClockFailureOrNoListenerSkipsThePass) {
    test::TraceCapture trace;
    clock.nowMs = 0;
    controller->onFrameRendered(1, 1, 0);
    listener.take();
    clock.nowMs = 10'000;
    clock.readable = false;
    controller->checkSignalStrength();
    controller->onAudioReady(10);
    EXPECT_EQ(trace.count(TRACE_ERROR, "checkSignalStrength: Error getting system time"), 1u);
    EXPECT_EQ(trace.count(TRACE_ERROR, "updateSignalTimer: Error getting system time."), 1u);
    clock.readable = true;
    controller->setListener(nullptr);
    controller->checkSignalStrength();
    EXPECT_EQ(trace.count(TRACE_ERROR, "checkSignalStrength: Error getting system time"), 2u);
    EXPECT_EQ(controller->getSignalStatus(), 0);
    controller->setListener(&listener);
    // Neither failed pass moved the last signal time.
    controller->checkSignalStrength();
    EXPECT_EQ(listener.take(), (std::vector<Event>{{SC::SIGNAL_UPDATE_EVENT, 0, 1}}));
}

// --- buffering progress ---------------------------------------------------------

TEST_F(ServiceControllerTest, BufferingProgressOnlyGrows) {
    struct Case {
        std::vector<long> waits;  // one buffering pass after each
        std::vector<unsigned int> sent;
    };
    const Case cases[] = {
        {{200}, {25}},      {{40}, {100}},
        {{50}, {100}},      {{51}, {98}},
        {{0}, {}},          {{-5}, {}},
        {{166, 250}, {30}}, {{5001, 4000, 1000, 1000, 10}, {1, 5, 100}},
    };
    for (const Case& c : cases) {
        controller->startBuffering();  // resets progress and wait to render
        controller->stopBuffering();
        listener.take();
        std::vector<unsigned int> sent;
        for (long wait : c.waits) {
            controller->onAudioReady(wait);
            controller->bufferingProcess();
            for (const Event& e : listener.take()) {
                EXPECT_EQ(std::get<0>(e), SC::BUFFERING_EVENT);
                EXPECT_EQ(std::get<2>(e), 0u);
                sent.push_back(std::get<1>(e));
            }
        }
        EXPECT_EQ(sent, c.sent) << "first wait " << c.waits.front();
    }
}

// --- frame rate -----------------------------------------------------------------

TEST_F(ServiceControllerTest, FrameRateReadsMinusOneFromTheFifthEmptySecond) {
    EXPECT_EQ(controller->getFrameRate(), -1);  // before the first tick
    struct Second {
        int frames;
        int rate;
    };
    const Second seconds[] = {
        {30, 30}, {0, 0}, {0, 0}, {0, 0}, {0, 0}, {0, -1}, {0, -1}, {1, 1}, {0, 0}, {29, 29},
    };
    int index = 0;
    for (const Second& s : seconds) {
        for (int i = 0; i < s.frames; ++i)
            controller->onFrameRendered(16, 16, 0);
        controller->updateFrameRate();
        EXPECT_EQ(controller->getFrameRate(), s.rate) << "second " << index;
        ++index;
    }
}

// --- the polling threads ----------------------------------------------------------

std::vector<std::string> threadNames() {
    std::vector<std::string> names;
    DIR* dir = opendir("/proc/self/task");
    if (dir == nullptr)
        return names;
    while (dirent* entry = readdir(dir)) {
        if (entry->d_name[0] == '.')
            continue;
        std::ifstream comm(std::string("/proc/self/task/") + entry->d_name + "/comm");
        std::string name;
        std::getline(comm, name);
        names.push_back(name);
    }
    closedir(dir);
    return names;
}

size_t pollingThreads() {
    size_t n = 0;
    for (const std::string& name : threadNames())
        n += name == "PollingThread" ? 1 : 0;
    return n;
}

// libutils threads are detached: a joined thread may linger in /proc for a moment
// after its loop ended. Waits (generously) for the count to settle.
size_t pollingThreadsSettlingAt(size_t expected) {
    for (int i = 0; i < 500 && pollingThreads() != expected; ++i)
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    return pollingThreads();
}

// Real threads and the real clock: assertions are on what happens, with
// generous deadlines, never on when.
class ServiceControllerThreadsTest : public ::testing::Test {
protected:
    void SetUp() override {
        controller = new SC();
        controller->setListener(&listener);
    }
    RecordingListener listener;
    android::sp<SC> controller;
};

TEST_F(ServiceControllerThreadsTest, EndOfContentComesOnceAndTheCheckerEnds) {
    const size_t before = pollingThreads();
    controller->startCheckEndOfContent();
    for (int i = 0; i < 3; ++i)
        controller->onFrameRendered(16, 16, 0);
    ASSERT_TRUE(listener.waitFor(SC::EOC_EVENT, 1));
    // The checker ended itself: no second event, and its thread is gone.
    EXPECT_EQ(pollingThreadsSettlingAt(before), before);
    EXPECT_EQ(listener.count(SC::EOC_EVENT), 1u);
    controller->stopCheckEndOfContent();
}

TEST_F(ServiceControllerThreadsTest, CheckersRunAsPollingThreadsAndStopAllLeavesNone) {
    const size_t before = pollingThreads();
    controller->startBuffering();
    controller->startCheckSignal();
    controller->startCheckFrameRate();
    controller->startCheckEndOfContent();
    EXPECT_EQ(pollingThreadsSettlingAt(before + 4), before + 4);
    controller->onAudioReady(40);
    ASSERT_TRUE(listener.waitFor(SC::BUFFERING_EVENT, 1));
    controller->stopAll();
    EXPECT_EQ(pollingThreadsSettlingAt(before), before);
    EXPECT_EQ(listener.count(SC::BUFFERING_END_EVENT), 1u);
    // A second stop has no buffering check to end and sends nothing.
    controller->stopAll();
    EXPECT_EQ(listener.count(SC::BUFFERING_END_EVENT), 1u);
}

TEST_F(ServiceControllerThreadsTest, DestroyingWhileCheckingLeavesNoThread) {
    const size_t before = pollingThreads();
    controller->startCheckSignal();
    controller->startCheckSignal();  // a restart must not leave the first polling
    controller->startCheckFrameRate();
    controller.clear();
    EXPECT_EQ(pollingThreadsSettlingAt(before), before);
}

}  // namespace
}  // namespace TavoPlayer
