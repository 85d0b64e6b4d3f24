// ICTavoPlayerClient: the callbacks the service sends to its client application,
// every one one-way. The service holds a BpCTavoPlayerClient; the application
// implements BnCTavoPlayerClient.
#pragma once

#include <cstdint>

#include "platform/binder/IInterface.h"

namespace TavoPlayer {

class ICTavoPlayerClient : public android::IInterface {
public:
    DECLARE_META_INTERFACE(CTavoPlayerClient)

    // Transaction codes, the wire contract with the client.
    enum : uint32_t {
        OPEN_URI_COMPLETE = 1,
        START_COMPLETE = 2,
        CLOSED_CAPTION_TEXT = 3,
        ON_CAPTURE_FRAME = 4,
        ON_SIGNAL_STATUS_CHANGED = 5,
        ON_STOP_COMPLETE = 6,
        ON_ERROR = 7,
        ON_BUFFERING_BEGIN = 8,
        ON_BUFFERING_END = 9,
        ON_BUFFERING = 10,
        ON_AUDIO_SESSION_ID = 11,
        ON_START_VIDEO_TASK = 12,
        ON_TIME_UPDATE = 13,
        ON_END_OF_CONTENT = 14,
        ON_RECORDER_STARTED = 15,
        ON_RECORDER_STOPPED = 16,
        ON_PAUSED = 17,
        ON_RESUMED = 18,
        ON_SEEKED = 19,
    };

    virtual void openUriComplete(int32_t status) = 0;
    virtual void startComplete(int32_t status) = 0;
    // `data` holds width x height pixels of 2 bytes (flag set) or 4 bytes; the callee
    // does not take ownership.
    virtual void onCaptureFrame(uint8_t* data, int32_t width, int32_t height, int32_t flag) = 0;
    virtual void onSignalStatusChanged(int32_t previous, int32_t current) = 0;
    // `text` holds `length` bytes (caption text as 32-bit code points, ARIB STD-B24).
    virtual void closedCaptionText(const uint8_t* text, int32_t length) = 0;
    virtual void onStopComplete(int32_t status) = 0;
    virtual void onError(int32_t code) = 0;
    virtual void onBufferingBegin() = 0;
    virtual void onBufferingEnd() = 0;
    virtual void onBuffering(int32_t progress) = 0;
    virtual void onAudioSessionId(int32_t id) = 0;
    virtual void onStartVideoTask(int32_t width, int32_t height) = 0;
    virtual void onTimeUpdate(int32_t time) = 0;
    virtual void onEndOfContent() = 0;
    virtual void onRecorderStarted(int32_t status) = 0;
    virtual void onRecorderStopped(int32_t status) = 0;
    virtual void onPaused(int32_t status) = 0;
    virtual void onResumed(int32_t status) = 0;
    virtual void onSeeked(int32_t ms) = 0;
};

}  // namespace TavoPlayer
