#include "service/BpCTavoPlayerClient.h"

#include <cstring>

#include "platform/binder/MemoryHeapBase.h"
#include "platform/binder/Parcel.h"

namespace TavoPlayer {

using android::IBinder;
using android::OK;
using android::Parcel;

BpCTavoPlayerClient::BpCTavoPlayerClient(const android::sp<android::IBinder>& impl)
    : BpInterface<ICTavoPlayerClient>(impl) {}

void BpCTavoPlayerClient::send(uint32_t code, std::initializer_list<int32_t> values) {
    Parcel data;
    data.writeInterfaceToken(ICTavoPlayerClient::descriptor);
    for (int32_t value : values)
        data.writeInt32(value);
    // One-way: a client that is gone or slow gets nothing, and nothing is reported.
    remote()->transact(code, data, nullptr, IBinder::FLAG_ONEWAY);
}

void BpCTavoPlayerClient::openUriComplete(int32_t status) {
    send(OPEN_URI_COMPLETE, {status});
}

void BpCTavoPlayerClient::startComplete(int32_t status) {
    send(START_COMPLETE, {status});
}

void BpCTavoPlayerClient::onCaptureFrame(uint8_t* data, int32_t width, int32_t height,
                                         int32_t flag) {
    Parcel parcel;
    parcel.writeInterfaceToken(ICTavoPlayerClient::descriptor);
    parcel.writeInt32(width);
    parcel.writeInt32(height);
    parcel.writeInt32(flag != 0 ? 1 : 0);
    // 2-byte pixels when the flag is set, 4-byte otherwise (the capture decides).
    const int64_t pixelBytes = flag != 0 ? 2 : 4;
    const int64_t len = static_cast<int64_t>(width) * height * pixelBytes;
    if (data == nullptr || width <= 0 || height <= 0 || len > INT32_MAX)
        return;
    android::sp<android::MemoryHeapBase> heap =
        new android::MemoryHeapBase(static_cast<size_t>(len), 0, "Frame Pixels");
    if (heap->initCheck() != OK || heap->setReadOnly() != OK)
        return;
    if (parcel.writeDupFileDescriptor(heap->getHeapID()) != OK)
        return;
    memcpy(heap->getBase(), data, static_cast<size_t>(len));
    remote()->transact(ON_CAPTURE_FRAME, parcel, nullptr, IBinder::FLAG_ONEWAY);
    // The mapping goes with the heap; the client keeps the region through its descriptor.
}

void BpCTavoPlayerClient::onSignalStatusChanged(int32_t previous, int32_t current) {
    send(ON_SIGNAL_STATUS_CHANGED, {previous, current});
}

void BpCTavoPlayerClient::closedCaptionText(const uint8_t* text, int32_t length) {
    if (length < 0 || (length > 0 && text == nullptr))
        return;
    Parcel data;
    data.writeInterfaceToken(ICTavoPlayerClient::descriptor);
    data.writeInt32(length);
    data.writeInt32(length);  // twice on purpose: the client reads both
    if (data.write(text, static_cast<size_t>(length)) != OK)
        return;
    remote()->transact(CLOSED_CAPTION_TEXT, data, nullptr, IBinder::FLAG_ONEWAY);
}

void BpCTavoPlayerClient::onStopComplete(int32_t status) {
    send(ON_STOP_COMPLETE, {status});
}

void BpCTavoPlayerClient::onError(int32_t code) {
    send(ON_ERROR, {code});
}

void BpCTavoPlayerClient::onBufferingBegin() {
    send(ON_BUFFERING_BEGIN, {});
}

void BpCTavoPlayerClient::onBufferingEnd() {
    send(ON_BUFFERING_END, {});
}

void BpCTavoPlayerClient::onBuffering(int32_t progress) {
    send(ON_BUFFERING, {progress});
}

void BpCTavoPlayerClient::onAudioSessionId(int32_t id) {
    send(ON_AUDIO_SESSION_ID, {id});
}

void BpCTavoPlayerClient::onStartVideoTask(int32_t width, int32_t height) {
    send(ON_START_VIDEO_TASK, {width, height});
}

void BpCTavoPlayerClient::onTimeUpdate(int32_t time) {
    send(ON_TIME_UPDATE, {time});
}

void BpCTavoPlayerClient::onEndOfContent() {
    send(ON_END_OF_CONTENT, {});
}

void BpCTavoPlayerClient::onRecorderStarted(int32_t status) {
    send(ON_RECORDER_STARTED, {status});
}

void BpCTavoPlayerClient::onRecorderStopped(int32_t status) {
    send(ON_RECORDER_STOPPED, {status});
}

void BpCTavoPlayerClient::onPaused(int32_t status) {
    send(ON_PAUSED, {status});
}

void BpCTavoPlayerClient::onResumed(int32_t status) {
    send(ON_RESUMED, {status});
}

void BpCTavoPlayerClient::onSeeked(int32_t ms) {
    send(ON_SEEKED, {ms});
}

}  // namespace TavoPlayer
