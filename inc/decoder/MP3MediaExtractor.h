// MP3MediaExtractor: cuts single, complete MPEG-1/2 audio frames (Layers I, II and III,
// and the MPEG 2.5 extension) out of the PESData records of an MPEG audio elementary
// stream (ISO/IEC 11172-3, ISO/IEC 13818-3), each with its presentation time.
//
// A frame may straddle two or more PES packets: its start is held in a carry buffer
// and it is delivered whole, with the PTS that was current when it began, on the call
// that reads its last bytes. After a header fails at a frame boundary the extractor
// rescans byte by byte for the next sync word followed by a valid header.
//
// Threads: only the decoder's input thread calls it (see MediaExtractor). Nothing is
// reset by reset(): the state is deliberately kept across a decoder flush.
#pragma once

#include <cstdint>
#include <memory>

#include "decoder/MediaExtractor.h"

namespace TavoPlayer {

class MP3MediaExtractor : public MediaExtractor {
public:
    // Results of getNextFragment.
    enum FragmentResult : unsigned int {
        FRAGMENT_DELIVERED = 0,
        FRAGMENT_CONTINUES = 1,  // the frame goes on in the next record
        FRAGMENT_RECORD_EXHAUSTED = 2,
        FRAGMENT_ERROR = 5,
    };

    // kbit/s by bit-rate index; columns MPEG-1 Layer I, II, III, MPEG-2/2.5 Layer I,
    // MPEG-2/2.5 Layers II and III (ISO/IEC 11172-3, 2.4.2.3; ISO/IEC 13818-3, 2.4.2.3).
    // Row 15 (the standards' forbidden index) is kept as a sixteenth row: the header
    // check lets index 15 through and these are the values it then uses.
    static const uint32_t bitRateTable[16][5];
    // Samples per frame; rows Layer I, II, III; columns MPEG-1, MPEG-2, MPEG 2.5.
    // Kept beside the other tables; the frame logic does not use it.
    static const uint32_t samplesPerFrameTable[3][3];
    // Hz by sampling-rate index; columns MPEG-1, MPEG-2, MPEG 2.5.
    static const uint32_t samplingRateTable[3][3];

    explicit MP3MediaExtractor(android::sp<RingBuffer> ring);
    ~MP3MediaExtractor() override;

    // At most one frame per call; `flags` is not touched.
    unsigned int getDecodableUnit(void* buffer, unsigned long size, unsigned long* length,
                                  long long* pts, unsigned char* flags) override;
    void reset() override;
    // Gives a record in use back unconsumed, releasing the input ring's reader lock on
    // the calling thread (which must be the one that took it); the next call takes it
    // again from its start. The decoder's input thread calls this on its way out so
    // that no lock is left held by a thread that has ended.
    void giveBackRecord();

    // From the position, finds the next offset where a sync pattern is followed by a
    // valid header: 0 there, RESULT_RESYNC_FAILED when the payload ends first.
    unsigned int resync();
    // Parses the 32-bit header at the position (ISO/IEC 11172-3, 2.4.1.3). Returns 0,
    // RESULT_NOT_ENOUGH_BYTES or RESULT_INVALID, each logged with its reason.
    unsigned int parseHeader();
    unsigned int getNextFragment(void* buffer, unsigned long size, unsigned long* length,
                                 long long* pts);

    // Values of the last parsed header.
    uint32_t frameLength() const { return mFrameLength; }
    uint64_t frameDuration() const { return mFrameDuration; }
    uint32_t versionId() const { return mVersionId; }
    uint32_t layer() const { return mLayer; }
    bool crcPresent() const { return mCrcPresent; }
    uint8_t channelMode() const { return mChannelMode; }
    bool isSynced() const { return mSynced; }

private:
    void adoptRecord(PESData* record);

    uint8_t* mPayload;
    uint32_t mPayloadSize;  // the record's ES size, bounded by the record
    long long mCurrentPTS;
    uint64_t mFrameDuration;  // 90 kHz ticks
    uint64_t mPosition;
    bool mSynced;
    bool mCarryPending;
    uint32_t mCarryLength;
    long long mCarryPTS;
    PESData* mCurrentRecord;
    uint32_t mVersionId;
    uint32_t mLayer;
    bool mCrcPresent;
    uint8_t mBitRateIndex;
    uint8_t mSamplingRateIndex;
    bool mPadding;
    uint8_t mChannelMode;
    uint8_t mModeExtension;
    bool mRights;
    bool mOriginal;
    uint8_t mEmphasis;
    uint32_t mFrameLength;
    std::unique_ptr<uint8_t[]> mCarryBuffer;  // mFrameLength + 4 bytes
    // The 32 header bits of the last header that parsed, whose results the fields hold.
    uint32_t mLastHeaderWord;
    bool mLastHeaderValid;
};

}  // namespace TavoPlayer
