#include "platform/dtv/RecPlayerService.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <ctime>

#include "platform/dtv/Demux.h"
#include "platform/os/Properties.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {

constexpr size_t kPacket = kTsPacketSize;

// mkdir -p. Returns 0 or an errno value.
int makeDirs(const std::string& path) {
    std::string partial;
    size_t at = 0;
    while (at != std::string::npos) {
        at = path.find('/', at + 1);
        partial = path.substr(0, at);
        if (partial.empty())
            continue;
        if (mkdir(partial.c_str(), 0755) != 0 && errno != EEXIST)
            return errno;
    }
    struct stat st {};
    if (stat(path.c_str(), &st) != 0)
        return errno;
    return S_ISDIR(st.st_mode) ? 0 : ENOTDIR;
}

char* copyName(const std::string& name) {
    if (name.empty())
        return nullptr;
    char* copy = static_cast<char*>(malloc(name.size() + 1));
    if (copy != nullptr)
        memcpy(copy, name.c_str(), name.size() + 1);
    return copy;
}

}  // namespace

RecPlayerService& RecPlayerService::instance() {
    static RecPlayerService service;
    return service;
}

RecPlayerService::RecPlayerService() {
    // The demux must outlive the service: statics die in reverse order of construction.
    Demux::instance();
}

RecPlayerService::~RecPlayerService() {
    std::lock_guard<std::mutex> lock(mLock);
    if (mRecording)
        mRecording->finish();
    Demux::instance().setSourceProvider(nullptr);
}

std::string RecPlayerService::recordingsDir() {
    std::string dir = propertyGetString(kRecordingsDirProperty, "");
    if (!dir.empty())
        return dir;
    // The XDG base directory convention: user data under $XDG_DATA_HOME, which
    // defaults to ~/.local/share.
    const char* xdg = getenv("XDG_DATA_HOME");
    if (xdg != nullptr && xdg[0] == '/')
        return std::string(xdg) + "/tavoplayer/recordings";
    const char* home = getenv("HOME");
    return std::string(home != nullptr ? home : "") + "/.local/share/tavoplayer/recordings";
}

RecordingCatalog* RecPlayerService::catalog_l(const char* caller) {
    const std::string dir = recordingsDir();
    if (mCatalog && mCatalog->dir() == dir)
        return mCatalog.get();
    mCatalog.reset();
    const int error = makeDirs(dir);
    if (error != 0) {
        TAVO_LOGE("%s: cannot create the recordings folder %s: %s\n", caller, dir.c_str(),
                  strerror(error));
        return nullptr;
    }
    auto catalog = std::make_unique<RecordingCatalog>(dir);
    const RecordingCatalog::Status status = catalog->open();
    if (status != RecordingCatalog::Status::kOk) {
        TAVO_LOGE("%s: the recordings catalog in %s cannot be used%s\n", caller, dir.c_str(),
                  status == RecordingCatalog::Status::kBusy ? " (locked)" : "");
        return nullptr;
    }
    mCatalog = std::move(catalog);
    return mCatalog.get();
}

// --- recording ----------------------------------------------------------------

