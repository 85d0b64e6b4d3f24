// DemuxSource: where the demux's TS bytes come from.
//
// One source per process at a time, read by the demux's source thread; the demux
// aligns the bytes to packets and hands them to its filters. A source says through
// paced() whether its packets must be released at their PCR times (a file, played
// as live) or as they arrive (a network, a pipe, a tuner: already live).
//
// Threads: open() and addPid()/removePid() run on the controller's thread; read()
// only on the source thread; interrupt() from any thread, to end a blocked read().
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

#include "platform/dtv/DemuxSourceConfig.h"

namespace TavoPlayer {

class DemuxSource {
public:
    // Results of read() besides a byte count.
    static constexpr ssize_t kNothing = 0;   // nothing arrived within the time-out
    static constexpr ssize_t kEnd = -1;      // the stream has ended
    static constexpr ssize_t kRestart = -2;  // the stream starts again (a loop)
    static constexpr ssize_t kFailed = -3;   // a read error; logged by the source

    // The source for `config`, not yet opened.
    static std::unique_ptr<DemuxSource> create(const DemuxSourceConfig& config);

    DemuxSource();
    virtual ~DemuxSource();
    DemuxSource(const DemuxSource&) = delete;
    DemuxSource& operator=(const DemuxSource&) = delete;

    // Opens the device, socket or file. Returns 0, or a negative errno value after
    // logging why.
    virtual int open() = 0;
    // Reads up to `size` bytes, waiting at most `timeoutMs` for some to arrive.
    virtual ssize_t read(uint8_t* buffer, size_t size, int timeoutMs) = 0;
    virtual bool paced() const { return false; }
    // A tuner demux filters in hardware and must be told each PID; other sources
    // carry the whole multiplex and ignore these. addPid returns 0 or negative errno.
    virtual int addPid(uint16_t pid);
    virtual void removePid(uint16_t pid);
    // A short description for logs ("file /x.ts", "udp 239.0.0.1:1234").
    virtual std::string describe() const = 0;

    // Ends a read() that is waiting; the next read() waits normally again.
    void interrupt();

    // Source thread: every packet of the stream has been handed to the filters
    // (`packets` of them), or reading failed (`failed`). The source reads no more.
    virtual void onEnded(uint64_t packets, bool failed);

protected:
    // Waits until `fd` is readable, the time-out passes or interrupt() is called.
    // Returns 1 readable, 0 time-out or interrupted, negative errno on error (logged).
    int waitReadable(int fd, int timeoutMs);
    int wakeFd() const { return mWakeFd; }
    // Consumes a pending interrupt(), if any.
    void drainWake();

private:
    int mWakeFd;
};

}  // namespace TavoPlayer
