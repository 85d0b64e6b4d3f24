// IRecorderListener: the outcome of recordings driven by the Recorder. Calls come
// on the caller's thread (started, stopped) or on the recording service's thread
// (errors).
#pragma once

class IRecorderListener {
public:
    virtual ~IRecorderListener() = default;
    // The recording's file number, or 0 when the recording service gave no details.
    virtual void onRecorderStarted(int fileNumName) = 0;
    // 1 for a completed stop or cancel, 0 when it failed, else the delete's code.
    virtual void onRecorderStopped(int result) = 0;
    // One of the recorder error codes 0x60001..0x60004.
    virtual void onError(int code) = 0;
};
