#pragma once

#include <string>

#include "Options.h"

namespace TavoPlayer::tsgen {

// The command line of tsgen: every option, its checks and its help text.
class OptionParser {
public:
    // Returns 0 with the options filled in, 1 with a message in error(), or 2
    // when --help was asked for (the usage text is then in usage()).
    int parse(int argc, char** argv, Options& options);
    const std::string& error() const { return mError; }
    static std::string usage();

private:
    int fail(const std::string& message);
    std::string mError;
};

}  // namespace TavoPlayer::tsgen
