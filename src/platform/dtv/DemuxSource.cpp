#include "platform/dtv/DemuxSource.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/dtv/DvbSource.h"
#include "platform/dtv/FileSource.h"
#include "platform/dtv/StdinSource.h"
#include "platform/dtv/UdpSource.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {

std::unique_ptr<DemuxSource> DemuxSource::create(const DemuxSourceConfig& config) {
    switch (config.kind) {
        case DemuxSourceConfig::Kind::kFile:
            return std::make_unique<FileSource>(config.path, config.loop, config.paced);
        case DemuxSourceConfig::Kind::kUdp:
            return std::make_unique<UdpSource>(config.host, config.port, config.iface);
        case DemuxSourceConfig::Kind::kStdin:
            return std::make_unique<StdinSource>(STDIN_FILENO);
        case DemuxSourceConfig::Kind::kDvb:
            return std::make_unique<DvbSource>(config.adapter, config.demux);
        case DemuxSourceConfig::Kind::kNone:
            break;
    }
    return nullptr;
}

DemuxSource::DemuxSource() : mWakeFd(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

DemuxSource::~DemuxSource() {
    if (mWakeFd >= 0)
        close(mWakeFd);
}

int DemuxSource::addPid(uint16_t) {
    return 0;
}

void DemuxSource::removePid(uint16_t) {}

void DemuxSource::onEnded(uint64_t, bool) {}

void DemuxSource::interrupt() {
    const uint64_t one = 1;
    if (mWakeFd >= 0) {
        [[maybe_unused]] ssize_t n = write(mWakeFd, &one, sizeof one);
    }
}

void DemuxSource::drainWake() {
    uint64_t value;
    if (mWakeFd >= 0) {
        [[maybe_unused]] ssize_t n = ::read(mWakeFd, &value, sizeof value);
    }
}

int DemuxSource::waitReadable(int fd, int timeoutMs) {
    pollfd fds[2] = {{fd, POLLIN, 0}, {mWakeFd, POLLIN, 0}};
    const int n = poll(fds, mWakeFd >= 0 ? 2 : 1, timeoutMs);
    if (n < 0) {
        const int error = errno;
        if (error == EINTR)
            return 0;
        TAVO_LOGE("%s: waiting on %s failed: %s\n", "DemuxSource::read", describe().c_str(),
                  strerror(error));
        return -error;
    }
    if (n == 0)
        return 0;
    if (fds[1].revents & POLLIN) {
        drainWake();
        return 0;
    }
    // POLLHUP and POLLERR count as readable: the read() that follows reports them.
    return (fds[0].revents & (POLLIN | POLLHUP | POLLERR)) ? 1 : 0;
}

}  // namespace TavoPlayer
