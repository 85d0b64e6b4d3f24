#include "platform/dtv/UdpSource.h"

#include <arpa/inet.h>
#include <netdb.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {
constexpr size_t kPacket = 188;
constexpr size_t kRsPacket = 204;
// Bursts of a 20 Mbit/s multiplex must fit while the source thread is busy.
constexpr int kReceiveBufferBytes = 4 * 1024 * 1024;

bool resolve(const std::string& host, in_addr* address) {
    if (host.empty()) {
        address->s_addr = htonl(INADDR_ANY);
        return true;
    }
    if (inet_pton(AF_INET, host.c_str(), address) == 1)
        return true;
    addrinfo hints{};
    hints.ai_family = AF_INET;
    hints.ai_socktype = SOCK_DGRAM;
    addrinfo* result = nullptr;
    if (getaddrinfo(host.c_str(), nullptr, &hints, &result) != 0 || result == nullptr)
        return false;
    *address = reinterpret_cast<sockaddr_in*>(result->ai_addr)->sin_addr;
    freeaddrinfo(result);
    return true;
}
}  // namespace

UdpSource::UdpSource(std::string host, int port, std::string iface)
    : mHost(std::move(host)), mPort(port), mIface(std::move(iface)) {}

UdpSource::~UdpSource() {
    if (mFd >= 0)
        close(mFd);
}

std::string UdpSource::describe() const {
    return "udp " + mHost + ":" + std::to_string(mPort);
}

int UdpSource::open() {
    in_addr address{};
    if (!resolve(mHost, &address)) {
        TAVO_LOGE("%s: cannot resolve UDP address %s\n", "DemuxSource::open", mHost.c_str());
        return -EINVAL;
    }
    mFd = socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    if (mFd < 0) {
        const int error = errno;
        TAVO_LOGE("%s: socket failed: %s\n", "DemuxSource::open", strerror(error));
        return -error;
    }
    const int one = 1;
    setsockopt(mFd, SOL_SOCKET, SO_REUSEADDR, &one, sizeof one);
    setsockopt(mFd, SOL_SOCKET, SO_RCVBUF, &kReceiveBufferBytes, sizeof kReceiveBufferBytes);
    const bool multicast = IN_MULTICAST(ntohl(address.s_addr));
    sockaddr_in local{};
    local.sin_family = AF_INET;
    local.sin_port = htons(static_cast<uint16_t>(mPort));
    // Binding a multicast group's address receives only that group's datagrams.
    local.sin_addr = address;
    if (bind(mFd, reinterpret_cast<sockaddr*>(&local), sizeof local) != 0) {
        const int error = errno;
        TAVO_LOGE("%s: cannot bind UDP %s:%d: %s\n", "DemuxSource::open", mHost.c_str(), mPort,
                  strerror(error));
        close(mFd);
        mFd = -1;
        return -error;
    }
    if (multicast) {
        ip_mreq request{};
        request.imr_multiaddr = address;
        request.imr_interface.s_addr = htonl(INADDR_ANY);
        if (!mIface.empty() && inet_pton(AF_INET, mIface.c_str(), &request.imr_interface) != 1) {
            TAVO_LOGE("%s: bad interface address %s\n", "DemuxSource::open", mIface.c_str());
            close(mFd);
            mFd = -1;
            return -EINVAL;
        }
        if (setsockopt(mFd, IPPROTO_IP, IP_ADD_MEMBERSHIP, &request, sizeof request) != 0) {
            const int error = errno;
            TAVO_LOGE("%s: cannot join multicast group %s: %s\n", "DemuxSource::open",
                      mHost.c_str(), strerror(error));
            close(mFd);
            mFd = -1;
            return -error;
        }
    }
    sockaddr_in bound{};
    socklen_t length = sizeof bound;
    if (getsockname(mFd, reinterpret_cast<sockaddr*>(&bound), &length) == 0) {
        mBoundPort = ntohs(bound.sin_port);
    }
    TAVO_LOGI("%s: receiving TS on UDP %s:%d%s\n", "DemuxSource::open", mHost.c_str(), mBoundPort,
              multicast ? " (multicast)" : "");
    return 0;
}

ssize_t UdpSource::read(uint8_t* buffer, size_t size, int timeoutMs) {
    const int ready = waitReadable(mFd, timeoutMs);
    if (ready <= 0)
        return ready < 0 ? kFailed : kNothing;
    const ssize_t n = recv(mFd, buffer, size, MSG_DONTWAIT);
    if (n < 0) {
        if (errno == EINTR || errno == EAGAIN)
            return kNothing;
        TAVO_LOGE("%s: receiving from %s failed: %s\n", "DemuxSource::read", describe().c_str(),
                  strerror(errno));
        return kFailed;
    }
    const size_t bytes = static_cast<size_t>(n);
    if (bytes % kPacket == 0 || bytes % kRsPacket == 0)
        return n;
    ++mMalformed;
    const size_t whole = bytes - bytes % kPacket;
    TAVO_LOGW(
        "%s: UDP datagram of %zu bytes is not a whole number of TS packets; "
        "%zu bytes dropped (%llu such datagrams)\n",
        "DemuxSource::read", bytes, bytes - whole, static_cast<unsigned long long>(mMalformed));
    return static_cast<ssize_t>(whole);
}

}  // namespace TavoPlayer
