#include "platform/binder/Parcel.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <limits>

#include "platform/binder/IBinder.h"

namespace android {

namespace {

// The strict-mode word a request carries before its descriptor; the platform sets
// the "gather penalties" bit in every token it writes, and readers ignore the word.
constexpr int32_t kStrictModePenaltyGather = 0x40 << 16;

constexpr size_t pad4(size_t len) {
    return (len + 3) & ~size_t{3};
}

void putLe32(uint8_t* p, uint32_t v) {
    for (int i = 0; i < 4; ++i)
        p[i] = static_cast<uint8_t>(v >> (8 * i));
}

uint32_t getLe32(const uint8_t* p) {
    return static_cast<uint32_t>(p[0]) | static_cast<uint32_t>(p[1]) << 8 |
           static_cast<uint32_t>(p[2]) << 16 | static_cast<uint32_t>(p[3]) << 24;
}

}  // namespace

Parcel::Parcel() = default;

Parcel::~Parcel() {
    freeData();
}

void Parcel::setDataPosition(size_t pos) const {
    mPos = std::min(pos, mData.size());
}

status_t Parcel::setData(const uint8_t* buffer, size_t size) {
    freeData();
    if (size > 0 && buffer == nullptr)
        return BAD_VALUE;
    mData.assign(buffer, buffer + size);
    return OK;
}

void Parcel::freeData() {
    for (const Object& object : mObjects) {
        if (object.ownsFd && object.fd >= 0)
            close(object.fd);
    }
    mObjects.clear();
    mData.clear();
    mData.shrink_to_fit();
    mPos = 0;
}

status_t Parcel::grow(size_t len, uint8_t** out) {
    const size_t padded = pad4(len);
    if (padded < len || mData.size() > std::numeric_limits<size_t>::max() - padded)
        return NO_MEMORY;
    // Writes always append: a parcel is written front to back, then read.
    const size_t at = mData.size();
    mData.resize(at + padded, 0);
    mPos = mData.size();
    *out = mData.data() + at;
    return OK;
}

const uint8_t* Parcel::take(size_t len) const {
    const size_t padded = pad4(len);
    if (padded < len || mPos > mData.size() || mData.size() - mPos < padded)
        return nullptr;
    const uint8_t* p = mData.data() + mPos;
    mPos += padded;
    return p;
}

status_t Parcel::writeInt32(int32_t value) {
    return writeUint32(static_cast<uint32_t>(value));
}

status_t Parcel::writeUint32(uint32_t value) {
    uint8_t* p = nullptr;
    const status_t err = grow(4, &p);
    if (err == OK)
        putLe32(p, value);
    return err;
}

status_t Parcel::writeInt64(int64_t value) {
    return writeUint64(static_cast<uint64_t>(value));
}

status_t Parcel::writeUint64(uint64_t value) {
    uint8_t* p = nullptr;
    const status_t err = grow(8, &p);
    if (err == OK) {
        putLe32(p, static_cast<uint32_t>(value));
        putLe32(p + 4, static_cast<uint32_t>(value >> 32));
    }
    return err;
}

status_t Parcel::write(const void* buffer, size_t len) {
    uint8_t* p = nullptr;
    const status_t err = grow(len, &p);
    if (err == OK && len > 0)
        memcpy(p, buffer, len);
    return err;
}

status_t Parcel::writeString16(const String16& str) {
    return writeString16(str.string(), str.size());
}

status_t Parcel::writeString16(const char16_t* str, size_t len) {
    if (str == nullptr)
        return writeNullString16();
    if (len > static_cast<size_t>(std::numeric_limits<int32_t>::max()) / 2 - 1)
        return BAD_VALUE;
    status_t err = writeInt32(static_cast<int32_t>(len));
    uint8_t* p = nullptr;
    if (err == OK)
        err = grow((len + 1) * 2, &p);
    if (err != OK)
        return err;
    for (size_t i = 0; i < len; ++i) {
        p[2 * i] = static_cast<uint8_t>(str[i]);
        p[2 * i + 1] = static_cast<uint8_t>(str[i] >> 8);
    }
    return OK;
}

status_t Parcel::writeNullString16() {
    return writeInt32(-1);
}

status_t Parcel::writeString8(const String8& str) {
    const size_t len = str.size();
    if (len > static_cast<size_t>(std::numeric_limits<int32_t>::max()) - 1)
        return BAD_VALUE;
    status_t err = writeInt32(static_cast<int32_t>(len));
    uint8_t* p = nullptr;
    if (err == OK)
        err = grow(len + 1, &p);
    if (err == OK && len > 0)
        memcpy(p, str.string(), len);
    return err;
}

status_t Parcel::writeCString(const char* str) {
    if (str == nullptr)
        return BAD_VALUE;
    return write(str, strlen(str) + 1);
}

status_t Parcel::writeInterfaceToken(const String16& descriptor) {
    const status_t err = writeInt32(kStrictModePenaltyGather);
    return err == OK ? writeString16(descriptor) : err;
}

status_t Parcel::writeObject(Object object, uint64_t handle) {
    uint8_t* p = nullptr;
    const status_t err = grow(kFlatObjectBytes, &p);
    if (err != OK)
        return err;
    putLe32(p, object.type);
    putLe32(p + 8, static_cast<uint32_t>(handle));
    putLe32(p + 12, static_cast<uint32_t>(handle >> 32));
    object.offset = static_cast<size_t>(p - mData.data());
    mObjects.push_back(std::move(object));
    return OK;
}

status_t Parcel::writeStrongBinder(const sp<IBinder>& binder) {
    // In the process the object itself travels; the connection that carries the
    // parcel writes the ids the peer understands (docs/protocol.md).
    const uint32_t type =
        binder != nullptr && binder->remoteBinder() != nullptr ? OBJECT_HANDLE : OBJECT_BINDER;
    return writeObject(Object{0, type, binder, -1, false}, 0);
}

status_t Parcel::writeFileDescriptor(int fd, bool takeOwnership) {
    if (fd < 0)
        return BAD_VALUE;
    return writeObject(Object{0, OBJECT_FD, nullptr, fd, takeOwnership}, 0);
}

status_t Parcel::writeDupFileDescriptor(int fd) {
    const int dup = fcntl(fd, F_DUPFD_CLOEXEC, 0);
    if (dup < 0)
        return -errno;
    const status_t err = writeFileDescriptor(dup, true);
    if (err != OK)
        close(dup);
    return err;
}

void Parcel::adoptObject(size_t offset, uint32_t type, sp<IBinder> binder, int fd) {
    mObjects.push_back(Object{offset, type, std::move(binder), fd, fd >= 0});
}

status_t Parcel::readUint32(uint32_t* value) const {
    const uint8_t* p = take(4);
    if (p == nullptr)
        return NOT_ENOUGH_DATA;
    *value = getLe32(p);
    return OK;
}

status_t Parcel::readInt32(int32_t* value) const {
    uint32_t v = 0;
    const status_t err = readUint32(&v);
    if (err == OK)
        *value = static_cast<int32_t>(v);
    return err;
}

status_t Parcel::readUint64(uint64_t* value) const {
    const uint8_t* p = take(8);
    if (p == nullptr)
        return NOT_ENOUGH_DATA;
    *value = static_cast<uint64_t>(getLe32(p)) | static_cast<uint64_t>(getLe32(p + 4)) << 32;
    return OK;
}

status_t Parcel::readInt64(int64_t* value) const {
    uint64_t v = 0;
    const status_t err = readUint64(&v);
    if (err == OK)
        *value = static_cast<int64_t>(v);
    return err;
}

int32_t Parcel::readInt32() const {
    int32_t v = 0;
    return readInt32(&v) == OK ? v : 0;
}

uint32_t Parcel::readUint32() const {
    uint32_t v = 0;
    return readUint32(&v) == OK ? v : 0;
}

int64_t Parcel::readInt64() const {
    int64_t v = 0;
    return readInt64(&v) == OK ? v : 0;
}

status_t Parcel::read(void* out, size_t len) const {
    const void* p = readInplace(len);
    if (p == nullptr)
        return NOT_ENOUGH_DATA;
    if (len > 0)
        memcpy(out, p, len);
    return OK;
}

const void* Parcel::readInplace(size_t len) const {
    return take(len);
}

status_t Parcel::readString16(String16* out, bool* isNull) const {
    const size_t start = mPos;
    int32_t len = 0;
    status_t err = readInt32(&len);
    if (err != OK)
        return err;
    if (isNull != nullptr)
        *isNull = len == -1;
    if (len == -1) {
        *out = String16();
        return OK;
    }
    const uint8_t* p = len >= 0 ? take((static_cast<size_t>(len) + 1) * 2) : nullptr;
    // The terminating unit must be there and be 0, as the platform checks.
    if (p == nullptr || p[2 * len] != 0 || p[2 * len + 1] != 0) {
        mPos = start;
        *out = String16();
        return len < 0 ? BAD_VALUE : NOT_ENOUGH_DATA;
    }
    std::vector<char16_t> units(static_cast<size_t>(len));
    for (size_t i = 0; i < units.size(); ++i)
        units[i] = static_cast<char16_t>(p[2 * i] | p[2 * i + 1] << 8);
    *out = String16(units.data(), units.size());
    return OK;
}

String16 Parcel::readString16() const {
    String16 s;
    readString16(&s);
    return s;
}

status_t Parcel::readString8(String8* out) const {
    const size_t start = mPos;
    int32_t len = 0;
    const status_t err = readInt32(&len);
    if (err != OK)
        return err;
    const uint8_t* p = len >= 0 ? take(static_cast<size_t>(len) + 1) : nullptr;
    if (p == nullptr || p[len] != 0) {
        mPos = start;
        *out = String8();
        return len < 0 ? BAD_VALUE : NOT_ENOUGH_DATA;
    }
    *out = String8(reinterpret_cast<const char*>(p), static_cast<size_t>(len));
    return OK;
}

String8 Parcel::readString8() const {
    String8 s;
    readString8(&s);
    return s;
}

const char* Parcel::readCString() const {
    if (mPos >= mData.size())
        return nullptr;
    const uint8_t* start = mData.data() + mPos;
    const void* nul = memchr(start, 0, mData.size() - mPos);
    if (nul == nullptr)
        return nullptr;
    take(static_cast<size_t>(static_cast<const uint8_t*>(nul) - start) + 1);
    return reinterpret_cast<const char*>(start);
}

bool Parcel::enforceInterface(const String16& descriptor) const {
    const size_t start = mPos;
    int32_t strictMode = 0;
    String16 name;
    bool isNull = false;
    if (readInt32(&strictMode) != OK || readString16(&name, &isNull) != OK || isNull) {
        mPos = start;
        return false;
    }
    return name == descriptor;
}

const Parcel::Object* Parcel::objectAt(size_t offset) const {
    auto it = std::lower_bound(mObjects.begin(), mObjects.end(), offset,
                               [](const Object& o, size_t off) { return o.offset < off; });
    return it != mObjects.end() && it->offset == offset ? &*it : nullptr;
}

status_t Parcel::readStrongBinder(sp<IBinder>* out) const {
    out->clear();
    const Object* object = objectAt(mPos);
    // Only an object written as one is a binder: plain data that happens to look
    // like a flat object is refused, as the platform's offset list does.
    if (object == nullptr || object->type == OBJECT_FD)
        return mPos + kFlatObjectBytes <= mData.size() ? BAD_TYPE : NOT_ENOUGH_DATA;
    take(kFlatObjectBytes);
    *out = object->binder;
    return OK;
}

sp<IBinder> Parcel::readStrongBinder() const {
    sp<IBinder> binder;
    readStrongBinder(&binder);
    return binder;
}

int Parcel::readFileDescriptor() const {
    const Object* object = objectAt(mPos);
    if (object == nullptr || object->type != OBJECT_FD)
        return mPos + kFlatObjectBytes <= mData.size() ? BAD_TYPE : NOT_ENOUGH_DATA;
    take(kFlatObjectBytes);
    return object->fd;
}

}  // namespace android
