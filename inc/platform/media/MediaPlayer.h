// MediaPlayer: the platform's player of ordinary media files and streams (MP4, MKV,
// audio-only files, HTTP URLs), on libmpv. It keeps the platform's interface and
// state machine: setDataSource, then a synchronous prepare, then start, pause, seekTo
// and stop, with notifications to one listener under the platform's message numbers.
//
// Threads: every public call may come from any thread (the controller calls under
// the service's lock). Notifications are delivered on the player's own callback
// thread ("MediaPlayerCB"), which turns libmpv's events into them; the listener is
// called without any of the player's locks held, so it may call back into the player.
// mLock guards every field below it; libmpv's handle is thread-safe by itself.
//
// Output: video goes to libmpv's output matching tavoplayer.video.sink when a surface
// is set (null otherwise), audio to the one matching tavoplayer.audio.sink; see
// MediaPlayerOutputs.h.
#pragma once

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>
#include <vector>

#include <utils/Errors.h>
#include <utils/KeyedVector.h>
#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/StrongPointer.h>
#include <utils/Thread.h>

struct mpv_handle;
struct mpv_event;

namespace android {

class Parcel;
class Surface;

// The platform's message numbers (the "msg" of notify).
enum media_event_type {
    MEDIA_NOP = 0,
    MEDIA_PREPARED = 1,
    MEDIA_PLAYBACK_COMPLETE = 2,
    MEDIA_BUFFERING_UPDATE = 3,  // ext1: percent of the stream buffered
    MEDIA_SEEK_COMPLETE = 4,
    MEDIA_SET_VIDEO_SIZE = 5,  // ext1 x ext2 as displayed; 0 x 0 when there is no video
    MEDIA_ERROR = 100,         // ext1: media_error_type, ext2: the status below
    MEDIA_INFO = 200,          // ext1: media_info_type
};

enum media_error_type {
    MEDIA_ERROR_UNKNOWN = 1,
    MEDIA_ERROR_SERVER_DIED = 100,
    // Extras (ext2 of MEDIA_ERROR) and prepare's result for a source that fails.
    MEDIA_ERROR_IO = -1004,
    MEDIA_ERROR_MALFORMED = -1007,
    MEDIA_ERROR_UNSUPPORTED = -1010,
};

enum media_info_type {
    MEDIA_INFO_UNKNOWN = 1,
    MEDIA_INFO_RENDERING_START = 3,  // the first video frame has been shown after start
    MEDIA_INFO_BUFFERING_START = 701,
    MEDIA_INFO_BUFFERING_END = 702,
};

enum MediaPlayerSeekMode : int32_t {
    SEEK_PREVIOUS_SYNC = 0,  // the sync (key) frame at or before the target
    SEEK_NEXT_SYNC = 1,
    SEEK_CLOSEST_SYNC = 2,
    SEEK_CLOSEST = 3,  // decode from the previous sync frame up to the target
};

enum media_player_states {
    MEDIA_PLAYER_STATE_ERROR = 0,
    MEDIA_PLAYER_IDLE = 1 << 0,
    MEDIA_PLAYER_INITIALIZED = 1 << 1,
    MEDIA_PLAYER_PREPARING = 1 << 2,
    MEDIA_PLAYER_PREPARED = 1 << 3,
    MEDIA_PLAYER_STARTED = 1 << 4,
    MEDIA_PLAYER_PAUSED = 1 << 5,
    MEDIA_PLAYER_STOPPED = 1 << 6,
    MEDIA_PLAYER_PLAYBACK_COMPLETE = 1 << 7,
};

// Streaming services are not used on this platform; callers pass null.
class IMediaHTTPService : public virtual RefBase {};

class MediaPlayerListener : public virtual RefBase {
public:
    // obj: extra data of the message; always null here.
    virtual void notify(int msg, int ext1, int ext2, const Parcel* obj) = 0;
};

class MediaPlayer : public virtual RefBase {
public:
    MediaPlayer();
    ~MediaPlayer() override;

