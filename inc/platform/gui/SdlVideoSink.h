// SdlVideoSink: an SDL2 window showing each picture at its real size (the crop),
// keeping the aspect ratio when the window is resized (black bars), and
// deinterlacing interlaced pictures with FFmpeg's bwdif unless told not to.
//
// Threads: SDL's video belongs to the thread that initialises it, so one thread of
// the sink's own ("SdlVideoSink") initialises SDL, owns the window, pumps its events
// and presents. show() runs on the codec's thread and only puts the picture into a
// one-place mailbox (a picture still waiting there is replaced, and counted as
// dropped), so the decoder never waits for the display. mLock guards the mailbox
// and the start-up state. One window at a time per process: SDL's video is not
// made for several threads.
#pragma once

#include <condition_variable>
#include <memory>
#include <mutex>
#include <thread>

#include "platform/gui/ShowLog.h"
#include "platform/gui/VideoSink.h"

namespace android {

class SdlVideoSink : public VideoSink {
public:
    // Null when no window can be shown here (no display, SDL cannot start, or
    // another window sink is open).
    static std::unique_ptr<SdlVideoSink> open(ShowLog& log, bool deinterlace);
    ~SdlVideoSink() override;
    SdlVideoSink(const SdlVideoSink&) = delete;
    SdlVideoSink& operator=(const SdlVideoSink&) = delete;

    const char* name() const override { return "sdl"; }
    int show(const std::shared_ptr<const SinkPicture>& picture) override;

    // The window waits this long at most between two looks at its events.
    static constexpr int kEventPollMs = 20;

private:
    class Window;
    enum class Startup { Pending, Ready, Failed };

    SdlVideoSink(ShowLog& log, bool deinterlace);
    void run();

    ShowLog& mLog;  // the surface's; it outlives the sink
    const bool mDeinterlace;
    std::mutex mLock;
    std::condition_variable mWake;
    std::shared_ptr<const SinkPicture> mPending;
    bool mQuit = false;
    Startup mStartup = Startup::Pending;
    std::thread mThread;
};

}  // namespace android
