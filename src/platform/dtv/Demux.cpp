#include "platform/dtv/Demux.h"

#include <pthread.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>

#include <utils/Thread.h>

#include "platform/dtv/PacketAligner.h"
#include "platform/dtv/PcrPacer.h"
#include "platform/os/Properties.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {

constexpr size_t kPacket = kTsPacketSize;
constexpr uint16_t kMaxPid = 0x1FFF;
constexpr size_t kReadChunkBytes = 64 * 1024;
// A source read waits this long, so the thread sees a stop request in good time
// even when interrupt() is not enough (a regular file never blocks anyway).
constexpr int kReadTimeoutMs = 100;
// Paced packets due within this much of now go out together, as a tuner's do (a USB
// adapter hands over whole transfer buffers): each burst wakes the demux, receiver
// and parser threads once, and 10 ms is far below any reader's buffering and the
// clock's 1 s re-base threshold. (At 2 ms the wake-ups cost about 0.6 s of CPU a
// minute more at 1080i rates.)
constexpr int64_t kReleaseSlackNs = 10'000'000;
constexpr int64_t kMaxSleepNs = 100'000'000;
constexpr int64_t kSyncLogIntervalNs = 1'000'000'000;

int64_t monotonicNs() {
    return std::chrono::duration_cast<std::chrono::nanoseconds>(
               std::chrono::steady_clock::now().time_since_epoch())
        .count();
}

std::chrono::steady_clock::time_point toTimePoint(int64_t ns) {
    return std::chrono::steady_clock::time_point(std::chrono::nanoseconds(ns));
}

uint16_t pidOf(const uint8_t* packet) {
    return static_cast<uint16_t>(((packet[1] & 0x1f) << 8) | packet[2]);
}

}  // namespace

// The source thread: reads the source, aligns, paces, delivers.
class Demux::SourceThread : public android::Thread {
public:
    SourceThread(Demux& demux, DemuxSource& source)
        : android::Thread(false), mDemux(demux), mSource(source), mBuffer(kReadChunkBytes) {}

    // Ends a pacing sleep early (stop).
    void wake() {
        std::lock_guard<std::mutex> lock(mSleepLock);
        mWake = true;
        mSleepCondition.notify_all();
    }

private:
    // libutils names the kernel thread only on Android.
    android::status_t readyToRun() override {
        pthread_setname_np(pthread_self(), "DemuxSource");
        return android::NO_ERROR;
    }

    bool threadLoop() override {
        if (exitPending())
            return false;
        if (mDemux.mPaused.load(std::memory_order_acquire)) {
            const int64_t now = monotonicNs();
            if (!mHeld) {
                mHeld = true;
                mHeldSinceNs = now;
                mDemux.noteHolding(true);
            }
            sleepUntil(now + kMaxSleepNs);
            return true;
        }
        if (mHeld) {
            // The packets held for pacing keep their spacing, moved past the pause.
            mHeld = false;
            mPacer.shift(monotonicNs() - mHeldSinceNs);
            mDemux.noteHolding(false);
        }
        if (mSource.paced() && mPacer.nextKnown()) {
            const int64_t now = monotonicNs();
            const int64_t due = mPacer.nextDueNs();
            if (due > now + kReleaseSlackNs) {
                sleepUntil(std::min(due, now + kMaxSleepNs));
                return true;
            }
            mOut.clear();
            const size_t n = mPacer.takeDue(now + kReleaseSlackNs, mOut);
            mDemux.deliver(mOut.data(), n);
            return true;
        }
        if (mFinished) {
            finish();
            return false;
        }
        if (!mDemux.waitUntilFlowing(kReadTimeoutMs))
            return true;
        const ssize_t n = mSource.read(mBuffer.data(), mBuffer.size(), kReadTimeoutMs);
        mPackets.clear();
        if (n > 0) {
            mAligner.push(mBuffer.data(), static_cast<size_t>(n), mPackets);
            noteSync(false);
            forward();
            return true;
        }
        if (n == DemuxSource::kNothing)
            return true;
        // The end of a pass: hand out the packet held back, drop a truncated tail.
        const size_t dropped = mAligner.finish(mPackets);
        if (dropped > 0) {
            TAVO_LOGW("%s: %s ends with %zu bytes that are no whole TS packet; dropped\n",
                      "DemuxSource", mSource.describe().c_str(), dropped);
        }
        noteSync(true);
        forward();
        if (mSource.paced())
            mPacer.endOfStream(monotonicNs());
        if (n == DemuxSource::kRestart) {
            TAVO_LOGD("%s: %s: looping to the start\n", "DemuxSource", mSource.describe().c_str());
            return true;
        }
        mFinished = true;  // the paced packets still held go out first
        mFailed = n == DemuxSource::kFailed;
        return true;
    }

