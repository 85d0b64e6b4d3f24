#include "support/ScopedEnv.h"

#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <map>

#include "support/TsTestUtil.h"

namespace TavoPlayer::test {

ScopedEnv::ScopedEnv(std::string name, const std::string& value) : mName(std::move(name)) {
    const char* old = getenv(mName.c_str());
    mHad = old != nullptr;
    if (mHad)
        mOld = old;
    setenv(mName.c_str(), value.c_str(), 1);
}

ScopedEnv::~ScopedEnv() {
    if (mHad)
        setenv(mName.c_str(), mOld.c_str(), 1);
    else
        unsetenv(mName.c_str());
}

namespace {
std::string newFolder() {
    char name[] = "/tmp/tavo_recordings_XXXXXX";
    return mkdtemp(name) != nullptr ? name : "";
}
}  // namespace

ScopedRecordingsDir::ScopedRecordingsDir()
    : mPath(newFolder()), mEnv("TAVOPLAYER_PROP_tavoplayer_recordings_dir", mPath) {}

ScopedRecordingsDir::~ScopedRecordingsDir() {
    std::error_code ignored;
    if (!mPath.empty())
        std::filesystem::remove_all(mPath, ignored);
}

const std::string& tsgenStream(const std::string& tsgen, int seconds, const std::string& options) {
    static std::map<std::string, std::string> made;
    static struct Cleanup {
        ~Cleanup() {
            for (auto& [key, path] : made)
                unlink(path.c_str());
        }
    } cleanup;
    const std::string key = std::to_string(seconds) + options;
    auto it = made.find(key);
    if (it != made.end())
        return it->second;
    const std::string path =
        "/tmp/tavo_stream_" + std::to_string(getpid()) + "_" + std::to_string(made.size()) + ".ts";
    bool ok = false;
    runCommand(tsgen + " -o " + path + " -d " + std::to_string(seconds) + " --size 320x240 " +
                   options + " 2>&1",
               &ok);
    return made[key] = ok ? path : std::string();
}

}  // namespace TavoPlayer::test
