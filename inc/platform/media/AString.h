// AString: the platform codec API's string, as small as its users need.
#pragma once

#include <cstddef>
#include <string>

namespace android {

class AString {
public:
    AString() = default;
    AString(const char* text)
        : mText(text != nullptr ? text : "") {}        // NOLINT: implicit as the platform's
    AString(const std::string& text) : mText(text) {}  // NOLINT

    const char* c_str() const { return mText.c_str(); }
    size_t size() const { return mText.size(); }
    bool empty() const { return mText.empty(); }
    void setTo(const char* text) { mText = text != nullptr ? text : ""; }
    void clear() { mText.clear(); }
    const std::string& str() const { return mText; }

    bool operator==(const AString& other) const { return mText == other.mText; }
    bool operator==(const char* other) const { return other != nullptr && mText == other; }

private:
    std::string mText;
};

}  // namespace android
