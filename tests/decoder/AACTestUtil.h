// Builders of LOAS/LATM and ADTS frames for the AAC tests, written field by field
// with a bit writer so that every header in a test reads like its syntax table
// (ISO/IEC 14496-3, 1.7.2-1.7.3 and 1.6.2.1; ISO/IEC 13818-7, 6.2), and a driver that
// runs an AACMediaExtractor over PES records until its input is used up.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include <utils/StrongPointer.h>

#include "common/RingBuffer.h"
#include "decoder/AACMediaExtractor.h"

namespace TavoPlayer::test {

// MSB-first writer of fields up to 32 bits into a growing byte vector.
class BitSink {
public:
    void put(uint32_t value, unsigned int bits);
    void putBytes(const std::vector<uint8_t>& bytes);
    void align() {
        while (mBits % 8 != 0) {
            put(0, 1);
        }
    }
    size_t bitCount() const { return mBits; }
    const std::vector<uint8_t>& bytes() const { return mBytes; }

private:
    std::vector<uint8_t> mBytes;
    size_t mBits = 0;
};

struct AscFields {
    uint32_t aot = 2;
    uint32_t samplingFrequencyIndex = 3;
    uint32_t channelConfiguration = 2;
    // Hierarchical SBR/PS signalling: write 5 or 29 first, then `aot` as the core.
    uint32_t hierarchicalExtension = 0;
    uint32_t extensionSamplingFrequencyIndex = 0;
    // Backward-compatible SBR signalling after the GASpecificConfig (needs ascLen,
    // i.e. audioMuxVersion 1).
    bool backwardCompatibleSbr = false;
    bool backwardCompatiblePs = false;
    uint32_t frameLengthFlag = 0;
};

// AudioSpecificConfig with a GASpecificConfig for channel configurations 1..7.
void writeAsc(BitSink& sink, const AscFields& asc);

struct LoasOptions {
    uint32_t audioMuxVersion = 0;
    bool useSameStreamMux = false;
    AscFields asc;
    uint32_t ascFillBits = 0;  // version 1: bits after the configuration inside ascLen
    uint32_t numProgram = 0;   // anything but 0 is unsupported
    uint32_t numLayer = 0;
    uint32_t frameLengthType = 0;
    uint32_t audioMuxVersionA = 0;
    bool crc = false;
    uint32_t otherDataBits = 0;  // other data after the payloads, as zero bits
};

// One AudioSyncStream frame carrying `payloads` as subframes (numSubFrames =
// payloads.size() - 1).
std::vector<uint8_t> loasFrame(const LoasOptions& options,
                               const std::vector<std::vector<uint8_t>>& payloads);

struct AdtsOptions {
    uint32_t profile = 1;  // AAC LC
    uint32_t samplingFrequencyIndex = 3;
    uint32_t channelConfiguration = 2;
    bool crc = false;
    uint32_t rawDataBlocks = 0;  // number_of_raw_data_blocks_in_frame
};

std::vector<uint8_t> adtsFrame(const AdtsOptions& options, const std::vector<uint8_t>& payload);

// A payload of `size` bytes whose content depends on `seed`.
std::vector<uint8_t> patternPayload(size_t size, uint32_t seed);

struct Unit {
    std::vector<uint8_t> bytes;
    long long pts = 0;
    unsigned char flags = 0;
};

// Calls getDecodableUnit until `idleCalls` calls in a row returned 2 with no unit
// (the ring is drained), collecting what came out. `outputSize` is the buffer size.
std::vector<Unit> drain(AACMediaExtractor& extractor, size_t outputSize = 8192, int idleCalls = 3);

// Golden-dump line per unit: "pts flags size fnv1a64".
std::string dumpUnits(const std::vector<Unit>& units);

// Path of a sample stream, empty when the folder or file is absent.
std::string sharedStream(const std::string& name);

// The PES payloads (with PTS) of one PID in a 188-byte TS, as a TS parser would
// hand them on (ISO/IEC 13818-1, 2.4.3.2 and 2.4.3.6); a PES without PTS carries
// the last PTS seen.
struct PesPayload {
    std::vector<uint8_t> es;
    uint64_t pts = 0;
};
std::vector<PesPayload> pesPayloadsOfPid(const std::vector<uint8_t>& ts, uint16_t pid);

}  // namespace TavoPlayer::test
