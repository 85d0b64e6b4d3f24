// ControllerInterface: the controller the player service holds while a source is
// open. MainController (the broadcast pipeline, live or a recorded clip) and
// MP4Controller (the platform media player) implement all of it.
//
// Threads: the player service calls every operation on a binder thread under its
// one lock, except getPCRValue, which it calls without the lock.
//
// Results: 0 for success, 1 for refused, or a module error code (0xK100N), unless
// the operation returns a value. Listeners are plain pointers that the service
// owns and keeps alive for the controller's whole life.
#pragma once

#include <cstdint>
#include <cstdio>
#include <map>
#include <string>

#include <utils/RefBase.h>
#include <utils/String16.h>
#include <utils/StrongPointer.h>
#include <utils/Vector.h>

#include "common/ErrorListener.h"
#include "common/Uri.h"
#include "platform/gui/Surface.h"
#include "recorder/IPlayerListener.h"
#include "recorder/IRecorderListener.h"
#include "renderer/AudioRenderer.h"
#include "renderer/ClosedCaptionListener.h"
#include "renderer/VideoRenderer.h"
#include "servicecontroller/ServiceController.h"

namespace TavoPlayer {

// Only pointers to it pass through here; its users include its own header.
class CaptureFrameListener;

class ControllerInterface : public virtual android::RefBase {
public:
    ~ControllerInterface() override = default;

    // Reads the source's settings. Keys are looked up with the map's subscript, so
    // a missing key is added to the caller's map with an empty value.
    virtual unsigned int configure(std::map<std::string, std::string>& config) = 0;
    virtual unsigned int start() = 0;
    virtual unsigned int stop() = 0;
    virtual unsigned int pause() = 0;
    virtual unsigned int resume() = 0;
    virtual unsigned int seek(int ms) = 0;
    virtual unsigned int setSurface(android::sp<android::Surface>& surface) = 0;
    virtual unsigned int dump(FILE* stream, const android::Vector<android::String16>& args,
                              int indent) = 0;
    // Captures `count` displayed frames `intervalMs` apart; they arrive through the
    // capture-frame listener.
    virtual unsigned int getFrame(int count, int intervalMs) = 0;
    // Frames shown in the last second; -1 when unknown or without video.
    virtual int getFrameRate() = 0;
    // The clock's current PCR (90 kHz); 0 while nothing drives it.
    virtual int64_t getPCRValue() = 0;
    virtual unsigned int setAudioPID(int pid) = 0;
    virtual unsigned int setCCPID(int pid) = 0;
    // The URI stays the caller's.
    virtual unsigned int startRecord(Uri* uri) = 0;
    virtual unsigned int stopRecord(bool keep) = 0;
    virtual unsigned int setSoundEffect(int effect) = 0;
    virtual unsigned int setCropRect(int a, int b, int c, int d, int e) = 0;
    virtual unsigned int setAVSync(int offsetMs) = 0;
    virtual unsigned int setAudioEnable(int enable) = 0;
    virtual unsigned int setAudioOnlyMode(int audioOnly) = 0;
    virtual unsigned int setCaptionSync(int offsetMs) = 0;

    virtual unsigned int setErrorListener(ErrorListener* listener) = 0;
    virtual unsigned int setCaptureFrameListener(CaptureFrameListener* listener) = 0;
    virtual unsigned int setCaptionListener(ClosedCaptionListener* listener) = 0;
    virtual unsigned int setAudioRenderedListener(
        AudioRenderer::AudioRenderedListener* listener) = 0;
    virtual unsigned int setVideoRenderedListener(
        VideoRenderer::FrameRenderedListener* listener) = 0;
    virtual unsigned int setServiceControllerListener(
        ServiceController::ServiceControllerListener* listener) = 0;
    virtual unsigned int setPlayerListener(IPlayerListener* listener) = 0;
    virtual unsigned int setRecorderListener(IRecorderListener* listener) = 0;
};

}  // namespace TavoPlayer
