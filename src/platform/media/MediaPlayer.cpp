#include "platform/media/MediaPlayer.h"

#include <mpv/client.h>
#include <pthread.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstring>
#include <string>

#include "platform/gui/Surface.h"
#include "platform/media/MediaPlayerOutputs.h"
#include "platform/os/SharedLibrary.h"
#include "platform/os/Trace.h"

namespace android {
namespace {

// libmpv, opened when the first player is made (see SharedLibrary): a process that
// never plays a file does not load it and its dependencies.
struct MpvLibrary {
    decltype(&::mpv_command) mpv_command;
    decltype(&::mpv_create) mpv_create;
    decltype(&::mpv_error_string) mpv_error_string;
    decltype(&::mpv_free_node_contents) mpv_free_node_contents;
    decltype(&::mpv_get_property) mpv_get_property;
    decltype(&::mpv_initialize) mpv_initialize;
    decltype(&::mpv_observe_property) mpv_observe_property;
    decltype(&::mpv_request_log_messages) mpv_request_log_messages;
    decltype(&::mpv_set_property) mpv_set_property;
    decltype(&::mpv_set_property_string) mpv_set_property_string;
    decltype(&::mpv_terminate_destroy) mpv_terminate_destroy;
    decltype(&::mpv_wait_event) mpv_wait_event;
    decltype(&::mpv_wakeup) mpv_wakeup;

