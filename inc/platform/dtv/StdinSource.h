// StdinSource: a TS arriving on a pipe, standard input by default (`tsgen | tavoplay`).
// The descriptor is not closed by the source: it belongs to the process.
#pragma once

#include "platform/dtv/DemuxSource.h"

namespace TavoPlayer {

class StdinSource : public DemuxSource {
public:
    explicit StdinSource(int fd);

    int open() override;
    ssize_t read(uint8_t* buffer, size_t size, int timeoutMs) override;
    std::string describe() const override;

private:
    const int mFd;
};

}  // namespace TavoPlayer
