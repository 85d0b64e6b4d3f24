#include "service/BpCTavoPlayer.h"

#include "platform/binder/BBinder.h"
#include "platform/binder/Parcel.h"

namespace TavoPlayer {

using android::OK;
using android::Parcel;
using android::status_t;

BpCTavoPlayer::BpCTavoPlayer(const android::sp<android::IBinder>& impl)
    : BpInterface<ICTavoPlayer>(impl) {}

status_t BpCTavoPlayer::call(uint32_t code, std::initializer_list<int32_t> args, int32_t* reply32) {
    Parcel data;
    Parcel reply;
    data.writeInterfaceToken(ICTavoPlayer::descriptor);
    for (int32_t arg : args)
        data.writeInt32(arg);
    const status_t err = remote()->transact(code, data, &reply);
    if (reply32 != nullptr)
        *reply32 = err == OK ? reply.readInt32() : err;
    return err;
}

uint32_t BpCTavoPlayer::registerClient(const android::sp<ICTavoPlayerClient>& client) {
    Parcel data;
    Parcel reply;
    data.writeInterfaceToken(ICTavoPlayer::descriptor);
    data.writeStrongBinder(IInterface::asBinder(client));
    return static_cast<uint32_t>(remote()->transact(REGISTER_CLIENT, data, &reply));
}

uint32_t BpCTavoPlayer::start() {
    return static_cast<uint32_t>(call(START, {}));
}

uint32_t BpCTavoPlayer::stop() {
    return static_cast<uint32_t>(call(STOP, {}));
}

uint32_t BpCTavoPlayer::getState() {
    int32_t state = 0;
    call(GET_STATE, {}, &state);
    return static_cast<uint32_t>(state);
}

uint32_t BpCTavoPlayer::pause() {
    return static_cast<uint32_t>(call(PAUSE, {}));
}

uint32_t BpCTavoPlayer::resume() {
    return static_cast<uint32_t>(call(RESUME, {}));
}

uint32_t BpCTavoPlayer::seek(int32_t ms) {
    return static_cast<uint32_t>(call(SEEK, {ms}));
}

uint32_t BpCTavoPlayer::openUri(const char* uri, int32_t type) {
    Parcel data;
    Parcel reply;
    data.writeInterfaceToken(ICTavoPlayer::descriptor);
    data.writeInt32(type);
    data.writeString16(android::String16(uri != nullptr ? uri : ""));
    return static_cast<uint32_t>(remote()->transact(OPEN_URI, data, &reply));
}

uint32_t BpCTavoPlayer::close() {
    return static_cast<uint32_t>(call(CLOSE, {}));
}

uint32_t BpCTavoPlayer::setSurface(const android::sp<android::Surface>& surface) {
    Parcel data;
    Parcel reply;
    data.writeInterfaceToken(ICTavoPlayer::descriptor);
    data.writeString16(android::String16("TavoPlayer"));
    data.writeString16(android::String16(""));
    data.writeInt32(0);
    data.writeUint32(0);
    if (surface != nullptr && mSurfaceToken == nullptr)
        mSurfaceToken = new android::BBinder();
    data.writeStrongBinder(surface != nullptr ? mSurfaceToken : nullptr);
    const status_t err = remote()->transact(SET_SURFACE, data, &reply);
    return static_cast<uint32_t>(err == OK ? reply.readInt32() : err);
}

uint32_t BpCTavoPlayer::getFrame(int32_t width, int32_t height) {
    return static_cast<uint32_t>(call(GET_FRAME, {width, height}));
}

uint32_t BpCTavoPlayer::setSoundEffect(int32_t effect, int32_t option) {
    int32_t result = 0;
    call(SET_SOUND_EFFECT, {effect, option}, &result);
    return static_cast<uint32_t>(result);
}

uint32_t BpCTavoPlayer::startRecorder(const char* uri) {
    Parcel data;
    Parcel reply;
    data.writeInterfaceToken(ICTavoPlayer::descriptor);
    data.writeString16(android::String16(uri != nullptr ? uri : ""));
    const status_t err = remote()->transact(START_RECORDER, data, &reply);
    return static_cast<uint32_t>(err == OK ? reply.readInt32() : err);
}

uint32_t BpCTavoPlayer::stopRecorder(int32_t flag) {
    int32_t result = 0;
    call(STOP_RECORDER, {flag}, &result);
    return static_cast<uint32_t>(result);
}

uint32_t BpCTavoPlayer::setAVSync(int32_t value) {
    int32_t result = 0;
    call(SET_AV_SYNC, {value}, &result);
    return static_cast<uint32_t>(result);
}

uint32_t BpCTavoPlayer::setCaptionSync(int32_t value) {
    int32_t result = 0;
    call(SET_CAPTION_SYNC, {value}, &result);
    return static_cast<uint32_t>(result);
}

uint32_t BpCTavoPlayer::setAudioEnable(int32_t on) {
    return static_cast<uint32_t>(call(SET_AUDIO_ENABLE, {on}));
}

uint32_t BpCTavoPlayer::setCaptionLanguage(int32_t language) {
    return static_cast<uint32_t>(call(SET_CAPTION_LANGUAGE, {language}));
}

uint32_t BpCTavoPlayer::setAudioPID(int32_t pid) {
    return static_cast<uint32_t>(call(SET_AUDIO_PID, {pid}));
}

int32_t BpCTavoPlayer::setAudioPathForce(int32_t mode) {
    return call(SET_AUDIO_PATH_FORCE, {mode});
}

uint32_t BpCTavoPlayer::setCCPID(int32_t pid) {
    return static_cast<uint32_t>(call(SET_CC_PID, {pid}));
}

int32_t BpCTavoPlayer::getFrameRate() {
    int32_t rate = 0;
    call(GET_FRAME_RATE, {}, &rate);
    return rate;
}

uint32_t BpCTavoPlayer::setCropRect(int32_t a, int32_t b, int32_t c, int32_t d, int32_t e) {
    int32_t result = 0;
    call(SET_CROP_RECT, {a, b, c, d, e}, &result);
    return static_cast<uint32_t>(result);
}

uint32_t BpCTavoPlayer::setAudioOnlyMode(int32_t on) {
    int32_t result = 0;
    call(SET_AUDIO_ONLY_MODE, {on}, &result);
    return static_cast<uint32_t>(result);
}

int64_t BpCTavoPlayer::getPCRValue() {
    Parcel data;
    Parcel reply;
    data.writeInterfaceToken(ICTavoPlayer::descriptor);
    const status_t err = remote()->transact(GET_PCR_VALUE, data, &reply);
    return err == OK ? reply.readInt64() : err;
}

}  // namespace TavoPlayer
