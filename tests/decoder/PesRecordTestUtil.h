// Writes PESData records of given elementary-stream bytes into a ring, the way the TS
// parser module lays them out: a 40-byte header, then a PES packet whose header is a
// minimal optional header with a PTS (ISO/IEC 13818-1, 2.4.3.6-7), then the ES bytes.
// Also the drivers that run an extractor over such records, libavcodec's parsers as
// an independent reference, and golden dumps.
#pragma once

#include <cstdint>
#include <functional>
#include <ostream>
#include <string>
#include <vector>

#include <utils/StrongPointer.h>

#include "common/RingBuffer.h"
#include "decoder/MediaExtractor.h"
#include "support/NamedRow.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer::test {

using Bytes = std::vector<uint8_t>;

// MSB-first writer of fields up to 32 bits into a growing byte vector.
class BitSink {
public:
    void put(uint32_t value, unsigned int bits);
    void putBytes(const Bytes& bytes) {
        for (uint8_t b : bytes)
            put(b, 8);
    }
    void align() { put(0, (8 - mBits % 8) % 8); }
    size_t bitCount() const { return mBits; }
    const Bytes& bytes() const { return mBytes; }

private:
    Bytes mBytes;
    size_t mBits = 0;
};

struct PesChunk {
    Bytes es;
    uint64_t pts = 0;
};

// Appends one PESData record carrying `es` with `pts`. Returns false when the ring has
// no room (after its one wait). `streamId` goes into the PES header.
bool writePesRecord(RingBuffer& ring, const Bytes& es, uint64_t pts, uint8_t streamId = 0xE0);

// Appends a record whose header fields are written as given (mSize, mOffsetES,
// mSizeES), with `bytes` after the 40-byte header: for inconsistent records.
bool writeRawRecord(RingBuffer& ring, uint32_t size, uint32_t offsetES, uint32_t sizeES,
                    uint64_t pts, const Bytes& bytes);

// Chunks of `size` bytes; chunk i carries the PTS `firstPts` + i x `ptsStep`.
std::vector<PesChunk> fixedCuts(const Bytes& es, size_t size, uint64_t firstPts, uint64_t ptsStep);
// `perPes` units in each chunk; a chunk's PTS is `firstPts` + (index of its first unit)
// x `ptsStep`.
std::vector<PesChunk> groupCuts(const std::vector<Bytes>& units, size_t perPes, uint64_t firstPts,
                                uint64_t ptsStep);
Bytes joinEs(const std::vector<PesChunk>& chunks);
Bytes concat(std::initializer_list<Bytes> parts);

// One unit as an extractor delivered it.
struct ExtractedUnit {
    Bytes bytes;
    long long pts = 0;
    unsigned char flags = 0;
    bool operator==(const ExtractedUnit&) const = default;
};
// Prints as its golden-dump line.
void PrintTo(const ExtractedUnit& unit, std::ostream* os);
// The bytes of each unit: an extractor's, libavcodec's parser's or a demuxer's.
template <typename Unit = ExtractedUnit>
std::vector<Bytes> bytesOf(const std::vector<Unit>& units) {
    std::vector<Bytes> out;
    for (const Unit& unit : units)
        out.push_back(unit.bytes);
    return out;
}

// Empty when `got` equals `want`, else which unit first differs and how.
std::string firstDifference(const std::vector<ExtractedUnit>& got,
                            const std::vector<ExtractedUnit>& want);

// One getDecodableUnit call into `out`; a delivered unit is appended to *units.
unsigned int pullUnit(MediaExtractor& extractor, Bytes& out, std::vector<ExtractedUnit>* units);

// Feeds `chunks` as PESData records into `ring` (writing only while the ring has room,
// so one thread can do both sides) and collects every unit `extractor` delivers until
// it reports that no input is left.
std::vector<ExtractedUnit> runExtractor(MediaExtractor& extractor, RingBuffer& ring,
                                        const std::vector<PesChunk>& chunks,
                                        size_t outputSize = 4u << 20);

// Calls getDecodableUnit until `idleCalls` calls in a row found no input (the ring is
// drained) or the ring faults, collecting what came out.
std::vector<ExtractedUnit> drain(MediaExtractor& extractor, size_t outputSize = 8192,
                                 int idleCalls = 3);

// Writes the 188-byte packets of `pid` from `ts` into `input` in batches, as the
// receiver does, until all are written or `deadline` passes.
void feedPid(RingBuffer& input, const Bytes& ts, uint16_t pid,
             std::chrono::steady_clock::time_point deadline);

// Empty when the records the system's TS parser module of `kind` writes for the packets
// of `pid` bring an extractor made by `make` the units of every PES of `pid` but the last
// (the parser emits a PES only when the next one starts), else the first difference.
using ExtractorFactory =
    std::function<android::sp<MediaExtractor>(const android::sp<RingBuffer>& input)>;
std::string tsParserPathDifference(const Bytes& ts, uint16_t pid, int kind,
                                   const ExtractorFactory& make);

// The PES packets of `pid` in a transport stream (ISO/IEC 13818-1, 2.4.3.2 and
// 2.4.3.6), each as its ES payload (bounded by PES_packet_length when given) with its
// PTS (the last PTS seen when a packet has none). A small, independent splitter.
std::vector<PesChunk> pesFromTs(const Bytes& ts, uint16_t pid);

// libavcodec's parser for `codecId` (an AVCodecID) over a whole elementary stream.
struct ParsedUnit {
    Bytes bytes;
    bool key = false;
};
std::vector<ParsedUnit> ffmpegParse(const Bytes& es, int codecId);

// One line per unit: "pts=<90 kHz> flags=<n> size=<bytes> fnv=<FNV-1a 64 of the bytes>".
std::string goldenDump(const std::vector<ExtractedUnit>& units);

// Compares `dump` with tests/decoder/golden/<name>; with TAVO_UPDATE_GOLDEN=1 in the
// environment, (re)writes that file instead. Returns an empty string when they agree,
// else the first line where they differ.
std::string compareGolden(const std::string& name, const std::string& dump);

// Path of a sample stream in the shared folder, empty when it is absent.
std::string sampleStream(const std::string& name);

// Runs the project's stream generator with `arguments` and returns the stream it wrote;
// empty when the generator is not built or fails.
Bytes runTsgen(const std::string& arguments);

}  // namespace TavoPlayer::test