    void forward() {
        const size_t count = mPackets.size() / kPacket;
        if (count == 0)
            return;
        if (mSource.paced()) {
            const int64_t now = monotonicNs();
            for (size_t i = 0; i < count; ++i)
                mPacer.push(&mPackets[i * kPacket], now);
            mDemux.mDiscontinuities.store(mPacer.discontinuities(), std::memory_order_relaxed);
        } else {
            mDemux.deliver(mPackets.data(), count);
        }
    }

    void noteSync(bool force) {
        mDemux.mSyncLosses.store(mAligner.syncLosses(), std::memory_order_relaxed);
        mDemux.mBytesSkipped.store(mAligner.bytesSkipped(), std::memory_order_relaxed);
        if (mAligner.bytesSkipped() == mReportedSkipped)
            return;
        // Garbage can arrive at every read; one line a second says enough.
        const int64_t now = monotonicNs();
        if (!force && mLastSyncLogNs != 0 && now - mLastSyncLogNs < kSyncLogIntervalNs)
            return;
        mLastSyncLogNs = now;
        mReportedSkipped = mAligner.bytesSkipped();
        TAVO_LOGW("%s: TS sync lost on %s: %llu bytes skipped, %llu resynchronisations so far\n",
                  "DemuxSource", mSource.describe().c_str(),
                  static_cast<unsigned long long>(mAligner.bytesSkipped()),
                  static_cast<unsigned long long>(mAligner.syncLosses()));
    }

    void finish() {
        const uint64_t packets = mAligner.packetsOut();
        if (packets == 0) {
            TAVO_LOGE(
                "%s: %s held no TS packets (no sync byte 0x47 repeating every 188 or "
                "204 bytes)\n",
                "DemuxSource", mSource.describe().c_str());
        } else {
            TAVO_LOGI("%s: end of %s after %llu packets\n", "DemuxSource",
                      mSource.describe().c_str(), static_cast<unsigned long long>(packets));
        }
        mDemux.noteEnded();
        mSource.onEnded(packets, mFailed);
    }

    void sleepUntil(int64_t deadlineNs) {
        std::unique_lock<std::mutex> lock(mSleepLock);
        mSleepCondition.wait_until(lock, toTimePoint(deadlineNs), [this] { return mWake; });
        mWake = false;
    }

    Demux& mDemux;
    DemuxSource& mSource;
    std::vector<uint8_t> mBuffer;
    std::vector<uint8_t> mPackets;
    std::vector<uint8_t> mOut;
    PacketAligner mAligner;
    PcrPacer mPacer;
    bool mFinished = false;
    bool mFailed = false;
    bool mHeld = false;
    int64_t mHeldSinceNs = 0;
    uint64_t mReportedSkipped = 0;
    int64_t mLastSyncLogNs = 0;
    std::mutex mSleepLock;
    std::condition_variable mSleepCondition;
    bool mWake = false;  // mSleepLock
};

Demux& Demux::instance() {
    static Demux demux;
    return demux;
}

Demux::Demux() : mPidFilters(kMaxPid + 1) {}

Demux::~Demux() {
    std::lock_guard<std::mutex> control(mControlLock);
    if (mSource)
        closeSource_c();
}

int Demux::openSource_c() {
    if (mProvider) {
        std::unique_ptr<DemuxSource> provided = mProvider();
        if (provided) {
            const int rc = provided->open();
            if (rc < 0) {
                TAVO_LOGE("%s: cannot open demux source %s\n", "DemuxBinder_StartFiltering",
                          provided->describe().c_str());
                return rc;
            }
            {
                std::lock_guard<std::mutex> lock(mLock);
                mConfig = DemuxSourceConfig();
                mConfig.kind = DemuxSourceConfig::Kind::kFile;
            }
            mSource = std::move(provided);
            return startThread_c();
        }
    }
    const std::string text = propertyGetString(kSourceProperty, "");
    if (text.empty()) {
        TAVO_LOGE("%s: no demux source: set %s (file:PATH, udp://GROUP:PORT, stdin or dvb:N)\n",
                  "DemuxBinder_StartFiltering", kSourceProperty);
        return -ENOENT;
    }
    DemuxSourceConfig config;
    std::string error;
    if (!DemuxSourceConfig::parse(text, &config, &error)) {
        TAVO_LOGE("%s: bad %s \"%s\": %s\n", "DemuxBinder_StartFiltering", kSourceProperty,
                  text.c_str(), error.c_str());
        return -EINVAL;
    }
    std::unique_ptr<DemuxSource> source = DemuxSource::create(config);
    const int rc = source->open();
    if (rc < 0) {
        TAVO_LOGE("%s: cannot open demux source \"%s\"\n", "DemuxBinder_StartFiltering",
                  text.c_str());
        return rc;
    }
    {
        std::lock_guard<std::mutex> lock(mLock);
        mConfig = config;
    }
    mSource = std::move(source);
    return startThread_c();
}

