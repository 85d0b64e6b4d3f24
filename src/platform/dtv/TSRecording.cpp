#include "platform/dtv/TSRecording.h"

#include <fcntl.h>
#include <pthread.h>
#include <sys/file.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <ctime>

#include "platform/dtv/Demux.h"
#include "platform/dtv/PcrPacer.h"
#include "platform/dtv/RecPlayerBinder.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {

constexpr size_t kPacket = kTsPacketSize;
constexpr size_t kReadPackets = 512;
constexpr size_t kFlushBytes = 512 * 1024;
// Without any PCR the tables are still repeated, by packet count.
constexpr uint64_t kTablesEveryPackets = 4096;

bool validPid(int pid) {
    return pid >= 0 && pid < 0x1FFF;
}

uint16_t pidOf(const uint8_t* packet) {
    return static_cast<uint16_t>(((packet[1] & 0x1f) << 8) | packet[2]);
}

bool hasPcr(const uint8_t* packet) {
    uint64_t pcr = 0;
    bool discontinuity = false;
    return PcrPacer::readPcr(packet, &pcr, &discontinuity);
}

int64_t monotonicMs() {
    return std::chrono::duration_cast<std::chrono::milliseconds>(
               std::chrono::steady_clock::now().time_since_epoch())
        .count();
}

}  // namespace

TSRecording::TSRecording(int videoPid, int audioPid, int isLATM, Events events)
    : mVideoPid(videoPid), mAudioPid(audioPid), mIsLATM(isLATM), mEvents(events) {
    mPending.reserve(kFlushBytes + 64 * kPacket);
}

TSRecording::~TSRecording() {
    finish();
}

void TSRecording::fallbackProgram() {
    // ISO/IEC 13818-1, Table 2-34: H.264 video, AAC in LATM/LOAS or ADTS.
    constexpr uint8_t kStreamTypeH264 = 0x1B;
    constexpr uint8_t kStreamTypeAacLatm = 0x11;
    constexpr uint8_t kStreamTypeAacAdts = 0x0F;
    mProgram = ProgramInfo();
    mProgram.pcrPid = static_cast<uint16_t>(validPid(mVideoPid) ? mVideoPid : mAudioPid);
    if (validPid(mVideoPid))
        mProgram.streams.push_back({kStreamTypeH264, static_cast<uint16_t>(mVideoPid), {}});
    if (validPid(mAudioPid) && mAudioPid != mVideoPid) {
        mProgram.streams.push_back({mIsLATM ? kStreamTypeAacLatm : kStreamTypeAacAdts,
                                    static_cast<uint16_t>(mAudioPid),
                                    {}});
    }
}

