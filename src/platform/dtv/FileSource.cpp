#include "platform/dtv/FileSource.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/os/Trace.h"

namespace TavoPlayer {

FileSource::FileSource(std::string path, bool loop, bool paced)
    : mPath(std::move(path)), mLoop(loop), mPaced(paced) {}

FileSource::~FileSource() {
    if (mFd >= 0)
        close(mFd);
}

int FileSource::open() {
    mFd = ::open(mPath.c_str(), O_RDONLY | O_CLOEXEC);
    if (mFd < 0) {
        const int error = errno;
        TAVO_LOGE("%s: cannot open TS file %s: %s\n", "DemuxSource::open", mPath.c_str(),
                  strerror(error));
        return -error;
    }
    return 0;
}

ssize_t FileSource::read(uint8_t* buffer, size_t size, int) {
    if (mFd < 0)
        return kFailed;
    const ssize_t n = ::read(mFd, buffer, size);
    if (n > 0) {
        mBytesThisPass += static_cast<uint64_t>(n);
        return n;
    }
    if (n < 0) {
        if (errno == EINTR || errno == EAGAIN)
            return kNothing;
        TAVO_LOGE("%s: reading %s failed: %s\n", "DemuxSource::read", mPath.c_str(),
                  strerror(errno));
        return kFailed;
    }
    ++mPasses;
    // An empty file would otherwise loop without end and without data.
    if (!mLoop || mBytesThisPass == 0)
        return kEnd;
    if (lseek(mFd, 0, SEEK_SET) != 0) {
        TAVO_LOGE("%s: cannot rewind %s: %s\n", "DemuxSource::read", mPath.c_str(),
                  strerror(errno));
        return kFailed;
    }
    mBytesThisPass = 0;
    return kRestart;
}

}  // namespace TavoPlayer
