#include "platform/dtv/ClipSource.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/os/Trace.h"

namespace TavoPlayer {

ClipSource::ClipSource(std::string path, std::shared_ptr<ClipCursor> cursor, bool paced)
    : mPath(std::move(path)), mCursor(std::move(cursor)), mPaced(paced) {
    std::lock_guard<std::mutex> lock(mCursor->lock);
    ++mCursor->openSources;
}

ClipSource::~ClipSource() {
    if (mFd >= 0)
        close(mFd);
    std::lock_guard<std::mutex> lock(mCursor->lock);
    --mCursor->openSources;
    mCursor->armed = false;
}

int ClipSource::open() {
    mFd = ::open(mPath.c_str(), O_RDONLY | O_CLOEXEC);
    if (mFd < 0) {
        const int error = errno;
        TAVO_LOGE("%s: cannot open the clip %s: %s\n", "DemuxSource::open", mPath.c_str(),
                  strerror(error));
        return -error;
    }
    struct stat st {};
    if (fstat(mFd, &st) == 0)
        mFileSize = static_cast<uint64_t>(st.st_size);
    std::lock_guard<std::mutex> lock(mCursor->lock);
    mStartOffset = mCursor->offset;
    return 0;
}

void ClipSource::setOffset(uint64_t offset) {
    std::lock_guard<std::mutex> lock(mCursor->lock);
    mCursor->offset = offset;
    mStartOffset = offset;
}

ssize_t ClipSource::read(uint8_t* buffer, size_t size, int) {
    if (mFd < 0)
        return kFailed;
    uint64_t offset;
    {
        std::lock_guard<std::mutex> lock(mCursor->lock);
        offset = mCursor->offset;
    }
    const ssize_t n = pread(mFd, buffer, size, static_cast<off_t>(offset));
    if (n > 0) {
        std::lock_guard<std::mutex> lock(mCursor->lock);
        mCursor->offset = offset + static_cast<uint64_t>(n);
        return n;
    }
    if (n == 0)
        return kEnd;
    if (errno == EINTR || errno == EAGAIN)
        return kNothing;
    TAVO_LOGE("%s: reading the clip %s failed: %s\n", "DemuxSource::read", mPath.c_str(),
              strerror(errno));
    return kFailed;
}

void ClipSource::onEnded(uint64_t packets, bool failed) {
    std::function<void(uint64_t, bool, bool)> onEnd;
    {
        std::lock_guard<std::mutex> lock(mCursor->lock);
        onEnd = mCursor->onEnd;
    }
    if (onEnd)
        onEnd(packets, failed, mStartOffset + 188 <= mFileSize);
}

}  // namespace TavoPlayer
