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

TempDir::TempDir(const std::string& prefix) {
    std::string name = std::filesystem::temp_directory_path() / (prefix + "_XXXXXX");
    if (mkdtemp(name.data()) != nullptr)
        mPath = name;
}

TempDir::~TempDir() {
    std::error_code ignored;
    if (!mPath.empty())
        std::filesystem::remove_all(mPath, ignored);
}

const std::string& tsgenStream(const std::string& tsgen, int seconds, const std::string& options) {
    static std::map<std::string, std::string> made;
    const std::string key = std::to_string(seconds) + options;
    auto it = made.find(key);
    if (it != made.end())
        return it->second;
    const std::string path = tempPath("stream" + std::to_string(made.size()) + ".ts");
    const bool ok = runCommand(tsgen + " -o " + path + " -d " + std::to_string(seconds) +
                               " --size 320x240 " + options)
                        .exitCode == 0;
    return made[key] = ok ? path : std::string();
}

}  // namespace TavoPlayer::test
