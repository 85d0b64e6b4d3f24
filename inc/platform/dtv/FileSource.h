// FileSource: a recorded TS file played as if it were being broadcast.
//
// The demux releases its packets at their PCR times (see PcrPacer) unless the
// source was made unpaced, in which case the reader gets them as fast as it takes
// them. With loop set, the end of the file starts it again (read() reports
// kRestart once per pass, so that the demux re-aligns and re-anchors its pacing).
#pragma once

#include <string>

#include "platform/dtv/DemuxSource.h"

namespace TavoPlayer {

class FileSource : public DemuxSource {
public:
    FileSource(std::string path, bool loop, bool paced);
    ~FileSource() override;

    int open() override;
    ssize_t read(uint8_t* buffer, size_t size, int timeoutMs) override;
    bool paced() const override { return mPaced; }
    std::string describe() const override { return "file " + mPath; }

    uint64_t passes() const { return mPasses; }

private:
    const std::string mPath;
    const bool mLoop;
    const bool mPaced;
    int mFd = -1;
    uint64_t mBytesThisPass = 0;
    uint64_t mPasses = 0;
};

}  // namespace TavoPlayer
