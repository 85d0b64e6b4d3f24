#include "RecorderTestUtil.h"

#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <map>

#include "support/TsTestUtil.h"

namespace TavoPlayer::test {

namespace {
constexpr const char* kDirVariable = "TAVOPLAYER_PROP_tavoplayer_recordings_dir";
}

ScopedRecordingsDir::ScopedRecordingsDir() {
    char name[] = "/tmp/tavo_recorder_XXXXXX";
    if (mkdtemp(name) != nullptr)
        mPath = name;
    setenv(kDirVariable, mPath.c_str(), 1);
}

ScopedRecordingsDir::~ScopedRecordingsDir() {
    unsetenv(kDirVariable);
    std::error_code ignored;
    if (!mPath.empty())
        std::filesystem::remove_all(mPath, ignored);
}

const std::string& smallTsgenStream(int seconds, const std::string& options) {
    static std::map<std::string, std::string> made;
    static struct Cleanup {
        ~Cleanup() {
            for (auto& [s, path] : made)
                unlink(path.c_str());
        }
    } cleanup;
    const std::string key = std::to_string(seconds) + options;
    auto it = made.find(key);
    if (it != made.end())
        return it->second;
    std::string path =
        "/tmp/tavo_recorder_" + std::to_string(getpid()) + "_" + std::to_string(seconds) + ".ts";
    bool ok = false;
    runCommand(std::string(TAVO_TSGEN_PATH) + " -o " + path + " -d " + std::to_string(seconds) +
                   " --size 320x240 " + options + " 2>&1",
               &ok);
    return made[key] = ok ? path : std::string();
}

}  // namespace TavoPlayer::test
