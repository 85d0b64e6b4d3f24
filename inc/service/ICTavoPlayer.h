// ICTavoPlayer: the player service's binder interface, served by BnCTavoPlayer
// (implemented by the player service) and called through BpCTavoPlayer by clients.
// Operations return an unsigned status (0 success, 1 refused, or a module error
// code) unless their result is a value.
#pragma once

#include <cstdint>

#include "platform/binder/IInterface.h"
#include "platform/gui/Surface.h"
#include "service/ICTavoPlayerClient.h"

namespace TavoPlayer {

class ICTavoPlayer : public android::IInterface {
public:
    DECLARE_META_INTERFACE(CTavoPlayer)

    // Transaction codes, the wire contract with the client. The gaps (12, 15, 16)
    // are part of it: the client's numbering must not be compacted.
    enum : uint32_t {
        REGISTER_CLIENT = 1,
        START = 2,
        STOP = 3,
        PAUSE = 4,
        RESUME = 5,
        SEEK = 6,
        OPEN_URI = 7,
        CLOSE = 8,
        SET_SURFACE = 9,
        GET_FRAME = 10,
        SET_SOUND_EFFECT = 11,
        START_RECORDER = 13,
        STOP_RECORDER = 14,
        SET_AV_SYNC = 17,
        SET_CAPTION_SYNC = 18,
        SET_CAPTION_LANGUAGE = 19,
        SET_AUDIO_ENABLE = 20,
        SET_AUDIO_PID = 21,
        SET_AUDIO_PATH_FORCE = 22,
        SET_CC_PID = 23,
        GET_FRAME_RATE = 24,
        GET_STATE = 25,
        SET_CROP_RECT = 26,
        SET_AUDIO_ONLY_MODE = 27,
        GET_PCR_VALUE = 28,
    };

    virtual uint32_t registerClient(const android::sp<ICTavoPlayerClient>& client) = 0;
    virtual uint32_t start() = 0;
    virtual uint32_t stop() = 0;
    virtual uint32_t getState() = 0;
    virtual uint32_t pause() = 0;
    virtual uint32_t resume() = 0;
    virtual uint32_t seek(int32_t ms) = 0;
    virtual uint32_t openUri(const char* uri, int32_t type) = 0;
    virtual uint32_t close() = 0;
    virtual uint32_t setSurface(const android::sp<android::Surface>& surface) = 0;
    virtual uint32_t getFrame(int32_t width, int32_t height) = 0;
    virtual uint32_t setSoundEffect(int32_t effect, int32_t option) = 0;
    virtual uint32_t startRecorder(const char* uri) = 0;
    virtual uint32_t stopRecorder(int32_t flag) = 0;
    virtual uint32_t setAVSync(int32_t value) = 0;
    virtual uint32_t setCaptionSync(int32_t value) = 0;
    virtual uint32_t setAudioEnable(int32_t on) = 0;
    virtual uint32_t setCaptionLanguage(int32_t language) = 0;
    virtual uint32_t setAudioPID(int32_t pid) = 0;
    virtual int32_t setAudioPathForce(int32_t mode) = 0;
    virtual uint32_t setCCPID(int32_t pid) = 0;
    virtual int32_t getFrameRate() = 0;
    virtual uint32_t setCropRect(int32_t a, int32_t b, int32_t c, int32_t d, int32_t e) = 0;
    virtual uint32_t setAudioOnlyMode(int32_t on) = 0;
    virtual int64_t getPCRValue() = 0;
};

}  // namespace TavoPlayer
