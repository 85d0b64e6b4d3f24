// ClipSource: a recorded clip as the demux's source.
//
// The demux reads the clip at the pace of its PCR, as it reads any file. What the
// clip adds is a shared cursor (ClipCursor) that outlives any one opening: the
// byte offset the next read starts from, whether the clip is the demux's source
// for the next opening (armed), and where the end of the feed is reported. The
// controller stops and starts its pipeline around a seek, which closes the demux
// source and opens it again; the cursor carries the position across.
//
// Threads: read() and onEnded() on the demux's source thread; setOffset() only
// while no thread reads (Demux::restartSource); the cursor is locked.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>

#include "platform/dtv/DemuxSource.h"

namespace TavoPlayer {

struct ClipCursor {
    std::mutex lock;
    uint64_t offset = 0;  // where the next read starts
    bool armed = false;   // the next demux opening takes the clip
    int openSources = 0;  // ClipSources open on this cursor
    // The end of a feed: (packets handed out, read failed, the feed started short of
    // the end). Runs on the source thread; must not call into the demux.
    std::function<void(uint64_t, bool, bool)> onEnd;
};

class ClipSource : public DemuxSource {
public:
    ClipSource(std::string path, std::shared_ptr<ClipCursor> cursor, bool paced);
    // Closing the source disarms the clip: the next opening reads the property
    // again unless the clip is armed anew (a seek, or the clip opened again).
    ~ClipSource() override;

    int open() override;
    ssize_t read(uint8_t* buffer, size_t size, int timeoutMs) override;
    bool paced() const override { return mPaced; }
    std::string describe() const override { return "clip " + mPath; }
    void onEnded(uint64_t packets, bool failed) override;

    const std::shared_ptr<ClipCursor>& cursor() const { return mCursor; }
    void setOffset(uint64_t offset);

private:
    const std::string mPath;
    const std::shared_ptr<ClipCursor> mCursor;
    const bool mPaced;
    int mFd = -1;
    uint64_t mFileSize = 0;
    uint64_t mStartOffset = 0;
};

}  // namespace TavoPlayer
