// UdpSource: a TS over UDP, as an IP gateway or `ffmpeg -f mpegts udp://` sends it.
//
// Each datagram carries whole TS packets (1 to 7 of 188 bytes, or 204-byte packets
// from some gateways). A multicast group is joined (IP_ADD_MEMBERSHIP) on the
// interface given, or on the one the kernel chooses; any other address is bound as
// a unicast receiver ("" or 0.0.0.0 for every local address). A datagram that is not
// a whole number of packets is logged and only its whole packets are kept, so that
// a bad datagram cannot shift the packets that follow.
#pragma once

#include <string>

#include "platform/dtv/DemuxSource.h"

namespace TavoPlayer {

class UdpSource : public DemuxSource {
public:
    UdpSource(std::string host, int port, std::string iface);
    ~UdpSource() override;

    int open() override;
    ssize_t read(uint8_t* buffer, size_t size, int timeoutMs) override;
    std::string describe() const override;

    // The bound port (useful when 0 was asked for by a test); 0 before open().
    int boundPort() const { return mBoundPort; }
    uint64_t malformedDatagrams() const { return mMalformed; }

private:
    const std::string mHost;
    const int mPort;
    const std::string mIface;
    int mFd = -1;
    int mBoundPort = 0;
    uint64_t mMalformed = 0;
};

}  // namespace TavoPlayer
