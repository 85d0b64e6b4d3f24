// Environment overrides for the tests (system properties are read through them),
// the recordings folder of the in-process recording service, and tsgen streams
// shared by the tests of one program.
#pragma once

#include <string>

namespace TavoPlayer::test {

// Sets an environment variable while it lives, then restores what was there.
class ScopedEnv {
public:
    ScopedEnv(std::string name, const std::string& value);
    ~ScopedEnv();
    ScopedEnv(const ScopedEnv&) = delete;
    ScopedEnv& operator=(const ScopedEnv&) = delete;

private:
    std::string mName, mOld;
    bool mHad = false;
};

// A new folder in the system's temporary folder while it lives, removed with its
// contents afterwards; its path is empty when it could not be made.
class TempDir {
public:
    explicit TempDir(const std::string& prefix = "tavo");
    ~TempDir();
    TempDir(const TempDir&) = delete;
    TempDir& operator=(const TempDir&) = delete;
    const std::string& path() const { return mPath; }
    std::string operator/(const std::string& name) const { return mPath + "/" + name; }

private:
    std::string mPath;
};

// Points tavoplayer.recordings.dir at a new temporary folder while it lives, and
// removes the folder afterwards.
class ScopedRecordingsDir {
public:
    ScopedRecordingsDir() : mDir("tavo_recordings"), mEnv(kVariable, mDir.path()) {}
    const std::string& path() const { return mDir.path(); }

private:
    static constexpr const char* kVariable = "TAVOPLAYER_PROP_tavoplayer_recordings_dir";
    TempDir mDir;
    ScopedEnv mEnv;
};

// A 320x240 stream of `seconds` written by the tsgen program at `tsgen` with these
// further options, made once per test program and removed at its end; empty when
// tsgen fails.
const std::string& tsgenStream(const std::string& tsgen, int seconds,
                               const std::string& options = "");
#ifdef TAVO_TSGEN_PATH
inline const std::string& tsgenStream(int seconds, const std::string& options = "") {
    return tsgenStream(TAVO_TSGEN_PATH, seconds, options);
}
#endif

}  // namespace TavoPlayer::test
