// Caption PES payloads and the records that carry them, for the caption decoder and
// renderer tests: a PES_data_packet with one data group of caption statement data
// and one data unit (ARIB STD-B24 Volume 1 Part 3, 9.1 to 9.4; ABNT NBR 15606-1).
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "common/RingBuffer.h"
#include "common/data/PESData.h"

namespace TavoPlayer::test {

using Bytes = std::vector<uint8_t>;

struct CaptionUnitOptions {
    uint8_t timeControlMode = 0;   // TMD; 1 and 2 carry a 5-byte presentation time
    uint8_t unitParameter = 0x20;  // statement body
    uint8_t separator = 0x1F;
    uint8_t dataIdentifier = 0x80;
    uint8_t headerLength = 0;  // PES_data_packet_header_length (bytes skipped)
    long declaredSize = -1;    // data_unit_size as written; -1: the real size
};

// The PES payload (elementary stream) of one caption statement carrying `unit`.
Bytes captionEs(const Bytes& unit, const CaptionUnitOptions& options = {});
Bytes bytesOf(const std::string& text);

// A PESData record in a buffer of exactly its size (so that a read past the record
// is a read past the allocation), with the ES right after the 40-byte header.
class OwnedPesRecord {
public:
    OwnedPesRecord(const Bytes& es, uint64_t pts);
    PESData* get() { return reinterpret_cast<PESData*>(mBytes.get()); }

private:
    std::unique_ptr<uint8_t[]> mBytes;
};

// A caption record as read back from a ring.
struct CaptionRecord {
    uint32_t size = 0;
    uint64_t pts = 0;
    std::u32string text;
};
// Every caption record readable now, consumed.
std::vector<CaptionRecord> drainCaptions(RingBuffer& ring);
// Appends one caption record as the decoder writes it; false when there is no room.
bool writeCaption(RingBuffer& ring, const std::u32string& text, uint64_t pts);
std::u32string toU32(const unsigned char* bytes, int length);

// Splits a caption elementary stream of concatenated PES_data_packets (each starting
// 80 FF F0) at the data group sizes.
std::vector<Bytes> splitCaptionEs(const Bytes& es);

}  // namespace TavoPlayer::test
