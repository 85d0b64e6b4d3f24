// Test doubles for the renderers: a monotonic clock that moves only when told to, a listener that
// keeps what it receives (and the stream clock at that moment), and a renderer whose timed waits
// are recorded and run the clock forward instead of sleeping. Header-only: only tests that link the
// renderer include it.
#pragma once

#include <time.h>

#include <atomic>
#include <mutex>
#include <utility>
#include <vector>

#include "renderer/ClosedCaptionRenderer.h"
#include "support/CaptionBuilder.h"
#include "support/Recorded.h"

namespace TavoPlayer::test {

struct ManualClock {
    std::atomic<int64_t> nowMs{1'000'000};
    std::atomic<int> reads{0};
    Synchronization::MonotonicClock reader() {
        return [this](timespec* ts) {
            const int64_t ms = nowMs.load();
            ts->tv_sec = ms / 1000;
            ts->tv_nsec = (ms % 1000) * 1'000'000;
            reads.fetch_add(1);
            return true;
        };
    }
    android::sp<Synchronization> make() { return new Synchronization(reader()); }
};

struct CaptionDelivery {
    std::u32string text;
    uint64_t pcr;  // the stream clock when the caption arrived (0 without a clock)
};

class RecordingListener : public ClosedCaptionListener, public Recorded<CaptionDelivery> {
public:
    explicit RecordingListener(android::sp<Synchronization> clock = nullptr)
        : mClock(std::move(clock)) {}
    void onClosedCaptionReceived(unsigned char* text, int length) override {
        push({toU32(text, length), mClock != nullptr ? mClock->getPCR() : 0});
    }
    std::vector<std::u32string> texts() {
        std::vector<std::u32string> out;
        for (const auto& d : snapshot())
            out.push_back(d.text);
        return out;
    }

private:
    android::sp<Synchronization> mClock;
};

class WaitRecordingRenderer : public ClosedCaptionRenderer {
public:
    WaitRecordingRenderer(android::sp<Synchronization> clock, ManualClock& manual)
        : ClosedCaptionRenderer(std::move(clock)), mManual(manual) {}
    // Written by the renderer's thread; read once it has stopped.
    std::vector<int64_t> waits;

protected:
    void waitFor_l(std::unique_lock<std::mutex>&, int64_t waitMs) override {
        waits.push_back(waitMs);
        mManual.nowMs.fetch_add(waitMs);
    }

private:
    ManualClock& mManual;
};

}  // namespace TavoPlayer::test