int RecPlayerService::createTSRecorder(int storageType, int videoPid, int audioPid, int isLATM,
                                       RecPlayerEventCallback callback, void* userData) {
    std::lock_guard<std::mutex> lock(mLock);
    const char* kName = "RecPlayerBinder_CreateTSRecorder";
    if (mRecState == RecState::kCreated || mRecState == RecState::kRecording) {
        TAVO_LOGE("%s: recording %d is still running; a second recording is refused\n", kName,
                  mEntry.fileNumName);
        mRefused = true;
        mRefusedCallback = callback;
        mRefusedUserData = userData;
        return 0;
    }
    releaseRecording_l();
    RecordingCatalog* catalog = catalog_l(kName);
    if (catalog == nullptr) {
        mEvents.post(callback, userData, kRecEventFileError);
        return 0;
    }
    if (access(catalog->dir().c_str(), W_OK) != 0) {
        TAVO_LOGE("%s: the recordings folder %s is read-only: %s\n", kName, catalog->dir().c_str(),
                  strerror(errno));
        mEvents.post(callback, userData, kRecEventFileError);
        return 0;
    }
    auto recording = std::make_unique<TSRecording>(
        videoPid, audioPid, isLATM, TSRecording::Events{&mEvents, callback, userData});
    if (recording->open(kTablesWaitMs) < 0) {
        mEvents.post(callback, userData, kRecEventDemuxLost);
        return 0;
    }
    mRecording = std::move(recording);
    mEntry = RecordingCatalog::Entry();
    mEntry.videoPid = videoPid;
    mEntry.audioPid = audioPid;
    mEntry.pcrPid = mRecording->program().pcrPid;
    mEntry.captionPid = mRecording->captionPid();
    mEntry.isLATM = isLATM;
    mEntry.recLocation = storageType;
    mStorageType = storageType;
    mRecState = RecState::kCreated;
    TAVO_LOGI("%s: recording PIDs PCR %d, video %d, audio %d, captions %d\n", kName, mEntry.pcrPid,
              videoPid, audioPid, mEntry.captionPid);
    return 1;
}

int RecPlayerService::anyMoreRecordings() {
    std::lock_guard<std::mutex> lock(mLock);
    if (mRefused) {
        // The refused attempt hears why; the running recording goes on untouched.
        mEvents.post(mRefusedCallback, mRefusedUserData, kRecEventTooManyRecordings);
        return 0;
    }
    if (mRecState == RecState::kRecording) {
        TAVO_LOGW("%s: recording %d is running; no other recording can start\n",
                  "RecPlayerBinder_AnyMoreRecordings", mEntry.fileNumName);
        return 0;
    }
    return 1;
}

int RecPlayerService::startTSRecorder() {
    std::lock_guard<std::mutex> lock(mLock);
    const char* kName = "RecPlayerBinder_StartTSRecorder";
    if (mRefused) {
        TAVO_LOGE("%s: this recording was refused; recording %d goes on\n", kName,
                  mEntry.fileNumName);
        return 0;
    }
    if (mRecState != RecState::kCreated || !mRecording) {
        TAVO_LOGE("%s: no recording has been created\n", kName);
        return 0;
    }
    RecordingCatalog* catalog = catalog_l(kName);
    if (catalog == nullptr) {
        releaseRecording_l();
        return 0;
    }
    const int number = catalog->nextNumber();
    const uint32_t now = static_cast<uint32_t>(time(nullptr));
    mEntry.fileNumName = number;
    mEntry.path = catalog->pathOf(number);
    mEntry.creationTime = now;
    mEntry.recStartTime = now;
    mEntry.recEndTime = 0;
    mEntry.bCanPlay = 1;
    mEntry.state = RecordingCatalog::kRecording;
    if (catalog->insert(mEntry) != RecordingCatalog::Status::kOk) {
        TAVO_LOGE("%s: recording %d cannot be entered in the catalog; not started\n", kName,
                  number);
        releaseRecording_l();
        return 0;
    }
    if (mRecording->start(mEntry.path, number, catalog) < 0) {
        catalog->remove(number);
        releaseRecording_l();
        return 0;
    }
    mRecState = RecState::kRecording;
    TAVO_LOGI("%s: recording %d to %s\n", kName, number, mEntry.path.c_str());
    return 1;
}

RecDetails* RecPlayerService::toDetails(const RecordingCatalog::Entry& e) {
    auto* d = static_cast<RecDetails*>(calloc(1, sizeof(RecDetails)));
    if (d == nullptr)
        return nullptr;
    d->stationName = copyName(e.stationName);
    d->prgName = copyName(e.prgName);
    d->stationNameLength =
        d->stationName != nullptr ? static_cast<uint32_t>(e.stationName.size()) : 0;
    d->prgNameLength = d->prgName != nullptr ? static_cast<uint32_t>(e.prgName.size()) : 0;
    d->creationTime = e.creationTime;
    d->durationOfRec = e.durationOfRec;
    d->sizeOfRec = e.sizeOfRec;
    d->recMode = e.recMode;
    d->recLocation = e.recLocation;
    d->bCanPlay = e.bCanPlay;
    d->playbackDuration = e.playbackDuration;
    d->recStartTime = e.recStartTime;
    d->recEndTime = e.recEndTime;
    d->iV_PID = e.videoPid;
    d->iA_PID = e.audioPid;
    d->isLATM = e.isLATM;
    d->fileNumName = e.fileNumName;
    return d;
}

