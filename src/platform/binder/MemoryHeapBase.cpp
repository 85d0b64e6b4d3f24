#include "platform/binder/MemoryHeapBase.h"

#include <cutils/ashmem.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <string>

namespace android {

MemoryHeapBase::MemoryHeapBase(size_t size, uint32_t /*flags*/, const char* name) {
    if (size == 0) {
        mStatus = BAD_VALUE;
        return;
    }
    mFd = ashmem_create_region(name != nullptr ? name : "MemoryHeapBase", size);
    if (mFd < 0) {
        mStatus = NO_MEMORY;
        return;
    }
    if (ashmem_set_prot_region(mFd, PROT_READ | PROT_WRITE) < 0) {
        mStatus = PERMISSION_DENIED;
        return;
    }
    void* base = mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_SHARED, mFd, 0);
    if (base == MAP_FAILED) {
        mStatus = NO_MEMORY;
        return;
    }
    mBase = base;
    mSize = size;
    mStatus = OK;
}

MemoryHeapBase::~MemoryHeapBase() {
    if (mBase != nullptr)
        munmap(mBase, mSize);
    if (mFd >= 0)
        close(mFd);
}

status_t MemoryHeapBase::setReadOnly() {
    if (mStatus != OK)
        return mStatus;
    if (ashmem_set_prot_region(mFd, PROT_READ) < 0)
        return PERMISSION_DENIED;
    const std::string self = "/proc/self/fd/" + std::to_string(mFd);
    const int readOnly = open(self.c_str(), O_RDONLY | O_CLOEXEC);
    if (readOnly < 0)
        return -errno;
    close(mFd);
    mFd = readOnly;
    return OK;
}

}  // namespace android
