#include "support/CaptionBuilder.h"

#include <algorithm>
#include <cstring>
#include <new>

#include "common/data/ClosedCaptionFragmentData.h"

namespace TavoPlayer::test {
namespace {

void put24(Bytes& out, size_t value) {
    out.push_back(static_cast<uint8_t>(value >> 16));
    out.push_back(static_cast<uint8_t>(value >> 8));
    out.push_back(static_cast<uint8_t>(value));
}

}  // namespace

Bytes captionEs(const Bytes& unit, const CaptionUnitOptions& options) {
    Bytes data;
    data.push_back(static_cast<uint8_t>(options.timeControlMode << 6 | 0x3F));
    if (options.timeControlMode == 1 || options.timeControlMode == 2)
        data.insert(data.end(), {0x00, 0x00, 0x01, 0x00, 0x00});  // STM 00:00:01.000
    put24(data, 5 + unit.size());
    data.push_back(options.separator);
    data.push_back(options.unitParameter);
    put24(data, options.declaredSize < 0 ? unit.size() : static_cast<size_t>(options.declaredSize));
    data.insert(data.end(), unit.begin(), unit.end());

    Bytes es = {options.dataIdentifier, 0xFF, static_cast<uint8_t>(0xF0 | options.headerLength)};
    es.insert(es.end(), options.headerLength, 0xFF);
    // Data group: statement data of the first language, version 0, no links.
    es.insert(es.end(), {0x04, 0x00, 0x00, static_cast<uint8_t>(data.size() >> 8),
                         static_cast<uint8_t>(data.size())});
    es.insert(es.end(), data.begin(), data.end());
    es.insert(es.end(), {0x00, 0x00});  // CRC_16, not checked by the decoder
    return es;
}

Bytes bytesOf(const std::string& text) {
    return Bytes(text.begin(), text.end());
}

OwnedPesRecord::OwnedPesRecord(const Bytes& es, uint64_t pts)
    : mBytes(new uint8_t[PESData::kHeaderSize + es.size()]) {
    PESData header;
    header.mSize = static_cast<uint32_t>(PESData::kHeaderSize + es.size());
    header.mPTS = pts;
    header.mOffsetES = PESData::kHeaderSize;
    header.mSizeES = static_cast<uint32_t>(es.size());
    memcpy(mBytes.get(), static_cast<const void*>(&header), PESData::kHeaderSize);
    std::copy(es.begin(), es.end(), mBytes.get() + PESData::kHeaderSize);
}

std::u32string toU32(const unsigned char* bytes, int length) {
    std::u32string text(static_cast<size_t>(length) / 4, U'\0');
    if (!text.empty())
        memcpy(text.data(), bytes, text.size() * 4);
    return text;
}

std::vector<CaptionRecord> drainCaptions(RingBuffer& ring) {
    std::vector<CaptionRecord> out;
    while (ring.usedSpace() >= ClosedCaptionFragmentData::kHeaderSize &&
           ring.waitForData(ClosedCaptionFragmentData::kHeaderSize)) {
        auto* record = reinterpret_cast<ClosedCaptionFragmentData*>(ring.readPointer());
        CaptionRecord r;
        r.size = record->mSize;
        r.pts = record->mPTS;
        r.text = toU32(record->textBytes(), static_cast<int>(record->mSize - 32));
        out.push_back(r);
        ring.consume(record->mSize);
    }
    return out;
}

bool writeCaption(RingBuffer& ring, const std::u32string& text, uint64_t pts) {
    const auto size =
        static_cast<uint32_t>(ClosedCaptionFragmentData::kHeaderSize + text.size() * 4);
    if (!ring.waitForSpace(size))
        return false;
    auto* record = new (ring.writePointer()) ClosedCaptionFragmentData();
    record->mSize = size;
    record->mPTS = pts;
    memcpy(record->textBytes(), text.data(), text.size() * 4);  // data() is never null
    ring.commitWrite(size);
    return true;
}

std::vector<Bytes> splitCaptionEs(const Bytes& es) {
    std::vector<Bytes> units;
    for (size_t at = 0, end = 0; at < es.size(); at = end) {
        const size_t group = at + 3 + (es.size() > at + 2 ? es[at + 2] & 0x0F : 0);
        end = es.size();
        // PES_data_packet header, data group header with its 16-bit size, CRC_16; what
        // does not parse is the last unit.
        if (es[at] == 0x80 && group + 5 <= es.size())
            end = std::min(end, group + 5 + (size_t{es[group + 3]} << 8 | es[group + 4]) + 2);
        units.emplace_back(es.begin() + static_cast<long>(at), es.begin() + static_cast<long>(end));
    }
    return units;
}

}  // namespace TavoPlayer::test
