#include "PesRecordTestUtil.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <new>

#include "common/data/PESData.h"
#include "support/ParseTs.h"
#include "support/PesBuilder.h"
#include "support/TsReader.h"
#include "tsparser/TSParser.h"

extern "C" {
#include <libavcodec/avcodec.h>
}

namespace TavoPlayer::test {

namespace {

// FNV-1a 64 of the bytes, for golden dumps.
uint64_t fnv1a64(const uint8_t* data, size_t size) {
    uint64_t hash = 0xcbf29ce484222325ull;
    for (size_t i = 0; i < size; ++i)
        hash = (hash ^ data[i]) * 0x100000001b3ull;
    return hash;
}

}  // namespace

void BitSink::put(uint32_t value, unsigned int bits) {
    for (unsigned int i = bits; i-- > 0; ++mBits) {
        if (mBits % 8 == 0)
            mBytes.push_back(0);
        if (i < 32 && ((value >> i) & 1u))  // fields wider than 32 bits are zero-extended
            mBytes.back() |= static_cast<uint8_t>(0x80u >> (mBits % 8));
    }
}

bool writeRawRecord(RingBuffer& ring, uint32_t size, uint32_t offsetES, uint32_t sizeES,
                    uint64_t pts, const Bytes& bytes) {
    const uint32_t footprint =
        RingBuffer::roundUp4(PESData::kHeaderSize + static_cast<uint32_t>(bytes.size()));
    if (!ring.waitForSpace(footprint))
        return false;
    uint8_t* at = ring.writePointer();
    auto* record = new (at) PESData();
    record->mSize = size;
    record->mOffsetES = offsetES;
    record->mSizeES = sizeES;
    record->mPTS = record->mDTS = pts;
    std::copy(bytes.begin(), bytes.end(), at + PESData::kHeaderSize);
    // The ring advances by what was really written, whatever mSize says.
    ring.commitWrite(footprint);
    return true;
}

bool writePesRecord(RingBuffer& ring, const Bytes& es, uint64_t pts, uint8_t streamId) {
    const uint64_t p = pts & 0x1FFFFFFFFull;
    const Bytes pes = PesBuilder(streamId).pts(p).payload(es).build();
    return writeRawRecord(ring, PESData::kHeaderSize + static_cast<uint32_t>(pes.size()),
                          PESData::kHeaderSize + 14, static_cast<uint32_t>(es.size()), p, pes);
}

std::vector<PesChunk> fixedCuts(const Bytes& es, size_t size, uint64_t firstPts, uint64_t ptsStep) {
    std::vector<PesChunk> chunks;
    for (size_t at = 0; at < es.size(); at += size) {
        const auto end = es.begin() + static_cast<long>(std::min(at + size, es.size()));
        chunks.push_back(
            {Bytes(es.begin() + static_cast<long>(at), end), firstPts + chunks.size() * ptsStep});
    }
    return chunks;
}

std::vector<PesChunk> groupCuts(const std::vector<Bytes>& units, size_t perPes, uint64_t firstPts,
                                uint64_t ptsStep) {
    std::vector<PesChunk> chunks;
    for (size_t i = 0; i < units.size(); ++i) {
        if (i % perPes == 0)
            chunks.push_back({{}, firstPts + i * ptsStep});
        chunks.back().es.insert(chunks.back().es.end(), units[i].begin(), units[i].end());
    }
    return chunks;
}

Bytes joinEs(const std::vector<PesChunk>& chunks) {
    Bytes es;
    for (const PesChunk& chunk : chunks)
        es.insert(es.end(), chunk.es.begin(), chunk.es.end());
    return es;
}

Bytes concat(std::initializer_list<Bytes> parts) {
    Bytes out;
    for (const Bytes& part : parts)
        out.insert(out.end(), part.begin(), part.end());
    return out;
}

void PrintTo(const ExtractedUnit& unit, std::ostream* os) {
    *os << goldenDump({unit});
}

std::string firstDifference(const std::vector<ExtractedUnit>& got,
                            const std::vector<ExtractedUnit>& want) {
    const auto [g, w] = std::mismatch(got.begin(), got.end(), want.begin(), want.end());
    if (g == got.end() && w == want.end())
        return {};
    const auto describe = [](auto it, const auto& units) {
        return it == units.end() ? std::string("<none>") : goldenDump({*it});
    };
    return "unit " + std::to_string(g - got.begin()) + " of " + std::to_string(got.size()) +
           " (want " + std::to_string(want.size()) + "): got " + describe(g, got) + " want " +
           describe(w, want);
}

unsigned int pullUnit(MediaExtractor& extractor, Bytes& out, std::vector<ExtractedUnit>* units) {
    unsigned long length = 0;
    long long pts = 0;
    unsigned char flags = 0;
    const unsigned int result =
        extractor.getDecodableUnit(out.data(), out.size(), &length, &pts, &flags);
    if (result == MediaExtractor::RESULT_OK && length > 0)
        units->push_back({Bytes(out.begin(), out.begin() + static_cast<long>(length)), pts, flags});
    return result;
}

namespace {

// Writes the records with `write`, pulling units whenever the ring has no room for the
// next one (so one thread can do both sides), then pulls until no input is left.
std::vector<ExtractedUnit> feedAndPull(MediaExtractor& extractor, RingBuffer& ring, size_t count,
                                       const std::function<uint32_t(size_t)>& footprint,
                                       const std::function<void(size_t)>& write,
                                       size_t outputSize) {
    std::vector<ExtractedUnit> units;
    Bytes out(outputSize);
    for (size_t i = 0; i < count; ++i) {
        while (ring.freeSpace() < footprint(i) && pullUnit(extractor, out, &units) == 0) {
        }
        write(i);
    }
    while (pullUnit(extractor, out, &units) == MediaExtractor::RESULT_OK) {
    }
    return units;
}

}  // namespace

std::vector<ExtractedUnit> runExtractor(MediaExtractor& extractor, RingBuffer& ring,
                                        const std::vector<PesChunk>& chunks, size_t outputSize) {
    return feedAndPull(
        extractor, ring, chunks.size(),
        [&](size_t i) {
            return RingBuffer::roundUp4(PESData::kHeaderSize + 14 +
                                        static_cast<uint32_t>(chunks[i].es.size()));
        },
        [&](size_t i) { writePesRecord(ring, chunks[i].es, chunks[i].pts); }, outputSize);
}

std::vector<ExtractedUnit> drain(MediaExtractor& extractor, size_t outputSize, int idleCalls) {
    std::vector<ExtractedUnit> units;
    Bytes out(outputSize);
    for (int idle = 0; idle < idleCalls;) {
        const size_t before = units.size();
        const unsigned int result = pullUnit(extractor, out, &units);
        if (result == MediaExtractor::RESULT_RING_FAULT)
            break;
        idle = (result == MediaExtractor::RESULT_NO_INPUT && units.size() == before) ? idle + 1 : 0;
    }
    return units;
}

void feedPid(RingBuffer& input, const Bytes& ts, uint16_t pid,
             std::chrono::steady_clock::time_point deadline) {
    const Bytes packets = bytesOfPid(ts, pid);
    for (size_t at = 0; at < packets.size() && std::chrono::steady_clock::now() < deadline;) {
        const auto size = static_cast<uint32_t>(std::min<size_t>(64 * 188, packets.size() - at));
        if (input.waitForSpace(size)) {
            std::memcpy(input.writePointer(), packets.data() + at, size);
            input.commitWrite(size);
            at += size;
        }
    }
}

std::string tsParserPathDifference(const Bytes& ts, uint16_t pid, int kind,
                                   const ExtractorFactory& make) {
    std::vector<PesChunk> chunks = pesFromTs(ts, pid);
    chunks.pop_back();
    android::sp<RingBuffer> ring = makeRing("PES", 1u << 22);
    const std::vector<ExtractedUnit> expected = runExtractor(*make(ring), *ring, chunks);
    const std::vector<PesRecord> records = parseTs(bytesOfPid(ts, pid), kind);
    ring = makeRing("PES", 1u << 22);
    const std::vector<ExtractedUnit> units = feedAndPull(
        *make(ring), *ring, records.size(),
        [&](size_t i) { return RingBuffer::roundUp4(records[i].size); },
        [&](size_t i) {
            const PesRecord& r = records[i];
            writeRawRecord(*ring, r.size, r.offsetES, r.sizeES, r.pts, r.pes);
        },
        4u << 20);
    return firstDifference(units, expected);
}

std::vector<PesChunk> pesFromTs(const Bytes& ts, uint16_t pid) {
    std::vector<PesChunk> chunks;
    uint64_t lastPts = 0;
    for (Pes& pes : TsFile(ts).pesOf(pid)) {
        lastPts = pes.hasPts ? static_cast<uint64_t>(pes.pts) : lastPts;
        chunks.push_back({std::move(pes.payload), lastPts});
    }
    return chunks;
}

std::vector<ParsedUnit> ffmpegParse(const Bytes& es, int codecId) {
    std::vector<ParsedUnit> units;
    AVCodecParserContext* parser = av_parser_init(codecId);
    AVCodecContext* context = avcodec_alloc_context3(nullptr);
    const uint8_t* data = es.data();
    for (int left = static_cast<int>(es.size());;) {
        uint8_t* out = nullptr;
        int outSize = 0;
        const int used = av_parser_parse2(parser, context, &out, &outSize, data, left,
                                          AV_NOPTS_VALUE, AV_NOPTS_VALUE, 0);
        if (outSize > 0)
            units.push_back({Bytes(out, out + outSize), parser->key_frame == 1});
        if (left == 0 && outSize == 0)
            break;
        data += used;
        left -= used;
    }
    avcodec_free_context(&context);
    av_parser_close(parser);
    return units;
}

std::string goldenDump(const std::vector<ExtractedUnit>& units) {
    std::string dump;
    char line[128];
    for (const ExtractedUnit& unit : units) {
        std::snprintf(
            line, sizeof line, "pts=%lld flags=%u size=%zu fnv=%016llx\n", unit.pts,
            static_cast<unsigned>(unit.flags), unit.bytes.size(),
            static_cast<unsigned long long>(fnv1a64(unit.bytes.data(), unit.bytes.size())));
        dump += line;
    }
    return dump;
}

std::string compareGolden(const std::string& name, const std::string& dump) {
    const std::string path = std::string(TAVO_SOURCE_DIR) + "/tests/decoder/golden/" + name;
    const char* update = std::getenv("TAVO_UPDATE_GOLDEN");
    if (update != nullptr && std::string(update) == "1") {
        std::ofstream(path, std::ios::binary | std::ios::trunc) << dump;
        return {};
    }
    const std::string expected = fileText(path);
    if (expected == dump)
        return {};
    const auto at = std::mismatch(expected.begin(), expected.end(), dump.begin(), dump.end()).first;
    return path + " differs from line " +
           std::to_string(1 + std::count(expected.begin(), at, '\n')) +
           " (TAVO_UPDATE_GOLDEN=1 rewrites it after an intended change)";
}

std::string sampleStream(const std::string& name) {
    const std::string path = std::string(TAVO_SHARED_STREAMS_DIR) + "/" + name;
    return std::filesystem::exists(path) ? path : std::string();
}

Bytes runTsgen(const std::string& arguments) {
#ifdef TAVO_TSGEN_PATH
    const TempDir dir("tavo_tsgen");
    const std::string path = dir / "stream.ts";
    const bool ok =
        runCommand(std::string(TAVO_TSGEN_PATH) + " -o '" + path + "' " + arguments).exitCode == 0;
    return ok ? fileBytes(path) : Bytes();
#else
    (void)arguments;
    return {};
#endif
}

}  // namespace TavoPlayer::test
