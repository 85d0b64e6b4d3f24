// DvbTuner: what tavoplay does with a `dvb:ADAPTER[.DEMUX]` source before the
// service plays it: tune the adapter's frontend to a channel of a dvbv5 channel
// file (as dvbv5-scan writes it, ISDB-T included) through libdvbv5 and keep it
// tuned, and read the start of the adapter's transport stream for the probe.
//
// Every failure comes back as a one-line reason; nothing waits without a bound.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>

struct dvb_v5_fe_parms;

namespace tavoplay {

struct DvbAddress {
    int adapter = 0;
    int demux = 0;
};

// "dvb:0" or "dvb:0.1"; false when the text after "dvb:" is not of that form.
bool parseDvbSource(const std::string& source, DvbAddress* out);

// The demux device of an address: TAVOPLAYER_DVB_ROOT (default /dev/dvb), as the
// service's demux finds it.
std::string dvbDemuxPath(const DvbAddress& address);

class DvbTuner {
public:
    DvbTuner() = default;
    ~DvbTuner();
    DvbTuner(const DvbTuner&) = delete;
    DvbTuner& operator=(const DvbTuner&) = delete;

    // Finds `channel` in the dvbv5 channel file `channelsFile`; empty on success,
    // else the reason. The channel's service id is kept for serviceId().
    std::string findChannel(const std::string& channelsFile, const std::string& channel);
    // Opens the adapter's first frontend, sets the channel's delivery system and
    // parameters and waits up to `lockWait` for the lock; empty on success, else
    // the reason. The frontend stays open, and tuned, until this object goes.
    std::string tune(const DvbAddress& address, std::chrono::milliseconds lockWait);
    // The channel's SERVICE_ID (its programme number), 0 when the file has none.
    uint16_t serviceId() const { return mServiceId; }

private:
    struct Channel;
    Channel* mChannel = nullptr;
    dvb_v5_fe_parms* mFrontend = nullptr;
    std::string mChannelName;
    uint16_t mServiceId = 0;
};

// Reads whole TS packets of every PID (PID 0x2000, ISO/IEC 13818-1 carries none
// above 0x1FFF) from the adapter's demux and hands them to `feed` until it returns
// true, `maxBytes` were read or `wait` passed with nothing. Empty on success, else
// the reason.
std::string readDvbStream(const DvbAddress& address, std::chrono::milliseconds wait,
                          size_t maxBytes, const std::function<bool(const uint8_t*, size_t)>& feed);

}  // namespace tavoplay
