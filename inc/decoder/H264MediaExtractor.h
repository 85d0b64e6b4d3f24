// H264MediaExtractor: cuts whole access units out of the PESData records of an H.264
// byte stream (ITU-T H.264, Annex B, carried in PES as ISO/IEC 13818-1, 2.14 allows),
// each with a presentation time, for the video decoder.
//
// Access units are delimited by access unit delimiters and SPSs (ITU-T H.264, 7.4.1.2.3),
// once the first slice of the unit has been seen; a stream that never delimits this way
// for 31 records switches for good to delimiting by first_mb_in_slice = 0 alone. The
// SPS (with its VUI and HRD) and the picture-timing SEI are decoded because the frame
// duration that stamps every unit after the first one of a PES comes from the VUI
// timing information (ITU-T H.264, E.2.1).
//
// Threads: only the decoder's input thread calls it; reset() is called on that thread's
// behalf while it is stopped. The ring's reader lock is held while a record is in use,
// across calls (see MediaExtractor).
//
// Every bitstream read is bounded by the NAL unit it belongs to, and every NAL unit by
// its record: a truncated or corrupted SPS or SEI fails with its logged reason, and
// a record whose stated payload runs past its end is read only up to its end.
#pragma once

#include <cstdint>
#include <memory>

#include "decoder/MediaExtractor.h"
#include "decoder/ReadBitInterface.h"

namespace TavoPlayer {

class H264MediaExtractor : public MediaExtractor {
public:
    // nal_unit_type (ITU-T H.264, Table 7-1); the values acted on.
    enum NALUnitType : uint8_t {
        NAL_SLICE = 1,
        NAL_IDR_SLICE = 5,
        NAL_SEI = 6,
        NAL_SPS = 7,
        NAL_AUD = 9,
    };

    // Bits of the unit flags of getDecodableUnit.
    static constexpr unsigned char kFlagIdr = 2;
    static constexpr unsigned char kFlagSps = 16;

    // Results of getNextAccessUnit.
    static constexpr unsigned int kUnitInsideRecord = 2;
    static constexpr unsigned int kRecordFinished = 3;

    // Consecutive records without an access-unit start before the workaround.
    static constexpr uint8_t kWorkaroundRecords = 31;

    // hrd_parameters() (ITU-T H.264, E.1.2), one for NAL and one for VCL.
    struct HRD {
        HRD() = default;
        HRD(const HRD&) = delete;
        HRD& operator=(const HRD&) = delete;

        uint32_t cpbCountMinus1 = 0;
        uint8_t bitRateScale = 0;
        uint8_t cpbSizeScale = 0;
        std::unique_ptr<uint32_t[]> bitRateValueMinus1;
        std::unique_ptr<uint32_t[]> cpbSizeValueMinus1;
        std::unique_ptr<bool[]> cbrFlag;
        // Filled by five 5-bit reads: initial_cpb_removal_delay_length_minus1,
        // cpb_removal_delay_length_minus1, then dpb_output_delay_length_minus1 overwritten
        // by the next read, then the time-offset length.
        uint8_t lengthField[4] = {0, 0, 0, 0};
    };

    // Told the frame duration when it becomes known. Not owned; must outlive the
    // extractor. Nothing in the player sets one.
    class FrameDurationListener {
    public:
        virtual ~FrameDurationListener() = default;
        virtual void onFrameDuration(long long durationTicks) = 0;
    };

    explicit H264MediaExtractor(android::sp<RingBuffer> ring);
    ~H264MediaExtractor() override;

    // One access unit per call (Annex B bytes as found, start codes included); flags
    // kFlagIdr and kFlagSps. Flags and length are zeroed on entry.
    unsigned int getDecodableUnit(void* buffer, unsigned long size, unsigned long* length,
                                  long long* pts, unsigned char* flags) override;
    // Forces a new SPS and frame duration; a held record is given back unconsumed and
    // taken again from its start. The picture-timing flag and the workaround are kept.
    void reset() override;

    void setFrameDurationListener(FrameDurationListener* listener) { mListener = listener; }

    // The picture size of the last decoded SPS after cropping, in pixels.
    uint32_t getCroppedWidth() const { return mWidth; }
    uint32_t getCroppedHeight() const { return mHeight; }
    long long getFrameDuration() const { return mFrameDuration; }
    bool isFrameDurationKnown() const { return mFrameDurationKnown; }
    bool isWorkaroundActive() const { return mWorkaround; }
    bool isPicTimingSeen() const { return mPicTimingSeen; }
    uint8_t getPicStruct() const { return mPicStruct; }
    uint8_t getProfileIdc() const { return mProfileIdc; }
    uint8_t getChromaFormatIdc() const { return mChromaFormatIdc; }
    bool getFrameMbsOnly() const { return mFrameMbsOnly; }
    uint32_t getNumUnitsInTick() const { return mNumUnitsInTick; }
    uint32_t getTimeScale() const { return mTimeScale; }
    bool getPicStructPresent() const { return mPicStructPresent; }
    const HRD& getNalHrd() const { return mNalHrd; }
    const HRD& getVclHrd() const { return mVclHrd; }

