#include "platform/dtv/PacketQueue.h"

#include <gtest/gtest.h>

#include <array>
#include <vector>

namespace TavoPlayer {
namespace {

std::array<uint8_t, 188> packet(uint8_t tag) {
    std::array<uint8_t, 188> p{};
    p[0] = 0x47;
    p[1] = tag;
    p[187] = tag;
    return p;
}

std::vector<uint8_t> popTags(PacketQueue& queue, size_t max) {
    std::vector<uint8_t> buffer(max * 188);
    const size_t n = queue.pop(buffer.data(), max);
    std::vector<uint8_t> tags;
    for (size_t i = 0; i < n; ++i) {
        EXPECT_EQ(buffer[i * 188 + 1], buffer[i * 188 + 187]) << "packet torn at " << i;
        tags.push_back(buffer[i * 188 + 1]);
    }
    return tags;
}

TEST(PacketQueueTest, KeepsOrderAcrossTheWrapOfItsStorage) {
    PacketQueue queue(4);
    for (uint8_t t = 1; t <= 3; ++t)
        queue.push(packet(t).data());
    EXPECT_EQ(popTags(queue, 2), (std::vector<uint8_t>{1, 2}));
    // The next three wrap past the end of the four slots.
    for (uint8_t t = 4; t <= 6; ++t)
        queue.push(packet(t).data());
    EXPECT_EQ(popTags(queue, 10), (std::vector<uint8_t>{3, 4, 5, 6}));
    EXPECT_TRUE(queue.empty());
    EXPECT_EQ(queue.dropped(), 0u);
}

TEST(PacketQueueTest, FullQueueDropsItsOldestAndCountsThem) {
    PacketQueue queue(3);
    for (uint8_t t = 1; t <= 7; ++t)
        queue.push(packet(t).data());
    EXPECT_TRUE(queue.full());
    EXPECT_EQ(queue.dropped(), 4u);
    EXPECT_EQ(queue.pushed(), 7u);
    EXPECT_EQ(popTags(queue, 10), (std::vector<uint8_t>{5, 6, 7}));
}

TEST(PacketQueueTest, PopOfNothingAndClear) {
    PacketQueue queue(2);
    std::vector<uint8_t> buffer(188);
    EXPECT_EQ(queue.pop(buffer.data(), 1), 0u);
    queue.push(packet(9).data());
    queue.clear();
    EXPECT_EQ(queue.pop(buffer.data(), 1), 0u);
    queue.push(packet(8).data());
    EXPECT_EQ(popTags(queue, 1), (std::vector<uint8_t>{8}));
}

}  // namespace
}  // namespace TavoPlayer
