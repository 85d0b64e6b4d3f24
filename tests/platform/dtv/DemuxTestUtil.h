// Reading a demux filter as a client of the demux service does.
#pragma once

#include <chrono>
#include <cstddef>
#include <limits>
#include <vector>

#include "support/TsTestUtil.h"

namespace TavoPlayer::test {

// The packets that reach the filter `handle` until `packets` have arrived or
// `window` has passed; reads are always whole packets.
std::vector<TsPacket> readFilter(int handle, size_t packets = std::numeric_limits<size_t>::max(),
                                 std::chrono::milliseconds window = kDeadline);

}  // namespace TavoPlayer::test
