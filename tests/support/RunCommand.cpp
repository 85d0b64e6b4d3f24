#include "support/RunCommand.h"

#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>

namespace TavoPlayer::test {

std::vector<uint8_t> fileBytes(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

std::string fileText(const std::string& path) {
    const auto bytes = fileBytes(path);
    return {bytes.begin(), bytes.end()};
}

std::string tempPath(const std::string& name) {
    static struct Folder {
        Folder() { std::filesystem::create_directories(path); }
        // A forked child that exits (a death test) must not remove its parent's files.
        ~Folder() {
            if (getpid() == owner)
                std::filesystem::remove_all(path, ec);
        }
        pid_t owner = getpid();
        std::string path = "/tmp/tavo_test_" + std::to_string(owner);
        std::error_code ec;
    } folder;
    return folder.path + "/" + name;
}

CommandResult runCommand(const std::string& command) {
    static std::atomic<int> count{0};
    const std::string out = tempPath("command" + std::to_string(++count)), err = out + ".err";
    const int status = std::system(("(" + command + ") >'" + out + "' 2>'" + err + "'").c_str());
    const auto outBytes = fileBytes(out), errBytes = fileBytes(err);
    std::filesystem::remove(out);
    std::filesystem::remove(err);
    return {WIFEXITED(status) ? WEXITSTATUS(status) : -1,
            {outBytes.begin(), outBytes.end()},
            {errBytes.begin(), errBytes.end()}};
}

int runCommand(const std::string& command, std::string* output) {
    const CommandResult result = runCommand(command + " 2>&1");
    output->append(result.out);
    return result.exitCode;
}

}  // namespace TavoPlayer::test
