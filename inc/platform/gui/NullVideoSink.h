// NullVideoSink: the headless sink. Pictures are only recorded (counted, with
// their PTS and the time they were shown); the surface keeps the last one for
// capture.
#pragma once

#include "platform/gui/ShowLog.h"
#include "platform/gui/VideoSink.h"

namespace android {

class NullVideoSink : public VideoSink {
public:
    // `log` belongs to the surface, which outlives its sink.
    explicit NullVideoSink(ShowLog& log) : mLog(log) {}
    const char* name() const override { return "null"; }
    int show(const std::shared_ptr<const SinkPicture>& picture) override;

private:
    ShowLog& mLog;
};

}  // namespace android
