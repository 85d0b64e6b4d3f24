#include "platform/dtv/PacketAligner.h"

#include <gtest/gtest.h>

#include "support/NamedRow.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

using test::PrintTo;

// 60 packets, of a PID whose low byte is the sync byte among them.
std::vector<uint8_t> cleanStream() {
    return test::buildStream({.pids = {0x100, 0x101, 0x47}, .rounds = 20});
}

// Feeds `bytes` in pieces of `piece` bytes (0: all at once) and finishes, setting
// `dropped` to the bytes finish() reports.
std::vector<uint8_t> align(PacketAligner& aligner, const std::vector<uint8_t>& bytes, size_t piece,
                           size_t& dropped) {
    std::vector<uint8_t> out;
    if (piece == 0)
        piece = bytes.size();
    for (size_t at = 0; at < bytes.size(); at += piece)
        aligner.push(bytes.data() + at, std::min(piece, bytes.size() - at), out);
    dropped = aligner.finish(out);
    return out;
}

class PacketAlignerPieces : public ::testing::TestWithParam<size_t> {};

TEST_P(PacketAlignerPieces, CleanStreamComesOutUnchangedWhateverThePieceSize) {
    const std::vector<uint8_t> stream = cleanStream();
    PacketAligner aligner;
    size_t dropped = 99;
    EXPECT_EQ(align(aligner, stream, GetParam(), dropped), stream);
    EXPECT_EQ(dropped, 0u);
    EXPECT_EQ(aligner.syncLosses(), 0u);
    EXPECT_EQ(aligner.bytesSkipped(), 0u);
}

INSTANTIATE_TEST_SUITE_P(Pieces, PacketAlignerPieces,
                         ::testing::Values(1, 7, 187, 188, 189, 376, 1000, 0));

// One fault each: `erase` bytes at `at` replaced by `insert`. The packets that are
// whole come out, the broken ones do not.
struct Fault {
    const char* name;
    size_t at, erase;
    std::vector<uint8_t> insert;
    size_t expectedPackets;  // of the 60 in the clean stream
    int finishDropped = -1;  // bytes finish() reports, where checked
};

class PacketAlignerFaults : public ::testing::TestWithParam<Fault> {};

TEST_P(PacketAlignerFaults, RecoversAndDeliversOnlyWholePackets) {
    const Fault& f = GetParam();
    const std::vector<uint8_t> clean = cleanStream();
    std::vector<uint8_t> damaged = clean;
    damaged.erase(damaged.begin() + f.at, damaged.begin() + f.at + f.erase);
    damaged.insert(damaged.begin() + f.at, f.insert.begin(), f.insert.end());
    for (size_t piece : {size_t{1}, size_t{100}, size_t{0}}) {
        PacketAligner aligner;
        size_t dropped = 0;
        const std::vector<uint8_t> out = align(aligner, damaged, piece, dropped);
        ASSERT_EQ(out.size() % 188, 0u);
        EXPECT_EQ(out.size() / 188, f.expectedPackets) << "piece " << piece;
        if (f.finishDropped >= 0) {
            EXPECT_EQ(dropped, static_cast<size_t>(f.finishDropped)) << "piece " << piece;
        }
        // Every packet out is one of the clean packets, in the original order.
        size_t from = 0;
        for (size_t i = 0; i < out.size(); i += 188) {
            while (from < clean.size() &&
                   !std::equal(out.begin() + i, out.begin() + i + 188, clean.begin() + from))
                from += 188;
            ASSERT_LT(from, clean.size())
                << "packet " << i / 188 << " is not a clean packet in order";
            from += 188;
        }
        EXPECT_GT(aligner.bytesSkipped(), 0u);
    }
}

INSTANTIATE_TEST_SUITE_P(
    Faults, PacketAlignerFaults,
    ::testing::Values(
        Fault{"GarbageBeforeTheFirstPacket", 0, 0, {1, 2, 0x47, 4, 5, 0x47, 0, 0, 9}, 60},
        Fault{"GarbageBetweenPackets", 188 * 10, 0, std::vector<uint8_t>(33, 0x47), 60},
        // The packet before the garbage is whole and must not be lost with it.
        Fault{"ZerosBetweenPackets", 188 * 10, 0, std::vector<uint8_t>(50, 0), 60},
        Fault{"PacketCutShortInTheMiddle", 188 * 5 + 100, 88, {}, 59},
        Fault{"TruncatedLastPacket", 188 * 60 - 50, 50, {}, 59, 138},
        Fault{"LostSyncByte", 188 * 30, 1, {0}, 59}),
    [](const ::testing::TestParamInfo<Fault>& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace TavoPlayer
