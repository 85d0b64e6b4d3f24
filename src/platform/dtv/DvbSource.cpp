#include "platform/dtv/DvbSource.h"

#include <fcntl.h>
#include <linux/dvb/dmx.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {
// The kernel's default demux buffer (8 KiB) overflows within milliseconds at
// full-segment rates; one second of a 20 Mbit/s PID is about 2.5 MB.
constexpr unsigned long kDemuxBufferBytes = 2 * 1024 * 1024;
constexpr size_t kPacket = 188;
}  // namespace

DvbSource::DvbSource(int adapter, int demux) : mAdapter(adapter), mDemux(demux) {}

DvbSource::~DvbSource() {
    for (auto& [pid, tap] : mTaps)
        close(tap.fd);
    for (int fd : mToClose)
        close(fd);
}

std::string DvbSource::devicePath() const {
    const char* root = getenv("TAVOPLAYER_DVB_ROOT");
    return std::string(root != nullptr && *root != '\0' ? root : "/dev/dvb") + "/adapter" +
           std::to_string(mAdapter) + "/demux" + std::to_string(mDemux);
}

std::string DvbSource::describe() const {
    return "dvb " + devicePath();
}

int DvbSource::open() {
    // Filters are opened per PID; here only check that the device is there, so
    // that a missing tuner fails the first StartFiltering with a clear message.
    const std::string path = devicePath();
    const int fd = ::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) {
        const int error = errno;
        TAVO_LOGE("%s: cannot open DVB demux %s: %s\n", "DemuxSource::open", path.c_str(),
                  strerror(error));
        return -error;
    }
    close(fd);
    return 0;
}

int DvbSource::addPid(uint16_t pid) {
    std::lock_guard<std::mutex> lock(mLock);
    auto it = mTaps.find(pid);
    if (it != mTaps.end()) {
        ++it->second.users;
        return 0;
    }
    const std::string path = devicePath();
    const int fd = ::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) {
        const int error = errno;
        TAVO_LOGE("%s: cannot open DVB demux %s for PID %d: %s\n", "DemuxSource::addPid",
                  path.c_str(), pid, strerror(error));
        return -error;
    }
    if (ioctl(fd, DMX_SET_BUFFER_SIZE, kDemuxBufferBytes) != 0) {
        TAVO_LOGW("%s: DMX_SET_BUFFER_SIZE failed on %s: %s\n", "DemuxSource::addPid", path.c_str(),
                  strerror(errno));
    }
    dmx_pes_filter_params params{};
    params.pid = pid;
    params.input = DMX_IN_FRONTEND;
    params.output = DMX_OUT_TSDEMUX_TAP;  // whole TS packets on this descriptor
    params.pes_type = DMX_PES_OTHER;
    params.flags = DMX_IMMEDIATE_START;
    if (ioctl(fd, DMX_SET_PES_FILTER, &params) != 0) {
        const int error = errno;
        TAVO_LOGE("%s: DMX_SET_PES_FILTER for PID %d on %s failed: %s\n", "DemuxSource::addPid",
                  pid, path.c_str(), strerror(error));
        close(fd);
        return -error;
    }
    mTaps.emplace(pid, Tap{fd, 1});
    interrupt();  // the source thread polls the new descriptor from its next round
    return 0;
}

void DvbSource::removePid(uint16_t pid) {
    std::lock_guard<std::mutex> lock(mLock);
    auto it = mTaps.find(pid);
    if (it == mTaps.end())
        return;
    if (--it->second.users > 0)
        return;
    ioctl(it->second.fd, DMX_STOP);
    mToClose.push_back(it->second.fd);
    mTaps.erase(it);
    interrupt();
}

ssize_t DvbSource::read(uint8_t* buffer, size_t size, int timeoutMs) {
    std::vector<pollfd> fds;
    {
        std::lock_guard<std::mutex> lock(mLock);
        for (int fd : mToClose)
            close(fd);
        mToClose.clear();
        fds.reserve(mTaps.size() + 1);
        for (const auto& [pid, tap] : mTaps)
            fds.push_back({tap.fd, POLLIN, 0});
    }
    fds.push_back({wakeFd(), POLLIN, 0});
    const int n = poll(fds.data(), fds.size(), timeoutMs);
    if (n < 0) {
        if (errno == EINTR)
            return kNothing;
        TAVO_LOGE("%s: poll on %s failed: %s\n", "DemuxSource::read", describe().c_str(),
                  strerror(errno));
        return kFailed;
    }
    if (fds.back().revents & POLLIN)
        drainWake();
    // Read whole packets from every ready tap, starting with a different one each
    // round so that a busy video PID cannot starve the others.
    size_t total = 0;
    const size_t taps = fds.size() - 1;
    for (size_t i = 0; i < taps && size - total >= kPacket; ++i) {
        pollfd& p = fds[(mNextTap + i) % taps];
        if ((p.revents & (POLLIN | POLLERR)) == 0)
            continue;
        const size_t room = (size - total) / kPacket * kPacket;
        const ssize_t got = ::read(p.fd, buffer + total, room);
        if (got > 0) {
            total += static_cast<size_t>(got);
        } else if (got < 0 && errno == EOVERFLOW) {
            // The kernel dropped packets because we were late; the stream goes on.
            TAVO_LOGW("%s: DVB demux buffer overflow on %s\n", "DemuxSource::read",
                      describe().c_str());
        }
    }
    if (taps > 0)
        mNextTap = (mNextTap + 1) % taps;
    return static_cast<ssize_t>(total);
}

}  // namespace TavoPlayer
