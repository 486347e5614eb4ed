#include "linux/display/DamageTracker.h"

#include <gtest/gtest.h>

namespace lumacast::x11 {
namespace {

const PixelRect kWhole{0, 0, 1920, 1080};

TEST(DamageTracker, StartsWithEveryPlaneOutOfDate) {
    const DamageTracker tracker(3, 1920, 1080);
    for (std::size_t plane = 0; plane < 3; ++plane) EXPECT_TRUE(tracker.ofPlane(plane).covers(kWhole));
    EXPECT_TRUE(tracker.sinceDelivery().covers(kWhole));
}

TEST(DamageTracker, BringsEachPlaneUpToDateFromItsOwnPicture) {
    DamageTracker tracker(2, 1920, 1080);
    tracker.planeIsCurrent(0);
    tracker.planeIsCurrent(1);
    tracker.delivered();
    tracker.add({0, 0, 200, 200});
    tracker.planeIsCurrent(0);
    tracker.delivered();
    tracker.add({1000, 800, 200, 200});

    EXPECT_TRUE(tracker.ofPlane(1).covers({0, 0, 200, 200})) << "plane 1 missed the first change";
    EXPECT_TRUE(tracker.ofPlane(1).covers({1000, 800, 200, 200}));
    EXPECT_FALSE(tracker.ofPlane(0).covers({0, 0, 1, 1})) << "plane 0 has the first change";
    EXPECT_TRUE(tracker.ofPlane(0).covers({1000, 800, 200, 200}));
    EXPECT_FALSE(tracker.sinceDelivery().covers({0, 0, 1, 1}));
    EXPECT_TRUE(tracker.sinceDelivery().covers({1000, 800, 200, 200}));
}

TEST(DamageTracker, CutsOffWhatLiesOutside) {
    DamageTracker tracker(1, 1920, 1080);
    tracker.planeIsCurrent(0);
    tracker.delivered();
    tracker.add({1900, 1000, 500, 500});
    ASSERT_EQ(tracker.ofPlane(0).rects().size(), 1u);
    EXPECT_EQ(tracker.ofPlane(0).rects()[0], (PixelRect{1900, 1000, 20, 80}));
    tracker.planeIsCurrent(0);
    tracker.add({-50, -50, 40, 40});
    EXPECT_TRUE(tracker.ofPlane(0).empty());
}

TEST(DamageTracker, ShowsEverythingToANewViewerWithoutReadingItAgain) {
    DamageTracker tracker(1, 1920, 1080);
    tracker.planeIsCurrent(0);
    tracker.delivered();
    tracker.nothingDelivered();
    EXPECT_TRUE(tracker.sinceDelivery().covers(kWhole));
    EXPECT_TRUE(tracker.ofPlane(0).empty());
}

}  // namespace
}  // namespace lumacast::x11
