// IPlayerListener: time and end-of-content reports of a recorded clip's playback.
// onTimeUpdate comes on the presenting renderer's thread, the others also on the
// recording service's thread. Every operation has an empty default.
#pragma once

class IPlayerListener {
public:
    virtual ~IPlayerListener() = default;
    // Elapsed playback time in whole seconds.
    virtual void onTimeUpdate(int /*seconds*/) {}
    virtual void onEndOfContent() {}
    virtual void onError(int /*code*/) {}
};
