// Where a tap's streams meet, without a server.

#include <gtest/gtest.h>

#include <array>

#include "linux/audio/TapMix.h"

namespace lumacast::sound {
namespace {

TEST(TapMix, TellsOfAStreamBeforeAnythingIsWrittenToIt) {
    TapMix mix(44100, 1, HostTime{0});
    int told = 0;
    bool wasQuiet = true;
    mix.whenStreamComes([&] {
        ++told;
        wasQuiet = mix.isQuiet();  // no lock is held
    });
    mix.skipTo(3 * 44100);
    ASSERT_TRUE(mix.isQuiet());
    const auto lane = mix.addLane();
    EXPECT_EQ(told, 1);
    EXPECT_FALSE(wasQuiet);
    mix.write(*lane, 3 * 44100, std::array<float, 10>{});
    mix.closeLane(lane);
    EXPECT_EQ(told, 1);
}

}  // namespace
}  // namespace lumacast::sound
