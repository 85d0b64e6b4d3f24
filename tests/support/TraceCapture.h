// Captures what the trace facility logs while the object lives, so that tests can
// assert on the designed messages.
#pragma once

#include <string>
#include <vector>

#include "platform/os/Trace.h"
#include "support/Recorded.h"

namespace TavoPlayer::test {

class TraceCapture {
public:
    struct Line {
        uint32_t severity;
        std::string text;
    };

    TraceCapture();
    ~TraceCapture();
    TraceCapture(const TraceCapture&) = delete;
    TraceCapture& operator=(const TraceCapture&) = delete;

    std::vector<Line> lines() const { return mLines.snapshot(); }
    // Number of captured messages whose text contains `fragment`.
    size_t count(const std::string& fragment) const { return count(kAnySeverity, fragment); }
    bool contains(const std::string& fragment) const { return count(fragment) > 0; }
    // Number of captured messages of this severity containing `fragment`.
    size_t count(uint32_t severity, const std::string& fragment) const;
    void clear() { mLines.take(); }
    // Every captured text, one per line, for failure messages.
    std::string all() const;

private:
    static constexpr uint32_t kAnySeverity = ~0u;
    Recorded<Line> mLines;
    TraceSink mPrevious;
};

}  // namespace TavoPlayer::test
