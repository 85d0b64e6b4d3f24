// Caption text as the service delivers it (32-bit code points in host order, rows
// separated by code point 10) turned into UTF-8 for a terminal. Shared by tavoctl
// and tavoplay.
#pragma once

#include <cstdint>
#include <cstring>
#include <string>

namespace tavoapps {

inline std::string captionToUtf8(const uint8_t* text, int32_t length) {
    std::string out;
    for (int32_t i = 0; i + 4 <= length; i += 4) {
        uint32_t cp;
        std::memcpy(&cp, text + i, 4);
        if (cp < 0x80) {
            out += static_cast<char>(cp);
        } else if (cp < 0x800) {
            out += static_cast<char>(0xC0 | (cp >> 6));
            out += static_cast<char>(0x80 | (cp & 0x3F));
        } else if (cp < 0x10000) {
            out += static_cast<char>(0xE0 | (cp >> 12));
            out += static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
            out += static_cast<char>(0x80 | (cp & 0x3F));
        } else if (cp < 0x110000) {
            out += static_cast<char>(0xF0 | (cp >> 18));
            out += static_cast<char>(0x80 | ((cp >> 12) & 0x3F));
            out += static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
            out += static_cast<char>(0x80 | (cp & 0x3F));
        }
    }
    return out;
}

}  // namespace tavoapps
