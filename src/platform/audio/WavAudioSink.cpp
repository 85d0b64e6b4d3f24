#include "platform/audio/WavAudioSink.h"

#include <cerrno>
#include <cstring>

#include "platform/audio/AudioTrack.h"
#include "platform/os/Trace.h"

namespace android {
namespace {

void putLE16(uint8_t* at, uint16_t value) {
    at[0] = static_cast<uint8_t>(value);
    at[1] = static_cast<uint8_t>(value >> 8);
}

void putLE32(uint8_t* at, uint32_t value) {
    for (int i = 0; i < 4; ++i)
        at[i] = static_cast<uint8_t>(value >> (8 * i));
}

}  // namespace

WavAudioSink::~WavAudioSink() {
    if (mFile != nullptr) {
        // RIFF sizes are 32-bit; a longer file keeps the largest size that fits.
        writeHeader(mDataBytes > 0xFFFFFFFFull - kHeaderSize
                        ? static_cast<uint32_t>(0xFFFFFFFFull - kHeaderSize)
                        : static_cast<uint32_t>(mDataBytes));
        fclose(mFile);
    }
}

status_t WavAudioSink::open(uint32_t sampleRate, uint32_t channels) {
    mSampleRate = sampleRate;
    mChannels = channels;
    mFrameSize = static_cast<size_t>(channels) * 2;
    mFile = fopen(mPath.c_str(), "wb");
    if (mFile == nullptr) {
        const int error = errno;
        TAVO_LOGE("%s: cannot create %s: %s\n", "WavAudioSink", mPath.c_str(), strerror(error));
        return -error;
    }
    writeHeader(0);
    mPacer = std::make_unique<AudioPacer>(sampleRate, mFrameSize,
                                          AudioTrack::kSimulatedLatencyMs * 1'000'000ll);
    return NO_ERROR;
}

void WavAudioSink::writeHeader(uint32_t dataBytes) {
    uint8_t header[kHeaderSize];
    memcpy(header, "RIFF", 4);
    putLE32(header + 4, static_cast<uint32_t>(kHeaderSize - 8 + dataBytes));
    memcpy(header + 8, "WAVEfmt ", 8);
    putLE32(header + 16, 16);
    putLE16(header + 20, 1);  // PCM
    putLE16(header + 22, static_cast<uint16_t>(mChannels));
    putLE32(header + 24, mSampleRate);
    putLE32(header + 28, static_cast<uint32_t>(mSampleRate * mFrameSize));
    putLE16(header + 32, static_cast<uint16_t>(mFrameSize));
    putLE16(header + 34, 16);
    memcpy(header + 36, "data", 4);
    putLE32(header + 40, dataBytes);
    if (fseek(mFile, 0, SEEK_SET) == 0) {
        fwrite(header, 1, sizeof(header), mFile);
        fseek(mFile, 0, SEEK_END);
    }
}

uint32_t WavAudioSink::latencyMs() const {
    return AudioTrack::kSimulatedLatencyMs;
}

ssize_t WavAudioSink::write(const void* data, size_t bytes, int64_t* leaveNs) {
    if (mFile == nullptr || mPacer == nullptr)
        return NO_INIT;
    const size_t taken = bytes - bytes % mFrameSize;
    *leaveNs = mPacer->pace(taken);
    // Flushed through to the file on every write, so that a reader (or a full
    // disk) sees each write when it happens.
    if (fwrite(data, 1, taken, mFile) != taken || fflush(mFile) != 0) {
        const int error = errno != 0 ? errno : EIO;
        clearerr(mFile);
        TAVO_LOGE("%s: cannot write %s: %s\n", "WavAudioSink", mPath.c_str(), strerror(error));
        return -error;
    }
    mDataBytes += taken;
    return static_cast<ssize_t>(taken);
}

void WavAudioSink::flush() {
    if (mPacer != nullptr)
        mPacer->reset();
}

}  // namespace android
