#include <gtest/gtest.h>
#include <unistd.h>

#include <cstring>
#include <new>

#include "common/RingBuffer.h"
#include "common/data/AudioFragmentData.h"
#include "common/data/ClosedCaptionFragmentData.h"
#include "common/data/PESData.h"
#include "common/data/VideoFrameData.h"
#include "platform/gui/GraphicBuffer.h"

namespace TavoPlayer {
namespace {

const unsigned int kPage = static_cast<unsigned int>(sysconf(_SC_PAGE_SIZE));

template <typename T>
uint32_t fieldOffset(const T& record, const void* field) {
    return static_cast<uint32_t>(reinterpret_cast<const uint8_t*>(field) -
                                 reinterpret_cast<const uint8_t*>(&record));
}

class RecordInRingTest : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_EQ(0u, ring->configure("records", 16)); }
    android::sp<RingBuffer> ring = new RingBuffer;
};

// A PES packet of n bytes makes a record of 40 + n bytes that advances the ring by
// that size rounded up to 4.
TEST_F(RecordInRingTest, PesRecordSizeAndAdvance) {
    const struct {
        uint32_t pesBytes, recordSize, advance;
    } cases[] = {{2000, 2040, 2040}, {2001, 2041, 2044}, {2003, 2043, 2044}, {0, 40, 40}};
    for (const auto& c : cases) {
        SCOPED_TRACE(c.pesBytes);
        ring->reset();
        ASSERT_TRUE(ring->waitForSpace(PESData::kHeaderSize + c.pesBytes));
        auto* record = new (ring->writePointer()) PESData;
        record->mSize = PESData::kHeaderSize + c.pesBytes;
        memset(record->pesBytes(), 0x5A, c.pesBytes);
        record->mSizeES = c.pesBytes > 9 ? c.pesBytes - 9 : 0;
        record->mOffsetES = record->mSize - record->mSizeES;
        ring->commitWrite(record->mSize);
        EXPECT_EQ(c.recordSize, record->mSize);
        EXPECT_EQ(c.advance, ring->head());

        ASSERT_TRUE(ring->waitForData(PESData::kHeaderSize));
        auto* read = reinterpret_cast<Data*>(ring->readPointer());
        EXPECT_EQ(Data::TYPE_PES, read->mType);
        unsigned char* raw = nullptr;
        unsigned int rawSize = 0;
        EXPECT_EQ(0, read->getRaw(&raw, &rawSize));  // dispatched through the record's header
        EXPECT_EQ(ring->readPointer() + 40, raw);
        EXPECT_EQ(c.pesBytes, rawSize);
        ring->consume(read->mSize);
        EXPECT_EQ(c.advance, ring->tail());
    }
}

// ---------------------------------------------------------------------------------
// Byte layouts, read back from the raw bytes of each record.

uint32_t u32At(const void* record, size_t offset) {
    uint32_t v;
    memcpy(&v, static_cast<const uint8_t*>(record) + offset, 4);
    return v;
}
uint64_t u64At(const void* record, size_t offset) {
    uint64_t v;
    memcpy(&v, static_cast<const uint8_t*>(record) + offset, 8);
    return v;
}

// PESData, AudioFragmentData and VideoFrameData offsets are checked at compile
// time; the caption record's virtual base cannot be, so it is checked here.
TEST(RecordLayoutTest, CaptionPartPrecedesTheSharedBase) {
    ClosedCaptionFragmentData r;
    r.mPTS = 0x123456789;
    EXPECT_EQ(0x123456789u, u64At(&r, 8));
    EXPECT_EQ(3u, u32At(&r, 24));
    EXPECT_EQ(32u, u32At(&r, 28));
    const Data& base = r;
    EXPECT_EQ(16u, fieldOffset(r, &base));
    EXPECT_EQ(24u, fieldOffset(r, &base.mType));
}

// ---------------------------------------------------------------------------------
// Text forms: toString output, and fromString with its scan formats kept as designed.

