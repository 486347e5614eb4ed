#include "linux/media/PlaneConverter.h"

#include <gtest/gtest.h>

#include <cstring>
#include <random>

#include "tests/contract/MediaWorld.h"

namespace lumacast::testing {
namespace {

using media::I420Picture;
using media::PlaneConverter;

void paintNoise(PaintedPlane& plane, PixelRect rect, unsigned seed) {
    std::mt19937 random(seed);
    for (int y = rect.y; y < rect.y + rect.height; ++y) {
        for (int x = rect.x; x < rect.x + rect.width; ++x) {
            const auto value = random();
            plane.setPixel(x, y, static_cast<std::uint8_t>(value), static_cast<std::uint8_t>(value >> 8),
                           static_cast<std::uint8_t>(value >> 16));
        }
    }
}

bool equal(const I420Picture& a, const I420Picture& b) {
    for (int row = 0; row < a.height(); ++row) {
        const auto luma = static_cast<std::size_t>(row * a.lumaStride());
        if (std::memcmp(a.y() + luma, b.y() + luma, static_cast<std::size_t>(a.width())) != 0) return false;
        const auto chroma = static_cast<std::size_t>(row / 2 * a.chromaStride());
        const auto width = static_cast<std::size_t>(a.width() / 2);
        if (std::memcmp(a.u() + chroma, b.u() + chroma, width) != 0) return false;
        if (std::memcmp(a.v() + chroma, b.v() + chroma, width) != 0) return false;
    }
    return true;
}

TEST(PlaneConverter, IsLimitedRangeBt601) {
    PlaneConverter converter(16, 16);
    PaintedPlane plane(16, 16, 1);
    for (int y = 0; y < 16; ++y) {
        for (int x = 0; x < 16; ++x) plane.setPixel(x, y, 255, 0, 0);
    }
    const auto red = converter.convert(plane);
    EXPECT_NEAR(red->y()[0], 82, 1);  // 16 + 65.481
    EXPECT_NEAR(red->u()[0], 90, 1);  // 128 - 37.797
    EXPECT_NEAR(red->v()[0], 240, 1);
    PaintedPlane white(16, 16, 3);
    white.fill({0, 0, 16, 16}, 255);
    EXPECT_NEAR(converter.convert(white)->y()[0], 235, 1);
}

TEST(PlaneConverter, OfDamageAloneGivesWhatTheWholePlaneGives) {
    for (const auto& [width, height] : {std::pair{320, 240}, {321, 241}}) {
        PlaneConverter partial(width + width % 2, height + height % 2);
        PaintedPlane first(width, height, 1);
        paintNoise(first, {0, 0, width, height}, 1);
        partial.convert(first);
        std::mt19937 random(5);
        PaintedPlane plane = first;
        for (std::uint64_t number = 2; number < 60; ++number) {
            std::vector<PixelRect> damage;
            PaintedPlane next(width, height, number);
            std::memcpy(const_cast<std::uint8_t*>(next.pixels().data()), plane.pixels().data(), plane.pixels().size());
            for (unsigned i = 0; i < random() % 4; ++i) {
                const int x = static_cast<int>(random() % static_cast<unsigned>(width));
                const int y = static_cast<int>(random() % static_cast<unsigned>(height));
                const PixelRect rect{x, y, 1 + static_cast<int>(random() % static_cast<unsigned>(width - x)),
                                     1 + static_cast<int>(random() % static_cast<unsigned>(height - y))};
                paintNoise(next, rect, static_cast<unsigned>(number) * 10 + i);
                damage.push_back(rect);
            }
            next.setDamage(damage);
            PlaneConverter whole(width + width % 2, height + height % 2);
            ASSERT_TRUE(equal(*partial.convert(next), *whole.convert(next))) << number;
            plane = next;
        }
    }
}

TEST(PlaneConverter, TouchesOnlyTheDamage) {
    PlaneConverter converter(320, 240);
    converter.convert(PaintedPlane(320, 240, 1));
    ASSERT_EQ(converter.convertedPixels(), 320u * 240u);
    PaintedPlane second(320, 240, 2);
    second.setDamage({{10, 10, 20, 20}});
    converter.convert(second);
    EXPECT_EQ(converter.convertedPixels(), 320u * 240u + 20u * 20u);
    PaintedPlane third(320, 240, 3);
    third.setDamage({});
    converter.convert(third);
    EXPECT_EQ(converter.convertedPixels(), 320u * 240u + 20u * 20u);
}

TEST(PlaneConverter, TakesTheWholePlaneWhenOneWasMissed) {
    PlaneConverter converter(64, 64);
    converter.convert(PaintedPlane(64, 64, 1));
    PaintedPlane third(64, 64, 3);
    third.fill({0, 0, 64, 64}, 200);
    third.setDamage({{0, 0, 2, 2}});
    EXPECT_NEAR(converter.convert(third)->y()[40 * 64 + 40], 188, 1);
    PaintedPlane again(64, 64, 3);  // the same number once more is no successor either
    again.setDamage({});
    EXPECT_NEAR(converter.convert(again)->y()[40 * 64 + 40], 16, 1);
}

TEST(PlaneConverter, TakesTheWholePlaneWhenItsSizeChanged) {
    PlaneConverter converter(64, 64);
    converter.convert(PaintedPlane(64, 64, 1));
    PaintedPlane wide(128, 32, 2);
    wide.fill({0, 0, 128, 32}, 200);
    wide.setDamage({});
    EXPECT_NEAR(converter.convert(wide)->y()[63 * 64 + 63], 188, 1);
    PaintedPlane back(64, 64, 3);
    back.setDamage({});
    EXPECT_NEAR(converter.convert(back)->y()[63 * 64 + 63], 16, 1);
}

TEST(PlaneConverter, ExtendsAPlaneThatIsAPixelShort) {
    PlaneConverter converter(64, 64);
    PaintedPlane plane(63, 63, 1);
    plane.fill({0, 0, 63, 63}, 255);
    plane.fill({62, 0, 1, 63}, 100);
    plane.fill({0, 62, 63, 1}, 100);
    const auto picture = converter.convert(plane);
    EXPECT_NEAR(picture->y()[61], 235, 1) << "not blurred";
    EXPECT_EQ(picture->y()[62], picture->y()[63]);
    EXPECT_EQ(picture->y()[62 * 64 + 10], picture->y()[63 * 64 + 10]);
    EXPECT_NEAR(picture->y()[63], 102, 1);
}

TEST(PlaneConverter, SurvivesDamageOutsideThePlane) {
    PlaneConverter converter(64, 64);
    converter.convert(PaintedPlane(64, 64, 1));
    PaintedPlane plane(64, 64, 2);
    plane.setDamage({{-10, -10, 20, 20}, {60, 60, 100, 100}, {100, 100, 5, 5}, {5, 5, -3, 4}, {0, 0, 0, 0},
                     {2147483647, 0, 2147483647, 10}, {-2147483647, 0, 2147483647, 10}});
    EXPECT_TRUE(converter.convert(plane));
}

}  // namespace
}  // namespace lumacast::testing
