// Recorder: records the live broadcast through the recording service. It holds no
// stream data: it asks the recording service to create, start, stop, cancel and
// delete a TS recording, fills in the descriptive record of the current recording
// and reports the outcome to an IRecorderListener.
//
// Threads: start and stop run on the caller's thread (a binder thread, under the
// service's lock); recorderCallback on the recording service's thread, where it
// only reads the listener.
#pragma once

#include <atomic>

#include <utils/RefBase.h>

#include "recorder/IRecorderListener.h"

namespace TavoPlayer {

class Uri;

class Recorder : public virtual android::RefBase {
public:
    // Codes given to IRecorderListener::onError for the recording service's events.
    static constexpr int kErrorEvent2 = 0x60001;
    static constexpr int kErrorEvent1 = 0x60002;
    static constexpr int kErrorEvent0 = 0x60003;
    static constexpr int kErrorEvent3 = 0x60004;

    Recorder();
    ~Recorder() override;

    // Not owned: the listener must outlive this recorder.
    void setListener(IRecorderListener* listener) { mListener = listener; }

    // Starts a recording of the given PIDs with the parameters of the URI's query
    // ("storageType", "channelName", "programName"). `reserved` is ignored. Failures
    // of the recording service are logged and never abort the sequence; the
    // listener learns the outcome through onRecorderStarted.
    void start(const Uri* uri, int videoPid, int audioPid, int reserved, int isLATM);
    // reason >= 1 stops and keeps the recording, reason < 1 cancels it.
    void stop(int reason);

    // The recording service's event function; userData is the Recorder.
    static void recorderCallback(int event, void* userData);

private:
    std::atomic<IRecorderListener*> mListener;
};

}  // namespace TavoPlayer
