// A picture buffer that can be locked for CPU access, as the platform's graphic
// buffers are. The surface implementation provides the concrete buffers.
#pragma once

#include <cstddef>
#include <cstdint>

#include <utils/RefBase.h>

namespace TavoPlayer {

class GraphicBuffer : public virtual android::RefBase {
public:
    // Usage bits of lock(): software reads, often.
    static constexpr uint32_t USAGE_SW_READ_OFTEN = 3;

    // Maps the picture for the CPU; 0 on success, a negative status otherwise.
    virtual int lock(uint32_t usage, void** vaddr) = 0;
    virtual int unlock() = 0;
    // Bytes of the whole picture as mapped by lock().
    virtual size_t getByteSize() const = 0;
};

}  // namespace TavoPlayer
