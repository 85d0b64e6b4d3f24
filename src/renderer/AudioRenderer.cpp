#include "renderer/AudioRenderer.h"

#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <mutex>
#include <set>
#include <string>
#include <thread>

#include <utils/ThreadDefs.h>

#include "common/data/AudioFragmentData.h"
#include "platform/audio/AudioSystem.h"
#include "platform/audio/AudioTrack.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {
namespace {

constexpr uint32_t kHeaderSize = AudioFragmentData::kHeaderSize;

// Record fields, read by byte copies: a ring position is only 4-byte aligned and
// the record holds an 8-byte field.
constexpr size_t kTypeOffset = 8;
constexpr size_t kSizeOffset = 12;
constexpr size_t kPTSOffset = 16;
constexpr size_t kChannelsOffset = 24;
constexpr size_t kBitsOffset = 25;
constexpr size_t kRateOffset = 28;

struct RecordHeader {
    uint32_t type;
    uint32_t size;
    uint64_t pts;
    uint32_t channels;
    uint32_t bits;
    uint32_t rate;
};

RecordHeader readHeader(const uint8_t* at) {
    RecordHeader h{};
    uint8_t channels = 0;
    uint8_t bits = 0;
    memcpy(&h.type, at + kTypeOffset, 4);
    memcpy(&h.size, at + kSizeOffset, 4);
    memcpy(&h.pts, at + kPTSOffset, 8);
    memcpy(&channels, at + kChannelsOffset, 1);
    memcpy(&bits, at + kBitsOffset, 1);
    memcpy(&h.rate, at + kRateOffset, 4);
    h.channels = channels;
    h.bits = bits;
    h.pts = mask33(h.pts);
    return h;
}

// Loudspeaker positions for a channel count; more than eight channels get a mask
// the platform refuses.
uint32_t channelMaskFor(uint32_t channels) {
    static constexpr uint32_t kMasks[] = {0x0, 0x1, 0x3, 0x7, 0x33, 0x37, 0x3F, 0x13F, 0x63F};
    return channels < sizeof(kMasks) / sizeof(kMasks[0]) ? kMasks[channels] : 0xC0000000u;
}

// The output devices watched, and whether each is a Bluetooth one.
struct WatchedDevice {
    android::audio_devices_t device;
    bool bluetooth;
};
constexpr WatchedDevice kWatchedDevices[] = {
    {android::AUDIO_DEVICE_OUT_BLUETOOTH_SCO, true},
    {android::AUDIO_DEVICE_OUT_BLUETOOTH_SCO_HEADSET, true},
    {android::AUDIO_DEVICE_OUT_BLUETOOTH_SCO_CARKIT, true},
    {android::AUDIO_DEVICE_OUT_BLUETOOTH_A2DP, true},
    {android::AUDIO_DEVICE_OUT_BLUETOOTH_A2DP_HEADPHONES, true},
    {android::AUDIO_DEVICE_OUT_BLUETOOTH_A2DP_SPEAKER, true},
    {android::AUDIO_DEVICE_OUT_WIRED_HEADPHONE, false},
    {android::AUDIO_DEVICE_OUT_WIRED_HEADSET, false},
};

// Renderers whose resync timer may still call back. A timer's notification thread
// can start just before the timer is deleted; it finds its renderer here, under
// the lock, or not at all.
std::mutex& timerLock() {
    static std::mutex lock;
    return lock;
}
std::set<AudioRenderer*>& liveRenderers() {
    static std::set<AudioRenderer*> renderers;
    return renderers;
}

// Without a track, a write fails the way a lost device does, and holds the writer
// as long, so that no pass spins.
constexpr int64_t kMaxFailurePaceNs = 1'000'000'000;

}  // namespace

// Zero-initialised static storage that nothing ever writes: every instance reads
// its silence here, without clearing it again.
uint8_t AudioRenderer::mSilenceBuff[AudioRenderer::kSilenceBufferSize];

