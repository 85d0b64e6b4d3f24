// Parcel: the container of a binder transaction's arguments and reply.
//
// The encoding is the platform binder's: little-endian 32- and 64-bit integers,
// every item padded to a multiple of 4 bytes; a 16-bit string is its length in
// UTF-16 units (-1 for a null string), the units, a 0 unit, padded to 4; an 8-bit
// string is its length in bytes, the bytes, a 0 byte, padded to 4. Binders and file
// descriptors are 24-byte flat objects in the data, with their offsets listed beside
// it; the connection that carries the parcel turns them into object ids and
// SCM_RIGHTS descriptors (docs/protocol.md).
//
// Every read checks the remaining data: a read past the end returns NOT_ENOUGH_DATA
// (or a zero/empty value from the value-returning forms) and leaves the position
// where it was. A parcel is used by one thread at a time.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include <utils/Errors.h>
#include <utils/String16.h>
#include <utils/String8.h>
#include <utils/StrongPointer.h>

namespace android {

class IBinder;
class Connection;

class Parcel {
public:
    // Flat object types, the values the binder driver uses (B_PACK_CHARS).
    enum : uint32_t {
        OBJECT_BINDER = 0x73622a85u,  // 's','b','*': an object of the sender
        OBJECT_HANDLE = 0x73682a85u,  // 's','h','*': an object of the receiver
        OBJECT_FD = 0x66642a85u,      // 'f','d','*': a file descriptor
    };
    static constexpr size_t kFlatObjectBytes = 24;

    Parcel();
    ~Parcel();
    Parcel(const Parcel&) = delete;
    Parcel& operator=(const Parcel&) = delete;

    const uint8_t* data() const { return mData.data(); }
    size_t dataSize() const { return mData.size(); }
    size_t dataPosition() const { return mPos; }
    size_t dataAvail() const { return mPos < mData.size() ? mData.size() - mPos : 0; }
    // Positions past the end are clamped to the end.
    void setDataPosition(size_t pos) const;
    // Replaces the contents by a copy of `size` plain bytes (no objects).
    status_t setData(const uint8_t* buffer, size_t size);
    // Empties the parcel, closing the descriptors it owns.
    void freeData();
    size_t objectCount() const { return mObjects.size(); }

    status_t writeInt32(int32_t value);
    status_t writeUint32(uint32_t value);
    status_t writeInt64(int64_t value);
    status_t writeUint64(uint64_t value);
    // `len` raw bytes, padded with zeros to a multiple of 4.
    status_t write(const void* buffer, size_t len);
    status_t writeString16(const String16& str);
    status_t writeString16(const char16_t* str, size_t len);
    status_t writeNullString16();
    status_t writeString8(const String8& str);
    status_t writeCString(const char* str);
    // The strict-mode word, then the descriptor, as a request's first item.
    status_t writeInterfaceToken(const String16& descriptor);
    status_t writeStrongBinder(const sp<IBinder>& binder);
    // With takeOwnership the parcel closes `fd` when it is freed.
    status_t writeFileDescriptor(int fd, bool takeOwnership = false);
    status_t writeDupFileDescriptor(int fd);

    status_t readInt32(int32_t* value) const;
    status_t readUint32(uint32_t* value) const;
    status_t readInt64(int64_t* value) const;
    status_t readUint64(uint64_t* value) const;
    int32_t readInt32() const;
    uint32_t readUint32() const;
    int64_t readInt64() const;
    status_t read(void* out, size_t len) const;
    // A pointer to `len` bytes inside the parcel (padding skipped), or null.
    const void* readInplace(size_t len) const;
    // A null string reads as OK with *isNull set (when given) and an empty value.
    status_t readString16(String16* out, bool* isNull = nullptr) const;
    String16 readString16() const;
    status_t readString8(String8* out) const;
    String8 readString8() const;
    const char* readCString() const;
    // True when the next items are a token naming `descriptor`.
    bool enforceInterface(const String16& descriptor) const;
    // BAD_TYPE when the data at the position is not a binder object.
    status_t readStrongBinder(sp<IBinder>* out) const;
    sp<IBinder> readStrongBinder() const;
    // The descriptor (still owned by the parcel) or a negative status.
    int readFileDescriptor() const;

private:
    friend class Connection;

    struct Object {
        size_t offset;  // of the flat object in mData
        uint32_t type;
        sp<IBinder> binder;
        int fd;
        bool ownsFd;
    };

    status_t grow(size_t len, uint8_t** out);
    const uint8_t* take(size_t len) const;
    status_t writeObject(Object object, uint64_t handle);
    const Object* objectAt(size_t offset) const;
    // Appends an object that arrived over a connection: the flat object's bytes are
    // already in mData at `offset`.
    void adoptObject(size_t offset, uint32_t type, sp<IBinder> binder, int fd);

    std::vector<uint8_t> mData;
    std::vector<Object> mObjects;  // ascending offsets
    mutable size_t mPos = 0;
};

}  // namespace android
