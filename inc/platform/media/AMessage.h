// AMessage: a bag of named values, used here as the platform codec's media format
// ("mime", "width", "height", "sample-rate", "channel-count", "color-format",
// "crop", ...). A message handed between threads is not modified after it is
// handed over (the codec publishes a new message for each new output format), so it
// carries no lock.
#pragma once

#include <cstdint>
#include <map>
#include <string>

#include <utils/RefBase.h>
#include <utils/StrongPointer.h>

#include "platform/media/AString.h"

namespace android {

class AMessage : public RefBase {
public:
    AMessage() = default;

    void setInt32(const char* name, int32_t value);
    void setInt64(const char* name, int64_t value);
    void setString(const char* name, const char* value);
    void setString(const char* name, const AString& value) { setString(name, value.c_str()); }
    // A rectangle with inclusive right and bottom, as the platform's "crop" is.
    void setRect(const char* name, int32_t left, int32_t top, int32_t right, int32_t bottom);

    // Each find fails (false, output untouched) when the name is absent or holds a
    // value of another type.
    bool findInt32(const char* name, int32_t* value) const;
    bool findInt64(const char* name, int64_t* value) const;
    bool findString(const char* name, AString* value) const;
    bool findRect(const char* name, int32_t* left, int32_t* top, int32_t* right,
                  int32_t* bottom) const;
    bool contains(const char* name) const { return mItems.count(name) != 0; }
    size_t countEntries() const { return mItems.size(); }

    sp<AMessage> dup() const;
    void clear() { mItems.clear(); }

private:
    enum class Type { Int32, Int64, String, Rect };
    struct Item {
        Type type;
        int64_t number = 0;
        std::string text;
        int32_t rect[4] = {0, 0, 0, 0};
    };
    std::map<std::string, Item> mItems;
};

}  // namespace android