int Demux::startThread_c() {
    {
        std::lock_guard<std::mutex> lock(mLock);
        mStopping = false;
        mEnded = false;
        mReaderArrived = false;
        mHolding = false;
    }
    mPaused = false;
    mPackets = 0;
    mSyncLosses = 0;
    mBytesSkipped = 0;
    mDiscontinuities = 0;
    android::sp<SourceThread> thread = new SourceThread(*this, *mSource);
    if (thread->run("DemuxSource") != android::OK) {
        TAVO_LOGE("%s: cannot start the demux source thread\n", "DemuxBinder_StartFiltering");
        mSource.reset();
        return -EAGAIN;
    }
    mThread = thread;
    TAVO_LOGI("%s: demux source %s opened\n", "DemuxBinder_StartFiltering",
              mSource->describe().c_str());
    return 0;
}

void Demux::stopThread_c() {
    {
        std::lock_guard<std::mutex> lock(mLock);
        mStopping = true;
        mRoomReady.notify_all();
        mFlowing.notify_all();
    }
    mThread->requestExit();
    mThread->wake();
    mSource->interrupt();
    mThread->join();
    // libutils' thread drops its own reference just after join() returns; letting it
    // go first makes this thread destroy the object, after the thread's last step
    // (ThreadSanitizer cannot see libutils' reference counts).
    for (int i = 0; i < 10000 && mThread->getStrongCount() > 1; ++i)
        usleep(100);
    mThread->isRunning();  // takes the thread's lock: orders its last unlock before us
    mThread.clear();
}

void Demux::closeSource_c() {
    stopThread_c();
    TAVO_LOGI("%s: demux source %s closed\n", "DemuxBinder_StopFiltering",
              mSource->describe().c_str());
    mSource.reset();
}

void Demux::setSourceProvider(SourceProvider provider) {
    std::lock_guard<std::mutex> control(mControlLock);
    mProvider = std::move(provider);
}

int Demux::restartSource(const std::function<void(DemuxSource&)>& change) {
    std::lock_guard<std::mutex> control(mControlLock);
    if (!mSource || !mThread)
        return -ENODEV;
    stopThread_c();
    if (change)
        change(*mSource);
    bool readerArrived = false;
    {
        std::lock_guard<std::mutex> lock(mLock);
        for (auto& filter : mFilters) {
            if (filter)
                filter->queue.clear();
        }
        readerArrived = mReaderArrived;
    }
    const int rc = startThread_c();
    if (rc == 0 && readerArrived) {
        // The reader is already selecting: the new thread need not wait for it.
        std::lock_guard<std::mutex> lock(mLock);
        mReaderArrived = true;
        mFlowing.notify_all();
    }
    return rc;
}

int Demux::setPaused(bool paused) {
    std::lock_guard<std::mutex> control(mControlLock);
    mPaused.store(paused, std::memory_order_release);
    if (!mThread)
        return 0;
    mThread->wake();
    if (!paused)
        return 0;
    std::unique_lock<std::mutex> lock(mLock);
    const bool held = mHoldingChanged.wait_for(lock, std::chrono::seconds(1),
                                               [this] { return mHolding || mEnded || mStopping; });
    return held ? 0 : -ETIMEDOUT;
}

void Demux::noteHolding(bool holding) {
    std::lock_guard<std::mutex> lock(mLock);
    mHolding = holding;
    mHoldingChanged.notify_all();
}

