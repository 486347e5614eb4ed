#include "session/FrameGeometry.h"

#include <gtest/gtest.h>

#include "tests/unit/session/SessionWorld.h"

namespace lumacast {
namespace {

TEST(FrameGeometry, EachOfTheEightFlagsHasItsTransform) {
    struct Row {
        double a, b, c, d;
    };
    constexpr double kZero = 6.123233995736766e-17;  // the cosine of a quarter turn
    const Row rows[8] = {
        {1, 0, 0, 1},          {1, 0, 0, -1},         {-1, 0, 0, 1},           {-1, 0, 0, -1},
        {kZero, 1, -1, kZero}, {kZero, 1, 1, -kZero}, {-kZero, -1, -1, kZero}, {-kZero, -1, 1, -kZero}};
    Log log;
    for (std::uint32_t flags = 0; flags < 8; ++flags) {
        const AffineTransform t = frameTransformFromFlags(log, flags);
        EXPECT_EQ(t, (AffineTransform{rows[flags].a, rows[flags].b, rows[flags].c, rows[flags].d, 0, 0})) << flags;
    }
}

TEST(FrameGeometry, HigherBitsCarryNoMeaning) {
    Log log;
    EXPECT_EQ(frameTransformFromFlags(log, 8), AffineTransform());
    EXPECT_EQ(frameTransformFromFlags(log, 0xFFFFFFF8 | 5), frameTransformFromFlags(log, 5));
}

TEST(FrameGeometry, EachOfTheEightFlagsHasItsOrientationAndAnyOtherValueIsUpright) {
    const std::uint32_t expected[8] = {1, 4, 2, 3, 8, 5, 7, 6};
    for (std::uint32_t flags = 0; flags < 8; ++flags) EXPECT_EQ(orientationFromFrameTransform(flags), expected[flags]);
    for (const std::uint32_t flags : {8u, 9u, 13u, 0xFFFFFFFFu}) EXPECT_EQ(orientationFromFrameTransform(flags), 1u);
}

TEST(FrameGeometry, EveryStepIsLoggedInItsOrder) {
    Log log;
    frameTransformFromFlags(log, 7);
    EXPECT_EQ(log.recentLines(), (std::vector<std::string>{"rotate clockwise", "flip x", "flip y"}));
    frameTransformFromFlags(log, 0);
    EXPECT_EQ(log.recentLines().size(), 3u);
}

class CaptureSizeCap : public SessionWorld {
protected:
    Size capped(Size size) {
        session_->setWindowSize(size);
        EXPECT_EQ(session_->originalWindowSize(), size);
        return session_->windowSize();
    }
};

TEST_F(CaptureSizeCap, NeitherLengthIsOver1920) {
    EXPECT_EQ(capped({2560, 1440}), (Size{1920, 1080}));
    EXPECT_EQ(capped({1080, 2400}), (Size{864, 1920}));
    EXPECT_EQ(capped({3840, 3840}), (Size{1920, 1920}));
    EXPECT_EQ(capped({1920, 1080}), (Size{1920, 1080}));
    EXPECT_EQ(capped({640.5, 360.25}), (Size{640.5, 360.25}));
}

TEST_F(CaptureSizeCap, TheHeightIsFittedFirstAndNothingIsRounded) {
    EXPECT_EQ(capped({1001, 1921}), (Size{1001 * (1920.0 / 1921), 1920}));
    const Size both = capped({5760, 3840});
    EXPECT_EQ(both.width, 1920);
    EXPECT_DOUBLE_EQ(both.height, 1280);
}

TEST_F(CaptureSizeCap, ANumberOrATextTurnsItOffToo) {
    const std::vector<std::pair<Value, bool>> values{{std::int64_t{1}, true}, {std::int64_t{0}, false}, {0.5, true},
                                                     {0.0, false},            {Value("yes"), true},     {Value("TRUE"), true},
                                                     {Value("1"), true},      {Value("0"), false},      {Value("no"), false},
                                                     {Value(""), false},      {Value("false"), false}};
    for (const auto& [value, isOn] : values) {
        fakes_.preferences.set(kPreferenceDomain, "LCFullResCapture", value);
        EXPECT_EQ(capped({2560, 1440}).width, isOn ? 2560 : 1920) << describe(value);
    }
}

TEST_F(CaptureSizeCap, ThePreferenceTurnsItOff) {
    const int questions = fakes_.deviceInfo.questions();
    fakes_.preferences.set(kPreferenceDomain, "LCFullResCapture", true);
    EXPECT_EQ(capped({2560, 1440}), (Size{2560, 1440}));
    EXPECT_EQ(logged("full res capture enabled"), 1u);
    EXPECT_EQ(fakes_.deviceInfo.questions(), questions) << "the device is not asked at all";
    fakes_.preferences.set(kPreferenceDomain, "LCFullResCapture", false);
    EXPECT_EQ(capped({2560, 1440}), (Size{1920, 1080}));
    EXPECT_EQ(logged("full res capture enabled"), 1u);
}

TEST_F(CaptureSizeCap, OneOldTabletIsCappedAt1600) {
    fakes_.deviceInfo.setUserInterfaceIdiom(1);
    fakes_.deviceInfo.setReducedCaptureChipID(0x8000);
    fakes_.deviceInfo.setChipID(0x8000);
    EXPECT_EQ(capped({2560, 1440}), (Size{1600, 900}));
}

TEST_F(CaptureSizeCap, OtherTabletsAndOtherDevicesWithThatChipAreNot) {
    fakes_.deviceInfo.setReducedCaptureChipID(0x8000);
    fakes_.deviceInfo.setChipID(0x8000);
    EXPECT_EQ(capped({2560, 1440}), (Size{1920, 1080})) << "no answer to the class";
    fakes_.deviceInfo.setUserInterfaceIdiom(2);
    EXPECT_EQ(capped({2560, 1440}), (Size{1920, 1080}));
    fakes_.deviceInfo.setUserInterfaceIdiom(1);
    fakes_.deviceInfo.setChipID(0x8001);
    session_ = makeSession();
    EXPECT_EQ(capped({2560, 1440}), (Size{1920, 1080}));
}

TEST_F(CaptureSizeCap, AnUnknownChipIsAskedForAgainAndAKnownOneIsKept) {
    fakes_.deviceInfo.setUserInterfaceIdiom(1);
    fakes_.deviceInfo.setReducedCaptureChipID(0x8000);
    EXPECT_EQ(capped({2560, 1440}), (Size{1920, 1080}));
    fakes_.deviceInfo.setChipID(0x8000);
    EXPECT_EQ(capped({2560, 1440}), (Size{1600, 900}));
    fakes_.deviceInfo.setChipID(0x9000);
    EXPECT_EQ(capped({2560, 1440}), (Size{1600, 900}));
}

}  // namespace
}  // namespace lumacast