    // The table, resolved once; nullptr when libmpv cannot be loaded (logged).
    static const MpvLibrary* get() {
        // libmpv's soname follows its client API's major version.
        static const std::string soname =
            "libmpv.so." + std::to_string(MPV_CLIENT_API_VERSION >> 16);
        return SharedLibrary::loadOnce<MpvLibrary>(
            soname.c_str(), [](void* handle, MpvLibrary& table) {
                return TAVO_RESOLVE(handle, table, mpv_command) &&
                       TAVO_RESOLVE(handle, table, mpv_create) &&
                       TAVO_RESOLVE(handle, table, mpv_error_string) &&
                       TAVO_RESOLVE(handle, table, mpv_free_node_contents) &&
                       TAVO_RESOLVE(handle, table, mpv_get_property) &&
                       TAVO_RESOLVE(handle, table, mpv_initialize) &&
                       TAVO_RESOLVE(handle, table, mpv_observe_property) &&
                       TAVO_RESOLVE(handle, table, mpv_request_log_messages) &&
                       TAVO_RESOLVE(handle, table, mpv_set_property) &&
                       TAVO_RESOLVE(handle, table, mpv_set_property_string) &&
                       TAVO_RESOLVE(handle, table, mpv_terminate_destroy) &&
                       TAVO_RESOLVE(handle, table, mpv_wait_event) &&
                       TAVO_RESOLVE(handle, table, mpv_wakeup);
            });
    }
};

// Only for players that exist: their constructor loaded the table.
const MpvLibrary& libmpv() {
    return *MpvLibrary::get();
}

// Reply ids of the observed libmpv properties.
enum : uint64_t {
    kVideoParams = 1,
    kEofReached,
    kCacheBufferingState,
    kPausedForCache,
};

constexpr auto kWaitSlice = std::chrono::milliseconds(100);
constexpr double kEventWaitSeconds = 0.1;

// Session ids are process-unique, as the platform's audio system hands them out, so
// that an audio effect set on one player's session never reaches another's.
int newAudioSessionId() {
    static std::atomic<int> next{1};
    return next.fetch_add(1) * 8 + 1;
}

// Sets a libmpv option or property; a failure is logged with its name, because
// libmpv builds differ in the options they know.
int setOption(mpv_handle* handle, const char* name, const std::string& value) {
    const int err = libmpv().mpv_set_property_string(handle, name, value.c_str());
    if (err < 0) {
        TAVO_LOGW("%s: mpv option %s=%s: %s\n", "MediaPlayer", name, value.c_str(),
                  libmpv().mpv_error_string(err));
    }
    return err;
}

status_t statusFromMpvError(int err) {
    switch (err) {
        case MPV_ERROR_UNKNOWN_FORMAT:
        case MPV_ERROR_NOTHING_TO_PLAY:
        case MPV_ERROR_AO_INIT_FAILED:
        case MPV_ERROR_VO_INIT_FAILED:
            return MEDIA_ERROR_UNSUPPORTED;
        case MPV_ERROR_LOADING_FAILED:
            return MEDIA_ERROR_IO;
        default:
            return MEDIA_ERROR_MALFORMED;
    }
}

const mpv_node* mapValue(const mpv_node& map, const char* key) {
    if (map.format != MPV_FORMAT_NODE_MAP || map.u.list == nullptr)
        return nullptr;
    for (int i = 0; i < map.u.list->num; ++i) {
        if (strcmp(map.u.list->keys[i], key) == 0)
            return &map.u.list->values[i];
    }
    return nullptr;
}

int64_t intValue(const mpv_node* node) {
    return node != nullptr && node->format == MPV_FORMAT_INT64 ? node->u.int64 : 0;
}

// libutils' thread drops its own strong reference just after join() has returned;
// waiting for that makes the joiner the one that destroys the thread object, which
// ThreadSanitizer can see (it cannot see libutils' reference counts).
// The exact type is taken: converting to sp<Thread> would add a reference of its own.
template <typename T>
void waitForLastReference(const sp<T>& thread) {
    for (int i = 0; i < 10000 && thread->getStrongCount() > 1; ++i)
        usleep(100);
    thread->isRunning();  // takes the thread's lock: orders its last unlock before us
}

}  // namespace

MediaPlayer::MediaPlayer() : mAudioSessionId(newAudioSessionId()) {
    if (MpvLibrary::get() == nullptr) {
        TAVO_LOGE("%s: Could not create the mpv player\n", __func__);
        return;
    }
    mpv_handle* handle = libmpv().mpv_create();
    if (handle == nullptr) {
        TAVO_LOGE("%s: Could not create the mpv player\n", __func__);
        return;
    }
    // No user configuration, scripts, key bindings or terminal: the player belongs to
    // the service, and must behave the same on every machine.
    setOption(handle, "config", "no");
    setOption(handle, "terminal", "no");
    setOption(handle, "input-default-bindings", "no");
    setOption(handle, "load-scripts", "no");
    setOption(handle, "ytdl", "no");
    setOption(handle, "osc", "no");
    // Idle between files; at the end stay on the last frame (paused), so that the
    // position, seeking and a new start still work after completion, as on the platform.
    setOption(handle, "idle", "yes");
    setOption(handle, "keep-open", "yes");
    setOption(handle, "audio-display", "no");
    setOption(handle, "force-window", "no");
    setOption(handle, "pause", "yes");
    setOption(handle, "network-timeout", std::to_string(kNetworkTimeoutSeconds));
#if defined(__SANITIZE_THREAD__)
    // FFmpeg's frame threads synchronise in ways ThreadSanitizer cannot see inside an
    // uninstrumented library; one decoding thread keeps its reports to our own code.
    setOption(handle, "vd-lavc-threads", "1");
#endif
    const MediaPlayerOutputs outputs = MediaPlayerOutputs::fromSystem(false);
    if (!outputs.note.empty())
        TAVO_LOGW("%s: %s\n", __func__, outputs.note.c_str());
    setOption(handle, "vo", outputs.vo);
    setOption(handle, "ao", outputs.ao);
    for (const auto& [name, value] : outputs.options)
        setOption(handle, name.c_str(), value);

    const int err = libmpv().mpv_initialize(handle);
    if (err < 0) {
        TAVO_LOGE("%s: Could not initialise the mpv player: %s\n", __func__,
                  libmpv().mpv_error_string(err));
        libmpv().mpv_terminate_destroy(handle);
        return;
    }
    libmpv().mpv_observe_property(handle, kVideoParams, "video-params", MPV_FORMAT_NODE);
    libmpv().mpv_observe_property(handle, kEofReached, "eof-reached", MPV_FORMAT_FLAG);
    libmpv().mpv_observe_property(handle, kCacheBufferingState, "cache-buffering-state",
                                  MPV_FORMAT_INT64);
    libmpv().mpv_observe_property(handle, kPausedForCache, "paused-for-cache", MPV_FORMAT_FLAG);
    libmpv().mpv_request_log_messages(handle, "warn");
    mHandle = handle;
}

MediaPlayer::~MediaPlayer() {
    disconnect();
}

void MediaPlayer::onFirstRef() {
    // Started here, not in the constructor: the thread holds the player by a weak
    // reference, which may only be promoted once a strong one exists.
    if (mHandle == nullptr)
        return;
    mThread = new CallbackThread(this);
    if (mThread->run("MediaPlayerCB") != OK) {
        TAVO_LOGE("%s: Could not start the callback thread\n", __func__);
        mThread.clear();
    }
}

status_t MediaPlayer::CallbackThread::readyToRun() {
    pthread_setname_np(pthread_self(), "MediaPlayerCB");
    return OK;
}

bool MediaPlayer::CallbackThread::threadLoop() {
    // Held for one round, so that a listener dropping the last reference to the
    // player while it is notified destroys it only after the round.
    sp<MediaPlayer> player = mPlayer.promote();
    if (player == nullptr)
        return false;
    mpv_event* event = libmpv().mpv_wait_event(player->mHandle, kEventWaitSeconds);
    while (event->event_id != MPV_EVENT_NONE) {
        {
            std::lock_guard<std::mutex> lock(player->mLock);
            player->handleEvent_l(*event);
        }
        event = libmpv().mpv_wait_event(player->mHandle, 0);
    }
    player->deliverPending();
    return !exitPending();
}

void MediaPlayer::deliverPending() {
    std::vector<Notification> pending;
    sp<MediaPlayerListener> listener;
    {
        std::lock_guard<std::mutex> lock(mLock);
        pending.swap(mPending);
        listener = mListener;
    }
    for (const Notification& n : pending) {
        if (listener != nullptr)
            listener->notify(n.msg, n.ext1, n.ext2, nullptr);
        // A listener cleared while we deliver gets nothing more.
        std::lock_guard<std::mutex> lock(mLock);
        if (mListener != listener)
            listener = mListener;
    }
}

void MediaPlayer::post_l(int msg, int ext1, int ext2) {
    mPending.push_back({msg, ext1, ext2});
    if (mHandle != nullptr)
        libmpv().mpv_wakeup(mHandle);
}

void MediaPlayer::handleEvent_l(const mpv_event& event) {
    switch (event.event_id) {
        case MPV_EVENT_LOG_MESSAGE: {
            const auto* m = static_cast<const mpv_event_log_message*>(event.data);
            if (m->log_level <= MPV_LOG_LEVEL_ERROR)
                TAVO_LOGE("%s: mpv %s: %s", "MediaPlayer", m->prefix, m->text);
            else
                TAVO_LOGW("%s: mpv %s: %s", "MediaPlayer", m->prefix, m->text);
            return;
        }
        case MPV_EVENT_START_FILE: {
            const auto* s = static_cast<const mpv_event_start_file*>(event.data);
            if (s->playlist_entry_id == mEntryId && mState == MEDIA_PLAYER_PREPARING)
                mFileStarted = true;
            return;
        }
        case MPV_EVENT_END_FILE:
            handleEndFile_l(event);
            return;
        default:
            break;
    }
    if (!mFileStarted)
        return;  // stale: an earlier file's, or nothing loaded
    switch (event.event_id) {
        case MPV_EVENT_FILE_LOADED: {
            int flag = 0;
            libmpv().mpv_get_property(mHandle, "demuxer-via-network", MPV_FORMAT_FLAG, &flag);
            mNetworkSource = flag != 0;
            return;
        }
        case MPV_EVENT_PROPERTY_CHANGE:
            handleProperty_l(event);
            return;
        case MPV_EVENT_PLAYBACK_RESTART:
            // After loading, the first frame is decoded and shown (paused); after a seek,
            // the frame at the new position is.
            mFirstFrameShown = true;
            if (mState == MEDIA_PLAYER_PREPARING) {
                if (mVideoWidth < 0)
                    readVideoSize_l();
                if (mVideoWidth < 0) {
                    // No video: the platform reports an empty size so that clients know.
                    mVideoWidth = 0;
                    mVideoHeight = 0;
                    post_l(MEDIA_SET_VIDEO_SIZE, 0, 0);
                }
                mState = MEDIA_PLAYER_PREPARED;
                mPrepareStatus = OK;
                mPrepared.notify_all();
                post_l(MEDIA_PREPARED, 0, 0);
            } else if (mSeeksPending > 0) {
                // libmpv folds seeks issued close together into one.
                mSeeksPending = 0;
                post_l(MEDIA_SEEK_COMPLETE, 0, 0);
            }
            checkRenderingStart_l();
            return;
        default:
            return;
    }
}

void MediaPlayer::handleEndFile_l(const mpv_event& event) {
    const auto* e = static_cast<const mpv_event_end_file*>(event.data);
    if (!mFileStarted || e->playlist_entry_id != mEntryId)
        return;
    mFileStarted = false;
    if (mState == MEDIA_PLAYER_PREPARING) {
        const int err =
            e->reason == MPV_END_FILE_REASON_ERROR ? e->error : MPV_ERROR_NOTHING_TO_PLAY;
        failPrepare_l(statusFromMpvError(err), libmpv().mpv_error_string(err));
        return;
    }
    if (e->reason == MPV_END_FILE_REASON_ERROR &&
        (mState & (MEDIA_PLAYER_PREPARED | MEDIA_PLAYER_STARTED | MEDIA_PLAYER_PAUSED |
                   MEDIA_PLAYER_PLAYBACK_COMPLETE))) {
        TAVO_LOGE("%s: Playback of %s failed: %s\n", "MediaPlayer", mUrl.c_str(),
                  libmpv().mpv_error_string(e->error));
        mState = MEDIA_PLAYER_STATE_ERROR;
        post_l(MEDIA_ERROR, MEDIA_ERROR_UNKNOWN, statusFromMpvError(e->error));
    } else if (e->reason == MPV_END_FILE_REASON_EOF && mState == MEDIA_PLAYER_STARTED) {
        mState = MEDIA_PLAYER_PLAYBACK_COMPLETE;
        post_l(MEDIA_PLAYBACK_COMPLETE, 0, 0);
    }
}

void MediaPlayer::handleProperty_l(const mpv_event& event) {
    const auto* p = static_cast<const mpv_event_property*>(event.data);
    switch (event.reply_userdata) {
        case kVideoParams:
            if (p->format == MPV_FORMAT_NODE) {
                const auto* node = static_cast<const mpv_node*>(p->data);
                // dw x dh: the size as displayed, with the sample aspect ratio applied.
                const int w = static_cast<int>(intValue(mapValue(*node, "dw")));
                const int h = static_cast<int>(intValue(mapValue(*node, "dh")));
                if (w > 0 && h > 0 && (w != mVideoWidth || h != mVideoHeight)) {
                    mVideoWidth = w;
                    mVideoHeight = h;
                    post_l(MEDIA_SET_VIDEO_SIZE, w, h);
                }
            }
            return;
        case kEofReached: {
            const bool eof = p->format == MPV_FORMAT_FLAG && *static_cast<int*>(p->data) != 0;
            mEofReached = eof;
            if (!eof)
                return;
            if (mState == MEDIA_PLAYER_STARTED) {
                mState = MEDIA_PLAYER_PLAYBACK_COMPLETE;
                post_l(MEDIA_PLAYBACK_COMPLETE, 0, 0);
            } else if (mState == MEDIA_PLAYER_PREPARING) {
                // Nothing decodable before the end: prepared, and start completes at once.
                mState = MEDIA_PLAYER_PREPARED;
                mPrepared.notify_all();
                if (mVideoWidth < 0) {
                    mVideoWidth = 0;
                    mVideoHeight = 0;
                    post_l(MEDIA_SET_VIDEO_SIZE, 0, 0);
                }
                post_l(MEDIA_PREPARED, 0, 0);
            }
            return;
        }
        case kCacheBufferingState:
            if (mNetworkSource && p->format == MPV_FORMAT_INT64) {
                const int percent = static_cast<int>(*static_cast<int64_t*>(p->data));
                if (percent != mBufferedPercent) {
                    mBufferedPercent = percent;
                    post_l(MEDIA_BUFFERING_UPDATE, percent, 0);
                }
            }
            return;
        case kPausedForCache: {
            const bool buffering = p->format == MPV_FORMAT_FLAG && *static_cast<int*>(p->data) != 0;
            if (buffering != mBuffering) {
                mBuffering = buffering;
                post_l(MEDIA_INFO,
                       buffering ? MEDIA_INFO_BUFFERING_START : MEDIA_INFO_BUFFERING_END, 0);
            }
            return;
        }
        default:
            return;
    }
}

void MediaPlayer::readVideoSize_l() {
    mpv_node node;
    if (libmpv().mpv_get_property(mHandle, "video-params", MPV_FORMAT_NODE, &node) < 0)
        return;
    const int w = static_cast<int>(intValue(mapValue(node, "dw")));
    const int h = static_cast<int>(intValue(mapValue(node, "dh")));
    libmpv().mpv_free_node_contents(&node);
    if (w > 0 && h > 0) {
        mVideoWidth = w;
        mVideoHeight = h;
        post_l(MEDIA_SET_VIDEO_SIZE, w, h);
    }
}

void MediaPlayer::failPrepare_l(status_t status, const char* why) {
    TAVO_LOGE("%s: Error preparing \"%s\": %s\n", "prepare", mUrl.c_str(), why);
    mState = MEDIA_PLAYER_STATE_ERROR;
    mPrepareStatus = status;
    mPrepared.notify_all();
    // Reported to the listener as well: whoever set one learns of the failure there.
    post_l(MEDIA_ERROR, MEDIA_ERROR_UNKNOWN, status);
}

void MediaPlayer::checkRenderingStart_l() {
    if (mState == MEDIA_PLAYER_STARTED && mFirstFrameShown && mVideoWidth > 0 &&
        !mRenderingReported) {
        mRenderingReported = true;
        post_l(MEDIA_INFO, MEDIA_INFO_RENDERING_START, 0);
    }
}

void MediaPlayer::disconnect() {
    sp<CallbackThread> thread;
    {
        std::lock_guard<std::mutex> lock(mLock);
        mDisconnected = true;
        mListener.clear();
        mPending.clear();
        mPrepared.notify_all();
        thread = mThread;
        mThread.clear();
    }
    if (thread != nullptr) {
        thread->requestExit();
        if (mHandle != nullptr)
            libmpv().mpv_wakeup(mHandle);
        // A listener that disconnects from its notification runs on the callback
        // thread, which cannot join itself (WOULD_BLOCK): it ends by itself after the
        // round, touching libmpv no more.
        if (thread->join() == OK)
            waitForLastReference(thread);
    }
    std::lock_guard<std::mutex> lock(mLock);
    if (mHandle != nullptr) {
        libmpv().mpv_terminate_destroy(mHandle);
        mHandle = nullptr;
    }
}

status_t MediaPlayer::setDataSource(const sp<IMediaHTTPService>& /*httpService*/, const char* url,
                                    const KeyedVector<String8, String8>* headers) {
    if (url == nullptr)
        return BAD_VALUE;
    std::lock_guard<std::mutex> lock(mLock);
    if (mDisconnected || mHandle == nullptr)
        return NO_INIT;
    if (mState != MEDIA_PLAYER_IDLE) {
        TAVO_LOGE("%s: called in state %d\n", __func__, mState);
        return INVALID_OPERATION;
    }
    std::string fields;
    for (size_t i = 0; headers != nullptr && i < headers->size(); ++i) {
        // libmpv takes the header lines as one list, comma-separated.
        if (!fields.empty())
            fields += ',';
        fields += std::string(headers->keyAt(i).c_str()) + ": " + headers->valueAt(i).c_str();
    }
    setOption(mHandle, "http-header-fields", fields);
    mUrl = url;
    mState = MEDIA_PLAYER_INITIALIZED;
    return OK;
}

status_t MediaPlayer::setVideoSurfaceTexture(const sp<Surface>& surface) {
    std::lock_guard<std::mutex> lock(mLock);
    if (mDisconnected || mHandle == nullptr)
        return NO_INIT;
    const MediaPlayerOutputs outputs = MediaPlayerOutputs::fromSystem(surface != nullptr);
    if (!outputs.note.empty())
        TAVO_LOGW("%s: %s\n", __func__, outputs.note.c_str());
    // Changing "vo" while a file plays re-opens the video output in place.
    return setOption(mHandle, "vo", outputs.vo) < 0 ? UNKNOWN_ERROR : OK;
}

status_t MediaPlayer::setListener(const sp<MediaPlayerListener>& listener) {
    std::lock_guard<std::mutex> lock(mLock);
    mListener = listener;
    return OK;
}

status_t MediaPlayer::command_l(const char* const* args) {
    const int err = libmpv().mpv_command(mHandle, const_cast<const char**>(args));
    if (err < 0) {
        TAVO_LOGE("%s: mpv %s failed: %s\n", "MediaPlayer", args[0],
                  libmpv().mpv_error_string(err));
        return UNKNOWN_ERROR;
    }
    return OK;
}

status_t MediaPlayer::setPause_l(bool pause) {
    int flag = pause ? 1 : 0;
    const int err = libmpv().mpv_set_property(mHandle, "pause", MPV_FORMAT_FLAG, &flag);
    return err < 0 ? UNKNOWN_ERROR : OK;
}

status_t MediaPlayer::prepare() {
    std::unique_lock<std::mutex> lock(mLock);
    if (mDisconnected || mHandle == nullptr)
        return NO_INIT;
    if (!(mState & (MEDIA_PLAYER_INITIALIZED | MEDIA_PLAYER_STOPPED))) {
        TAVO_LOGE("%s: called in state %d\n", __func__, mState);
        return INVALID_OPERATION;
    }
    mState = MEDIA_PLAYER_PREPARING;
    mPrepareStatus = OK;
    mFileStarted = false;
    mFirstFrameShown = false;
    mRenderingReported = false;
    mEofReached = false;
    mSeeksPending = 0;
    mVideoWidth = -1;
    mVideoHeight = -1;
    mNetworkSource = false;
    mBufferedPercent = -1;
    mBuffering = false;
    if (mUrl.empty()) {
        failPrepare_l(MEDIA_ERROR_IO, "no data source");
        return mPrepareStatus;
    }
    // Loaded paused: the first frame is decoded and shown, and nothing plays until start.
    setPause_l(true);
    const char* load[] = {"loadfile", mUrl.c_str(), "replace", nullptr};
    int64_t entry = -1;
    if (command_l(load) != OK ||
        libmpv().mpv_get_property(mHandle, "playlist/0/id", MPV_FORMAT_INT64, &entry) < 0) {
        failPrepare_l(MEDIA_ERROR_UNSUPPORTED, "the player refused the source");
        return mPrepareStatus;
    }
    mEntryId = entry;
    // Each wait is bounded, so a stop or disconnect is seen at once; libmpv's own
    // network time-out bounds a source that never answers.
    while (mState == MEDIA_PLAYER_PREPARING && !mDisconnected)
        mPrepared.wait_for(lock, kWaitSlice);
    if (mState == MEDIA_PLAYER_PREPARED)
        return OK;
    if (mState == MEDIA_PLAYER_STATE_ERROR)
        return mPrepareStatus;
    TAVO_LOGW("%s: \"%s\" stopped before it was prepared\n", __func__, mUrl.c_str());
    return INVALID_OPERATION;
}

status_t MediaPlayer::start() {
    std::lock_guard<std::mutex> lock(mLock);
    if (mDisconnected || mHandle == nullptr)
        return NO_INIT;
    if (mState == MEDIA_PLAYER_STARTED)
        return OK;
    if (!(mState &
          (MEDIA_PLAYER_PREPARED | MEDIA_PLAYER_PAUSED | MEDIA_PLAYER_PLAYBACK_COMPLETE))) {
        TAVO_LOGE("%s: called in state %d\n", __func__, mState);
        return INVALID_OPERATION;
    }
    if (mState == MEDIA_PLAYER_PLAYBACK_COMPLETE || mEofReached) {
        // Starting again after the end plays from the beginning, as on the platform.
        const char* rewind[] = {"seek", "0", "absolute+keyframes", nullptr};
        command_l(rewind);
        mEofReached = false;
    }
    const status_t status = setPause_l(false);
    if (status != OK)
        return status;
    mState = MEDIA_PLAYER_STARTED;
    checkRenderingStart_l();
    return OK;
}

status_t MediaPlayer::pause() {
    std::lock_guard<std::mutex> lock(mLock);
    if (mDisconnected || mHandle == nullptr)
        return NO_INIT;
    if (!(mState & (MEDIA_PLAYER_STARTED | MEDIA_PLAYER_PAUSED))) {
        TAVO_LOGE("%s: called in state %d\n", __func__, mState);
        return INVALID_OPERATION;
    }
    const status_t status = setPause_l(true);
    if (status == OK)
        mState = MEDIA_PLAYER_PAUSED;
    return status;
}

status_t MediaPlayer::stop() {
    std::lock_guard<std::mutex> lock(mLock);
    if (mDisconnected || mHandle == nullptr)
        return NO_INIT;
    if (mState == MEDIA_PLAYER_STOPPED)
        return OK;
    if (!(mState & (MEDIA_PLAYER_PREPARING | MEDIA_PLAYER_PREPARED | MEDIA_PLAYER_STARTED |
                    MEDIA_PLAYER_PAUSED | MEDIA_PLAYER_PLAYBACK_COMPLETE))) {
        TAVO_LOGE("%s: called in state %d\n", __func__, mState);
        return INVALID_OPERATION;
    }
    const char* stopCmd[] = {"stop", nullptr};
    command_l(stopCmd);
    // Whatever libmpv still reports of this file is stale from here on.
    mFileStarted = false;
    mEntryId = -1;
    mState = MEDIA_PLAYER_STOPPED;
    mPrepared.notify_all();  // a prepare in progress returns
    return OK;
}

bool MediaPlayer::isPlaying() {
    std::lock_guard<std::mutex> lock(mLock);
    return mState == MEDIA_PLAYER_STARTED;
}

status_t MediaPlayer::seekTo(int msec, MediaPlayerSeekMode mode) {
    std::lock_guard<std::mutex> lock(mLock);
    if (mDisconnected || mHandle == nullptr)
        return NO_INIT;
    if (!(mState & (MEDIA_PLAYER_PREPARED | MEDIA_PLAYER_STARTED | MEDIA_PLAYER_PAUSED |
                    MEDIA_PLAYER_PLAYBACK_COMPLETE))) {
        TAVO_LOGE("%s: called in state %d\n", __func__, mState);
        return INVALID_OPERATION;
    }
    const std::string seconds = std::to_string(std::max(msec, 0) / 1000.0);
    // libmpv's key-frame seek lands on the key frame at or before the target, which is
    // the previous sync frame; it has no next-sync mode, so both sync modes use it.
    const char* flags = mode == SEEK_CLOSEST ? "absolute+exact" : "absolute+keyframes";
    const char* seek[] = {"seek", seconds.c_str(), flags, nullptr};
    const status_t status = command_l(seek);
    if (status == OK) {
        ++mSeeksPending;
        mEofReached = false;
    }
    return status;
}

status_t MediaPlayer::getCurrentPosition(int* msec) {
    if (msec == nullptr)
        return BAD_VALUE;
    std::lock_guard<std::mutex> lock(mLock);
    if (mDisconnected || mHandle == nullptr)
        return NO_INIT;
    double seconds = 0;
    // Nothing loaded (idle, stopped, failed): position 0.
    if (!mFileStarted ||
        libmpv().mpv_get_property(mHandle, "time-pos", MPV_FORMAT_DOUBLE, &seconds) < 0)
        seconds = 0;
    *msec = static_cast<int>(std::llround(std::max(seconds, 0.0) * 1000.0));
    return OK;
}

status_t MediaPlayer::getDuration(int* msec) {
    if (msec == nullptr)
        return BAD_VALUE;
    std::lock_guard<std::mutex> lock(mLock);
    if (mDisconnected || mHandle == nullptr)
        return NO_INIT;
    double seconds = 0;
    if (!mFileStarted ||
        libmpv().mpv_get_property(mHandle, "duration", MPV_FORMAT_DOUBLE, &seconds) < 0)
        return INVALID_OPERATION;
    *msec = static_cast<int>(std::llround(std::max(seconds, 0.0) * 1000.0));
    return OK;
}

status_t MediaPlayer::setVolume(float leftVolume, float rightVolume) {
    std::lock_guard<std::mutex> lock(mLock);
    if (mDisconnected || mHandle == nullptr)
        return NO_INIT;
    mVolume = std::clamp(std::max(leftVolume, rightVolume), 0.0f, 1.0f);
    double percent = mVolume * 100.0;
    const int err = libmpv().mpv_set_property(mHandle, "volume", MPV_FORMAT_DOUBLE, &percent);
    return err < 0 ? UNKNOWN_ERROR : OK;
}

int MediaPlayer::getAudioSessionId() {
    return mAudioSessionId;
}

}  // namespace android
