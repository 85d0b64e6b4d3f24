// RecPlayerService: the recording service behind the RecPlayerBinder_ calls.
//
// One per process. It keeps at most one recording (TSRecording) and one clip being
// played (a ClipCursor armed as the demux's source), the catalog of the recordings
// folder (RecordingCatalog) and the thread that delivers their events
// (RecEventDispatcher). docs/recording.md describes the behaviour for users.
//
// A recording goes created -> recording -> stopped or cancelled -> deleted (idle).
// Create finds the programme's PCR and caption PIDs in the live PAT and PMT and
// starts the demux filter; Start creates the file and its catalog row; Stop keeps
// both; Cancel removes both; Delete releases the recording (and removes both when
// it was neither stopped nor cancelled). A Create while a recording runs is
// refused: AnyMoreRecordings then answers 0 with the event "too many recordings",
// and the refused attempt's Start, Get/SetCurrTSRecDetails, Stop and Cancel fail
// without touching the running recording.
//
// Threads: every call holds the service lock; events are delivered on the
// dispatcher's thread, never under that lock. Lock order: service lock, then the
// demux's locks, then a clip cursor's lock.
#pragma once

#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/dtv/ClipSource.h"
#include "platform/dtv/ProgramFinder.h"
#include "platform/dtv/RecEventDispatcher.h"
#include "platform/dtv/RecPlayerBinder.h"
#include "platform/dtv/RecordingCatalog.h"
#include "platform/dtv/TSRecording.h"
#include "platform/dtv/TsIndexer.h"

namespace TavoPlayer {

class RecPlayerService {
public:
    // How long Create waits for the live PAT and PMT (both are sent at least every
    // 100 ms in ISDB-T, ABNT NBR 15603-2) before it records without them.
    static constexpr int kTablesWaitMs = 1500;
    // Property: "none" feeds clips as fast as they are read (tests, benchmarks).
    static constexpr const char* kClipPaceProperty = "tavoplayer.recordings.pace";

    static RecPlayerService& instance();

    RecPlayerService();
    ~RecPlayerService();
    RecPlayerService(const RecPlayerService&) = delete;
    RecPlayerService& operator=(const RecPlayerService&) = delete;

    int createTSRecorder(int storageType, int videoPid, int audioPid, int isLATM,
                         RecPlayerEventCallback callback, void* userData);
    int anyMoreRecordings();
    int startTSRecorder();
    RecDetails* getCurrTSRecDetails();
    int setCurrTSRecDetails(const RecDetails* details);
    int stopTSRecorder();
    int cancelTSRecorder();
    int deleteTSRecorder();

    int isTSPlayerActive(RecPlayerEventCallback callback, void* userData);
    RecDetails* getRecClipDetails(const char* clipPath, int notOnExternalCard);
    int pauseTSPlayer();
    int resumeTSPlayer();
    int isPossibleSeek();
    int repositioningTSPlayer(unsigned int elapsedTimeSec, int positionMs);
    int setCurrLapTime(unsigned int elapsedMs, unsigned int ptsMs);

    RecEventDispatcher& events() { return mEvents; }
    // The recordings folder as configured now (the property, else the XDG default).
    static std::string recordingsDir();

private:
    enum class RecState { kIdle, kCreated, kRecording, kStopped, kCancelled };

    // The catalog of the configured folder, created and opened as needed; null after
    // logging why.
    RecordingCatalog* catalog_l(const char* caller);
    void releaseRecording_l();
    static RecDetails* toDetails(const RecordingCatalog::Entry& entry);

    RecEventDispatcher mEvents;  // first: outlives everything that posts to it
    std::mutex mLock;
    std::unique_ptr<RecordingCatalog> mCatalog;

    // Recording.
    RecState mRecState = RecState::kIdle;
    std::unique_ptr<TSRecording> mRecording;
    RecordingCatalog::Entry mEntry;
    int mStorageType = 0;
    bool mRefused = false;
    RecPlayerEventCallback mRefusedCallback = nullptr;
    void* mRefusedUserData = nullptr;

    // Clip playback.
    RecPlayerEventCallback mClipCallback = nullptr;
    void* mClipUserData = nullptr;
    std::shared_ptr<ClipCursor> mCursor;
    std::optional<RecordingCatalog::Entry> mClip;
    std::vector<IndexPoint> mClipIndex;
    uint32_t mClipDurationMs = 0;
    bool mRepositionPending = false;
    uint32_t mLapMs = 0;
};

}  // namespace TavoPlayer
