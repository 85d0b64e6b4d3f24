#include "CaptionWriter.h"

#include <algorithm>
#include <cmath>

namespace TavoPlayer::tsgen {

namespace {

constexpr uint8_t kDataIdentifier = 0x80;  // synchronized PES data (ARIB STD-B24)
constexpr uint8_t kPrivateStreamId = 0xFF;
constexpr uint8_t kGroupManagement = 0x00;      // data_group_id, group A
constexpr uint8_t kGroupStatementFirst = 0x01;  // first language, group A
constexpr uint8_t kUnitSeparator = 0x1F;
constexpr uint8_t kUnitStatementBody = 0x20;

void put24(std::vector<uint8_t>& out, size_t value) {
    out.push_back(static_cast<uint8_t>(value >> 16));
    out.push_back(static_cast<uint8_t>(value >> 8));
    out.push_back(static_cast<uint8_t>(value));
}

std::vector<uint8_t> pesDataPacket(uint8_t dataGroupId, const std::vector<uint8_t>& groupData) {
    std::vector<uint8_t> group;
    group.push_back(static_cast<uint8_t>(dataGroupId << 2));  // data_group_version 0
    group.push_back(0);                                       // data_group_link_number
    group.push_back(0);                                       // last_data_group_link_number
    group.push_back(static_cast<uint8_t>(groupData.size() >> 8));
    group.push_back(static_cast<uint8_t>(groupData.size()));
    group.insert(group.end(), groupData.begin(), groupData.end());
    const uint16_t crc = CaptionWriter::crc16(group.data(), group.size());
    group.push_back(static_cast<uint8_t>(crc >> 8));
    group.push_back(static_cast<uint8_t>(crc));

    std::vector<uint8_t> out;
    out.push_back(kDataIdentifier);
    out.push_back(kPrivateStreamId);
    out.push_back(0xF0);  // reserved_future_use, PES_data_packet_header_length 0
    out.insert(out.end(), group.begin(), group.end());
    return out;
}

}  // namespace

uint16_t CaptionWriter::crc16(const uint8_t* data, size_t size) {
    uint16_t crc = 0;
    for (size_t i = 0; i < size; ++i) {
        crc ^= static_cast<uint16_t>(data[i] << 8);
        for (int bit = 0; bit < 8; ++bit) {
            crc = (crc & 0x8000) ? static_cast<uint16_t>((crc << 1) ^ 0x1021)
                                 : static_cast<uint16_t>(crc << 1);
        }
    }
    return crc;
}

std::vector<uint8_t> CaptionWriter::managementPayload() {
    // caption_management_data (ARIB STD-B24 Vol. 1 Part 3, 9.3.1), one language.
    std::vector<uint8_t> d;
    d.push_back(0x3F);  // TMD 00 (free), reserved
    d.push_back(1);     // num_languages
    d.push_back(0x03);  // language_tag 0, reserved, DMF 0011 (automatic display)
    d.push_back('p');   // ISO_639_language_code "por"
    d.push_back('o');
    d.push_back('r');
    // Format 0000 (horizontal, standard density), TCS 00 (8-bit codes), rollup_mode 00.
    d.push_back(0x00);
    put24(d, 0);  // data_unit_loop_length: no data units
    return pesDataPacket(kGroupManagement, d);
}

std::vector<uint8_t> CaptionWriter::statementPayload(const std::vector<uint8_t>& text) {
    // caption_data (ARIB STD-B24 Vol. 1 Part 3, 9.3.2) with one data_unit (9.4).
    std::vector<uint8_t> d;
    d.push_back(0x3F);  // TMD 00: presented at the PTS, no STM field
    put24(d, 5 + text.size());
    d.push_back(kUnitSeparator);
    d.push_back(kUnitStatementBody);
    put24(d, text.size());
    d.insert(d.end(), text.begin(), text.end());
    return pesDataPacket(kGroupStatementFirst, d);
}

CaptionWriter::CaptionWriter(const Options& options) {
    if (!options.captionStream) {
        return;
    }
    const auto toPts = [&](double sec) {
        return options.startPts + static_cast<int64_t>(std::llround(sec * 90000.0));
    };
    // Management data first and then at a fixed period, as receivers expect it
    // before any statement.
    for (double t = 0; t < options.durationSec; t += options.captionManagementIntervalSec) {
        mEvents.push_back(Event{toPts(t), true, {}});
    }
    for (const auto& c : options.captions) {
        if (c.timeSec <= options.durationSec) {
            mEvents.push_back(Event{toPts(c.timeSec), false, c.bytes});
        }
    }
    // Stable: at equal times management goes before statements, statements in
    // command-line order.
    std::stable_sort(mEvents.begin(), mEvents.end(), [](const Event& a, const Event& b) {
        return a.pts < b.pts || (a.pts == b.pts && a.management && !b.management);
    });
}

int CaptionWriter::next(PesUnit& unit) {
    if (mNext >= mEvents.size()) {
        return 1;
    }
    const Event& e = mEvents[mNext++];
    unit.payload = e.management ? managementPayload() : statementPayload(e.text);
    unit.pts = e.pts;
    unit.dts = e.pts;
    unit.hasDts = false;
    unit.randomAccess = true;
    return 0;
}

}  // namespace TavoPlayer::tsgen
