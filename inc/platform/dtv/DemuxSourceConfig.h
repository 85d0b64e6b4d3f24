// DemuxSourceConfig: the parsed value of the property tavoplayer.demux.source.
//
//   file:PATH[?OPTIONS]        a TS file, read at the pace of its PCR
//   udp://GROUP:PORT[?OPTIONS] TS over UDP; a multicast group is joined
//   stdin[?OPTIONS]            a TS on standard input
//   dvb:ADAPTER[.DEMUX]        /dev/dvb/adapterADAPTER/demuxDEMUX (DEMUX 0 by default)
//
// OPTIONS are name=value pairs separated by '&':
//   loop=0|1            file: start again at the end (default 0)
//   pace=pcr|none       file: PCR pace (default) or as fast as the reader takes it
//   queue=N             packets queued per filter before the oldest are dropped
//                       (16..1048576, default 8192)
//   overflow=drop|wait  on a full filter queue, drop its oldest packet at once, or
//                       first wait up to 2 s for the reader (default: wait for an
//                       unpaced file, drop for everything else)
//   iface=ADDRESS       udp: the local interface address for the multicast join
//
// Pure parsing; docs/demux.md has the same table for users.
#pragma once

#include <cstddef>
#include <string>

namespace TavoPlayer {

class DemuxSourceConfig {
public:
    enum class Kind { kNone, kFile, kUdp, kStdin, kDvb };
    enum class Overflow { kDrop, kWait };

    static constexpr size_t kDefaultQueuePackets = 8192;
    static constexpr size_t kMinQueuePackets = 16;
    static constexpr size_t kMaxQueuePackets = 1 << 20;

    // Parses `text`. On failure returns false and says why in `error`.
    static bool parse(const std::string& text, DemuxSourceConfig* config, std::string* error);

    Kind kind = Kind::kNone;
    std::string path;   // file
    std::string host;   // udp: group or unicast address ("" or 0.0.0.0: any)
    int port = 0;       // udp
    std::string iface;  // udp
    int adapter = 0;    // dvb
    int demux = 0;      // dvb
    bool loop = false;  // file
    bool paced = true;  // file
    size_t queuePackets = kDefaultQueuePackets;
    Overflow overflow = Overflow::kDrop;
};

}  // namespace TavoPlayer