int TSRecording::open(int tablesWaitMs) {
    const char* kName = "RecPlayerBinder_CreateTSRecorder";
    Demux& demux = Demux::instance();
    std::vector<uint16_t> av;
    for (int pid : {mVideoPid, mAudioPid}) {
        if (validPid(pid))
            av.push_back(static_cast<uint16_t>(pid));
    }
    if (av.empty()) {
        TAVO_LOGE("%s: neither video PID %d nor audio PID %d can be recorded\n", kName, mVideoPid,
                  mAudioPid);
        return -EINVAL;
    }
    std::vector<uint16_t> watching = av;
    watching.push_back(0);
    // Every PID until the programme is known: its PCR and caption packets are then
    // kept from this moment too, however fast the source runs.
    mHandle = demux.startTap(watching, kQueuePackets, true);
    if (mHandle < 0) {
        TAVO_LOGE("%s: cannot filter the recorded PIDs on the demux (%d)\n", kName, mHandle);
        return mHandle;
    }
    ProgramFinder finder(av.front());
    std::vector<uint8_t> buffer(kReadPackets * kPacket);
    size_t pmtPidsAsked = 0;
    bool prebufferFull = false;
    const auto deadline =
        std::chrono::steady_clock::now() + std::chrono::milliseconds(tablesWaitMs);
    while (!finder.program() && std::chrono::steady_clock::now() < deadline) {
        DemuxHandleSet set;
        DemuxBinder_HandleZERO(&set);
        DemuxBinder_HandleSET(mHandle, &set);
        const int n = demux.select(&set, 50) > 0
                          ? demux.readData(mHandle, buffer.data(), static_cast<int>(buffer.size()))
                          : 0;
        if (n < 0)
            break;
        for (int i = 0; i + static_cast<int>(kPacket) <= n; i += static_cast<int>(kPacket)) {
            const uint8_t* packet = &buffer[static_cast<size_t>(i)];
            finder.push(packet);
            if (mPrebuffer.size() < kMaxPrebufferBytes)
                mPrebuffer.insert(mPrebuffer.end(), packet, packet + kPacket);
            else
                prebufferFull = true;
        }
        if (finder.pmtPids().size() != pmtPidsAsked) {
            // A tuner must be asked for the PMT PIDs the PAT named.
            pmtPidsAsked = finder.pmtPids().size();
            for (uint16_t pid : finder.pmtPids())
                demux.addSourcePid(mHandle, pid);
        }
        if (n == 0) {
            Demux::FilterStats stats;
            if (demux.sourceStats().ended && demux.filterStats(mHandle, &stats) &&
                stats.queued == 0)
                break;
        }
    }
    if (prebufferFull) {
        TAVO_LOGW(
            "%s: the source ran far ahead while the tables were looked for; packets "
            "beyond %zu bytes were not kept\n",
            kName, kMaxPrebufferBytes);
    }
    if (finder.program()) {
        mProgram = *finder.program();
    } else {
        // Without the tables the recording still keeps its streams: the PCR is then
        // assumed on the video PID, as ISDB-T services carry it.
        TAVO_LOGW(
            "%s: no PAT/PMT naming PID %d within %d ms; recording video and audio with "
            "the PCR taken from the video PID, without captions\n",
            kName, av.front(), tablesWaitMs);
        fallbackProgram();
    }
    auto add = [&](int pid) {
        if (validPid(pid) && std::find(mPids.begin(), mPids.end(), pid) == mPids.end())
            mPids.push_back(static_cast<uint16_t>(pid));
    };
    add(mProgram.pcrPid);
    add(mVideoPid);
    add(mAudioPid);
    const ProgramStream* captions = mProgram.captionStream();
    add(captions != nullptr ? captions->pid : -1);
    // A PID the PMT does not list still gets a stream type a player understands.
    for (int pid : {mVideoPid, mAudioPid}) {
        if (validPid(pid) && mProgram.stream(static_cast<uint16_t>(pid)) == nullptr) {
            mProgram.streams.push_back({static_cast<uint8_t>(pid == mVideoPid ? 0x1B
                                                             : mIsLATM        ? 0x11
                                                                              : 0x0F),
                                        static_cast<uint16_t>(pid),
                                        {}});
        }
    }
    mIndexer = TsIndexer(mProgram.pcrPid);
    if (!mTables.build(mProgram, mPids)) {
        TAVO_LOGE("%s: cannot build the recording's programme tables\n", kName);
        return -EINVAL;
    }
    const int rc = demux.setFilterPids(mHandle, mPids);
    return rc < 0 ? rc : 0;
}

int TSRecording::captionPid() const {
    const ProgramStream* captions = mProgram.captionStream();
    return captions != nullptr &&
                   std::find(mPids.begin(), mPids.end(), captions->pid) != mPids.end()
               ? captions->pid
               : -1;
}

int TSRecording::start(const std::string& path, int fileNumName, RecordingCatalog* catalog) {
    if (mHandle < 0 || mFd >= 0 || mThread.joinable())
        return -EINVAL;
    const int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0644);
    if (fd < 0) {
        const int error = errno;
        TAVO_LOGE("%s: cannot create the recording file %s: %s\n",
                  "RecPlayerBinder_StartTSRecorder", path.c_str(), strerror(error));
        return -error;
    }
    if (flock(fd, LOCK_EX | LOCK_NB) != 0) {
        TAVO_LOGW("%s: cannot lock %s: %s\n", "RecPlayerBinder_StartTSRecorder", path.c_str(),
                  strerror(errno));
    }
    mFd = fd;
    mPath = path;
    mFileNumName = fileNumName;
    mCatalog = catalog;
    mThread = std::thread([this] { run(); });
    return 0;
}