int Demux::allocateHandle_l() const {
    // Handles are handed out round the whole range before one is used again, so
    // that a stale handle left in a caller's set does not name a new filter soon.
    for (int i = 0; i < kDemuxMaxHandles; ++i) {
        const int handle = (mNextHandle + i) % kDemuxMaxHandles;
        if (!mFilters[handle])
            return handle;
    }
    return -1;
}

int Demux::startFiltering(uint16_t pid, int filterKind) {
    if (pid > kMaxPid || filterKind < 0) {
        TAVO_LOGE("%s: invalid PID %d or filter kind %d\n", "DemuxBinder_StartFiltering", pid,
                  filterKind);
        return -EINVAL;
    }
    const int handle = addFilter({pid}, filterKind, 0, false);
    if (handle >= 0) {
        TAVO_LOGD("%s: PID %d kind %d -> handle %d\n", "DemuxBinder_StartFiltering", pid,
                  filterKind, handle);
    }
    return handle;
}

int Demux::startTap(const std::vector<uint16_t>& pids, size_t queuePackets, bool everyPid) {
    std::vector<uint16_t> unique;
    for (uint16_t pid : pids) {
        if (pid > kMaxPid) {
            TAVO_LOGE("%s: invalid PID %d\n", "Demux::startTap", pid);
            return -EINVAL;
        }
        if (std::find(unique.begin(), unique.end(), pid) == unique.end())
            unique.push_back(pid);
    }
    if (unique.empty())
        return -EINVAL;
    return addFilter(std::move(unique), kDemuxFilterPes, queuePackets, everyPid);
}

int Demux::setFilterPids(int handle, const std::vector<uint16_t>& pids) {
    std::vector<uint16_t> unique;
    for (uint16_t pid : pids) {
        if (pid > kMaxPid)
            return -EINVAL;
        if (std::find(unique.begin(), unique.end(), pid) == unique.end())
            unique.push_back(pid);
    }
    if (unique.empty())
        return -EINVAL;
    auto has = [](const std::vector<uint16_t>& list, uint16_t pid) {
        return std::find(list.begin(), list.end(), pid) != list.end();
    };
    std::lock_guard<std::mutex> control(mControlLock);
    std::vector<uint16_t> oldSource;
    {
        std::lock_guard<std::mutex> lock(mLock);
        if (handle < 0 || handle >= kDemuxMaxHandles || !mFilters[handle])
            return -EBADF;
        oldSource = mFilters[handle]->sourcePids;
    }
    for (uint16_t pid : unique) {
        if (!has(oldSource, pid) && mSource)
            mSource->addPid(pid);
    }
    {
        std::lock_guard<std::mutex> lock(mLock);
        Filter* filter = mFilters[handle].get();
        for (uint16_t pid : filter->pids)
            std::erase(mPidFilters[pid], filter);
        for (uint16_t pid : unique)
            mPidFilters[pid].push_back(filter);
        filter->pids = unique;
        filter->sourcePids = unique;
        filter->pid = unique.front();
    }
    for (uint16_t pid : oldSource) {
        if (!has(unique, pid) && mSource)
            mSource->removePid(pid);
    }
    return 0;
}

int Demux::addSourcePid(int handle, uint16_t pid) {
    if (pid > kMaxPid)
        return -EINVAL;
    std::lock_guard<std::mutex> control(mControlLock);
    {
        std::lock_guard<std::mutex> lock(mLock);
        if (handle < 0 || handle >= kDemuxMaxHandles || !mFilters[handle])
            return -EBADF;
        auto& pids = mFilters[handle]->sourcePids;
        if (std::find(pids.begin(), pids.end(), pid) != pids.end())
            return 0;
        pids.push_back(pid);
    }
    return mSource ? mSource->addPid(pid) : 0;
}

