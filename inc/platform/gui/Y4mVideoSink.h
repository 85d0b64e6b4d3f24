// Y4mVideoSink: every shown picture appended to a YUV4MPEG2 file, which any
// player or ffprobe opens. The stream's size is the first picture's; a later
// picture of another size is scaled to it, since the format has one size per file.
// The header names 30000/1001 frames per second, the broadcast rate: the file
// carries no time stamps of its own (the show log has them).
//
// Threads: show() runs on the codec's thread; mLock guards the file.
#pragma once

#include <cstdio>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/gui/ShowLog.h"
#include "platform/gui/VideoSink.h"

struct SwsContext;

namespace android {

class Y4mVideoSink : public VideoSink {
public:
    // Null (with an error logged) when the file cannot be created. It is truncated.
    static std::unique_ptr<Y4mVideoSink> open(const std::string& path, ShowLog& log);
    ~Y4mVideoSink() override;
    Y4mVideoSink(const Y4mVideoSink&) = delete;
    Y4mVideoSink& operator=(const Y4mVideoSink&) = delete;

    const char* name() const override { return "y4m"; }
    int show(const std::shared_ptr<const SinkPicture>& picture) override;

private:
    Y4mVideoSink(FILE* file, const std::string& path, ShowLog& log);
    // Fills mPlanar with the picture as planar 4:2:0 of the stream's size.
    bool toPlanar(const SinkPicture& picture);

    std::mutex mLock;
    FILE* mFile;
    const std::string mPath;
    ShowLog& mLog;  // the surface's; it outlives the sink
    int32_t mWidth = 0;
    int32_t mHeight = 0;
    bool mWriteFailed = false;
    std::vector<uint8_t> mPlanar;
    SwsContext* mScaler = nullptr;
};

}  // namespace android
