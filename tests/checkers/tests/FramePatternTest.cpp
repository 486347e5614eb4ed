#include "examples/scene/FramePattern.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <random>

#include "examples/scene/Scene.h"
#include "tests/checkers/Luma.h"
#include "tests/checkers/tests/MovieMaker.h"

namespace lumacast::checkers {
namespace {

using scene::Motion;
using scene::Rect;

std::optional<std::uint32_t> read(const LumaPlane& plane) {
    return frameNumberIn(plane.view());
}

// The mean of 2 x 2 samples each.
LumaPlane halved(const LumaPlane& plane) {
    LumaPlane half{plane.width / 2, plane.height / 2, {}};
    for (int y = 0; y < half.height; ++y) {
        for (int x = 0; x < half.width; ++x) {
            const auto at = [&](int dx, int dy) {
                return plane.samples[static_cast<std::size_t>((2 * y + dy) * plane.width + 2 * x + dx)];
            };
            half.samples.push_back(static_cast<std::uint8_t>((at(0, 0) + at(1, 0) + at(0, 1) + at(1, 1) + 2) / 4));
        }
    }
    return half;
}

TEST(FramePattern, IsReadBackAtEverySizeAndAtHalfOfIt) {
    for (const auto& [width, height] :
         {std::pair{160, 90}, {161, 91}, {390, 844}, {640, 360}, {1366, 768}, {1920, 1080}}) {
        for (const std::uint32_t number : {0U, 1U, 255U, 256U, 65535U, 0xABCDEFU, 0xFFFFFFU}) {
            const LumaPlane plane = sceneLuma(width, height, number);
            EXPECT_EQ(read(plane), number) << width << "x" << height;
            EXPECT_EQ(read(halved(plane)), number) << "half of " << width << "x" << height;
        }
    }
}

TEST(FramePattern, EveryNumberOfAThousandIsReadBackAsItself) {
    for (std::uint32_t number = 0; number < 1000; ++number)
        EXPECT_EQ(read(sceneLuma(160, 90, number * 16769)), (number * 16769) & 0xFFFFFF);
}

TEST(FramePattern, TheChecksumIsTheOneThatIsDescribed) {
    // CRC-8 with polynomial 0x07 and initial value 0xFF, worked out apart from this code.
    EXPECT_EQ(scene::frameNumberChecksum(0x000000), 0x2B);
    EXPECT_EQ(scene::frameNumberChecksum(0x313233), 0xEB);
}

TEST(FramePattern, AnySingleCellTurnedOverIsRefused) {
    const LumaPlane good = sceneLuma(320, 180, 0x00BEEF);
    const Rect area = scene::framePatternArea(320, 180);
    const double cellWidth = 320 / 19.0, cellHeight = 36 / 3.0;
    for (int row = 0; row < 2; ++row) {
        for (int column = 0; column < 18; ++column) {
            LumaPlane bad = good;
            for (int y = 0; y < 12; ++y) {
                for (int x = 0; x < 17; ++x) {
                    const int left = static_cast<int>((column + 0.5) * cellWidth);
                    const int top = area.y + static_cast<int>((row + 0.5) * cellHeight);
                    auto& sample = bad.samples[static_cast<std::size_t>((top + y) * 320 + std::min(319, left + x))];
                    sample = static_cast<std::uint8_t>(251 - sample);
                }
            }
            EXPECT_FALSE(read(bad)) << "row " << row << " column " << column;
        }
    }
}

TEST(FramePattern, APatternWithoutItsQuietFrameIsRefused) {
    LumaPlane plane = sceneLuma(320, 180, 4711);
    std::fill(plane.samples.begin() + 175 * 320, plane.samples.end(), static_cast<std::uint8_t>(200));
    EXPECT_FALSE(read(plane));
}

TEST(FramePattern, TwoPicturesMixedAreRefused) {
    for (std::uint32_t number = 0; number < 200; ++number) {
        LumaPlane mixed = sceneLuma(160, 90, number);
        const LumaPlane next = sceneLuma(160, 90, number + 1);
        for (std::size_t place = 0; place < mixed.samples.size(); ++place)
            mixed.samples[place] = static_cast<std::uint8_t>((mixed.samples[place] + next.samples[place]) / 2);
        EXPECT_FALSE(read(mixed)) << number;
    }
}

TEST(FramePattern, APictureTornBetweenTheRowsIsRefused) {
    for (std::uint32_t number = 255; number < 256 * 200; number += 256) {
        LumaPlane torn = sceneLuma(160, 90, number);
        const LumaPlane next = sceneLuma(160, 90, number + 1);
        const auto tear = static_cast<std::ptrdiff_t>(scene::framePatternLowerRow(160, 90).y) * 160;
        std::copy(next.samples.begin() + tear, next.samples.end(), torn.samples.begin() + tear);
        EXPECT_FALSE(read(torn)) << number;
    }
}

TEST(FramePattern, PicturesWithoutAPatternAreRefused) {
    EXPECT_FALSE(read({320, 180, std::vector<std::uint8_t>(320 * 180, 16)}));
    EXPECT_FALSE(read({320, 180, std::vector<std::uint8_t>(320 * 180, 235)}));
    EXPECT_FALSE(scene::readFrameNumber(nullptr, 320, 180, 320));
    EXPECT_FALSE(read({8, 8, std::vector<std::uint8_t>(64, 0)}));
    std::mt19937 random(7);
    int accepted = 0;
    for (int turn = 0; turn < 2000; ++turn) {
        // Blocks as large as cells, so that only references, frame and checksum stand against them.
        LumaPlane noise{190, 150, std::vector<std::uint8_t>(190 * 150, 16)};
        for (int block = 0; block < 36; ++block) {
            const std::uint8_t value = (random() & 1) != 0 ? 235 : 16;
            for (int y = 0; y < 10; ++y)
                std::fill_n(noise.samples.begin() + (125 + block / 18 * 10 + y) * 190 + 5 + block % 18 * 10, 10, value);
        }
        accepted += read(noise).has_value();
    }
    // One in 16 passes the references by chance, one in 256 of those the checksum.
    EXPECT_LE(accepted, 2);
}

TEST(FramePattern, AnUpsideDownOrTurnedPictureIsReadOnlyWhenItsTurnIsKnown) {
    const LumaPlane upright = sceneLuma(320, 180, 4711);
    for (int turns = 1; turns < 4; ++turns) {
        const LumaPlane plane = turned(upright.view(), turns);
        EXPECT_FALSE(frameNumberIn(plane.view())) << turns;
        EXPECT_EQ(frameNumberIn(plane.view(), turns), 4711U) << turns;
    }
    const LumaPlane clockwise = turned(LumaPlane{2, 1, {1, 2}}.view(), 1);
    EXPECT_EQ(clockwise.width, 1);
    EXPECT_EQ(clockwise.samples, (std::vector<std::uint8_t>{1, 2}));
    EXPECT_EQ(turned(LumaPlane{1, 2, {1, 2}}.view(), 1).samples, (std::vector<std::uint8_t>{2, 1}));
}

class SceneDrawing : public ::testing::Test {
protected:
    static constexpr int kWidth = 320, kHeight = 180;
    std::vector<std::uint32_t> draw(scene::Scene& scene, std::vector<std::uint32_t>& buffer, std::uint32_t number) {
        changed_ = scene.draw({reinterpret_cast<std::uint8_t*>(buffer.data()), kWidth, kHeight, kWidth * 4}, number,
                              {1, 2, 3, 4});
        return buffer;
    }
    [[nodiscard]] bool inChanged(int x, int y) const {
        return std::any_of(changed_.begin(), changed_.end(), [&](const Rect& rect) {
            return x >= rect.x && y >= rect.y && x < rect.x + rect.width && y < rect.y + rect.height;
        });
    }
    std::vector<Rect> changed_;
};

TEST_F(SceneDrawing, MovingEverywhereChangesMostPixelsFromFrameToFrame) {
    scene::Scene scene(kWidth, kHeight, Motion::Everywhere);
    std::vector<std::uint32_t> buffer(kWidth * kHeight);
    const auto before = draw(scene, buffer, 1), after = draw(scene, buffer, 2);
    EXPECT_EQ(changed_, (std::vector<Rect>{{0, 0, kWidth, kHeight}}));
    const int upper = kWidth * kHeight / 2;
    int different = 0;
    for (int place = 0; place < upper; ++place)
        different += before[static_cast<std::size_t>(place)] != after[static_cast<std::size_t>(place)];
    EXPECT_GT(different, upper / 2);
}

TEST_F(SceneDrawing, MovingInASmallPartChangesOnlyTheRectanglesItNames) {
    scene::Scene scene(kWidth, kHeight, Motion::SmallPart);
    std::vector<std::uint32_t> buffer(kWidth * kHeight);
    auto before = draw(scene, buffer, 250);
    for (std::uint32_t number = 251; number < 260; ++number) {
        const auto after = draw(scene, buffer, number);
        int area = 0, outside = 0;
        for (int y = 0; y < kHeight; ++y) {
            for (int x = 0; x < kWidth; ++x) {
                const auto place = static_cast<std::size_t>(y * kWidth + x);
                area += inChanged(x, y);
                outside += before[place] != after[place] && !inChanged(x, y);
            }
        }
        EXPECT_EQ(outside, 0) << number;
        EXPECT_LT(area, kWidth * kHeight / 3) << number;
        EXPECT_NE(before, after);
        before = after;
    }
}

TEST_F(SceneDrawing, IsTheSameForTheSameNumberAndTime) {
    scene::Scene one(kWidth, kHeight, Motion::Everywhere), other(kWidth, kHeight, Motion::Everywhere);
    std::vector<std::uint32_t> buffer(kWidth * kHeight), second(kWidth * kHeight);
    draw(one, buffer, 5);
    EXPECT_EQ(draw(one, buffer, 77), draw(other, second, 77));
}

TEST_F(SceneDrawing, StaysWithinThePictureAtOddSizes) {
    // A guard row after the picture and a guard column beside it; the sanitizers see the rest.
    for (const auto& [width, height] : {std::pair{160, 90}, {163, 1000}, {1000, 91}, {333, 777}}) {
        const auto stride = static_cast<std::size_t>(width + 1);
        std::vector<std::uint32_t> buffer(stride * static_cast<std::size_t>(height + 1), 0xDEADBEEF);
        scene::Scene scene(width, height, Motion::Everywhere);
        for (std::uint32_t number = 0; number < 300; number += 7)
            scene.draw({reinterpret_cast<std::uint8_t*>(buffer.data()), width, height, stride * 4}, number,
                       {23, 59, 59, 999});
        for (int y = 0; y <= height; ++y)
            EXPECT_EQ(buffer[static_cast<std::size_t>(y) * stride + static_cast<std::size_t>(width)], 0xDEADBEEF);
        for (std::size_t x = 0; x < stride; ++x)
            EXPECT_EQ(buffer[static_cast<std::size_t>(height) * stride + x], 0xDEADBEEF);
    }
}

}  // namespace
}  // namespace lumacast::checkers
