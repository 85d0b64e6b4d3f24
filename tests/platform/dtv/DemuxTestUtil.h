// Reading a demux filter as a client of the demux service does.
#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <cstddef>
#include <limits>
#include <vector>

#include "platform/dtv/DemuxBinder.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer::test {

// The packets that reach the filter `handle` until `packets` have arrived or
// `window` has passed; reads are always whole packets.
inline std::vector<TsPacket> readFilter(int handle,
                                        size_t packets = std::numeric_limits<size_t>::max(),
                                        std::chrono::milliseconds window = kDeadline) {
    std::vector<TsPacket> got;
    std::vector<uint8_t> buffer(188 * 100);
    const auto end = std::chrono::steady_clock::now() + window;
    while (got.size() < packets && std::chrono::steady_clock::now() < end) {
        DemuxHandleSet set;
        DemuxBinder_HandleZERO(&set);
        DemuxBinder_HandleSET(handle, &set);
        if (DemuxBinder_Select(&set, 20) <= 0)
            continue;
        const int n = DemuxBinder_ReadData(handle, buffer.data(), static_cast<int>(buffer.size()));
        EXPECT_EQ(n % 188, 0);
        if (n > 0) {
            const auto more = toPackets(std::vector<uint8_t>(buffer.begin(), buffer.begin() + n));
            got.insert(got.end(), more.begin(), more.end());
        }
    }
    return got;
}

}  // namespace TavoPlayer::test
