// Writes PESData records of given elementary-stream bytes into a ring, the way the TS
// parser module lays them out: a 40-byte header, then a PES packet whose header is a
// minimal optional header with a PTS (ISO/IEC 13818-1, 2.4.3.6-7), then the ES bytes.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include <utils/StrongPointer.h>

#include "common/RingBuffer.h"

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

// Reads a whole file; empty when it cannot be read.
std::vector<uint8_t> readFile(const std::string& path);

// Runs a shell command; true when it exits with status 0.
bool runCommand(const std::string& command);

// FNV-1a 64 of the bytes, for golden dumps.
uint64_t fnv1a64(const uint8_t* data, size_t size);

}  // namespace TavoPlayer::test
