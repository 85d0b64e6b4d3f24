// AudioRenderer: the last module of the audio chain. Reads AudioFragmentData
// records (decoded 16-bit PCM) from its input ring, plays them through the
// platform audio track, and keeps the audio output in step with the clock: early
// samples get silence in front of them, late samples lose their head. It watches
// the output devices and re-synchronises (3 s later) when a headset or Bluetooth
// output comes or goes; while a Bluetooth output is connected every wait is 170 ms
// shorter, the delay such links add.
//
// The constructor registers the renderer as a PCR listener of the clock; the
// clock keeps a plain pointer, so it must not be fed (setBasePCR) after the
// renderer is gone.
//
// Threads:
//   - the controller's (binder) threads: configure, start, stop, setOutputEnable,
//     setSoundEffect, setAudioRenderedListener, dump; serialised by mLock;
//   - "AudioRenderer": render(), one pass per round; the only writer of the audio
//     clock, the format fields and, through createAudioPlayer, of the track;
//   - "OutputDeviceThread": polls the audio system once a second; writes the
//     Bluetooth, output-status and change fields;
//   - the resync timer's notification thread and the clock's caller (onPCRChanged,
//     from the TS parser's thread): only flush the track and clear the synced flag.
// The synced flag, resync count, change flag and Bluetooth flag are shared by
// those threads without a lock (atomics, so that a stale read is the only risk).
// mTrackLock guards only the track pointer, so that a flush from another thread
// never meets a track being replaced; it is never held across a write.
#pragma once

#include <signal.h>
#include <time.h>

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <cstdio>
#include <mutex>

#include <utils/StrongPointer.h>
#include <utils/Thread.h>

#include "common/Module.h"
#include "common/Synchronization.h"
#include "common/Uint33.h"
#include "platform/os/ThreadName.h"

namespace android {
class AudioTrack;
}

namespace TavoPlayer {

class AudioRenderer : public Module, public Synchronization::PCRListener {
public:
    // Upward reports, called on the render thread (onAudioSessionId also on the
    // controller's thread, from configure and stop).
    class AudioRenderedListener {
    public:
        virtual ~AudioRenderedListener() = default;
        // Before every fragment that is played.
        virtual void onAudioRendered() = 0;
        // The fragment's distance from the audio clock, in ms (positive: early).
        virtual void onAudioReady(long waitMs) = 0;
        // The track's audio session, or -1 once the track is gone.
        virtual void onAudioSessionId(int id) = 0;
    };

    // Silence is written from one shared zero buffer of this size, never more at once.
    static constexpr uint32_t kSilenceBufferSize = 8192;
    // Early: between 201 ms and 10 s ahead of the audio clock (90 kHz ticks).
    static constexpr int64_t kEarlyMinTicks = 18090;
    static constexpr int64_t kEarlyMaxTicks = 899999;
    // Late: 201 ms or more behind.
    static constexpr int64_t kLateTicks = -18090;
    // A distance of this many ms or more resets the clock.
    static constexpr int64_t kHugeWaitMs = 10001;
    // What a Bluetooth link adds to the output path: 170 ms.
    static constexpr int64_t kBluetoothDelayTicks = 15300;
    static constexpr int kResyncDelaySeconds = 3;

    explicit AudioRenderer(const android::sp<Synchronization>& synchronization);
    ~AudioRenderer() override;

    // Creates the track; 0x41004 without an input ring or when no track can be made.
    unsigned int configure();
    unsigned int start() override;
    unsigned int stop() override;
    unsigned int dump(FILE* stream, int indent) override;

    // Output on (volume 1.0) or off (0.0); flushes and re-synchronises either way.
    // The output starts disabled, so that nothing is heard until the controller
    // has seen both the first picture and the first audio.
    void setOutputEnable(bool enable);
    // Kept for the dump; the sound effects of the original output are not
    // available on this platform, so the output is not changed.
    unsigned int setSoundEffect(int effect);
    // Not owned: the listener must outlive the renderer (or be replaced by null).
    void setAudioRenderedListener(AudioRenderedListener* listener);

    // Flushes the track and drops synchronisation so that the next fragment
    // re-anchors the audio clock.
    void resyncPCR();
    void onPCRChanged(unsigned long pcr) override;
    // Returns and clears the output device thread's change flag.
    bool checkOutputDevice();
    void startResyncTimer();
    void stopResyncTimer();
    static void onResyncTimerCallback(union sigval value);

    // One pass of the render thread. Public so that a test can drive passes itself
    // while the thread is not running. Returns 0, 1 (ring inconsistency) or a
    // module error code.
    unsigned int render();

    // State for tests and the dump.
    bool isSynced() const { return mSynced.load(); }
    int resyncCount() const { return mResyncCount.load(); }
    Uint33 audioClock() const { return mAudioClock.load(); }
    int sessionId() const { return mSessionId.load(); }
    float volume() const { return mVolume.load(); }
    android::sp<android::AudioTrack> audioTrack();

    static uint8_t mSilenceBuff[kSilenceBufferSize];

private:
    class RenderThread : public android::Thread {
    public:
        // The renderer owns this thread and outlives it (stop() joins it).
        explicit RenderThread(AudioRenderer* renderer)
            : android::Thread(false), mRenderer(renderer) {}

    private:
        android::status_t readyToRun() override;
        bool threadLoop() override;
        AudioRenderer* mRenderer;
        unsigned int mLastStatus = 0;
    };

    class OutputDeviceThread : public android::Thread {
    public:
        OutputDeviceThread() : android::Thread(false) {}
        // requestExit and a wake-up of the one-second wait.
        void stopRequest();

        std::atomic<bool> mBluetooth{false};
        std::atomic<int> mOutputStatus{0};
        std::atomic<bool> mChanged{false};

    private:
        android::status_t readyToRun() override {
            setCurrentThreadName("OutputDeviceThread");
            return android::OK;
        }
        bool threadLoop() override;
        std::mutex mWaitLock;
        std::condition_variable mWaitCondition;
        bool mWake = false;
    };

    // Replaces the track with one for the current format; 0 or 0x41004.
    unsigned int createAudioPlayer();
    // Writes to the current track; a missing track counts as a failed write.
    ssize_t writeTrack(const void* data, size_t bytes);
    void flushTrack();
    // Clock advance for `bytes` of PCM at the current format, in 90 kHz ticks.
    uint64_t ticksFor(uint64_t bytes) const;
    void advanceAudioClock(uint64_t bytes);
    // Every exit of a pass that held the input's read lock.
    void releaseInput(uint32_t consumeBytes);
    unsigned int renderSilence();
    void stopThread(android::sp<android::Thread>& thread);

    android::sp<Synchronization> mSynchronization;
    android::sp<android::AudioTrack> mAudioTrack;
    uint32_t mAudioFormat;
    uint32_t mChannels;
    uint32_t mSampleRate;
    std::atomic<float> mVolume;
    uint32_t mBitsPerSample;
    uint32_t mBytesPerSample;
    std::atomic<bool> mSynced;
    std::atomic<int> mResyncCount;
    std::atomic<Uint33> mAudioClock;
    std::atomic<int> mSessionId;
    timer_t mResyncTimer;
    bool mTimerCreated;
    int mState;
    int mSoundEffect;
    android::sp<RenderThread> mRenderThread;
    std::atomic<AudioRenderedListener*> mListener;
    android::sp<OutputDeviceThread> mOutputDeviceThread;
    std::mutex mLock;
    // Guards the track and output device thread pointers (see above).
    std::mutex mTrackLock;
};

}  // namespace TavoPlayer
