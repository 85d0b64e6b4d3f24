// Runs a shell command line for tests that drive the programs as separate processes.
#pragma once

#include <string>

namespace TavoPlayer::test {

// The command's exit status (-1 when it did not exit normally); its standard output
// and error are appended to *output.
int runCommand(const std::string& command, std::string* output);

}  // namespace TavoPlayer::test