RecDetails* RecPlayerService::getCurrTSRecDetails() {
    std::lock_guard<std::mutex> lock(mLock);
    const char* kName = "RecPlayerBinder_GetCurrTSRecDetails";
    if (mRefused) {
        TAVO_LOGE("%s: this recording was refused; no details\n", kName);
        return nullptr;
    }
    if (mRecState != RecState::kRecording && mRecState != RecState::kStopped) {
        TAVO_LOGE("%s: no recording has been started\n", kName);
        return nullptr;
    }
    RecordingCatalog::Entry entry = mEntry;
    if (mRecState == RecState::kRecording && mRecording) {
        entry.sizeBytes = mRecording->sizeBytes();
        entry.sizeOfRec = static_cast<uint32_t>(entry.sizeBytes / 1024);
        entry.playbackDuration = mRecording->durationMs();
        entry.durationOfRec = entry.playbackDuration / 1000;
    }
    return toDetails(entry);
}

int RecPlayerService::setCurrTSRecDetails(const RecDetails* details) {
    std::lock_guard<std::mutex> lock(mLock);
    const char* kName = "RecPlayerBinder_SetCurrTSRecDetails";
    if (details == nullptr || mRefused ||
        (mRecState != RecState::kRecording && mRecState != RecState::kStopped)) {
        TAVO_LOGE("%s: %s\n", kName,
                  details == nullptr ? "no details given" : "no recording to describe");
        return 0;
    }
    // The recorder owns the description; the service keeps what it measures (times,
    // size, durations) and the number it allocated.
    mEntry.stationName = details->stationName != nullptr ? details->stationName : "";
    mEntry.prgName = details->prgName != nullptr ? details->prgName : "";
    mEntry.recMode = details->recMode;
    mEntry.recLocation = details->recLocation;
    mEntry.bCanPlay = details->bCanPlay;
    mEntry.videoPid = details->iV_PID;
    mEntry.audioPid = details->iA_PID;
    mEntry.isLATM = details->isLATM;
    RecordingCatalog* catalog = catalog_l(kName);
    if (catalog == nullptr)
        return 0;
    // The row's measured fields may have moved on since Start: keep the catalog's.
    std::optional<RecordingCatalog::Entry> row = catalog->get(mEntry.fileNumName);
    RecordingCatalog::Entry updated = row ? *row : mEntry;
    updated.stationName = mEntry.stationName;
    updated.prgName = mEntry.prgName;
    updated.recMode = mEntry.recMode;
    updated.recLocation = mEntry.recLocation;
    updated.bCanPlay = mEntry.bCanPlay;
    updated.videoPid = mEntry.videoPid;
    updated.audioPid = mEntry.audioPid;
    updated.isLATM = mEntry.isLATM;
    return catalog->update(updated) == RecordingCatalog::Status::kOk ? 1 : 0;
}

