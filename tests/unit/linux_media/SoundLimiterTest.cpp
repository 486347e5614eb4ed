// A limiter in front of what two sound tracks add up to.

#include "linux/media/SoundLimiter.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>

namespace lumacast::testing {
namespace {

TEST(SoundLimiter, LeavesAloneWhatIsNotTooLoudAndKeepsItsLength) {
    media::SoundLimiter limiter(44100);
    media::StereoSound in, out;
    for (int i = 0; i < 10'000; ++i)
        for (auto& plane : in.planes) plane.push_back(static_cast<float>(i % 19 - 9) / 10);
    limiter.add(in, out);
    limiter.finish(out);
    EXPECT_EQ(out.planes, in.planes);
}

TEST(SoundLimiter, NeverLetsAPeakThroughAndNeverJumps) {
    media::SoundLimiter limiter(44100);
    media::StereoSound in, out;
    for (int i = 0; i < 30'000; ++i)
        for (auto& plane : in.planes) plane.push_back(i == 10'000 ? 3.0f : i > 20'000 && i < 20'010 ? -8.0f : 0.5f);
    limiter.add(in, out);
    limiter.finish(out);
    ASSERT_EQ(out.frames(), in.frames());
    float step = 0;
    for (std::size_t i = 1; i < out.frames(); ++i) {
        EXPECT_LE(std::abs(out.planes[0][i]), media::SoundLimiter::kCeiling + 1e-4f) << i;
        if (in.planes[0][i] == 0.5f && in.planes[0][i - 1] == 0.5f)
            step = std::max(step, std::abs(out.planes[0][i] - out.planes[0][i - 1]));
    }
    EXPECT_LT(step, 0.01f);
    EXPECT_NEAR(out.planes[0][9'000], 0.5f, 1e-6f);
}

}  // namespace
}  // namespace lumacast::testing
