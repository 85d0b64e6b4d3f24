#include <gtest/gtest.h>

#include <vector>

#include "platform/dtv/ProgramFinder.h"
#include "platform/dtv/ProgramTableWriter.h"

namespace TavoPlayer {
namespace {

// The recording's own tables, read back: the programme the writer was given,
// reduced to the recorded PIDs, with descriptors intact.
TEST(ProgramFinderTest, ReadsBackTheTablesTheWriterMadeForTheRecordedPids) {
    ProgramInfo broadcast;
    broadcast.transportStreamId = 0x5A5;
    broadcast.programNumber = 0xE760;
    broadcast.pmtPid = 0x1F0;
    broadcast.pcrPid = 0x111;
    broadcast.descriptors = {0xC1, 1, 0x84};  // kept as raw bytes
    broadcast.streams = {
        {0x1B, 0x111, {0x52, 1, 0x00}},
        {0x11, 0x112, {0x52, 1, 0x10}},
        {0x06, 0x130, {0x52, 1, 0x30, 0xFD, 3, 0x00, 0x08, 0x3D}},
        {0x06, 0x138, {0x52, 1, 0x38}},  // superimposed text: not recorded
    };
    ProgramTableWriter writer;
    ASSERT_TRUE(writer.build(broadcast, {0x111, 0x112, 0x130}));
    std::vector<uint8_t> packets;
    writer.append(packets);
    writer.append(packets);  // a repetition advances the continuity counters
    ASSERT_EQ(packets.size(), 2 * writer.packetsPerRepetition() * 188);
    EXPECT_NE(packets[3] & 0x0F, packets[writer.packetsPerRepetition() * 188 + 3] & 0x0F);

    ProgramFinder finder(0x112);
    ProgramFinder other(0x222);  // a PID no programme carries
    for (size_t i = 0; i < packets.size(); i += 188) {
        finder.push(&packets[i]);
        other.push(&packets[i]);
    }
    ASSERT_TRUE(finder.program().has_value());
    const ProgramInfo& found = *finder.program();
    EXPECT_EQ(found.transportStreamId, 0x5A5);
    EXPECT_EQ(found.programNumber, 0xE760);
    EXPECT_EQ(found.pmtPid, 0x1F0);
    EXPECT_EQ(found.descriptors, broadcast.descriptors);
    ASSERT_EQ(found.streams.size(), 3u);
    for (size_t i = 0; i < 3; ++i)
        EXPECT_EQ(found.streams[i].descriptors, broadcast.streams[i].descriptors);
    ASSERT_NE(found.captionStream(), nullptr);
    EXPECT_EQ(found.captionStream()->pid, 0x130);
    EXPECT_TRUE(other.havePat());
    EXPECT_FALSE(other.program().has_value());
}

}  // namespace
}  // namespace TavoPlayer
