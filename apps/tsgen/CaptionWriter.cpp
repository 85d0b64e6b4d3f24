#include "CaptionWriter.h"

#include <algorithm>
#include <cmath>
#include <cstdio>

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

int hexDigit(char c) {
    if (c >= '0' && c <= '9') {
        return c - '0';
    }
    if (c >= 'a' && c <= 'f') {
        return c - 'a' + 10;
    }
    if (c >= 'A' && c <= 'F') {
        return c - 'A' + 10;
    }
    return -1;
}

void appendUtf8CodePoint(uint32_t cp, std::vector<uint8_t>& bytes, bool& ok) {
    // ABNT NBR 15606-1 Latin set: ISO 8859-1 positions, with the ISO 8859-15
    // replacements for the euro sign and the Š, š, Ž, ž, Œ, œ, Ÿ letters.
    static const struct {
        uint32_t codePoint;
        uint8_t code;
    } kReplacements[] = {{0x20AC, 0xA4}, {0x0160, 0xA6}, {0x0161, 0xA8}, {0x017D, 0xB4},
                         {0x017E, 0xB8}, {0x0152, 0xBC}, {0x0153, 0xBD}, {0x0178, 0xBE}};
    for (const auto& r : kReplacements) {
        if (r.codePoint == cp) {
            bytes.push_back(r.code);
            return;
        }
    }
    if (cp < 0x100) {
        bytes.push_back(static_cast<uint8_t>(cp));
        return;
    }
    ok = false;
}

}  // namespace

bool CaptionWriter::encodeText(const std::string& text, std::vector<uint8_t>& bytes,
                               std::string& error) {
    bytes.clear();
    size_t i = 0;
    while (i < text.size()) {
        const auto c = static_cast<uint8_t>(text[i]);
        if (c == '\\') {
            if (i + 1 >= text.size()) {
                error = "caption text ends with a lone backslash";
                return false;
            }
            const char e = text[i + 1];
            if (e == 'x') {
                const int high = i + 3 < text.size() ? hexDigit(text[i + 2]) : -1;
                const int low = i + 3 < text.size() ? hexDigit(text[i + 3]) : -1;
                if (high < 0 || low < 0) {
                    error = "bad \\x escape in caption text (two hex digits expected)";
                    return false;
                }
                bytes.push_back(static_cast<uint8_t>(high * 16 + low));
                i += 4;
                continue;
            }
            if (e == 'n') {
                bytes.push_back(0x0D);  // APR: first position of the next row
            } else if (e == 'f') {
                bytes.push_back(0x0C);  // CS: clear screen
            } else if (e == '\\') {
                bytes.push_back('\\');
            } else {
                error = std::string("unknown escape \\") + e + " in caption text";
                return false;
            }
            i += 2;
            continue;
        }
        uint32_t cp = c;
        int extra = 0;
        if (c >= 0xF0) {
            cp = c & 0x07;
            extra = 3;
        } else if (c >= 0xE0) {
            cp = c & 0x0F;
            extra = 2;
        } else if (c >= 0xC0) {
            cp = c & 0x1F;
            extra = 1;
        } else if (c >= 0x80) {
            error = "caption text is not valid UTF-8";
            return false;
        }
        if (i + extra >= text.size() + (extra ? 0 : 1)) {
            error = "caption text is not valid UTF-8";
            return false;
        }
        for (int k = 1; k <= extra; ++k) {
            const auto cc = static_cast<uint8_t>(text[i + k]);
            if ((cc & 0xC0) != 0x80) {
                error = "caption text is not valid UTF-8";
                return false;
            }
            cp = (cp << 6) | (cc & 0x3F);
        }
        bool ok = true;
        appendUtf8CodePoint(cp, bytes, ok);
        if (!ok) {
            char name[16];
            snprintf(name, sizeof(name), "U+%04X", cp);
            error = std::string("caption character ") + name + " has no Latin caption code";
            return false;
        }
        i += 1 + extra;
    }
    return true;
}

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
