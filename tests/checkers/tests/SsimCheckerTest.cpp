#include "tests/checkers/SsimChecker.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <optional>
#include <random>

#include "tests/checkers/MovieReader.h"
#include "tests/checkers/tests/MovieMaker.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::checkers {
namespace {

TEST(Ssim, OfAPictureWithItselfIsOne) {
    const LumaPlane picture = sceneLuma(320, 180, 5);
    EXPECT_DOUBLE_EQ(meanSsim(picture.view(), picture.view()).value(), 1.0);
}

TEST(Ssim, IsTheFormulaForFlatPictures) {
    const LumaPlane dark{16, 16, std::vector<std::uint8_t>(256, 50)},
        light{16, 16, std::vector<std::uint8_t>(256, 100)};
    const double constant = 0.01 * 255 * 0.01 * 255;
    EXPECT_NEAR(meanSsim(dark.view(), light.view()).value(),
                (2 * 50 * 100 + constant) / (50 * 50 + 100 * 100 + constant), 1e-12);
}

TEST(Ssim, FallsWithNoiseAndIsNearZeroForUnrelatedPictures) {
    const LumaPlane picture = sceneLuma(320, 180, 5);
    std::mt19937 random(3);
    const auto noisy = [&](int amount) {
        LumaPlane copy = picture;
        for (auto& sample : copy.samples)
            sample = static_cast<std::uint8_t>(
                std::clamp(sample + static_cast<int>(random() % (2 * amount + 1)) - amount, 0, 255));
        return meanSsim(picture.view(), copy.view()).value();
    };
    const double little = noisy(3), much = noisy(40);
    EXPECT_GT(little, 0.85);
    EXPECT_LT(much, little - 0.2);
    LumaPlane one{64, 64, {}}, other{64, 64, {}};
    for (int place = 0; place < 64 * 64; ++place) {
        one.samples.push_back(static_cast<std::uint8_t>(random()));
        other.samples.push_back(static_cast<std::uint8_t>(random()));
    }
    EXPECT_NEAR(meanSsim(one.view(), other.view()).value(), 0, 0.05);
}

TEST(Ssim, OfOtherSizesIsNone) {
    const LumaPlane picture = sceneLuma(320, 180, 5), smaller = sceneLuma(318, 180, 5);
    EXPECT_FALSE(meanSsim(picture.view(), smaller.view()));
    EXPECT_FALSE(meanSsim({picture.samples.data(), 4, 4, 320}, {picture.samples.data(), 4, 4, 320}));
}

TEST(Ssim, TellsTheRightFrameOfAMovieFromItsNeighbour) {
    const ScratchDirectory folder;
    MoviePlan plan;
    plan.pictures = steadyPictures(100, 10, 30);
    plan.halfSize = false;
    plan.bitRate = 3'000'000;
    const std::string path = folder.path("movie.mp4");
    ASSERT_EQ(makeMovie(plan, path), "");
    MovieReader reader(path);
    std::uint32_t number = 100;
    ASSERT_TRUE(reader.readPictures([&](const DecodedPicture& picture) {
        const double right = meanSsim(picture.luma, sceneLuma(320, 180, number).view()).value();
        const double wrong = meanSsim(picture.luma, sceneLuma(320, 180, number + 1).view()).value();
        EXPECT_GT(right, 0.9) << number;
        EXPECT_LT(wrong, right - 0.1) << number;
        ++number;
    })) << reader.error();
    EXPECT_EQ(number, 110U);
}

}  // namespace
}  // namespace lumacast::checkers