    // Ends playback for good: the callback thread is joined and libmpv released.
    // Every later call returns NO_INIT. Safe to call twice.
    virtual void disconnect();

    // A path or URL (file:, http:, ...); headers go with HTTP requests. Only in the
    // idle state; the source is opened by prepare, which reports what is wrong with it.
    virtual status_t setDataSource(const sp<IMediaHTTPService>& httpService, const char* url,
                                   const KeyedVector<String8, String8>* headers);
    // Video goes to the sink behind `surface`; null: decoded but not shown.
    virtual status_t setVideoSurfaceTexture(const sp<Surface>& surface);
    virtual status_t setListener(const sp<MediaPlayerListener>& listener);

    // Opens the source and decodes up to the first frame, then returns: OK, or the
    // failure (MEDIA_ERROR_IO, MEDIA_ERROR_UNSUPPORTED, ...), which also goes to the
    // listener as MEDIA_ERROR; INVALID_OPERATION when a stop or disconnect ended it.
    virtual status_t prepare();
    virtual status_t start();
    virtual status_t stop();
    virtual status_t pause();
    virtual bool isPlaying();
    virtual status_t seekTo(int msec, MediaPlayerSeekMode mode = SEEK_PREVIOUS_SYNC);
    virtual status_t getCurrentPosition(int* msec);
    virtual status_t getDuration(int* msec);
    // Gains of the two channels, 0.0 to 1.0; libmpv has one volume, the larger gain.
    virtual status_t setVolume(float leftVolume, float rightVolume);
    virtual int getAudioSessionId();

    // Time allowed for a network source to answer before prepare fails.
    static constexpr int kNetworkTimeoutSeconds = 20;

protected:
    void onFirstRef() override;

private:
    class CallbackThread : public Thread {
    public:
        explicit CallbackThread(const wp<MediaPlayer>& player) : Thread(false), mPlayer(player) {}

    private:
        status_t readyToRun() override;
        bool threadLoop() override;
        // Weak: a listener may drop the last reference while it is notified; the
        // player then goes after the round that notified it.
        wp<MediaPlayer> mPlayer;
    };

    struct Notification {
        int msg;
        int ext1;
        int ext2;
    };

    // Callback thread: one libmpv event, under mLock; notifications go to mPending.
    void handleEvent_l(const mpv_event& event);
    void handleEndFile_l(const mpv_event& event);
    void handleProperty_l(const mpv_event& event);
    void readVideoSize_l();
    void failPrepare_l(status_t status, const char* why);
    void checkRenderingStart_l();
    // Queues a notification for the callback thread and wakes it.
    void post_l(int msg, int ext1, int ext2);
    void deliverPending();
    status_t setPause_l(bool pause);
    status_t command_l(const char* const* args);

    mpv_handle* mHandle = nullptr;  // set in the constructor, cleared only by disconnect
    sp<CallbackThread> mThread;
    const int mAudioSessionId;

    std::mutex mLock;
    std::condition_variable mPrepared;  // signalled when a prepare ends either way
    sp<MediaPlayerListener> mListener;
    int mState = MEDIA_PLAYER_IDLE;
    std::string mUrl;
    float mVolume = 1.0f;
    status_t mPrepareStatus = OK;
    std::vector<Notification> mPending;  // queued for the callback thread, in order
    // libmpv's playlist entry of the file being played: its events are the only ones
    // that count; those of a file loaded before (still queued after a stop) are stale.
    int64_t mEntryId = -1;
    bool mFileStarted = false;  // libmpv has begun mEntryId and not ended it
    bool mNetworkSource = false;
    int mBufferedPercent = -1;
    bool mBuffering = false;
    bool mFirstFrameShown = false;  // the loaded file showed its first frame
    bool mRenderingReported = false;
    bool mEofReached = false;
    int mSeeksPending = 0;
    int mVideoWidth = -1;  // last size reported; -1 before the first report
    int mVideoHeight = -1;
    bool mDisconnected = false;
};

}  // namespace android
