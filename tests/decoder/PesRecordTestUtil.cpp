#include "PesRecordTestUtil.h"

#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>
#include <new>

#include "common/data/PESData.h"

namespace TavoPlayer::test {

android::sp<RingBuffer> makeRing(unsigned int log2Size, const std::string& name) {
    android::sp<RingBuffer> ring = new RingBuffer();
    if (ring->configure(name, log2Size) != 0) {
        return nullptr;
    }
    return ring;
}

bool writePesRecord(RingBuffer& ring, const uint8_t* es, size_t esSize, uint64_t pts,
                    uint8_t streamId) {
    // PES header: prefix, stream_id, PES_packet_length, flags '10' 00 0 0 0 0,
    // PTS_DTS_flags '10', header length 5, then the 5-byte PTS.
    constexpr uint32_t kPesHeader = 14;
    const uint32_t pesSize = kPesHeader + static_cast<uint32_t>(esSize);
    const uint32_t recordSize = PESData::kHeaderSize + pesSize;
    if (!ring.waitForSpace(RingBuffer::roundUp4(recordSize))) {
        return false;
    }
    uint8_t* at = ring.writePointer();
    auto* record = new (at) PESData();
    record->mSize = recordSize;
    record->mPTS = pts & 0x1FFFFFFFFull;
    record->mDTS = record->mPTS;
    record->mSizeES = static_cast<uint32_t>(esSize);
    record->mOffsetES = recordSize - record->mSizeES;
    uint8_t* pes = at + PESData::kHeaderSize;
    const uint32_t packetLength = pesSize > 6 + 0xFFFF ? 0 : pesSize - 6;
    const uint64_t p = record->mPTS;
    const uint8_t header[kPesHeader] = {0x00,
                                        0x00,
                                        0x01,
                                        streamId,
                                        static_cast<uint8_t>(packetLength >> 8),
                                        static_cast<uint8_t>(packetLength),
                                        0x80,
                                        0x80,
                                        0x05,
                                        static_cast<uint8_t>(0x21 | ((p >> 29) & 0x0E)),
                                        static_cast<uint8_t>(p >> 22),
                                        static_cast<uint8_t>(((p >> 14) & 0xFE) | 1),
                                        static_cast<uint8_t>(p >> 7),
                                        static_cast<uint8_t>(((p << 1) & 0xFE) | 1)};
    std::memcpy(pes, header, kPesHeader);
    if (esSize > 0) {
        std::memcpy(pes + kPesHeader, es, esSize);
    }
    ring.commitWrite(recordSize);
    return true;
}

bool writeRawRecord(RingBuffer& ring, uint32_t size, uint32_t offsetES, uint32_t sizeES,
                    uint64_t pts, const std::vector<uint8_t>& bytes) {
    const uint32_t footprint =
        RingBuffer::roundUp4(PESData::kHeaderSize + static_cast<uint32_t>(bytes.size()));
    if (!ring.waitForSpace(footprint)) {
        return false;
    }
    uint8_t* at = ring.writePointer();
    auto* record = new (at) PESData();
    record->mSize = size;
    record->mOffsetES = offsetES;
    record->mSizeES = sizeES;
    record->mPTS = pts;
    record->mDTS = pts;
    if (!bytes.empty()) {
        std::memcpy(at + PESData::kHeaderSize, bytes.data(), bytes.size());
    }
    // The ring advances by what was really written, whatever mSize says.
    ring.commitWrite(footprint);
    return true;
}

std::vector<PesChunk> cutAt(const std::vector<uint8_t>& es, const std::vector<size_t>& offsets,
                            const std::vector<uint64_t>& ptsOf) {
    std::vector<PesChunk> chunks;
    for (size_t i = 0; i < offsets.size(); ++i) {
        const size_t begin = offsets[i];
        const size_t end = (i + 1 < offsets.size()) ? offsets[i + 1] : es.size();
        PesChunk chunk;
        chunk.es.assign(es.begin() + static_cast<long>(begin), es.begin() + static_cast<long>(end));
        chunk.pts = i < ptsOf.size() ? ptsOf[i] : 0;
        chunks.push_back(std::move(chunk));
    }
    return chunks;
}

std::vector<uint8_t> readFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    if (!in) {
        return {};
    }
    return std::vector<uint8_t>(std::istreambuf_iterator<char>(in), {});
}

bool runCommand(const std::string& command) {
    return std::system(command.c_str()) == 0;
}

uint64_t fnv1a64(const uint8_t* data, size_t size) {
    uint64_t hash = 0xcbf29ce484222325ull;
    for (size_t i = 0; i < size; ++i) {
        hash ^= data[i];
        hash *= 0x100000001b3ull;
    }
    return hash;
}

}  // namespace TavoPlayer::test
