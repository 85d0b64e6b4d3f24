// Shared by the recorder and clip-player tests: a recordings folder of their own
// for the in-process recording service, and tsgen streams.
#pragma once

#include <string>

namespace TavoPlayer::test {

// Points tavoplayer.recordings.dir (through its environment override) at a new
// temporary folder while it lives, and removes the folder afterwards.
class ScopedRecordingsDir {
public:
    ScopedRecordingsDir();
    ~ScopedRecordingsDir();
    ScopedRecordingsDir(const ScopedRecordingsDir&) = delete;
    ScopedRecordingsDir& operator=(const ScopedRecordingsDir&) = delete;
    const std::string& path() const { return mPath; }

private:
    std::string mPath;
};

// A small tsgen stream of `seconds` (320x240 unless `options` say otherwise, which
// they may extend), made once per test program and removed at its end. Empty when
// tsgen fails.
const std::string& smallTsgenStream(int seconds, const std::string& options = "");

}  // namespace TavoPlayer::test
