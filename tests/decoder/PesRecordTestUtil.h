// Writes PESData records of given elementary-stream bytes into a ring, the way the TS
// parser module lays them out: a 40-byte header, then a PES packet whose header is a
// minimal optional header with a PTS (ISO/IEC 13818-1, 2.4.3.6-7), then the ES bytes.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include <utils/StrongPointer.h>

#include "common/RingBuffer.h"
#include "decoder/MediaExtractor.h"

namespace TavoPlayer::test {

struct PesChunk {
    std::vector<uint8_t> es;
    uint64_t pts = 0;
};

// A configured ring of 2^log2Size bytes (the name only shows up in logs).
android::sp<RingBuffer> makeRing(unsigned int log2Size = 20, const std::string& name = "TestPES");

// Appends one PESData record carrying `es` with `pts`. Returns false when the ring has
// no room (after its one wait). `streamId` goes into the PES header.
bool writePesRecord(RingBuffer& ring, const uint8_t* es, size_t esSize, uint64_t pts,
                    uint8_t streamId = 0xE0);
inline bool writePesRecord(RingBuffer& ring, const std::vector<uint8_t>& es, uint64_t pts,
                           uint8_t streamId = 0xE0) {
    return writePesRecord(ring, es.data(), es.size(), pts, streamId);
}

// Appends a record whose header fields are written as given (mSize, mOffsetES,
// mSizeES), with `bytes` after the 40-byte header: for inconsistent records.
bool writeRawRecord(RingBuffer& ring, uint32_t size, uint32_t offsetES, uint32_t sizeES,
                    uint64_t pts, const std::vector<uint8_t>& bytes);

// Cuts `es` into chunks at the given offsets (ascending, each inside es), giving the
// chunk that starts at offsets[i] the PTS ptsOf[i].
std::vector<PesChunk> cutAt(const std::vector<uint8_t>& es, const std::vector<size_t>& offsets,
                            const std::vector<uint64_t>& ptsOf);

// One unit as an extractor delivered it.
struct ExtractedUnit {
    std::vector<uint8_t> bytes;
    long long pts = 0;
    unsigned char flags = 0;
    bool operator==(const ExtractedUnit&) const = default;
};

// Feeds `chunks` as PESData records into `ring` (writing only while the ring has room,
// so one thread can do both sides) and collects every unit `extractor` delivers until
// it reports that no input is left. Results of 1 are counted in *ringFaults.
std::vector<ExtractedUnit> runExtractor(MediaExtractor& extractor, RingBuffer& ring,
                                        const std::vector<PesChunk>& chunks,
                                        size_t outputSize = 4u << 20,
                                        unsigned* ringFaults = nullptr);

// Feeds the TS packets of `pid` from `ts` (188-byte packets) through the system's TS
// parser module of `kind` into `output`, on a feeder thread, while `extractor` reads
// from `output` on this thread; returns the units once the parser has taken every
// packet and no more records come. The parser emits a PES only when the next one
// starts, so the last PES of the stream is never seen.
std::vector<ExtractedUnit> runThroughTsParser(MediaExtractor& extractor,
                                              const android::sp<RingBuffer>& output,
                                              const std::vector<uint8_t>& ts, uint16_t pid,
                                              int kind, size_t outputSize = 4u << 20);

// Re-cuts an elementary stream into PES chunks of `size` bytes; every chunk carries
// the PTS `firstPts` + index x `ptsStep`.
std::vector<PesChunk> fixedCuts(const std::vector<uint8_t>& es, size_t size, uint64_t firstPts,
                                uint64_t ptsStep);

// The PES packets of `pid` in a 188-byte-packet transport stream (ISO/IEC 13818-1,
// 2.4.3.2 and 2.4.3.6), each as its ES payload with its PTS (the last PTS seen when
// a packet has none). A small, independent splitter for test inputs only.
std::vector<PesChunk> pesFromTs(const std::vector<uint8_t>& ts, uint16_t pid,
                                size_t packetSize = 188);

// One line per unit: "pts=<90 kHz> flags=<n> size=<bytes> fnv=<FNV-1a 64 of the bytes>".
std::string goldenDump(const std::vector<ExtractedUnit>& units);

// Compares `dump` with tests/decoder/golden/<name>; with TAVO_UPDATE_GOLDEN=1 in the
// environment, (re)writes that file instead. Returns an empty string when they agree,
// else a description of the first difference.
std::string compareGolden(const std::string& name, const std::string& dump);

// Runs the project's stream generator with `arguments` and returns the stream it wrote;
// empty when the generator is not built or fails.
std::vector<uint8_t> runTsgen(const std::string& arguments);

// Reads a whole file; empty when it cannot be read.
std::vector<uint8_t> readFile(const std::string& path);

// Runs a shell command; true when it exits with status 0.
bool runCommand(const std::string& command);

// FNV-1a 64 of the bytes, for golden dumps.
uint64_t fnv1a64(const uint8_t* data, size_t size);

}  // namespace TavoPlayer::test