AudioRenderer::AudioRenderer(const android::sp<Synchronization>& synchronization)
    : Module("AudioRenderer"),
      mSynchronization(synchronization),
      mAudioFormat(0),
      mChannels(1),
      mSampleRate(48000),
      mVolume(0.0f),
      mBitsPerSample(16),
      mBytesPerSample(2),
      mSynced(false),
      mResyncCount(0),
      mAudioClock(0),
      mSessionId(-1),
      mResyncTimer(),
      mTimerCreated(false),
      mState(1),
      mSoundEffect(-1),
      mListener(nullptr) {
    {
        std::lock_guard<std::mutex> lock(timerLock());
        liveRenderers().insert(this);
    }
    struct sigevent event {};
    event.sigev_notify = SIGEV_THREAD;
    event.sigev_notify_function = &AudioRenderer::onResyncTimerCallback;
    event.sigev_value.sival_ptr = this;
    if (timer_create(CLOCK_MONOTONIC, &event, &mResyncTimer) != 0) {
        const int error = errno;
        TAVO_LOGE("%s: Error creating timer: %d (%s)\n", "AudioRenderer", error, strerror(error));
    } else {
        mTimerCreated = true;
    }
    if (mSynchronization != nullptr)
        mSynchronization->addPCRListener(this);
}

AudioRenderer::~AudioRenderer() {
    stop();
    // The output device thread outlives stop() when the renderer was configured
    // but never started.
    android::sp<OutputDeviceThread> device;
    {
        std::lock_guard<std::mutex> lock(mTrackLock);
        device = mOutputDeviceThread;
        mOutputDeviceThread.clear();
    }
    if (device != nullptr) {
        device->stopRequest();
        android::sp<android::Thread> thread = device;
        device.clear();
        stopThread(thread);
    }
    {
        std::lock_guard<std::mutex> lock(timerLock());
        liveRenderers().erase(this);
    }
    if (mTimerCreated)
        timer_delete(mResyncTimer);
}

android::sp<android::AudioTrack> AudioRenderer::audioTrack() {
    std::lock_guard<std::mutex> lock(mTrackLock);
    return mAudioTrack;
}

unsigned int AudioRenderer::configure() {
    std::lock_guard<std::mutex> lock(mLock);
    if (mInput == nullptr) {
        TAVO_LOGE("%s: AudioRenderer must have an input\n", __func__);
        return ERROR_RENDERER_NO_OUTPUT;
    }
    if (createAudioPlayer() != OK) {
        TAVO_LOGE("%s: Error in createAudioPlayer\n", __func__);
        return ERROR_RENDERER_NO_OUTPUT;
    }
    return OK;
}

unsigned int AudioRenderer::start() {
    std::lock_guard<std::mutex> lock(mLock);
    if (audioTrack() == nullptr)
        createAudioPlayer();
    if (mRenderThread != nullptr) {
        mState = 2;
        return OK;
    }
    mRenderThread = new RenderThread(this);
    if (mRenderThread->run("AudioRenderer", android::PRIORITY_AUDIO) != android::OK) {
        TAVO_LOGE("%s: Could not initialize rendering Thread", __func__);
        mRenderThread.clear();
        return REFUSED;
    }
    mState = 2;
    return OK;
}

void AudioRenderer::stopThread(android::sp<android::Thread>& thread) {
    if (thread == nullptr)
        return;
    thread->join();
    // The thread drops its own reference just after join returns; waiting for that
    // (briefly) makes this thread release the last one.
    for (int i = 0; i < 1000 && thread->getStrongCount() > 1; ++i)
        usleep(1000);
    thread.clear();
}

unsigned int AudioRenderer::stop() {
    std::lock_guard<std::mutex> lock(mLock);
    if (mState == 1)
        return OK;
    if (mRenderThread != nullptr) {
        mRenderThread->requestExit();
        // The pass may be waiting for data; this cuts the wait short.
        if (mInput != nullptr)
            mInput->wakeAll();
        android::sp<android::Thread> thread = mRenderThread;
        mRenderThread.clear();
        stopThread(thread);
    }
    android::sp<OutputDeviceThread> device;
    android::sp<android::AudioTrack> track;
    {
        std::lock_guard<std::mutex> trackLock(mTrackLock);
        device = mOutputDeviceThread;
        mOutputDeviceThread.clear();
        track = mAudioTrack;
        mAudioTrack.clear();
    }
    if (device != nullptr) {
        device->stopRequest();
        android::sp<android::Thread> thread = device;
        device.clear();
        stopThread(thread);
    }
    if (track != nullptr) {
        track->stop();
        track->flush();
        track.clear();
    }
    mSessionId = -1;
    if (AudioRenderedListener* listener = mListener.load())
        listener->onAudioSessionId(-1);
    mState = 1;
    return OK;
}

