// Demux: the process's demux service behind the DemuxBinder_ calls.
//
// One source (DemuxSource, chosen by the property tavoplayer.demux.source) is read
// by one source thread, "DemuxSource", which aligns the bytes to TS packets, paces
// them by their PCR when the source is a file, and fans every packet out to the
// queue of each filter on its PID (several filters may share a PID). Each filter's
// queue is bounded (PacketQueue): a filter that is not read fast enough loses its
// oldest packets, counted, and never holds back the others (unless the source asks
// the demux to wait a little first, overflow=wait).
//
// The source is opened by the first startFiltering() and closed, its thread joined,
// when the last filter stops; the next startFiltering() reads the property again.
// Packets start to flow at the first select() or readData() after the source
// opened, so that the filters a reader starts together (the TS receiver starts all
// of its PIDs before its thread selects) all see the stream from the same packet.
//
// Locks: mControlLock serialises startFiltering/stopFiltering (and with them the
// source's lifetime); mLock guards the filters and their queues, and is what
// select() waits on. The source thread takes only mLock. Never take mControlLock
// while holding mLock.
#pragma once

#include <array>
#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <cstdio>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include <utils/StrongPointer.h>

#include "platform/dtv/DemuxBinder.h"
#include "platform/dtv/DemuxSource.h"
#include "platform/dtv/DemuxSourceConfig.h"
#include "platform/dtv/PacketQueue.h"

namespace TavoPlayer {

class Demux {
public:
    static constexpr const char* kSourceProperty = "tavoplayer.demux.source";
    // With overflow=wait, how long the source waits for a reader before dropping.
    static constexpr int kOverflowWaitMs = 2000;

    static Demux& instance();

    Demux();
    ~Demux();
    Demux(const Demux&) = delete;
    Demux& operator=(const Demux&) = delete;

    int startFiltering(uint16_t pid, int filterKind);
    // One filter on several PIDs: a single queue that keeps their packets in the
    // order of the multiplex (a recording needs that order, not one order per PID).
    // `queuePackets` 0 takes the source's queue size. With `everyPid` the filter
    // takes every packet but the null packets, while only `pids` are asked of the
    // source (a tuner filters in hardware). Returns a handle, or a negative value as
    // startFiltering does; stopFiltering ends it.
    int startTap(const std::vector<uint16_t>& pids, size_t queuePackets, bool everyPid = false);
    // Makes a filter take exactly `pids` from now on; what it queued stays. Returns
    // 0, or a negative value for an unknown handle or an invalid PID.
    int setFilterPids(int handle, const std::vector<uint16_t>& pids);
    // Asks the source for one more PID on behalf of an every-PID filter (a tuner
    // delivers only the PIDs it was asked for). Returns 0 or a negative value.
    int addSourcePid(int handle, uint16_t pid);
    int stopFiltering(int handle);
    int select(DemuxHandleSet* set, int timeoutMs);
    int readData(int handle, uint8_t* buffer, int size);

    struct FilterStats {
        uint16_t pid = 0;
        size_t queued = 0;      // packets waiting to be read
        uint64_t received = 0;  // packets queued since the filter started
        uint64_t dropped = 0;   // of those, dropped on overflow
    };
    bool filterStats(int handle, FilterStats* stats) const;

    struct SourceStats {
        bool open = false;
        bool ended = false;    // the source reached its end (or failed)
        uint64_t packets = 0;  // aligned packets handed to the filters
        uint64_t syncLosses = 0;
        uint64_t bytesSkipped = 0;     // garbage and broken packets, truncated tails included
        uint64_t discontinuities = 0;  // PCR discontinuities re-anchored by the pacing
    };
    SourceStats sourceStats() const;

    void dump(FILE* stream, int indent);

    // Where the next source comes from instead of the property: called at each open
    // (under the control lock: it must not call back into the demux); a null result
    // falls back to the property. An empty provider removes it. Any thread.
    using SourceProvider = std::function<std::unique_ptr<DemuxSource>()>;
    void setSourceProvider(SourceProvider provider);

    // Stops the source thread, lets `change` act on the open source while nothing
    // reads it, drops the packets queued in every filter and held by the pacing, and
    // reads on with a fresh time line (a clip moved to another position). Filters
    // stay open. Returns 0, or -ENODEV when no source is open.
    int restartSource(const std::function<void(DemuxSource&)>& change);

    // Holds the open source (no packet is handed out and its pacing stands still)
    // or lets it go on. Holding returns once the source thread has stopped handing
    // out packets (0), or -ETIMEDOUT after a second when it is stuck waiting for a
    // full filter. A newly opened source starts unheld.
    int setPaused(bool paused);

private:
    class SourceThread;
    friend class SourceThread;

    struct Filter {
        Filter(std::vector<uint16_t> pids, int kind, size_t capacity)
            : pid(pids.front()),
              pids(pids),
              sourcePids(std::move(pids)),
              kind(kind),
              queue(capacity) {}
        uint16_t pid;                      // the first PID, for diagnostics
        std::vector<uint16_t> pids;        // every PID this filter takes
        std::vector<uint16_t> sourcePids;  // the PIDs it asked of the source
        int kind;
        PacketQueue queue;
        bool overflowLogged = false;
        bool stalled = false;  // overflow=wait gave up on this reader until it reads again
    };

    int openSource_c();
    void closeSource_c();
    int startThread_c();
    void stopThread_c();
    int addFilter(std::vector<uint16_t> pids, int kind, size_t queuePackets, bool everyPid);
    // Source thread: it holds (true) or hands out packets again (false).
    void noteHolding(bool holding);
    int allocateHandle_l() const;
    // Source thread: hands `count` aligned packets to the filters.
    void deliver(const uint8_t* packets, size_t count);
    void noteEnded();
    // Source thread: waits (at most `timeoutMs`) until a reader has asked for data.
    // Returns true when packets may flow.
    bool waitUntilFlowing(int timeoutMs);

    std::mutex mControlLock;
    std::unique_ptr<DemuxSource> mSource;  // mControlLock
    android::sp<SourceThread> mThread;     // mControlLock
    DemuxSourceConfig mConfig;             // written under both locks, at open

    mutable std::mutex mLock;
    std::condition_variable mDataReady;  // a filter got packets
    std::condition_variable mRoomReady;  // a filter was read (overflow=wait)
    std::condition_variable mFlowing;    // the first reader arrived, or stop
    std::array<std::unique_ptr<Filter>, kDemuxMaxHandles> mFilters;  // mLock, by handle
    std::vector<std::vector<Filter*>> mPidFilters;                   // mLock, by PID
    size_t mFilterCount = 0;                                         // mLock
    int mNextHandle = 0;                                             // mLock
    bool mStopping = false;                                          // mLock
    bool mEnded = false;                                             // mLock
    bool mReaderArrived = false;                                     // mLock
    bool mHolding = false;  // mLock: the source thread observed mPaused
    std::condition_variable mHoldingChanged;
    std::atomic<bool> mPaused{false};
    SourceProvider mProvider;  // mControlLock

    std::atomic<uint64_t> mPackets{0};
    std::atomic<uint64_t> mSyncLosses{0};
    std::atomic<uint64_t> mBytesSkipped{0};
    std::atomic<uint64_t> mDiscontinuities{0};
};

}  // namespace TavoPlayer
