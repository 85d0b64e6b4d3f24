// ShowLog: what a sink has shown. Counts the pictures, keeps the PTS and the
// monotonic time of the most recent ones, and, when the property
// tavoplayer.video.log names a file, writes one line per picture to it:
//     monotonic_ns pts90k width height
// so that presentation timing can be measured from outside the process.
//
// Threads: record() is called by whichever thread presents (the codec's for the
// null and y4m sinks, the window's own for sdl); the readers come from anywhere.
// mLock guards everything.
#pragma once

#include <cstdint>
#include <cstdio>
#include <deque>
#include <mutex>
#include <string>
#include <vector>

namespace android {

class ShowLog {
public:
    struct Entry {
        int64_t monotonicNs;
        uint64_t pts90k;
        int32_t width;
        int32_t height;
    };

    // The history keeps this many of the most recent pictures (a few minutes of
    // video); the count and the log file see every one.
    static constexpr size_t kHistorySize = 8192;

    // Opens `logPath` for writing when it is not empty (truncating it).
    explicit ShowLog(const std::string& logPath);
    ~ShowLog();
    ShowLog(const ShowLog&) = delete;
    ShowLog& operator=(const ShowLog&) = delete;

    // A picture has been shown now.
    void record(uint64_t pts90k, int32_t width, int32_t height);
    // A picture was handed to the sink but replaced before it could be shown.
    void recordDropped();

    uint64_t shownCount() const;
    uint64_t droppedCount() const;
    std::vector<Entry> history() const;
    bool logOpen() const;

    static int64_t monotonicNs();

private:
    mutable std::mutex mLock;
    uint64_t mShown = 0;
    uint64_t mDropped = 0;
    std::deque<Entry> mHistory;
    FILE* mFile = nullptr;
};

}  // namespace android