void AudioRenderer::setOutputEnable(bool enable) {
    TAVO_LOGI("%s: enable: %s\n", __func__, enable ? "true" : "false");
    std::lock_guard<std::mutex> lock(mLock);
    flushTrack();
    mSynced = false;
    ++mResyncCount;
    mVolume = enable ? 1.0f : 0.0f;
    android::sp<android::AudioTrack> track = audioTrack();
    if (track != nullptr) {
        const android::status_t status = track->setVolume(mVolume, mVolume);
        if (status != android::NO_ERROR) {
            TAVO_LOGE("%s: Error setting the volume: %d (%s)\n", __func__, status,
                      strerror(-status));
        }
    }
}

unsigned int AudioRenderer::setSoundEffect(int effect) {
    TAVO_LOGI("%s: effect: %d (no effects on this output)\n", __func__, effect);
    std::lock_guard<std::mutex> lock(mLock);
    mSoundEffect = effect;
    return OK;
}

void AudioRenderer::setAudioRenderedListener(AudioRenderedListener* listener) {
    mListener = listener;
}

void AudioRenderer::flushTrack() {
    android::sp<android::AudioTrack> track = audioTrack();
    if (track != nullptr)
        track->flush();
}

void AudioRenderer::resyncPCR() {
    flushTrack();
    mSynced = false;
    ++mResyncCount;
}

void AudioRenderer::onPCRChanged(unsigned long /*pcr*/) {
    resyncPCR();
}

bool AudioRenderer::checkOutputDevice() {
    android::sp<OutputDeviceThread> device;
    {
        std::lock_guard<std::mutex> lock(mTrackLock);
        device = mOutputDeviceThread;
    }
    return device != nullptr && device->mChanged.exchange(false);
}

void AudioRenderer::startResyncTimer() {
    struct itimerspec value {};
    value.it_value.tv_sec = kResyncDelaySeconds;
    if (!mTimerCreated || timer_settime(mResyncTimer, 0, &value, nullptr) != 0) {
        const int error = mTimerCreated ? errno : EINVAL;
        TAVO_LOGE("%s: Error starting resync timer: %d (%s)\n", __func__, error, strerror(error));
    }
}

void AudioRenderer::stopResyncTimer() {
    struct itimerspec value {};
    if (!mTimerCreated || timer_settime(mResyncTimer, 0, &value, nullptr) != 0) {
        const int error = mTimerCreated ? errno : EINVAL;
        TAVO_LOGE("%s: Error stopping resync timer: %d (%s)\n", __func__, error, strerror(error));
    }
}

void AudioRenderer::onResyncTimerCallback(union sigval value) {
    std::lock_guard<std::mutex> lock(timerLock());
    AudioRenderer* renderer = static_cast<AudioRenderer*>(value.sival_ptr);
    if (liveRenderers().count(renderer) == 0)
        return;
    TAVO_LOGI("%s: Resync PCR by timer\n", __func__);
    renderer->resyncPCR();
}

unsigned int AudioRenderer::dump(FILE* stream, int indent) {
    if (stream == nullptr)
        return OK;
    Module::dump(stream, indent);
    const std::string prefix(indent >= 0 ? static_cast<size_t>(indent) + 1 : 1, '\t');
    fprintf(stream, "%sAudio Volume: %1.1f\n", prefix.c_str(), static_cast<double>(mVolume.load()));
    fprintf(stream, "%sResync PCR Count: %d\n", prefix.c_str(), mResyncCount.load());
    android::sp<OutputDeviceThread> device;
    android::sp<android::AudioTrack> track;
    {
        std::lock_guard<std::mutex> lock(mTrackLock);
        device = mOutputDeviceThread;
        track = mAudioTrack;
    }
    if (device != nullptr)
        fprintf(stream, "%smOutputStatus: %d\n", prefix.c_str(), device->mOutputStatus.load());
    fprintf(stream, "%sAudio Track: %p\n", prefix.c_str(), static_cast<void*>(track.get()));
    if (track != nullptr)
        fprintf(stream, "%sSession ID: %d\n", prefix.c_str(), mSessionId.load());
    return OK;
}

