// MemoryHeapBase: a shared-memory region (ashmem through libcutils) mapped into this
// process, whose descriptor can be sent in a parcel.
//
// setReadOnly() restricts what a receiver may do with the descriptor. The platform's
// ashmem enforces ashmem_set_prot_region itself; libcutils' Linux build backs ashmem
// with an unlinked file and cannot, so the descriptor is also replaced by one opened
// read-only on the same file: a receiver can then map it only for reading. This
// process's own mapping stays writable.
#pragma once

#include <cstddef>
#include <cstdint>

#include <utils/Errors.h>
#include <utils/RefBase.h>

namespace android {

class MemoryHeapBase : public virtual RefBase {
public:
    // Creates and maps (shared, read-write) a region of `size` bytes named `name`.
    MemoryHeapBase(size_t size, uint32_t flags = 0, const char* name = nullptr);

    // OK, or why the region could not be made; the other calls need OK.
    status_t initCheck() const { return mStatus; }
    int getHeapID() const { return mFd; }
    void* getBase() const { return mBase; }
    size_t getSize() const { return mSize; }
    status_t setReadOnly();

protected:
    ~MemoryHeapBase() override;

private:
    int mFd = -1;
    void* mBase = nullptr;
    size_t mSize = 0;
    status_t mStatus = NO_INIT;
};

}  // namespace android
