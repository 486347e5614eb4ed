#include <gtest/gtest.h>

#include "extensions/live-push/PacketQueue.h"

namespace lumacast::test {
namespace {

using extensions::AvOwned;
using extensions::OutgoingPacket;
using extensions::PacketQueue;

enum class Kind { KeyFrame, Frame, Sound };

OutgoingPacket packet(Kind kind, std::int64_t time) {
    OutgoingPacket made{AvOwned<AVPacket>(av_packet_alloc()), kind != Kind::Sound};
    EXPECT_EQ(av_new_packet(made.packet.get(), 100), 0);
    made.packet->pts = time;
    if (kind == Kind::KeyFrame) made.packet->flags |= AV_PKT_FLAG_KEY;
    return made;
}

std::vector<std::int64_t> timesIn(PacketQueue& queue) {
    std::vector<std::int64_t> times;
    while (!queue.empty()) times.push_back(queue.pop().packet->pts);
    return times;
}

TEST(PacketQueue, BeginsWithAKeyFrame) {
    PacketQueue queue(1000);
    EXPECT_EQ(queue.push(packet(Kind::Sound, 1)), 0u);
    EXPECT_EQ(queue.push(packet(Kind::Frame, 2)), 1u);
    EXPECT_TRUE(queue.needsKeyFrame());
    EXPECT_EQ(queue.push(packet(Kind::KeyFrame, 3)), 0u);
    EXPECT_EQ(queue.push(packet(Kind::Sound, 4)), 0u);
    EXPECT_EQ(timesIn(queue), (std::vector<std::int64_t>{3, 4}));
}

TEST(PacketQueue, WhenTooMuchWaitsWhatIsBeforeTheLatestKeyFrameGoes) {
    PacketQueue queue(500);
    queue.push(packet(Kind::KeyFrame, 1));
    queue.push(packet(Kind::Frame, 2));
    queue.push(packet(Kind::Sound, 3));
    queue.push(packet(Kind::KeyFrame, 4));
    queue.push(packet(Kind::Frame, 5));
    EXPECT_EQ(queue.push(packet(Kind::Frame, 6)), 2u);
    EXPECT_FALSE(queue.needsKeyFrame());
    EXPECT_EQ(timesIn(queue), (std::vector<std::int64_t>{4, 5, 6}));
}

TEST(PacketQueue, WhenThatIsNotEnoughEverythingGoesUntilTheNextKeyFrame) {
    PacketQueue queue(300);
    queue.push(packet(Kind::KeyFrame, 1));
    for (std::int64_t time = 2; time <= 3; ++time) queue.push(packet(Kind::Frame, time));
    EXPECT_EQ(queue.push(packet(Kind::Frame, 4)), 4u);
    EXPECT_TRUE(queue.needsKeyFrame());
    EXPECT_EQ(queue.push(packet(Kind::Frame, 5)), 1u);
    EXPECT_EQ(queue.push(packet(Kind::KeyFrame, 6)), 0u);
    EXPECT_EQ(timesIn(queue), (std::vector<std::int64_t>{6}));
}

TEST(PacketQueue, ANewConnectionBeginsWithTheLatestKeyFrame) {
    PacketQueue queue(10'000);
    queue.push(packet(Kind::KeyFrame, 1));
    queue.push(packet(Kind::Frame, 2));
    queue.push(packet(Kind::KeyFrame, 3));
    queue.push(packet(Kind::Sound, 4));
    EXPECT_EQ(queue.keepFromLatestKeyFrame(), 2u);
    queue.pop();
    // The key frame was on its way when the connection went: what follows can't be shown without it.
    EXPECT_EQ(queue.keepFromLatestKeyFrame(), 0u);
    EXPECT_TRUE(queue.empty() && queue.needsKeyFrame());
}

}  // namespace
}  // namespace lumacast::test
