#include "service/BnCTavoPlayer.h"

#include "platform/binder/Parcel.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {

using android::BAD_VALUE;
using android::OK;
using android::Parcel;
using android::sp;
using android::status_t;

namespace {

// Reads `n` 32-bit integers in order; false when the request is too short.
bool readInts(const Parcel& data, int32_t* out, size_t n) {
    for (size_t i = 0; i < n; ++i) {
        if (data.readInt32(&out[i]) != OK)
            return false;
    }
    return true;
}

// A 16-bit string argument, handed to the service as 8-bit text.
bool readText(const Parcel& data, android::String8* out) {
    android::String16 text;
    if (data.readString16(&text) != OK)
        return false;
    *out = android::String8(text);
    return true;
}

bool hasOperation(uint32_t code) {
    return code >= ICTavoPlayer::REGISTER_CLIENT && code <= ICTavoPlayer::GET_PCR_VALUE &&
           code != 12 && code != 15 && code != 16;
}

}  // namespace

status_t BnCTavoPlayer::onTransact(uint32_t code, const Parcel& data, Parcel* reply,
                                   uint32_t flags) {
    if (!hasOperation(code))
        return BBinder::onTransact(code, data, reply, flags);
    if (!data.enforceInterface(ICTavoPlayer::descriptor)) {
        TAVO_LOGE("%s: Call incorrectly routed to ICTavoPlayer\n", __func__);
        return -1;
    }
    Parcel scratch;  // a one-way request has no reply parcel
    Parcel& out = reply != nullptr ? *reply : scratch;
    int32_t a[5] = {};
    android::String8 text;
    bool ok = true;
    switch (code) {
        case REGISTER_CLIENT: {
            sp<android::IBinder> binder;
            ok = data.readStrongBinder(&binder) == OK;
            if (ok)
                registerClient(android::interface_cast<ICTavoPlayerClient>(binder));
            break;
        }
        case START:
            start();
            break;
        case STOP:
            stop();
            break;
        case PAUSE:
            pause();
            break;
        case RESUME:
            resume();
            break;
        case SEEK:
            if ((ok = readInts(data, a, 1)))
                seek(a[0]);
            break;
        case OPEN_URI:
            // The type comes before the URI.
            if ((ok = readInts(data, a, 1) && readText(data, &text)))
                openUri(text.string(), a[0]);
            break;
        case CLOSE:
            close();
            break;
        case SET_SURFACE: {
            // The surface as the platform's surface object writes itself: a name, a
            // second string and two integers (all unused here), then the producer.
            android::String16 name;
            android::String16 second;
            uint32_t unused = 0;
            sp<android::IBinder> producer;
            ok = data.readString16(&name) == OK && data.readString16(&second) == OK &&
                 data.readInt32(&a[0]) == OK && data.readUint32(&unused) == OK &&
                 data.readStrongBinder(&producer) == OK;
            if (ok) {
                sp<android::Surface> surface =
                    producer != nullptr ? android::Surface::create() : nullptr;
                out.writeInt32(static_cast<int32_t>(setSurface(surface)));
            }
            break;
        }
        case GET_FRAME:
            if ((ok = readInts(data, a, 2)))
                getFrame(a[0], a[1]);
            break;
        case SET_SOUND_EFFECT:
            if ((ok = readInts(data, a, 2)))
                out.writeInt32(static_cast<int32_t>(setSoundEffect(a[0], a[1])));
            break;
        case START_RECORDER:
            if ((ok = readText(data, &text)))
                out.writeInt32(static_cast<int32_t>(startRecorder(text.string())));
            break;
        case STOP_RECORDER:
            if ((ok = readInts(data, a, 1)))
                out.writeInt32(static_cast<int32_t>(stopRecorder(a[0])));
            break;
        case SET_AV_SYNC:
            if ((ok = readInts(data, a, 1)))
                out.writeInt32(static_cast<int32_t>(setAVSync(a[0])));
            break;
        case SET_CAPTION_SYNC:
            if ((ok = readInts(data, a, 1)))
                out.writeInt32(static_cast<int32_t>(setCaptionSync(a[0])));
            break;
        case SET_CAPTION_LANGUAGE:
            if ((ok = readInts(data, a, 1)))
                setCaptionLanguage(a[0]);
            break;
        case SET_AUDIO_ENABLE:
            if ((ok = readInts(data, a, 1)))
                setAudioEnable(a[0]);
            break;
        case SET_AUDIO_PID:
            if ((ok = readInts(data, a, 1)))
                setAudioPID(a[0]);
            break;
        case SET_AUDIO_PATH_FORCE:
            if ((ok = readInts(data, a, 1)))
                setAudioPathForce(a[0]);
            break;
        case SET_CC_PID:
            if ((ok = readInts(data, a, 1)))
                setCCPID(a[0]);
            break;
        case GET_FRAME_RATE:
            out.writeInt32(getFrameRate());
            break;
        case GET_STATE:
            out.writeInt32(static_cast<int32_t>(getState()));
            break;
        case SET_CROP_RECT:
            if ((ok = readInts(data, a, 5)))
                out.writeInt32(static_cast<int32_t>(setCropRect(a[0], a[1], a[2], a[3], a[4])));
            break;
        case SET_AUDIO_ONLY_MODE:
            if ((ok = readInts(data, a, 1)))
                out.writeInt32(static_cast<int32_t>(setAudioOnlyMode(a[0])));
            break;
        case GET_PCR_VALUE:
            out.writeInt64(getPCRValue());
            break;
    }
    if (!ok) {
        TAVO_LOGE("%s: request %u too short for its arguments\n", __func__, code);
        return BAD_VALUE;
    }
    return OK;
}

}  // namespace TavoPlayer
