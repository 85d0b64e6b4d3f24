// Runs the tsgen program and reads what it wrote with a packet reader of the
// tests' own, independent of tsgen's multiplexer.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "support/RunCommand.h"
#include "support/TsReader.h"

namespace TavoPlayer::test {

// "56 E0 11" -> {0x56, 0xE0, 0x11}; stops at the first word that is not hex.
std::vector<uint8_t> hex(const std::string& text);
bool contains(const std::vector<uint8_t>& bytes, const std::string& hexBytes);
// What libavcodec complains about while decoding every stream of `file`.
std::string decodeErrors(const std::string& file);

// Time of one packet slot at a constant transport rate, in 27 MHz ticks.
constexpr int64_t ticks27PerPacket(int64_t muxRate) {
    return 188 * 8 * 27000000LL / muxRate;
}
// PCR steps that differ from what the byte distance predicts at `muxRate`:
// (packet position of the later PCR, excess in 27 MHz ticks).
std::vector<std::pair<uint64_t, int64_t>> pcrAnomalies(const TsFile& ts, int64_t muxRate);

// tsgen's output for `args`, made once per test process and shared by the
// tests that ask for the same arguments; read as 204-byte packets where asked.
struct Generated {
    CommandResult run;
    std::string file;
    std::vector<uint8_t> bytes;
    TsFile ts;
    ::testing::AssertionResult ok() const {
        return ::testing::AssertionResult(run.exitCode == 0 && ts.valid)
               << "tsgen exit " << run.exitCode << ", " << bytes.size() << " bytes: " << run.err;
    }
};
const Generated& tsgen(const std::string& args);

// NAL unit types of an Annex B byte stream, in order.
std::vector<int> nalTypes(const std::vector<uint8_t>& es);

}  // namespace TavoPlayer::test
