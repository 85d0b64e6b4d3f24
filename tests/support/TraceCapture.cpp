#include "support/TraceCapture.h"

#include <algorithm>

namespace TavoPlayer::test {

TraceCapture::TraceCapture() {
    mPrevious = setTraceSink([this](const TraceRecord& record) {
        mLines.push({record.severity, record.text});
    });
}

TraceCapture::~TraceCapture() {
    setTraceSink(std::move(mPrevious));
}

size_t TraceCapture::count(uint32_t severity, const std::string& fragment) const {
    return mLines.read([&](const std::vector<Line>& lines) {
        return std::ranges::count_if(lines, [&](const Line& line) {
            return (severity == kAnySeverity || line.severity == severity) &&
                   line.text.find(fragment) != std::string::npos;
        });
    });
}

std::string TraceCapture::all() const {
    std::string text;
    for (const Line& line : mLines.snapshot()) {
        text += line.text;
        if (text.empty() || text.back() != '\n')
            text += '\n';
    }
    return text;
}

}  // namespace TavoPlayer::test