unsigned int AudioRenderer::createAudioPlayer() {
    android::sp<android::AudioTrack> old;
    {
        std::lock_guard<std::mutex> lock(mTrackLock);
        old = mAudioTrack;
        mAudioTrack.clear();
    }
    // The old sink closes before the new one opens (a WAV file is re-created).
    old.clear();

    android::sp<android::AudioTrack> track = new android::AudioTrack(
        android::AUDIO_STREAM_MUSIC, mSampleRate, mAudioFormat, channelMaskFor(mChannels), 0,
        android::AUDIO_OUTPUT_FLAG_NONE, nullptr, nullptr, 0, android::AUDIO_SESSION_ALLOCATE,
        android::AudioTrack::TRANSFER_DEFAULT, nullptr, static_cast<uid_t>(-1), -1, nullptr, false,
        1.0f);
    const android::status_t init = track->initCheck();
    if (init != android::NO_ERROR) {
        TAVO_LOGE("%s: Error initializing AudioTrack: %d", __func__, init);
        return ERROR_RENDERER_NO_OUTPUT;
    }
    const float volume = mVolume.load();
    const android::status_t status = track->setVolume(volume, volume);
    if (status != android::NO_ERROR)
        TAVO_LOGE("%s: Error setting the volume: %d", __func__, status);
    track->start();
    {
        std::lock_guard<std::mutex> lock(mTrackLock);
        mAudioTrack = track;
    }
    mSessionId = track->getSessionId();
    if (AudioRenderedListener* listener = mListener.load())
        listener->onAudioSessionId(mSessionId.load());

    bool startDevice = false;
    android::sp<OutputDeviceThread> device;
    {
        std::lock_guard<std::mutex> lock(mTrackLock);
        if (mOutputDeviceThread == nullptr) {
            mOutputDeviceThread = new OutputDeviceThread();
            device = mOutputDeviceThread;
            startDevice = true;
        }
    }
    if (startDevice && device->run("OutputDeviceThread") != android::OK) {
        TAVO_LOGE("%s: Could not start the output device thread\n", __func__);
        std::lock_guard<std::mutex> lock(mTrackLock);
        mOutputDeviceThread.clear();
    }
    return OK;
}