void TSRecording::run() {
    pthread_setname_np(pthread_self(), "TSRecorder");
    std::vector<uint8_t> buffer(kReadPackets * kPacket);
    int64_t lastProgressMs = monotonicMs();
    mTables.append(mPending);
    mLastTablesMs = 0;
    for (size_t i = 0; i + kPacket <= mPrebuffer.size(); i += kPacket)
        handle(&mPrebuffer[i]);
    mPrebuffer = {};
    for (;;) {
        {
            std::lock_guard<std::mutex> lock(mStopLock);
            if (mStop)
                break;
        }
        if (mEnd.load() != End::kNone) {
            // Nothing more will be written; wait for finish() or discard().
            std::unique_lock<std::mutex> lock(mStopLock);
            mStopChanged.wait_for(lock, std::chrono::milliseconds(100), [this] { return mStop; });
            continue;
        }
        DemuxHandleSet set;
        DemuxBinder_HandleZERO(&set);
        DemuxBinder_HandleSET(mHandle, &set);
        const int ready = Demux::instance().select(&set, 100);
        int n = 0;
        if (ready > 0) {
            n = Demux::instance().readData(mHandle, buffer.data(), static_cast<int>(buffer.size()));
            if (n < 0) {
                fail(End::kDemuxLost, -n);
                continue;
            }
            for (int i = 0; i + static_cast<int>(kPacket) <= n; i += static_cast<int>(kPacket))
                handle(&buffer[static_cast<size_t>(i)]);
            if (mPending.size() >= kFlushBytes && !flush())
                continue;
        }
        const int64_t now = monotonicMs();
        if (n == 0) {
            if (!flush())
                continue;
            const Demux::SourceStats stats = Demux::instance().sourceStats();
            Demux::FilterStats filter;
            const bool known = Demux::instance().filterStats(mHandle, &filter);
            if (!known || (stats.ended && filter.queued == 0)) {
                fail(End::kDemuxLost, 0);
                continue;
            }
        }
        if (now - lastProgressMs >= kProgressIntervalMs) {
            if (!flush())
                continue;
            reportProgress();
            lastProgressMs = now;
        }
    }
    if (mEnd.load() == End::kNone)
        flush();
}

void TSRecording::handle(const uint8_t* packet) {
    // The tables of the broadcast still queued from the search are not recorded.
    if (std::find(mPids.begin(), mPids.end(), pidOf(packet)) == mPids.end())
        return;
    const bool pcrPacket = pidOf(packet) == mProgram.pcrPid && hasPcr(packet);
    uint64_t offset = mWritten.load(std::memory_order_relaxed) + mPending.size();
    ++mPacketsSinceTables;
    if (pcrPacket) {
        // The tables go just before a PCR, so a reader moved to an index point finds
        // the programme's description and the clock together.
        const uint32_t nowMs = mIndexer.havePcr() ? mIndexer.elapsedMs() : 0;
        if (static_cast<int64_t>(nowMs) >= mLastTablesMs + kTablesIntervalMs) {
            mTables.append(mPending);
            mLastTablesMs = nowMs;
            mPacketsSinceTables = 0;
        }
    } else if (mPacketsSinceTables >= kTablesEveryPackets && !mIndexer.havePcr()) {
        offset += mTables.packetsPerRepetition() * kPacket;
        mTables.append(mPending);
        mPacketsSinceTables = 0;
    }
    if (mIndexer.push(packet, offset)) {
        mNewPoints.push_back(mIndexer.points().back());
        mIndexer.takePoints();
        mDurationMs.store(mIndexer.elapsedMs(), std::memory_order_relaxed);
    }
    mPending.insert(mPending.end(), packet, packet + kPacket);
    mPacketsRecorded.fetch_add(1, std::memory_order_relaxed);
}

bool TSRecording::flush() {
    size_t done = 0;
    while (done < mPending.size()) {
        const ssize_t n = ::write(mFd, mPending.data() + done, mPending.size() - done);
        if (n > 0) {
            done += static_cast<size_t>(n);
            mWritten.fetch_add(static_cast<uint64_t>(n), std::memory_order_relaxed);
            continue;
        }
        if (n < 0 && errno == EINTR)
            continue;
        const int error = n < 0 ? errno : ENOSPC;
        mPending.erase(mPending.begin(), mPending.begin() + static_cast<std::ptrdiff_t>(done));
        fail(
            error == ENOSPC || error == EDQUOT || error == EFBIG ? End::kDiskFull : End::kFileError,
            error);
        return false;
    }
    mPending.clear();
    return true;
}