int RecPlayerService::stopTSRecorder() {
    std::lock_guard<std::mutex> lock(mLock);
    const char* kName = "RecPlayerBinder_StopTSRecorder";
    if (mRefused) {
        mRefused = false;
        TAVO_LOGW("%s: the refused recording has nothing to stop; recording %d goes on\n", kName,
                  mEntry.fileNumName);
        return 0;
    }
    if (mRecState != RecState::kRecording || !mRecording) {
        TAVO_LOGE("%s: no recording is running\n", kName);
        return 0;
    }
    mRecording->finish();
    RecordingCatalog* catalog = catalog_l(kName);
    std::optional<RecordingCatalog::Entry> row;
    if (catalog != nullptr)
        row = catalog->get(mEntry.fileNumName);
    RecordingCatalog::Entry final = row ? *row : mEntry;
    final.sizeBytes = mRecording->sizeBytes();
    final.sizeOfRec = static_cast<uint32_t>(final.sizeBytes / 1024);
    final.playbackDuration = mRecording->durationMs();
    final.durationOfRec = final.playbackDuration / 1000;
    final.recEndTime = static_cast<uint32_t>(time(nullptr));
    final.state = RecordingCatalog::kComplete;
    switch (mRecording->end()) {
        case TSRecording::End::kNone:
            final.endReason = "stopped";
            break;
        case TSRecording::End::kDiskFull:
            final.endReason = "disk full";
            break;
        case TSRecording::End::kFileError:
            final.endReason = "file error";
            break;
        case TSRecording::End::kDemuxLost:
            final.endReason = "demux lost";
            break;
    }
    mEntry = final;
    mRecState = RecState::kStopped;
    if (catalog == nullptr || catalog->update(final) != RecordingCatalog::Status::kOk) {
        // The file is whole and kept; the next start marks the row incomplete.
        TAVO_LOGE("%s: recording %d is kept in %s but its catalog entry could not be closed\n",
                  kName, final.fileNumName, final.path.c_str());
    }
    TAVO_LOGI("%s: recording %d stopped: %llu bytes, %u ms (%s)\n", kName, final.fileNumName,
              static_cast<unsigned long long>(final.sizeBytes), final.playbackDuration,
              final.endReason.c_str());
    return 1;
}

int RecPlayerService::cancelTSRecorder() {
    std::lock_guard<std::mutex> lock(mLock);
    const char* kName = "RecPlayerBinder_CancelTSRecorder";
    if (mRefused) {
        mRefused = false;
        TAVO_LOGW("%s: the refused recording has nothing to cancel; recording %d goes on\n", kName,
                  mEntry.fileNumName);
        return 0;
    }
    if (mRecState == RecState::kIdle || mRecState == RecState::kCancelled || !mRecording) {
        TAVO_LOGE("%s: no recording to cancel\n", kName);
        return 0;
    }
    mRecording->discard();
    if (mRecState != RecState::kCreated) {
        RecordingCatalog* catalog = catalog_l(kName);
        if (catalog == nullptr ||
            catalog->remove(mEntry.fileNumName) != RecordingCatalog::Status::kOk)
            TAVO_LOGE("%s: recording %d's catalog entry could not be removed\n", kName,
                      mEntry.fileNumName);
    }
    TAVO_LOGI("%s: recording %d cancelled\n", kName, mEntry.fileNumName);
    mRecState = RecState::kCancelled;
    return 1;
}

int RecPlayerService::deleteTSRecorder() {
    std::unique_lock<std::mutex> lock(mLock);
    const char* kName = "RecPlayerBinder_DeleteTSRecorder";
    if (mRefused) {
        mRefused = false;
        TAVO_LOGW("%s: the refused recording has nothing to delete\n", kName);
        return 0;
    }
    if (mRecState == RecState::kIdle) {
        TAVO_LOGE("%s: no recording to delete\n", kName);
        return 0;
    }
    if (mRecState == RecState::kCreated || mRecState == RecState::kRecording) {
        lock.unlock();
        cancelTSRecorder();
        lock.lock();
    }
    releaseRecording_l();
    return 1;
}

void RecPlayerService::releaseRecording_l() {
    if (mRecording)
        mRecording->finish();
    mRecording.reset();
    mRecState = RecState::kIdle;
}

// --- clip playback ------------------------------------------------------------

int RecPlayerService::isTSPlayerActive(RecPlayerEventCallback callback, void* userData) {
    std::lock_guard<std::mutex> lock(mLock);
    mClipCallback = callback;
    mClipUserData = userData;
    return 1;
}