ssize_t AudioRenderer::writeTrack(const void* data, size_t bytes) {
    android::sp<android::AudioTrack> track = audioTrack();
    if (track != nullptr)
        return track->write(data, bytes, true);
    const uint64_t frameBytes = static_cast<uint64_t>(mChannels) * mBytesPerSample;
    int64_t paceNs = frameBytes != 0 && mSampleRate != 0
                         ? static_cast<int64_t>(bytes / frameBytes * 1'000'000'000ull / mSampleRate)
                         : 0;
    std::this_thread::sleep_for(std::chrono::nanoseconds(std::min(paceNs, kMaxFailurePaceNs)));
    return android::NO_INIT;
}

uint64_t AudioRenderer::ticksFor(uint64_t bytes) const {
    const uint64_t perSecond = static_cast<uint64_t>(mChannels) * mSampleRate * mBytesPerSample;
    return perSecond != 0 ? bytes * 90000u / perSecond : 0;
}

void AudioRenderer::advanceAudioClock(uint64_t bytes) {
    mAudioClock = add33(mAudioClock.load(), ticksFor(bytes));
}

void AudioRenderer::releaseInput(uint32_t consumeBytes) {
    // consume and abortRead both release the read lock and wake the writer with a
    // try-lock and broadcast.
    if (consumeBytes != 0) {
        mInput->consume(consumeBytes);
    } else {
        mInput->abortRead();
    }
}

unsigned int AudioRenderer::renderSilence() {
    if (!mSynced) {
        usleep(5000);
        return OK;
    }
    if (audioTrack() == nullptr)
        return OK;
    // Whole frames only: a track takes whole frames, and 8192 bytes are not a
    // whole number of 3-, 5- or 6-channel frames.
    const uint32_t frameBytes = mChannels * mBytesPerSample;
    const size_t bytes = kSilenceBufferSize - kSilenceBufferSize % frameBytes;
    const ssize_t written = writeTrack(mSilenceBuff, bytes);
    if (written != static_cast<ssize_t>(bytes)) {
        const int error = written < 0 ? static_cast<int>(-written) : EIO;
        TAVO_LOGE("%s Could not write into system audio buffer: %s (%d)", "render", strerror(error),
                  static_cast<int>(written));
        return ERROR_RENDERER_SHORT_WRITE;
    }
    advanceAudioClock(bytes);
    return OK;
}

unsigned int AudioRenderer::render() {
    if (mInput == nullptr) {
        usleep(5000);
        return OK;
    }
    if (!mInput->waitForData(kHeaderSize))
        return renderSilence();

    const uint8_t* record = mInput->readPointer();
    const RecordHeader header = readHeader(record);
    const uint32_t used = mInput->usedSpace();
    if (header.size < kHeaderSize || header.size > mInput->size()) {
        // No record can be this long or this short: the ring's contents cannot be
        // walked any further. Everything queued is dropped, so that reading starts
        // again at the writer's next record.
        TAVO_LOGE("%s: RingBuffer inconsistency", __func__);
        mInput->consume(used);
        return REFUSED;
    }
    if (used < header.size) {
        TAVO_LOGE("%s: RingBuffer inconsistency", __func__);
        mInput->abortRead();
        // Waits (once, at most 100 ms) for the claimed bytes instead of spinning on
        // the same record; the next pass looks at it again.
        if (mInput->waitForData(header.size))
            mInput->abortRead();
        return REFUSED;
    }
    if (header.type != Data::TYPE_AUDIO_FRAGMENT) {
        TAVO_LOGE("%s: frame is not an audio format", __func__);
        onError(ERROR_RENDERER_WRONG_RECORD);
        releaseInput(header.size);
        return ERROR_RENDERER_WRONG_RECORD;
    }
    // A width below 8 bits would make a sample zero bytes long: refused like the
    // zero values, since nothing could be played or timed with it.
    if (header.rate < 1 || header.channels < 1 || header.bits < 1 || (header.bits >> 3) == 0) {
        TAVO_LOGE("%s: Invalid config values: %d %d %d. Discarding the packet\n", __func__,
                  static_cast<int>(header.rate), static_cast<int>(header.channels),
                  static_cast<int>(header.bits));
        releaseInput(header.size);
        return OK;
    }
    if (header.rate != mSampleRate || header.channels != mChannels ||
        header.bits != mBitsPerSample) {
        TAVO_LOGI("%s: Changed audio rendering configuration: FS: %d - Ch: %d - bps: %d", __func__,
                  static_cast<int>(header.rate), static_cast<int>(header.channels),
                  static_cast<int>(header.bits));
        mSampleRate = header.rate;
        mChannels = header.channels;
        mBitsPerSample = header.bits;
        mBytesPerSample = header.bits >> 3;
        if (createAudioPlayer() != OK) {
            TAVO_LOGE("%s: Error in createAudioPlayer\n", __func__);
            releaseInput(0);
            return ERROR_RENDERER_SHORT_WRITE;
        }
        flushTrack();
        mSynced = false;
        ++mResyncCount;
    }
    if (!mSynced) {
        // getPCR reads the clock under its lock; 0 means no source drives it (a
        // clock that stands exactly at 0 waits one more millisecond).
        const Uint33 pcr = mSynchronization != nullptr ? mSynchronization->getPCR() : 0;
        if (pcr == 0) {
            TAVO_LOGD("%s: Synchronization is not ready\n", __func__);
            releaseInput(0);
            usleep(1000);
            return OK;
        }
        mAudioClock = pcr;
        mSynced = true;
    }
    if (checkOutputDevice())
        startResyncTimer();

    android::sp<OutputDeviceThread> device;
    {
        std::lock_guard<std::mutex> lock(mTrackLock);
        device = mOutputDeviceThread;
    }
    const bool bluetooth = device != nullptr && device->mBluetooth.load();
    const int64_t wait = signed33(header.pts - mAudioClock.load() -
                                  (bluetooth ? static_cast<uint64_t>(kBluetoothDelayTicks) : 0));
    const int64_t waitMs = wait / 90;

    if (waitMs >= kHugeWaitMs || waitMs <= -kHugeWaitMs) {
        TAVO_LOGW("%s: PCR resynchronization forced due to huge difference in wait interaval: %d\n",
                  __func__, static_cast<int>(waitMs));
        if (mSynchronization != nullptr)
            mSynchronization->resetPCR();
        mSynced = false;
        releaseInput(header.size);
        return OK;
    }
    if (AudioRenderedListener* listener = mListener.load())
        listener->onAudioReady(static_cast<long>(waitMs));

    const uint64_t frameBytes = static_cast<uint64_t>(mChannels) * mBytesPerSample;
    if (wait >= kEarlyMinTicks && wait <= kEarlyMaxTicks) {
        TAVO_LOGD("%s: Audio samples are %lld msec early. Inserting silence\n", __func__,
                  static_cast<long long>(waitMs));
        uint64_t silence = static_cast<uint64_t>(waitMs) * mSampleRate / 1000 * frameBytes;
        silence = std::min<uint64_t>(silence, kSilenceBufferSize);
        silence -= silence % frameBytes;
        writeTrack(mSilenceBuff, static_cast<size_t>(silence));
        advanceAudioClock(silence);
        // The record stays where it is and is tried again on the next pass.
        releaseInput(0);
        return OK;
    }

    const uint8_t* payload = record + kHeaderSize;
    uint64_t payloadBytes = header.size - kHeaderSize;
    if (wait <= kLateTicks) {
        TAVO_LOGW("%s: Audio samples are late. Skipping some samples. (%lld)\n", __func__,
                  static_cast<long long>(waitMs));
        // Evaluated left to right in double precision, as designed, then cut down to
        // whole frames so that the rest still starts on a sample of channel 0.
        uint64_t skip = static_cast<uint64_t>(
            static_cast<double>(waitMs) * -0.001 * static_cast<double>(mSampleRate) *
            static_cast<double>(mChannels) * static_cast<double>(mBytesPerSample));
        skip -= skip % frameBytes;
        if (payloadBytes <= skip) {
            TAVO_LOGW("Dropping fragment");
            releaseInput(header.size);
            return OK;
        }
        payload += skip;
        payloadBytes -= skip;
    }

    if (AudioRenderedListener* listener = mListener.load())
        listener->onAudioRendered();
    const ssize_t written = writeTrack(payload, static_cast<size_t>(payloadBytes));
    if (written != static_cast<ssize_t>(payloadBytes)) {
        const int error = written < 0 ? static_cast<int>(-written) : EIO;
        TAVO_LOGE("%s Could not write into system audio buffer: %s (%d)", __func__, strerror(error),
                  static_cast<int>(written));
    }
    advanceAudioClock(payloadBytes);
    releaseInput(header.size);
    return OK;
}

android::status_t AudioRenderer::RenderThread::readyToRun() {
    setCurrentThreadName("AudioRenderer");
    // The platform's audio priority, which libutils applies only on Android: here the
    // thread raises itself. At the normal priority a busy machine holds the writer up
    // until the device runs dry, and every such gap leaves the sound that much later
    // than the pictures for good, since the audio clock counts the samples written.
    // Raising a priority needs CAP_SYS_NICE; without it the thread runs at the
    // normal one.
    if (setpriority(PRIO_PROCESS, static_cast<id_t>(gettid()), android::PRIORITY_AUDIO) != 0)
        TAVO_LOGD("%s: audio priority not available: %s\n", __func__, strerror(errno));
    return android::OK;
}

bool AudioRenderer::RenderThread::threadLoop() {
    const unsigned int status = mRenderer->render();
    // A failing output is reported once when it starts failing, not on every pass.
    if (status == ERROR_RENDERER_SHORT_WRITE && mLastStatus != ERROR_RENDERER_SHORT_WRITE)
        mRenderer->onError(status);
    mLastStatus = status;
    return true;
}

void AudioRenderer::OutputDeviceThread::stopRequest() {
    requestExit();
    {
        std::lock_guard<std::mutex> lock(mWaitLock);
        mWake = true;
    }
    mWaitCondition.notify_all();
}

bool AudioRenderer::OutputDeviceThread::threadLoop() {
    bool bluetooth = false;
    int status = 0;
    for (const WatchedDevice& watched : kWatchedDevices) {
        if (android::AudioSystem::getDeviceConnectionState(watched.device, "") ==
            android::AUDIO_POLICY_DEVICE_STATE_AVAILABLE) {
            status |= static_cast<int>(watched.device);
            bluetooth = bluetooth || watched.bluetooth;
        }
    }
    mBluetooth = bluetooth;
    if (status != mOutputStatus.load()) {
        TAVO_LOGI("%s: Headset change detected", "OutputDeviceThread");
        mOutputStatus = status;
        mChanged = true;
    }
    std::unique_lock<std::mutex> lock(mWaitLock);
    // steady_clock is the monotonic clock.
    mWaitCondition.wait_for(lock, std::chrono::seconds(1), [this] { return mWake; });
    return true;
}

}  // namespace TavoPlayer