int Demux::addFilter(std::vector<uint16_t> pids, int kind, size_t queuePackets, bool everyPid) {
    std::lock_guard<std::mutex> control(mControlLock);
    if (!mSource) {
        const int rc = openSource_c();
        if (rc < 0)
            return rc;
    }
    int rc = 0;
    size_t added = 0;
    for (; added < pids.size() && rc >= 0; ++added)
        rc = mSource->addPid(pids[added]);
    if (rc < 0)
        --added;  // the PID that failed was not added
    int handle = -1;
    size_t filters = 0;
    if (rc >= 0) {
        std::lock_guard<std::mutex> lock(mLock);
        handle = allocateHandle_l();
        if (handle >= 0) {
            const size_t capacity = queuePackets > 0 ? queuePackets : mConfig.queuePackets;
            mFilters[handle] = std::make_unique<Filter>(pids, kind, capacity);
            Filter* filter = mFilters[handle].get();
            if (everyPid) {
                filter->pids.clear();
                for (uint16_t pid = 0; pid < kMaxPid; ++pid)
                    filter->pids.push_back(pid);
            }
            for (uint16_t pid : filter->pids)
                mPidFilters[pid].push_back(filter);
            ++mFilterCount;
            mNextHandle = (handle + 1) % kDemuxMaxHandles;
        }
        filters = mFilterCount;
    }
    if (handle < 0) {
        if (rc >= 0)
            TAVO_LOGE("%s: no free demux handle for PID %d\n", "DemuxBinder_StartFiltering",
                      pids.front());
        for (size_t i = 0; i < added; ++i)
            mSource->removePid(pids[i]);
        if (filters == 0)
            closeSource_c();
        return rc < 0 ? rc : -EMFILE;
    }
    return handle;
}

int Demux::stopFiltering(int handle) {
    std::lock_guard<std::mutex> control(mControlLock);
    uint16_t pid = 0;
    std::vector<uint16_t> pids;
    uint64_t dropped = 0;
    size_t remaining = 0;
    {
        std::lock_guard<std::mutex> lock(mLock);
        if (handle < 0 || handle >= kDemuxMaxHandles || !mFilters[handle]) {
            TAVO_LOGW("%s: unknown handle %d\n", "DemuxBinder_StopFiltering", handle);
            return -1;
        }
        Filter* filter = mFilters[handle].get();
        pid = filter->pid;
        pids = filter->sourcePids;
        for (uint16_t p : filter->pids)
            std::erase(mPidFilters[p], filter);
        dropped = filter->queue.dropped();
        mFilters[handle].reset();
        remaining = --mFilterCount;
        mRoomReady.notify_all();
    }
    if (dropped > 0) {
        TAVO_LOGW("%s: PID %d (handle %d) lost %llu packets: its reader was too slow\n",
                  "DemuxBinder_StopFiltering", pid, handle,
                  static_cast<unsigned long long>(dropped));
    }
    if (mSource) {
        for (uint16_t p : pids)
            mSource->removePid(p);
        if (remaining == 0)
            closeSource_c();
    }
    return 0;
}

int Demux::select(DemuxHandleSet* set, int timeoutMs) {
    if (set == nullptr)
        return -EINVAL;
    const auto deadline =
        std::chrono::steady_clock::now() + std::chrono::milliseconds(std::max(timeoutMs, 0));
    std::unique_lock<std::mutex> lock(mLock);
    if (!mReaderArrived) {
        mReaderArrived = true;
        mFlowing.notify_all();
    }
    for (;;) {
        DemuxHandleSet ready{};
        int count = 0;
        for (int word = 0; word < kDemuxHandleSetWords; ++word) {
            uint32_t bits = set->bits[word];
            while (bits != 0) {
                const int bit = __builtin_ctz(bits);
                bits &= bits - 1;
                const int handle = word * 32 + bit;
                if (mFilters[handle] && !mFilters[handle]->queue.empty()) {
                    ready.bits[word] |= 1u << bit;
                    ++count;
                }
            }
        }
        if (count > 0 || (timeoutMs >= 0 && std::chrono::steady_clock::now() >= deadline)) {
            *set = ready;
            return count;
        }
        if (timeoutMs < 0) {
            mDataReady.wait(lock);
        } else {
            mDataReady.wait_until(lock, deadline);
        }
    }
}

int Demux::readData(int handle, uint8_t* buffer, int size) {
    if (buffer == nullptr || size < static_cast<int>(kPacket))
        return -EINVAL;
    std::lock_guard<std::mutex> lock(mLock);
    if (handle < 0 || handle >= kDemuxMaxHandles || !mFilters[handle])
        return -EBADF;
    Filter* filter = mFilters[handle].get();
    const size_t n = filter->queue.pop(buffer, static_cast<size_t>(size) / kPacket);
    if (n > 0) {
        filter->stalled = false;
        if (mConfig.overflow == DemuxSourceConfig::Overflow::kWait)
            mRoomReady.notify_all();
    }
    if (filter->queue.empty())
        filter->overflowLogged = false;
    return static_cast<int>(n * kPacket);
}

