#include "service/BnCTavoPlayerClient.h"

#include <sys/mman.h>
#include <sys/stat.h>

#include <vector>

#include "platform/binder/Parcel.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {

using android::BAD_VALUE;
using android::OK;
using android::Parcel;
using android::status_t;

void BnCTavoPlayerClient::onCaptureFrameRegion(int fd, int32_t width, int32_t height,
                                               int32_t flag) {
    const int64_t len = static_cast<int64_t>(width) * height * (flag != 0 ? 2 : 4);
    struct stat st {};
    if (width <= 0 || height <= 0 || fstat(fd, &st) != 0 || st.st_size < len) {
        TAVO_LOGE("%s: frame region too small for %dx%d\n", __func__, width, height);
        return;
    }
    void* pixels = mmap(nullptr, static_cast<size_t>(len), PROT_READ, MAP_SHARED, fd, 0);
    if (pixels == MAP_FAILED) {
        TAVO_LOGE("%s: cannot map the frame region\n", __func__);
        return;
    }
    // The mapping is read-only; the interface's pointer type is the service's.
    onCaptureFrame(static_cast<uint8_t*>(pixels), width, height, flag);
    munmap(pixels, static_cast<size_t>(len));
}

status_t BnCTavoPlayerClient::onTransact(uint32_t code, const Parcel& data, Parcel* reply,
                                         uint32_t flags) {
    if (code < OPEN_URI_COMPLETE || code > ON_SEEKED)
        return BBinder::onTransact(code, data, reply, flags);
    if (!data.enforceInterface(ICTavoPlayerClient::descriptor)) {
        TAVO_LOGE("%s: Call incorrectly routed to ICTavoPlayerClient\n", __func__);
        return -1;
    }
    // How many integers each callback carries, by code.
    static constexpr int kInts[] = {0, 1, 1, 2, 3, 2, 1, 1, 0, 0, 1, 1, 2, 1, 0, 1, 1, 1, 1, 1};
    int32_t v[3] = {};
    for (int i = 0; i < kInts[code]; ++i) {
        if (data.readInt32(&v[i]) != OK)
            return BAD_VALUE;
    }
    switch (code) {
        case OPEN_URI_COMPLETE:
            openUriComplete(v[0]);
            break;
        case START_COMPLETE:
            startComplete(v[0]);
            break;
        case CLOSED_CAPTION_TEXT: {
            // The length comes twice; both must agree before the bytes are trusted.
            if (v[0] != v[1] || v[0] < 0)
                return BAD_VALUE;
            const void* text = data.readInplace(static_cast<size_t>(v[0]));
            if (text == nullptr)
                return BAD_VALUE;
            closedCaptionText(static_cast<const uint8_t*>(text), v[0]);
            break;
        }
        case ON_CAPTURE_FRAME: {
            const int fd = data.readFileDescriptor();
            if (fd < 0)
                return BAD_VALUE;
            onCaptureFrameRegion(fd, v[0], v[1], v[2]);
            break;
        }
        case ON_SIGNAL_STATUS_CHANGED:
            onSignalStatusChanged(v[0], v[1]);
            break;
        case ON_STOP_COMPLETE:
            onStopComplete(v[0]);
            break;
        case ON_ERROR:
            onError(v[0]);
            break;
        case ON_BUFFERING_BEGIN:
            onBufferingBegin();
            break;
        case ON_BUFFERING_END:
            onBufferingEnd();
            break;
        case ON_BUFFERING:
            onBuffering(v[0]);
            break;
        case ON_AUDIO_SESSION_ID:
            onAudioSessionId(v[0]);
            break;
        case ON_START_VIDEO_TASK:
            onStartVideoTask(v[0], v[1]);
            break;
        case ON_TIME_UPDATE:
            onTimeUpdate(v[0]);
            break;
        case ON_END_OF_CONTENT:
            onEndOfContent();
            break;
        case ON_RECORDER_STARTED:
            onRecorderStarted(v[0]);
            break;
        case ON_RECORDER_STOPPED:
            onRecorderStopped(v[0]);
            break;
        case ON_PAUSED:
            onPaused(v[0]);
            break;
        case ON_RESUMED:
            onResumed(v[0]);
            break;
        case ON_SEEKED:
            onSeeked(v[0]);
            break;
    }
    return OK;
}

}  // namespace TavoPlayer
