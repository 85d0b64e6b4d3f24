// TSRecording: one recording of the live stream to a TS file.
//
// open() starts one demux filter on PID 0 and the video and audio PIDs, so that
// their packets queue in multiplex order from that moment, learns the PCR and
// caption PIDs and the stream types from the live PAT and PMT (ProgramFinder;
// the filter takes the PMT PIDs as the PAT names them), and then narrows the
// filter to the recorded PIDs (PCR, video, audio, captions); the video and audio
// packets read meanwhile are kept for the file. start() creates the file and starts the writer
// thread ("TSRecorder"), which writes the queued packets unchanged and in order, after the
// recording's own PAT and PMT (ProgramTableWriter), repeated every 100 ms of stream time. While it
// writes it keeps the time index (TsIndexer) and, once a second, hands size,
// duration and new index points to the catalog: a recording cut short by a crash
// loses at most the last second of its catalog state, never its file.
//
// The file is held with an exclusive flock while the writer has it open, which is
// how a later process tells an interrupted recording from a live one.
//
// Failures end the writing (the file stays whole: cut back to whole packets) and
// post the recording's event on the service's event thread:
//   disk full (ENOSPC, EDQUOT, EFBIG)      -> kRecEventDiskFull
//   any other write or sync error           -> kRecEventFileError
//   the demux source ended or the filter is gone -> kRecEventDemuxLost
//
// Threads: open/start/finish/discard run on the caller's thread (the service holds
// its lock); the writer thread touches only its own members and the catalog.
#pragma once

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "platform/dtv/ProgramFinder.h"
#include "platform/dtv/ProgramTableWriter.h"
#include "platform/dtv/RecEventDispatcher.h"
#include "platform/dtv/RecordingCatalog.h"
#include "platform/dtv/TsIndexer.h"

namespace TavoPlayer {

class TSRecording {
public:
    // Packets the demux keeps for the writer: about 6 MB, several seconds of a
    // full multiplex, so a slow disk write costs no packet.
    static constexpr size_t kQueuePackets = 32768;
    static constexpr uint32_t kTablesIntervalMs = 100;
    static constexpr int kProgressIntervalMs = 1000;

    enum class End { kNone, kDiskFull, kFileError, kDemuxLost };

    struct Events {
        RecEventDispatcher* dispatcher = nullptr;
        RecPlayerEventCallback callback = nullptr;
        void* userData = nullptr;
    };

    // Packets kept while the tables are looked for: a bound for a source that
    // delivers much faster than real time.
    static constexpr size_t kMaxPrebufferBytes = 64u << 20;

    TSRecording(int videoPid, int audioPid, int isLATM, Events events);
    ~TSRecording();
    TSRecording(const TSRecording&) = delete;
    TSRecording& operator=(const TSRecording&) = delete;

    // Starts the demux filter and finds the programme, waiting at most
    // `tablesWaitMs` for its tables; without them the PCR is taken from the video
    // PID and captions are not recorded. Returns 0 or a negative errno value (logged).
    int open(int tablesWaitMs);
    // Creates `path` (which must not exist) and starts writing. `catalog` receives
    // the progress of row `fileNumName`; it must outlive the recording.
    int start(const std::string& path, int fileNumName, RecordingCatalog* catalog);
    // Stops writing: the file is flushed, synced and closed, the filter stopped, and
    // the catalog row gets the final size and duration. Idempotent.
    void finish();
    // Stops writing and removes the file. Idempotent.
    void discard();

    const ProgramInfo& program() const { return mProgram; }
    const std::vector<uint16_t>& pids() const { return mPids; }
    // The caption PID recorded, or -1.
    int captionPid() const;
    End end() const { return mEnd.load(); }
    uint64_t sizeBytes() const { return mWritten.load(); }
    uint32_t durationMs() const { return mDurationMs.load(); }
    uint64_t packetsRecorded() const { return mPacketsRecorded.load(); }
    bool started() const { return mThread.joinable() || mFd >= 0; }

private:
    void run();
    void handle(const uint8_t* packet);
    // Writes the pending bytes. False (with mEnd set) on failure.
    bool flush();
    void reportProgress();
    void stopThread();
    void fail(End end, int error);
    void stopFilter();

    void fallbackProgram();

    const int mVideoPid;
    const int mAudioPid;
    const int mIsLATM;
    ProgramInfo mProgram;
    std::vector<uint16_t> mPids;
    const Events mEvents;
    std::vector<uint8_t> mPrebuffer;
    ProgramTableWriter mTables;
    TsIndexer mIndexer{-1};

    int mHandle = -1;
    int mFd = -1;
    std::string mPath;
    int mFileNumName = 0;
    RecordingCatalog* mCatalog = nullptr;
    std::thread mThread;
    std::mutex mStopLock;
    std::condition_variable mStopChanged;
    bool mStop = false;  // mStopLock

    // Writer thread only, once started.
    std::vector<uint8_t> mPending;
    std::vector<IndexPoint> mNewPoints;
    int64_t mLastTablesMs = -1;
    uint64_t mPacketsSinceTables = 0;

    std::atomic<End> mEnd{End::kNone};
    std::atomic<uint64_t> mWritten{0};
    std::atomic<uint32_t> mDurationMs{0};
    std::atomic<uint64_t> mPacketsRecorded{0};
};

}  // namespace TavoPlayer
