#include "common/Synchronization.h"

#include <cinttypes>
#include <cstdlib>
#include <string>

#include "platform/os/Trace.h"

namespace TavoPlayer {
namespace {

constexpr uint64_t kTicksPerMs = 90;
// Two stamps of one source less than this far apart never re-base it.
constexpr uint64_t kMinRebaseIntervalMs = 11;
// A real PCR this far (20 s at 90 kHz) from a valid PTS source is ignored.
constexpr int64_t kMaxRealPCRDrift = 1'800'000;

bool readMonotonic(timespec* ts) {
    return clock_gettime(CLOCK_MONOTONIC, ts) == 0;
}

}  // namespace

const char* const Synchronization::moduleNames[5] = {"None", "Video", "Audio", "Real PCR", ""};

Synchronization::Synchronization() : Synchronization(MonotonicClock(readMonotonic)) {}

Synchronization::Synchronization(MonotonicClock clock)
    : mPauseTime(0),
      mCurrentModule(None),
      mBadRealPCR(false),
      mResyncEnabled(true),
      mResyncThreshold(90000),
      mClock(std::move(clock)) {
    for (int m = 0; m < 4; ++m) {
        mBasePCR[m] = kUint33Mask;
        mBaseTime[m] = 0;
        mValid[m] = false;
        mOffsetTime[m] = 0;
    }
}

Synchronization::~Synchronization() = default;

uint64_t Synchronization::getTimestamp() {
    timespec ts{};
    if (!mClock || !mClock(&ts)) {
        TAVO_LOGE("%s: Error on attempt of obtaining system time\n", "getTimestamp");
        return 0;
    }
    return static_cast<uint64_t>(ts.tv_sec) * 1000u + static_cast<uint64_t>(ts.tv_nsec) / 1000000u;
}

Uint33 Synchronization::currentPCR_l(uint32_t m, uint64_t now) const {
    return mask33(mBasePCR[m] + (now - mBaseTime[m]) * kTicksPerMs);
}

void Synchronization::setBasePCR(Uint33 pcr, module_t module) {
    std::lock_guard<std::mutex> lock(mLock);
    if (module == None || module > RealPCR) {
        TAVO_LOGE("%s: cannot set PCR for None\n", __func__);
        return;
    }
    const Uint33 adjusted =
        mask33(pcr - static_cast<int64_t>(mOffsetTime[module]) * static_cast<int64_t>(kTicksPerMs));
    const uint64_t now = getTimestamp();
    Uint33 expected = 0;
    uint64_t diff = 0;
    if (mValid[module]) {
        if (!mResyncEnabled)
            return;
        const uint64_t elapsed = now - mBaseTime[module];
        expected = mask33(mBasePCR[module] + elapsed * kTicksPerMs);
        diff = static_cast<uint64_t>(std::llabs(diff33(adjusted, expected)));
        // Jitter of up to a second never re-bases, nor do two stamps within 11 ms.
        if (static_cast<int64_t>(diff) <= mResyncThreshold || elapsed < kMinRebaseIntervalMs) {
            return;
        }
    }
    TAVO_LOGI("%s: Received PCR: %llu BasePCR: %llu (diff: %llu)\n", __func__,
              static_cast<unsigned long long>(adjusted), static_cast<unsigned long long>(expected),
              static_cast<unsigned long long>(diff));
    mBasePCR[module] = adjusted;
    mBaseTime[module] = getTimestamp();
    TAVO_LOGI("%s: Setting PCR: %llu - mBaseTime: %llu (%s)\n", __func__,
              static_cast<unsigned long long>(mBasePCR[module]),
              static_cast<unsigned long long>(mBaseTime[module]), moduleNames[module]);
    mValid[module] = true;
    checkForBadRealPCR(now);

    module_t choice = None;
    if (mValid[RealPCR] && !mBadRealPCR) {
        choice = RealPCR;
    } else if (mValid[Audio] && mValid[Video]) {
        const Uint33 videoPCR = currentPCR_l(Video, now);
        const Uint33 audioPCR = currentPCR_l(Audio, now);
        TAVO_LOGI("%s: videoPCR: %lld\n", __func__, static_cast<long long>(videoPCR));
        TAVO_LOGI("%s: audioPCR: %lld\n", __func__, static_cast<long long>(audioPCR));
        // The later-running (smaller) stream drives the clock; the other waits for it.
        choice = diff33(videoPCR, audioPCR) < 1 ? Video : Audio;
    }
    // With only one of video or audio there is no clock until a real PCR arrives,
    // as designed.
    mCurrentModule = choice;
    TAVO_LOGI("%s Using %s as PCR\n", __func__, moduleNames[choice]);

    if (choice == module) {
        const Uint33 pcrNow = currentPCR_l(module, now);
        for (PCRListener* listener : mPCRListeners) {
            listener->onPCRChanged(static_cast<unsigned long>(pcrNow));
        }
    }
}

void Synchronization::checkForBadRealPCR(unsigned long now) {
    if (!mValid[RealPCR])
        return;
    const Uint33 real = currentPCR_l(RealPCR, now);
    const int64_t dA = mValid[Audio] ? diff33(real, currentPCR_l(Audio, now)) : 0;
    const int64_t dV = mValid[Video] ? diff33(real, currentPCR_l(Video, now)) : 0;
    const bool acceptable = std::llabs(dA) < kMaxRealPCRDrift && std::llabs(dV) < kMaxRealPCRDrift;
    if (!mBadRealPCR && !acceptable) {
        TAVO_LOGW("%s: Ignoring real PCR due to high difference. (%lld) (%lld)\n", __func__,
                  static_cast<long long>(dA), static_cast<long long>(dV));
        mBadRealPCR = true;
    } else if (mBadRealPCR && acceptable) {
        TAVO_LOGW("%s: Real PCR normalized. (%d) (%d)\n", __func__, static_cast<int>(dA),
                  static_cast<int>(dV));
        mBadRealPCR = false;
    }
}

void Synchronization::setOffsetTime(int timeInMs, module_t module) {
    TAVO_LOGD("%s timeInMs = %d currentModule = %d\n", __func__, timeInMs,
              static_cast<int>(module));
    if (module < 4)
        mOffsetTime[module] = timeInMs;
}

void Synchronization::resetPCR() {
    TAVO_LOGD("%s\n", __func__);
    std::lock_guard<std::mutex> lock(mLock);
    mPauseTime = 0;
    for (bool& valid : mValid)
        valid = false;
    mCurrentModule = None;
}

void Synchronization::pause() {
    const uint64_t now = getTimestamp();
    // The design takes no lock here; taking it changes nothing but keeps the
    // renderers' concurrent reads well defined.
    std::lock_guard<std::mutex> lock(mLock);
    mPauseTime = now;
}

void Synchronization::resume() {
    Uint33 pcr = 0;
    {
        std::lock_guard<std::mutex> lock(mLock);
        if (mPauseTime == 0)
            return;
        const uint64_t now = getTimestamp();
        if (now == mPauseTime)
            return;  // the pause stays recorded
        // When the clock cannot be read this is -mPauseTime, accepted as designed.
        const uint64_t paused = now - mPauseTime;
        for (uint64_t& baseTime : mBaseTime)
            baseTime += paused;
        mPauseTime = 0;
        pcr = currentPCR_l(mCurrentModule, getTimestamp());
    }
    // Listeners are called without the lock: they may read the clock.
    for (PCRListener* listener : mPCRListeners) {
        listener->onPCRChanged(static_cast<unsigned long>(pcr));
    }
}

Uint33 Synchronization::getPCR() {
    std::lock_guard<std::mutex> lock(mLock);
    if (mCurrentModule == None)
        return 0;
    return currentPCR_l(mCurrentModule, getTimestamp());
}

bool Synchronization::getPCR(Uint33* pcr) {
    std::lock_guard<std::mutex> lock(mLock);
    if (mCurrentModule == None)
        return false;
    *pcr = currentPCR_l(mCurrentModule, getTimestamp());
    return true;
}

void Synchronization::addPCRListener(PCRListener* listener) {
    std::lock_guard<std::mutex> lock(mLock);
    mPCRListeners.push_back(listener);
}

void Synchronization::dump(FILE* stream, int indent) {
    if (stream == nullptr)
        return;
    const std::string prefix(indent > 0 ? static_cast<size_t>(indent) : 0, '\t');
    const char* p = prefix.c_str();
    // The design dumps without the lock; taking it keeps the dump from racing the
    // parsers' re-basing (a data race on the bases and flags) and costs nothing.
    std::lock_guard<std::mutex> lock(mLock);
    const uint64_t now = getTimestamp();
    fprintf(stream, "%s - Current PCR generated by: %s\n", p, moduleNames[mCurrentModule & 3]);
    const struct {
        const char* format;
        module_t module;
    } lines[] = {{"%s - Video PCR: %llu (%s)\n", Video},
                 {"%s - Audio PCR: %llu (%s)\n", Audio},
                 {"%s - Real PCR: %llu (%s)\n", RealPCR}};
    for (const auto& line : lines) {
        const bool valid = mValid[line.module];
        const unsigned long long value = valid ? currentPCR_l(line.module, now) : 0;
        fprintf(stream, line.format, p, value, valid ? "Valid" : "Invalid");
    }
}

}  // namespace TavoPlayer
