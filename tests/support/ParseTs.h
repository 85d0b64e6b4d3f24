// Runs a whole stream through one TS parser module, as the receiver would feed it,
// for tests that compare what comes out with an independent reading of the bytes.
#pragma once

#include <gtest/gtest.h>

#include <vector>

#include "support/TsTestUtil.h"
#include "tsparser/TSParser.h"

namespace TavoPlayer::test {

// The records a TS parser module of `kind` writes for `packets`, given in one batch.
inline std::vector<PesRecord> parseTs(const std::vector<uint8_t>& packets, int kind) {
    auto input = makeRing("TS", 1 << 23);
    auto output = makeRing("PES", 1 << 24);
    android::sp<TSParser> parser = new TSParser(kind);
    parser->setInput(input);
    parser->addOutput(output, nullptr);
    EXPECT_EQ(parser->start(), 0u);
    EXPECT_TRUE(writeAll(*input, packets));
    EXPECT_TRUE(waitConsumed(*input));
    auto records = drainRecords(*output);
    EXPECT_EQ(parser->stop(), 0u);
    return records;
}

}  // namespace TavoPlayer::test
