#include "support/TraceCapture.h"

namespace TavoPlayer::test {

TraceCapture::TraceCapture() {
    mPrevious = setTraceSink([this](const TraceRecord& record) {
        std::lock_guard<std::mutex> lock(mMutex);
        mLines.push_back({record.severity, record.text});
    });
}

TraceCapture::~TraceCapture() {
    setTraceSink(std::move(mPrevious));
}

std::vector<TraceCapture::Line> TraceCapture::lines() const {
    std::lock_guard<std::mutex> lock(mMutex);
    return mLines;
}

size_t TraceCapture::count(const std::string& fragment) const {
    return count(kAnySeverity, fragment);
}

size_t TraceCapture::count(uint32_t severity, const std::string& fragment) const {
    std::lock_guard<std::mutex> lock(mMutex);
    size_t n = 0;
    for (const Line& line : mLines) {
        if ((severity == kAnySeverity || line.severity == severity) &&
            line.text.find(fragment) != std::string::npos)
            ++n;
    }
    return n;
}

void TraceCapture::clear() {
    std::lock_guard<std::mutex> lock(mMutex);
    mLines.clear();
}

std::string TraceCapture::all() const {
    std::lock_guard<std::mutex> lock(mMutex);
    std::string text;
    for (const Line& line : mLines) {
        text += line.text;
        if (text.empty() || text.back() != '\n')
            text += '\n';
    }
    return text;
}

}  // namespace TavoPlayer::test