RecDetails* RecPlayerService::getRecClipDetails(const char* clipPath, int notOnExternalCard) {
    std::lock_guard<std::mutex> lock(mLock);
    const char* kName = "RecPlayerBinder_GetRecClipDetails";
    if (clipPath == nullptr || clipPath[0] == '\0') {
        TAVO_LOGE("%s: no clip path given\n", kName);
        return nullptr;
    }
    RecordingCatalog* catalog = catalog_l(kName);
    if (catalog == nullptr)
        return nullptr;
    // The path arrives without its last character (the URI parser's FILE form):
    // it names the one recording whose path starts with it.
    const std::vector<RecordingCatalog::Entry> rows = catalog->findByPathPrefix(clipPath);
    if (rows.empty()) {
        TAVO_LOGE("%s: no recording in %s matches the clip path %s (%s)\n", kName,
                  catalog->dir().c_str(), clipPath,
                  notOnExternalCard ? "internal storage" : "external card");
        return nullptr;
    }
    if (rows.size() > 1) {
        TAVO_LOGE("%s: the clip path %s matches %zu recordings (%s, %s, ...); refusing to guess\n",
                  kName, clipPath, rows.size(), rows[0].path.c_str(), rows[1].path.c_str());
        return nullptr;
    }
    RecordingCatalog::Entry entry = rows.front();
    struct stat st {};
    if (stat(entry.path.c_str(), &st) != 0) {
        TAVO_LOGE("%s: the clip file %s cannot be read: %s\n", kName, entry.path.c_str(),
                  strerror(errno));
        return nullptr;
    }
    const uint64_t size = static_cast<uint64_t>(st.st_size);
    uint8_t head[2 * kPacket] = {};
    const int fd = open(entry.path.c_str(), O_RDONLY | O_CLOEXEC);
    const ssize_t got = fd >= 0 ? pread(fd, head, sizeof head, 0) : -1;
    if (fd >= 0)
        close(fd);
    if (got < static_cast<ssize_t>(kPacket) || head[0] != 0x47 ||
        (got >= static_cast<ssize_t>(2 * kPacket) && head[kPacket] != 0x47)) {
        TAVO_LOGE(
            "%s: the clip file %s is not a transport stream (%lld bytes, no sync byte 0x47 "
            "every 188 bytes)\n",
            kName, entry.path.c_str(), static_cast<long long>(got < 0 ? 0 : size));
        return nullptr;
    }
    std::vector<IndexPoint> index = catalog->loadIndex(entry.fileNumName);
    if (index.empty()) {
        uint32_t durationMs = 0;
        TAVO_LOGI("%s: clip %s has no time index; indexing it\n", kName, entry.path.c_str());
        if (RecordingCatalog::scanFile(entry.path, 0, 0, &index, &durationMs, nullptr))
            catalog->storeIndex(entry.fileNumName, index);
    }
    // A truncated file: the index and the duration end where the file ends.
    while (!index.empty() && index.back().offset + kPacket > size)
        index.pop_back();
    if (!index.empty())
        entry.playbackDuration = index.back().timeMs;
    entry.durationOfRec = entry.playbackDuration / 1000;

    const bool sameClip = mClip && mClip->path == entry.path && mCursor;
    if (!sameClip) {
        mCursor = std::make_shared<ClipCursor>();
    }
    const RecPlayerEventCallback callback = mClipCallback;
    void* const userData = mClipUserData;
    RecEventDispatcher* events = &mEvents;
    const std::string path = entry.path;
    {
        std::lock_guard<std::mutex> cursorLock(mCursor->lock);
        if (!(sameClip && mRepositionPending))
            mCursor->offset = 0;
        mCursor->armed = true;
        mCursor->onEnd = [events, callback, userData, path](uint64_t packets, bool failed,
                                                            bool startedShort) {
            int event = kClipEventEnd;
            if (failed)
                event = kClipEventReadError;
            else if (packets == 0 && startedShort)
                event = kClipEventNotTs;
            TAVO_LOGI("%s: clip %s: %s (event %d)\n", "RecPlayerService", path.c_str(),
                      event == kClipEventEnd ? "end of the clip" : "the clip cannot be played",
                      event);
            events->post(callback, userData, event);
        };
    }
    mRepositionPending = false;
    mClip = entry;
    mClipIndex = std::move(index);
    mClipDurationMs = entry.playbackDuration;
    const bool paced = propertyGetString(kClipPaceProperty, "pcr") != "none";
    std::shared_ptr<ClipCursor> cursor = mCursor;
    Demux::instance().setSourceProvider([cursor, path, paced]() -> std::unique_ptr<DemuxSource> {
        {
            std::lock_guard<std::mutex> cursorLock(cursor->lock);
            if (!cursor->armed)
                return nullptr;
        }
        return std::make_unique<ClipSource>(path, cursor, paced);
    });
    TAVO_LOGI("%s: clip %s (recording %d, %u ms, %zu index points)\n", kName, path.c_str(),
              entry.fileNumName, entry.playbackDuration, mClipIndex.size());
    return toDetails(entry);
}

