// Shell commands, files and temporary paths for tests that drive programs as separate
// processes or read what they wrote.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace TavoPlayer::test {

struct CommandResult {
    int exitCode = -1;     // -1 when the command did not exit normally
    std::string out, err;  // standard output (unless redirected) and standard error
};

// Runs `command` with /bin/sh and waits for it; its output and error are kept apart.
CommandResult runCommand(const std::string& command);
// The same with `2>&1` appended: the exit status, and both streams, as they were
// interleaved, appended to *output.
int runCommand(const std::string& command, std::string* output);

// The bytes of a file; empty when it cannot be read.
std::vector<uint8_t> fileBytes(const std::string& path);
std::string fileText(const std::string& path);
// A path in a temporary folder of this test process, removed when it exits.
std::string tempPath(const std::string& name);

}  // namespace TavoPlayer::test