void Demux::deliver(const uint8_t* packets, size_t count) {
    std::unique_lock<std::mutex> lock(mLock);
    const bool wait = mConfig.overflow == DemuxSourceConfig::Overflow::kWait;
    bool delivered = false;
    for (size_t i = 0; i < count; ++i) {
        const uint8_t* packet = packets + i * kPacket;
        const uint16_t pid = pidOf(packet);
        if (mPidFilters[pid].empty())
            continue;
        if (wait) {
            const auto deadline =
                std::chrono::steady_clock::now() + std::chrono::milliseconds(kOverflowWaitMs);
            for (;;) {
                Filter* full = nullptr;
                for (Filter* f : mPidFilters[pid]) {
                    if (f->queue.full() && !f->stalled)
                        full = f;
                }
                if (full == nullptr || mStopping)
                    break;
                if (delivered) {
                    mDataReady.notify_all();
                    delivered = false;
                }
                if (mRoomReady.wait_until(lock, deadline) == std::cv_status::timeout) {
                    // Give up on this reader until it reads again; the others go on.
                    for (Filter* f : mPidFilters[pid]) {
                        if (f->queue.full() && !f->stalled) {
                            f->stalled = true;
                            TAVO_LOGW("%s: PID %d has not been read for %d ms\n", "DemuxSource",
                                      pid, kOverflowWaitMs);
                        }
                    }
                }
            }
        }
        for (Filter* f : mPidFilters[pid]) {
            if (f->queue.full() && !f->overflowLogged) {
                f->overflowLogged = true;
                TAVO_LOGW("%s: PID %d is not read fast enough; its oldest packets are dropped\n",
                          "DemuxSource", pid);
            }
            f->queue.push(packet);
        }
        delivered = true;
        mPackets.fetch_add(1, std::memory_order_relaxed);
    }
    if (delivered)
        mDataReady.notify_all();
}

bool Demux::waitUntilFlowing(int timeoutMs) {
    std::unique_lock<std::mutex> lock(mLock);
    return mFlowing.wait_for(lock, std::chrono::milliseconds(timeoutMs),
                             [this] { return mReaderArrived && !mStopping; });
}

void Demux::noteEnded() {
    std::lock_guard<std::mutex> lock(mLock);
    mEnded = true;
}

bool Demux::filterStats(int handle, FilterStats* stats) const {
    std::lock_guard<std::mutex> lock(mLock);
    if (handle < 0 || handle >= kDemuxMaxHandles || !mFilters[handle])
        return false;
    const Filter& f = *mFilters[handle];
    stats->pid = f.pid;
    stats->queued = f.queue.count();
    stats->received = f.queue.pushed();
    stats->dropped = f.queue.dropped();
    return true;
}

Demux::SourceStats Demux::sourceStats() const {
    SourceStats stats;
    {
        std::lock_guard<std::mutex> lock(mLock);
        stats.open = mFilterCount > 0;
        stats.ended = mEnded;
    }
    stats.packets = mPackets.load(std::memory_order_relaxed);
    stats.syncLosses = mSyncLosses.load(std::memory_order_relaxed);
    stats.bytesSkipped = mBytesSkipped.load(std::memory_order_relaxed);
    stats.discontinuities = mDiscontinuities.load(std::memory_order_relaxed);
    return stats;
}

void Demux::dump(FILE* stream, int indent) {
    if (stream == nullptr)
        return;
    const std::string prefix(static_cast<size_t>(std::max(indent, 0)), '\t');
    const SourceStats stats = sourceStats();
    fprintf(stream, "%s - Demux\n", prefix.c_str());
    fprintf(stream, "%s\tSource packets: %llu, sync losses: %llu, bytes skipped: %llu%s\n",
            prefix.c_str(), static_cast<unsigned long long>(stats.packets),
            static_cast<unsigned long long>(stats.syncLosses),
            static_cast<unsigned long long>(stats.bytesSkipped), stats.ended ? " (ended)" : "");
    std::lock_guard<std::mutex> lock(mLock);
    for (int handle = 0; handle < kDemuxMaxHandles; ++handle) {
        const Filter* f = mFilters[handle].get();
        if (f == nullptr)
            continue;
        fprintf(stream, "%s\tHandle %d: PID %d kind %d queued %zu/%zu received %llu dropped %llu\n",
                prefix.c_str(), handle, f->pid, f->kind, f->queue.count(), f->queue.capacity(),
                static_cast<unsigned long long>(f->queue.pushed()),
                static_cast<unsigned long long>(f->queue.dropped()));
    }
}

}  // namespace TavoPlayer
