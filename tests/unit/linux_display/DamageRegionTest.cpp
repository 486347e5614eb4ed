#include "linux/display/DamageRegion.h"

#include <gtest/gtest.h>

#include <random>
#include <vector>

namespace lumacast::x11 {
namespace {

constexpr int kSide = 96;

// The pixels of a small world, for comparing with the obvious way of keeping a region.
class Bitmap {
public:
    void add(const PixelRect& rect) {
        for (int y = rect.y; y < rect.y + rect.height; ++y)
            for (int x = rect.x; x < rect.x + rect.width; ++x) at(x, y) = true;
    }
    bool covers(const PixelRect& rect) {
        for (int y = rect.y; y < rect.y + rect.height; ++y)
            for (int x = rect.x; x < rect.x + rect.width; ++x)
                if (!at(x, y)) return false;
        return true;
    }

private:
    std::vector<bool>::reference at(int x, int y) { return bits_[static_cast<std::size_t>(y * kSide + x)]; }
    std::vector<bool> bits_ = std::vector<bool>(kSide * kSide);
};

PixelRect randomRect(std::mt19937& random, int largest) {
    std::uniform_int_distribution<int> size(1, largest);
    const int width = size(random), height = size(random);
    return {std::uniform_int_distribution<int>(0, kSide - width)(random),
            std::uniform_int_distribution<int>(0, kSide - height)(random), width, height};
}

TEST(DamageRegion, IsEmptyAtFirstAndAfterEmptyRectangles) {
    DamageRegion region;
    EXPECT_TRUE(region.empty());
    region.add(PixelRect{5, 5, 0, 10});
    region.add(PixelRect{5, 5, 10, -1});
    EXPECT_TRUE(region.empty());
}

TEST(DamageRegion, KeepsFarRectanglesApart) {
    DamageRegion region;
    region.add(PixelRect{0, 0, 10, 10});
    region.add(PixelRect{1500, 900, 10, 10});
    ASSERT_EQ(region.rects().size(), 2u);
    EXPECT_FALSE(region.covers({500, 500, 1, 1}));
}

TEST(DamageRegion, MergesWhatIsCheapToReadTogether) {
    DamageRegion region;
    region.add(PixelRect{0, 0, 100, 10});
    region.add(PixelRect{0, 12, 100, 10});
    ASSERT_EQ(region.rects().size(), 1u);
    EXPECT_EQ(region.rects()[0], (PixelRect{0, 0, 100, 22}));
}

TEST(DamageRegion, StaysSmallHoweverMuchIsAdded) {
    DamageRegion region;
    for (int i = 0; i < 200; ++i) region.add(PixelRect{(i * 977) % 4000, (i * 1531) % 4000, 3, 3});
    EXPECT_LE(region.rects().size(), DamageRegion::kMaximumRects);
    for (int i = 0; i < 200; ++i) EXPECT_TRUE(region.covers({(i * 977) % 4000, (i * 1531) % 4000, 3, 3})) << i;
}

TEST(DamageRegion, NeverLosesAPixel) {
    std::mt19937 random(7);
    for (int round = 0; round < 200; ++round) {
        DamageRegion region;
        std::vector<PixelRect> added;
        for (int i = 0; i < 30; ++i) {
            added.push_back(randomRect(random, 30));
            region.add(added.back());
        }
        for (const PixelRect& rect : added) ASSERT_TRUE(region.covers(rect));
    }
}

TEST(DamageRegion, AnswersCoverageToThePixel) {
    std::mt19937 random(11);
    int yes = 0, no = 0;
    for (int round = 0; round < 3000; ++round) {
        DamageRegion region;
        for (int i = 0; i < 6; ++i) region.add(randomRect(random, 60));
        Bitmap bitmap;
        for (const PixelRect& rect : region.rects()) bitmap.add(rect);
        const PixelRect asked = randomRect(random, 60);
        const bool covered = bitmap.covers(asked);
        ++(covered ? yes : no);
        ASSERT_EQ(region.covers(asked), covered);
    }
    EXPECT_GT(yes, 100);
    EXPECT_GT(no, 100);
}

TEST(DamageRegion, TakesAWholeRegion) {
    DamageRegion a, b;
    a.add(PixelRect{0, 0, 200, 200});
    b.add(PixelRect{1000, 1000, 200, 200});
    a.add(b);
    EXPECT_TRUE(a.covers({0, 0, 200, 200}));
    EXPECT_TRUE(a.covers({1000, 1000, 200, 200}));
    a.add(a);
    EXPECT_EQ(a.rects().size(), 2u);
}

}  // namespace
}  // namespace lumacast::x11