int RecPlayerService::pauseTSPlayer() {
    std::lock_guard<std::mutex> lock(mLock);
    if (!mCursor) {
        TAVO_LOGE("%s: no clip is playing\n", "RecPlayerBinder_PauseTSPlayer");
        return 0;
    }
    return Demux::instance().setPaused(true) == 0 ? 1 : 0;
}

int RecPlayerService::resumeTSPlayer() {
    std::lock_guard<std::mutex> lock(mLock);
    if (!mCursor) {
        TAVO_LOGE("%s: no clip is playing\n", "RecPlayerBinder_ResumeTSPlayer");
        return 0;
    }
    return Demux::instance().setPaused(false) == 0 ? 1 : 0;
}

int RecPlayerService::isPossibleSeek() {
    std::lock_guard<std::mutex> lock(mLock);
    return mCursor && !mClipIndex.empty() ? 1 : 0;
}

int RecPlayerService::repositioningTSPlayer(unsigned int elapsedTimeSec, int positionMs) {
    std::lock_guard<std::mutex> lock(mLock);
    const char* kName = "RecPlayerBinder_RepositioningTSPlayer";
    if (!mCursor || mClipIndex.empty()) {
        TAVO_LOGE("%s: no clip with a time index is playing\n", kName);
        return 0;
    }
    if (positionMs < 0 || static_cast<uint32_t>(positionMs) > mClipDurationMs) {
        TAVO_LOGE("%s: %d ms is outside the clip (0..%u ms)\n", kName, positionMs, mClipDurationMs);
        return 0;
    }
    // The last index point at or before the position: reading starts with the PCR
    // (and the tables) just before it, never after it.
    const auto after =
        std::upper_bound(mClipIndex.begin(), mClipIndex.end(), static_cast<uint32_t>(positionMs),
                         [](uint32_t ms, const IndexPoint& p) { return ms < p.timeMs; });
    const uint64_t offset = after == mClipIndex.begin() ? 0 : std::prev(after)->offset;
    bool open = false;
    {
        std::lock_guard<std::mutex> cursorLock(mCursor->lock);
        open = mCursor->openSources > 0;
        if (!open) {
            mCursor->offset = offset;
            mCursor->armed = true;
        }
    }
    if (open) {
        const std::shared_ptr<ClipCursor> cursor = mCursor;
        const int rc = Demux::instance().restartSource([&](DemuxSource& source) {
            auto* clip = dynamic_cast<ClipSource*>(&source);
            if (clip != nullptr && clip->cursor() == cursor)
                clip->setOffset(offset);
        });
        if (rc < 0) {
            std::lock_guard<std::mutex> cursorLock(mCursor->lock);
            mCursor->offset = offset;
            mCursor->armed = true;
        }
    }
    // A seek made while the pipeline is stopped waits for the clip to be opened again.
    mRepositionPending = !open;
    TAVO_LOGI("%s: from %u s to %d ms: byte %llu\n", kName, elapsedTimeSec, positionMs,
              static_cast<unsigned long long>(offset));
    return 1;
}

int RecPlayerService::setCurrLapTime(unsigned int elapsedMs, unsigned int ptsMs) {
    std::lock_guard<std::mutex> lock(mLock);
    if (!mCursor)
        return 0;
    mLapMs = elapsedMs;
    (void)ptsMs;
    return 1;
}

}  // namespace TavoPlayer