    // --- steps, each 0 on success and non-zero on failure ----------------------------
    // Start of the next NAL unit (its 00 00 01) at or after `from`; 3 at payload end.
    unsigned int findNextNalHeader(unsigned int from, unsigned int* start);
    // The NAL unit at or after the position; the position moves to its start.
    unsigned int getNextNalUnit(NALUnitType* type, unsigned int* length);
    unsigned int getNextNALUWithType(NALUnitType type, unsigned int* length);
    // Emulation-prevention removal (ITU-T H.264, 7.4.1) from byte 4 on; the caller
    // frees *out with delete[].
    unsigned int decodeNALUnit(unsigned char* in, unsigned int size, unsigned char** out,
                               unsigned int* outSize);
    unsigned int parseUEGolomb(ReadBitInterface* reader);
    int parseSEGolomb(ReadBitInterface* reader);
    unsigned int decodeSPS(void* data, unsigned long size, bool removeEmulation);
    unsigned int decodeVUI(ReadBitInterface* reader);
    unsigned int decodeHRD(HRD* hrd, ReadBitInterface* reader);
    unsigned int decodeSEI(void* data, unsigned long size, bool removeEmulation);
    unsigned int decodePicTimingSEI(ReadBitInterface* reader);
    unsigned int calculateFrameRate(bool fieldPicture);
    unsigned int getNextAccessUnit(void* buffer, unsigned long size, unsigned long* length,
                                   long long* pts, unsigned char* flags);

    // The payload the steps work on when no record is used (for tests of the scan).
    void setPayloadForTest(uint8_t* payload, uint32_t size) {
        mPayload = payload;
        mPayloadSize = size;
        mPosition = 0;
    }
    unsigned int getPosition() const { return mPosition; }

private:
    // Reads that never pass the end of the reader's buffer: past it they yield 0 and
    // set mOverrun, which fails the step that is decoding.
    bool haveBits(ReadBitInterface* reader, uint64_t count) const;
    uint32_t bits(ReadBitInterface* reader, unsigned int count);
    void skip(ReadBitInterface* reader, unsigned int count);
    // Copies `size` bytes into a new array, with emulation prevention removed if asked.
    unsigned int workCopy(void* data, unsigned long size, bool removeEmulation, unsigned char** out,
                          unsigned int* outSize);
    void releaseRecord(bool consume);

    // scan
    uint8_t* mPayload;
    uint32_t mPayloadSize;
    unsigned int mPosition;
    // flags
    bool mSpsSeen;
    bool mPicTimingSeen;
    bool mFrameDurationKnown;
    // SPS (ITU-T H.264, 7.3.2.1.1)
    uint8_t mProfileIdc;
    uint8_t mSpsId;
    uint8_t mChromaFormatIdc;
    uint8_t mBitDepthLuma;
    uint8_t mBitDepthChroma;
    uint8_t mLog2MaxFrameNum;
    uint8_t mPicOrderCntType;
    uint32_t mPocCycleLength;
    uint8_t mLog2MaxPocLsb;
    uint8_t mMaxNumRefFrames;
    uint32_t mWidthInMbs;
    uint32_t mHeightInMapUnits;
    uint32_t mWidth;
    uint32_t mHeight;
    bool mFrameMbsOnly;
    bool mFrameCropping;
    uint32_t mCropLeft;
    uint32_t mCropRight;
    uint32_t mCropTop;
    uint32_t mCropBottom;
    bool mVuiPresent;
    // VUI (ITU-T H.264, E.1.1)
    bool mAspectRatioPresent;
    uint8_t mAspectRatioIdc;
    bool mOverscanPresent;
    bool mVideoSignalPresent;
    bool mColourDescriptionPresent;
    bool mChromaLocationPresent;
    bool mTimingPresent;
    uint32_t mNumUnitsInTick;
    uint32_t mTimeScale;
    bool mFixedFrameRate;
    bool mNalHrdPresent;
    HRD mNalHrd;
    bool mVclHrdPresent;
    HRD mVclHrd;
    bool mLowDelay;
    bool mPicStructPresent;
    bool mBitstreamRestriction;
    bool mMotionVectorsOverPicBoundaries;
    uint32_t mRestriction[6];
    // picture timing (ITU-T H.264, D.1.3)
    uint8_t mDelay;
    uint8_t mPicStruct;
    struct ClockTimestamp {
        bool flag;
        uint8_t ctType;
        bool nuitFieldBased;
        uint8_t countingType;
        bool fullTimestamp;
        bool discontinuity;
        bool dropped;
        uint8_t nFrames;
        bool secondsFlag;
        uint8_t seconds;
        bool minutesFlag;
        uint8_t minutes;
        bool hoursFlag;
        uint8_t hours;
        uint32_t timeOffset;
    };
    ClockTimestamp mClock[3];
    // output
    PESData* mCurrentRecord;
    long long mCurrentPTS;
    long long mFrameDuration;  // 90 kHz ticks
    FrameDurationListener* mListener;
    // workaround
    bool mWorkaround;
    uint8_t mNoStartCount;

    bool mOverrun;  // a bounded read ran past its buffer during the current decode
};

}  // namespace TavoPlayer
