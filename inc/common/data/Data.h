// Data: the base of every record laid into a RingBuffer.
//
// Records are built in place at a ring's write position (placement new) and used
// in place at its read position; all modules share one process, so the dispatch
// header of a record is valid for its reader. Records are never destroyed in
// place: the reader consumes them by advancing the ring by mSize rounded up to 4.
//
// Layout (little-endian, host order): 8-byte dispatch header, mType at 8, mSize at
// 12. mSize is the whole record's length in bytes, header included.
#pragma once

#include <cstdint>
#include <string>

// Records start wherever the previous one ended, rounded up to 4 bytes, so their
// 8-byte fields (PTS, pointers) often sit at addresses that are 4 mod 8. Every
// record type is therefore declared with an alignment of 4 and no implicit
// padding: the compiler then reads and writes those fields with accesses that are
// safe at any 4-byte boundary, and the layouts (padding spelled out where it
// exists) stay exactly as they are laid into the rings.
#define TAVO_RING_RECORD __attribute__((packed, aligned(4)))

namespace TavoPlayer {

class TAVO_RING_RECORD Data {
public:
    enum Type : uint32_t {
        TYPE_PES = 0,
        TYPE_AUDIO_FRAGMENT = 1,
        TYPE_VIDEO_FRAME = 2,
        TYPE_CLOSED_CAPTION_FRAGMENT = 3,
    };

    // Capacity of the text that toString() builds, terminating NUL included.
    static constexpr size_t kToStringBufferSize = 256;

    explicit Data(uint32_t type = 0, uint32_t size = 0) : mType(type), mSize(size) {}
    Data(const Data&) = default;
    Data& operator=(const Data&) = default;

    virtual std::string toString();
    virtual bool fromString(char* text);
    // Yields the payload pointer and length; returns 0, or a status where producing
    // the payload can fail (a graphic buffer that cannot be locked).
    virtual int getRaw(unsigned char** data, unsigned int* size);
    virtual ~Data() = default;

    uint32_t mType;
    uint32_t mSize;

protected:
    // Appends one formatted line to a toString() buffer with the space that remains.
    static void appendLine(char* buffer, const char* format, ...)
        __attribute__((format(printf, 2, 3)));
};

}  // namespace TavoPlayer
