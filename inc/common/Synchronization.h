// Synchronization: the pipeline's presentation clock.
//
// Keeps one time base per source (video PTS, audio PTS, the stream's real PCR),
// each extrapolated from the monotonic clock at 90 kHz, chooses the source that
// drives the clock, and ignores a real PCR that drifts 20 s or more away from the
// streams' time stamps.
//
// Threads: the TS parsers call setBasePCR; the renderers getPCR and resetPCR; the
// controller setOffsetTime, pause, resume and resetPCR; the dump thread dump.
// setBasePCR, getPCR, resetPCR, pause, resume and dump hold mLock. PCR listeners are
// called from setBasePCR with mLock held, so a listener must not call setBasePCR or
// getPCR. setOffsetTime takes no lock: the controller sets the offsets before it starts
// the parsers that read them.
#pragma once

#include <time.h>

#include <cstdint>
#include <cstdio>
#include <functional>
#include <list>
#include <mutex>

#include <utils/RefBase.h>

#include "common/Uint33.h"

namespace TavoPlayer {

class Synchronization : public virtual android::RefBase {
public:
    enum module_t : uint32_t {
        None = 0,
        Video = 1,
        Audio = 2,
        RealPCR = 3,
    };
    static const char* const moduleNames[5];

    class PCRListener {
    public:
        virtual ~PCRListener() = default;
        virtual void onPCRChanged(unsigned long pcr) = 0;
    };

    // Reads the monotonic clock; returns false when it cannot be read. Tests pass
    // their own; the default reads CLOCK_MONOTONIC.
    using MonotonicClock = std::function<bool(timespec*)>;

    Synchronization();
    explicit Synchronization(MonotonicClock clock);
    ~Synchronization() override;

    // Monotonic time in ms; 0 (and an error message) when the clock cannot be read.
    uint64_t getTimestamp();
    void setBasePCR(Uint33 pcr, module_t module);
    void setOffsetTime(int timeInMs, module_t module);
    void resetPCR();
    void pause();
    void resume();
    // The current PCR of the driving source; 0 when no source drives the clock.
    Uint33 getPCR();
    // The same under one lock, telling "no source" (false, *pcr untouched) apart
    // from a PCR that happens to be 0.
    bool getPCR(Uint33* pcr);
    // Not owned: the listener must outlive this clock.
    void addPCRListener(PCRListener* listener);
    // Drift guard; runs under the caller's lock (called by setBasePCR).
    void checkForBadRealPCR(unsigned long now);
    virtual void dump(FILE* stream, int indent);

    module_t currentModule() const { return static_cast<module_t>(mCurrentModule); }
    bool isValid(module_t module) const { return module < 4 && mValid[module]; }
    bool isBadRealPCR() const { return mBadRealPCR; }

private:
    // mask(base + (now - baseTime) x 90) for source m.
    Uint33 currentPCR_l(uint32_t m, uint64_t now) const;

    Uint33 mBasePCR[4];
    uint64_t mBaseTime[4];
    uint64_t mPauseTime;
    bool mValid[4];
    uint32_t mCurrentModule;
    std::list<PCRListener*> mPCRListeners;
    int32_t mOffsetTime[4];
    std::mutex mLock;
    bool mBadRealPCR;
    // Fixed policy: nothing changes these after construction.
    const bool mResyncEnabled;
    const int64_t mResyncThreshold;

    MonotonicClock mClock;
};

}  // namespace TavoPlayer
