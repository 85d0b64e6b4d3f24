#include "platform/dtv/StdinSource.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/os/Trace.h"

namespace TavoPlayer {

StdinSource::StdinSource(int fd) : mFd(fd) {}

std::string StdinSource::describe() const {
    return mFd == STDIN_FILENO ? "stdin" : "fd " + std::to_string(mFd);
}

int StdinSource::open() {
    if (fcntl(mFd, F_GETFL) < 0) {
        const int error = errno;
        TAVO_LOGE("%s: %s is not open: %s\n", "DemuxSource::open", describe().c_str(),
                  strerror(error));
        return -error;
    }
    return 0;
}

ssize_t StdinSource::read(uint8_t* buffer, size_t size, int timeoutMs) {
    const int ready = waitReadable(mFd, timeoutMs);
    if (ready <= 0)
        return ready < 0 ? kFailed : kNothing;
    const ssize_t n = ::read(mFd, buffer, size);
    if (n > 0)
        return n;
    if (n == 0)
        return kEnd;
    if (errno == EINTR || errno == EAGAIN)
        return kNothing;
    TAVO_LOGE("%s: reading %s failed: %s\n", "DemuxSource::read", describe().c_str(),
              strerror(errno));
    return kFailed;
}

}  // namespace TavoPlayer
