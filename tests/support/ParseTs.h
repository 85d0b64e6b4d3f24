// Runs a whole stream through one TS parser module, as the receiver would feed it,
// for tests that compare what comes out with an independent reading of the bytes.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <vector>

#include "support/TsTestUtil.h"
#include "tsparser/TSParser.h"

namespace TavoPlayer::test {

// The records a TS parser module of `kind` writes for `packets`, given in uneven
// batches of 1 to 40 packets, as the receiver's reads cut a stream, so that PES
// packets run across batches.
inline std::vector<PesRecord> parseTs(const std::vector<uint8_t>& packets, int kind) {
    auto input = makeRing("TS", 1 << 23);
    auto output = makeRing("PES", 1 << 24);
    android::sp<TSParser> parser = new TSParser(kind);
    parser->setInput(input);
    parser->addOutput(output, nullptr);
    EXPECT_EQ(parser->start(), 0u);
    for (size_t at = 0, step = 1; at < packets.size(); step = step % 37 + 3) {
        const size_t end = std::min(packets.size(), at + 188 * step);
        EXPECT_TRUE(
            writeAll(*input, std::vector<uint8_t>(packets.begin() + at, packets.begin() + end)));
        at = end;
    }
    EXPECT_TRUE(waitConsumed(*input));
    auto records = drainRecords(*output);
    EXPECT_EQ(parser->stop(), 0u);
    return records;
}

}  // namespace TavoPlayer::test
