#include <gtest/gtest.h>

#include <array>
#include <cstdlib>

#include "extensions/live-push/PictureConverter.h"
#include "tests/contract/MediaWorld.h"

namespace lumacast::test {
namespace {

using extensions::PictureConverter;

/// Corners of four greys: top left 250, top right 180, bottom left 110, bottom right 40.
testing::PaintedPlane fourCorners(int width, int height) {
    testing::PaintedPlane plane(width, height, 1);
    plane.fill({0, 0, width / 2, height / 2}, 250);
    plane.fill({width / 2, 0, width - width / 2, height / 2}, 180);
    plane.fill({0, height / 2, width / 2, height - height / 2}, 110);
    plane.fill({width / 2, height / 2, width - width / 2, height - height / 2}, 40);
    return plane;
}

int lumaAt(const AVFrame& frame, int x, int y) {
    return frame.data[0][y * frame.linesize[0] + x];
}
/// The luma of a grey, limited range.
int luma(int grey) {
    return 16 + grey * 219 / 255;
}

using Corners = std::array<int, 4>;  // top left, top right, bottom left, bottom right

TEST(PictureConverter, TurnsThePictureUprightWhicheverWayItWasCaptured) {
    // Where the picture's corners are to be seen, for each EXIF orientation.
    const std::array<Corners, 8> wanted{Corners{250, 180, 110, 40}, {180, 250, 40, 110}, {40, 110, 180, 250},
                                        {110, 40, 250, 180},        {250, 110, 180, 40}, {110, 250, 40, 180},
                                        {40, 180, 110, 250},        {180, 40, 250, 110}};
    const auto plane = fourCorners(80, 40);
    for (std::uint32_t orientation = 1; orientation <= 8; ++orientation) {
        const auto size = PictureConverter::sizeWithin(80, 40, orientation, 1000, 1000);
        EXPECT_EQ(size.width, orientation < 5 ? 80 : 40);
        EXPECT_EQ(size.height, orientation < 5 ? 40 : 80);
        PictureConverter converter(size.width, size.height);
        const auto frame = converter.convert(plane, orientation);
        ASSERT_TRUE(frame);
        const Corners& corners = wanted[orientation - 1];
        const int right = size.width - 5, bottom = size.height - 5;
        EXPECT_NEAR(lumaAt(*frame, 5, 5), luma(corners[0]), 3) << orientation;
        EXPECT_NEAR(lumaAt(*frame, right, 5), luma(corners[1]), 3) << orientation;
        EXPECT_NEAR(lumaAt(*frame, 5, bottom), luma(corners[2]), 3) << orientation;
        EXPECT_NEAR(lumaAt(*frame, right, bottom), luma(corners[3]), 3) << orientation;
    }
}

TEST(PictureConverter, FitsTheStreamIntoItsLimitsAndKeepsItsShape) {
    const auto size = [](int width, int height, std::uint32_t orientation) {
        const auto fitted = PictureConverter::sizeWithin(width, height, orientation, 1920, 1080);
        return std::pair(fitted.width, fitted.height);
    };
    EXPECT_EQ(size(1920, 1080, 1), std::pair(1920, 1080));
    EXPECT_EQ(size(3840, 2160, 1), std::pair(1920, 1080));
    EXPECT_EQ(size(641, 361, 1), std::pair(640, 360));
    EXPECT_EQ(size(1080, 1920, 1), std::pair(608, 1080));
    EXPECT_EQ(size(1080, 1920, 6), std::pair(1920, 1080));
}

TEST(PictureConverter, APictureOfAnotherShapeStandsInTheMiddleOfBlack) {
    PictureConverter converter(80, 40);
    testing::PaintedPlane tall(40, 80, 1);
    tall.fill({0, 0, 40, 80}, 200);
    const auto frame = converter.convert(tall, 1);
    ASSERT_TRUE(frame);
    EXPECT_EQ(lumaAt(*frame, 5, 20), 16);
    EXPECT_EQ(lumaAt(*frame, 75, 20), 16);
    EXPECT_NEAR(lumaAt(*frame, 40, 20), luma(200), 3);
}

}  // namespace
}  // namespace lumacast::test
