#include "platform/gui/ShowLog.h"

#include <time.h>

#include <cerrno>
#include <cstring>

#include "platform/os/Trace.h"

namespace android {

ShowLog::ShowLog(const std::string& logPath) {
    if (logPath.empty())
        return;
    mFile = fopen(logPath.c_str(), "w");
    if (mFile == nullptr) {
        TAVO_LOGE("%s: cannot open the video log %s: %s\n", __func__, logPath.c_str(),
                  strerror(errno));
        return;
    }
    // One line per picture, readable by another process as soon as it is written.
    setvbuf(mFile, nullptr, _IOLBF, 0);
}

ShowLog::~ShowLog() {
    if (mFile != nullptr)
        fclose(mFile);
}

int64_t ShowLog::monotonicNs() {
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now);
    return static_cast<int64_t>(now.tv_sec) * 1'000'000'000 + now.tv_nsec;
}

void ShowLog::record(uint64_t pts90k, int32_t width, int32_t height) {
    const Entry entry{monotonicNs(), pts90k, width, height};
    std::lock_guard<std::mutex> lock(mLock);
    ++mShown;
    if (mHistory.size() == kHistorySize)
        mHistory.pop_front();
    mHistory.push_back(entry);
    if (mFile != nullptr) {
        fprintf(mFile, "%lld %llu %d %d\n", static_cast<long long>(entry.monotonicNs),
                static_cast<unsigned long long>(entry.pts90k), entry.width, entry.height);
    }
}

void ShowLog::recordDropped() {
    std::lock_guard<std::mutex> lock(mLock);
    ++mDropped;
}

uint64_t ShowLog::shownCount() const {
    std::lock_guard<std::mutex> lock(mLock);
    return mShown;
}

uint64_t ShowLog::droppedCount() const {
    std::lock_guard<std::mutex> lock(mLock);
    return mDropped;
}

std::vector<ShowLog::Entry> ShowLog::history() const {
    std::lock_guard<std::mutex> lock(mLock);
    return {mHistory.begin(), mHistory.end()};
}

bool ShowLog::logOpen() const {
    std::lock_guard<std::mutex> lock(mLock);
    return mFile != nullptr;
}

}  // namespace android