// toString is the record's diagnostic dump; fromString reads the scan formats as
// designed, which do not read the dump back for PES and audio records.
TEST(RecordTextTest, ToStringAndFromString) {
    PESData pes;
    pes.mSize = 2040;
    pes.mPTS = 8589934591;  // 2^33 - 1
    pes.mDTS = 90000;
    pes.mOffsetES = 54;
    pes.mSizeES = 1986;
    std::string text = pes.toString();
    EXPECT_EQ(
        "mType = 0\nmSize = 2040\nmPTS = 8589934591\nmDTS = 90000\nmOffsetES = 54\nmSizeES = "
        "1986\n",
        text);
    PESData back;
    EXPECT_FALSE(back.fromString(text.data()));
    // The scan stops after mPTS: three fields were assigned, the rest untouched.
    EXPECT_EQ(2040u, back.mSize);
    EXPECT_EQ(8589934591u, back.mPTS);
    EXPECT_EQ(0u, back.mDTS);
    char designed[] =
        "mType = 0\nmSize = 100\nmPTS = 5lu\nmDTS = 7lu\nmOffsetES = 60\nmSizeES = 40\n";
    EXPECT_TRUE(back.fromString(designed));
    EXPECT_EQ(100u, back.mSize);
    EXPECT_EQ(5u, back.mPTS);
    EXPECT_EQ(7u, back.mDTS);
    EXPECT_EQ(60u, back.mOffsetES);
    EXPECT_EQ(40u, back.mSizeES);

    AudioFragmentData audio;
    audio.mSize = 4128;
    audio.mPTS = 123456;
    audio.mNumberChannels = 2;
    audio.mSamplingRate = 48000;
    text = audio.toString();
    EXPECT_EQ(
        "mType = 1\nmSize = 4128\nmPTS = 123456\nmNumberChannels = 2\nmBitsPerSample = 16\n"
        "mSamplingRate = 48000\n",
        text);
    AudioFragmentData audioBack;
    EXPECT_FALSE(audioBack.fromString(text.data()));
    EXPECT_EQ(123456u, audioBack.mPTS);
    char audioText[] =
        "mType = 1\nmSize = 36\nmPTS = 9lu\nmNumberChannels = 2\nmBitsPerSample = X\nmSamplingRate "
        "= 44100\n";
    EXPECT_TRUE(audioBack.fromString(audioText));
    EXPECT_EQ('2', audioBack.mNumberChannels);  // the character, not the number
    EXPECT_EQ('X', audioBack.mBitsPerSample);
    EXPECT_EQ(44100u, audioBack.mSamplingRate);

    VideoFrameData video;
    video.mPTS = 0x1FFFFFFFF;
    text = video.toString();
    EXPECT_EQ("mType = 2\nmSize = 80\nmPTS = 8589934591\n", text);
    VideoFrameData videoBack;
    videoBack.mSize = 0;
    EXPECT_TRUE(videoBack.fromString(text.data()));
    EXPECT_EQ(80u, videoBack.mSize);
    EXPECT_EQ(0x1FFFFFFFFu, videoBack.mPTS);
}

// ---------------------------------------------------------------------------------
// getRaw of a video frame with a picture buffer attached.

class FakeGraphicBuffer : public GraphicBuffer {
public:
    explicit FakeGraphicBuffer(int lockStatus) : mLockStatus(lockStatus) {
        for (size_t i = 0; i < sizeof mPixels; ++i)
            mPixels[i] = static_cast<uint8_t>(i);
    }
    int lock(uint32_t usage, void** vaddr) override {
        mUsage = usage;
        if (mLockStatus != 0)
            return mLockStatus;
        ++mLocked;
        *vaddr = mPixels;
        return 0;
    }
    int unlock() override {
        --mLocked;
        return 0;
    }
    size_t getByteSize() const override { return sizeof mPixels; }

    int mLockStatus;
    uint32_t mUsage = 0;
    int mLocked = 0;
    uint8_t mPixels[96];
};

TEST(VideoFrameRawTest, CopiesTheLockedPictureOrReturnsTheLockStatus) {
    android::sp<FakeGraphicBuffer> buffer = new FakeGraphicBuffer(0);
    VideoFrameData frame;
    unsigned char* data = nullptr;
    unsigned int size = 1;
    // A decoder's record without a picture has no payload.
    EXPECT_EQ(0, frame.getRaw(&data, &size));
    EXPECT_EQ(reinterpret_cast<unsigned char*>(&frame) + 80, data);
    EXPECT_EQ(0u, size);

    frame.mGraphicBuffer = buffer.get();
    EXPECT_EQ(0, frame.getRaw(&data, &size));
    ASSERT_NE(nullptr, data);
    EXPECT_NE(buffer->mPixels, data);  // a copy the caller owns
    EXPECT_EQ(96u, size);
    EXPECT_EQ(0, memcmp(buffer->mPixels, data, 96));
    EXPECT_EQ(3u, buffer->mUsage);
    EXPECT_EQ(0, buffer->mLocked);
    delete[] data;

    buffer->mLockStatus = -22;
    EXPECT_EQ(-22, frame.getRaw(&data, &size));
    EXPECT_EQ(nullptr, data);
    EXPECT_EQ(0u, size);
}

}  // namespace
}  // namespace TavoPlayer