void TSRecording::reportProgress() {
    if (mCatalog == nullptr)
        return;
    // Only points inside what has reached the file: a crash must not leave an index
    // that leads past the end.
    std::vector<IndexPoint> points;
    const uint64_t written = mWritten.load();
    size_t keep = 0;
    for (; keep < mNewPoints.size() && mNewPoints[keep].offset < written; ++keep)
        points.push_back(mNewPoints[keep]);
    uint32_t durationMs = points.empty() ? mDurationMs.load() : points.back().timeMs;
    if (mCatalog->progress(mFileNumName, written, std::max(durationMs, mDurationMs.load()),
                           static_cast<uint32_t>(time(nullptr)),
                           points) == RecordingCatalog::Status::kOk) {
        mNewPoints.erase(mNewPoints.begin(),
                         mNewPoints.begin() + static_cast<std::ptrdiff_t>(keep));
    }
}

void TSRecording::fail(End end, int error) {
    if (mEnd.load() != End::kNone)
        return;
    int event = kRecEventFileError;
    switch (end) {
        case End::kDiskFull:
            event = kRecEventDiskFull;
            TAVO_LOGE("%s: the disk is full while recording %s (%s); the recording stops here\n",
                      "TSRecorder", mPath.c_str(), strerror(error));
            break;
        case End::kFileError:
            TAVO_LOGE("%s: writing %s failed (%s); the recording stops here\n", "TSRecorder",
                      mPath.c_str(), strerror(error));
            break;
        case End::kDemuxLost:
            event = kRecEventDemuxLost;
            TAVO_LOGE("%s: the demux stopped delivering to %s (%s); the recording stops here\n",
                      "TSRecorder", mPath.c_str(),
                      error != 0 ? strerror(error) : "the source ended");
            break;
        case End::kNone:
            return;
    }
    // What reached the file ends on a whole packet: a short write may have cut one.
    const uint64_t written = mWritten.load();
    const uint64_t whole = written / kPacket * kPacket;
    if (whole != written && ftruncate(mFd, static_cast<off_t>(whole)) == 0)
        mWritten.store(whole);
    mPending.clear();
    mEnd.store(end);
    reportProgress();
    if (mEvents.dispatcher != nullptr)
        mEvents.dispatcher->post(mEvents.callback, mEvents.userData, event);
}

void TSRecording::stopThread() {
    if (!mThread.joinable())
        return;
    {
        std::lock_guard<std::mutex> lock(mStopLock);
        mStop = true;
        mStopChanged.notify_all();
    }
    mThread.join();
}

void TSRecording::stopFilter() {
    if (mHandle >= 0) {
        Demux::FilterStats stats;
        if (Demux::instance().filterStats(mHandle, &stats) && stats.dropped > 0) {
            TAVO_LOGW("%s: %s lost %llu packets: the disk did not keep up\n", "TSRecorder",
                      mPath.c_str(), static_cast<unsigned long long>(stats.dropped));
        }
        Demux::instance().stopFiltering(mHandle);
        mHandle = -1;
    }
}

void TSRecording::finish() {
    stopThread();
    stopFilter();
    if (mFd < 0)
        return;
    if (fdatasync(mFd) != 0 && mEnd.load() == End::kNone) {
        TAVO_LOGE("%s: syncing %s failed: %s\n", "RecPlayerBinder_StopTSRecorder", mPath.c_str(),
                  strerror(errno));
    }
    reportProgress();
    close(mFd);
    mFd = -1;
}

void TSRecording::discard() {
    stopThread();
    stopFilter();
    if (mFd >= 0) {
        close(mFd);
        mFd = -1;
    }
    if (!mPath.empty() && unlink(mPath.c_str()) != 0 && errno != ENOENT) {
        TAVO_LOGE("%s: cannot remove %s: %s\n", "RecPlayerBinder_CancelTSRecorder", mPath.c_str(),
                  strerror(errno));
    }
    mPath.clear();
}

}  // namespace TavoPlayer
