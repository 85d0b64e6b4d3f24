#include "platform/media/AMessage.h"

namespace android {

void AMessage::setInt32(const char* name, int32_t value) {
    Item& item = mItems[name];
    item = Item{Type::Int32, value, {}, {}};
}

void AMessage::setInt64(const char* name, int64_t value) {
    Item& item = mItems[name];
    item = Item{Type::Int64, value, {}, {}};
}

void AMessage::setString(const char* name, const char* value) {
    Item& item = mItems[name];
    item = Item{Type::String, 0, value != nullptr ? value : "", {}};
}

void AMessage::setRect(const char* name, int32_t left, int32_t top, int32_t right, int32_t bottom) {
    Item& item = mItems[name];
    item = Item{Type::Rect, 0, {}, {left, top, right, bottom}};
}

bool AMessage::findInt32(const char* name, int32_t* value) const {
    const auto it = mItems.find(name);
    if (it == mItems.end() || it->second.type != Type::Int32)
        return false;
    *value = static_cast<int32_t>(it->second.number);
    return true;
}

bool AMessage::findInt64(const char* name, int64_t* value) const {
    const auto it = mItems.find(name);
    if (it == mItems.end() || it->second.type != Type::Int64)
        return false;
    *value = it->second.number;
    return true;
}

bool AMessage::findString(const char* name, AString* value) const {
    const auto it = mItems.find(name);
    if (it == mItems.end() || it->second.type != Type::String)
        return false;
    *value = AString(it->second.text);
    return true;
}

bool AMessage::findRect(const char* name, int32_t* left, int32_t* top, int32_t* right,
                        int32_t* bottom) const {
    const auto it = mItems.find(name);
    if (it == mItems.end() || it->second.type != Type::Rect)
        return false;
    *left = it->second.rect[0];
    *top = it->second.rect[1];
    *right = it->second.rect[2];
    *bottom = it->second.rect[3];
    return true;
}

sp<AMessage> AMessage::dup() const {
    sp<AMessage> copy = new AMessage();
    copy->mItems = mItems;
    return copy;
}

}  // namespace android
