// DvbSource: the Linux DVB demux of a tuner (linux/dvb/dmx.h).
//
// The frontend is tuned outside the player (docs/dvb.md: dvbv5-zap). For each PID
// asked for, one descriptor of /dev/dvb/adapterN/demuxM carries a TS-tap filter
// (DMX_SET_PES_FILTER with DMX_OUT_TSDEMUX_TAP), so that the whole TS packets of
// that PID are read from that descriptor; read() polls all of them at once.
//
// Threads: addPid()/removePid() run on the controller's thread and read() on the
// source thread; mLock guards the descriptor table. A descriptor is only closed by
// the source thread (or the destructor), so that it is never closed under a poll.
#pragma once

#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "platform/dtv/DemuxSource.h"

namespace TavoPlayer {

class DvbSource : public DemuxSource {
public:
    DvbSource(int adapter, int demux);
    ~DvbSource() override;

    // The device path this source uses, e.g. /dev/dvb/adapter0/demux0. The folder
    // can be moved for tests with TAVOPLAYER_DVB_ROOT (default /dev/dvb).
    std::string devicePath() const;

    int open() override;
    ssize_t read(uint8_t* buffer, size_t size, int timeoutMs) override;
    int addPid(uint16_t pid) override;
    void removePid(uint16_t pid) override;
    std::string describe() const override;

private:
    struct Tap {
        int fd;
        int users;  // filters of the demux on this PID
    };
    const int mAdapter;
    const int mDemux;
    std::mutex mLock;
    std::map<uint16_t, Tap> mTaps;  // guarded by mLock
    std::vector<int> mToClose;      // guarded by mLock; closed by the source thread
    size_t mNextTap = 0;            // source thread only: fairness between PIDs
};

}  // namespace TavoPlayer
