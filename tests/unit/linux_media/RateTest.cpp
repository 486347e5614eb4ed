// The bits that the software encoder of this build spends, by seconds of media time.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <functional>
#include <numeric>
#include <random>

#include "linux/media/VideoEncoder.h"
#include "linux/media/openh264/RateCeiling.h"

namespace lumacast::testing {
namespace {

using media::I420Picture;
using media::KeyFrame;
using media::RateCeiling;
using ::testing::Each;
using ::testing::Le;

constexpr std::int64_t kTicks = media::VideoEncoder::kTimescale;
constexpr std::int64_t kRate = 1'000'000;
constexpr int kWidth = 640, kHeight = 480;

void paintRandomly(I420Picture& picture, int number) {
    std::mt19937 random(static_cast<unsigned>(number));
    std::generate_n(picture.y(), picture.lumaStride() * kHeight, [&] { return static_cast<std::uint8_t>(random()); });
}

/// Lines of marks as small as letters; a step further with each number.
void paintScrolledPage(I420Picture& picture, int number) {
    for (int y = 0; y < kHeight; ++y) {
        const int line = (y + 2 * number) / 18, within = (y + 2 * number) % 18;
        std::minstd_rand random(static_cast<unsigned>(line * 7919 + 1));
        std::uint8_t* const row = picture.y() + y * picture.lumaStride();
        for (int x = 0; x < kWidth; x += 5) {
            const bool hasInk = (random() >> (within / 2)) % 4 == 0 && within > 3;
            std::memset(row + x, hasInk ? 40 : 230, 5);
        }
    }
}

struct Coded {
    std::int64_t stamp = 0;
    double bits = 0;
    bool isKeyFrame = false;
};

/// Encodes `seconds` of pictures; `interval` gives the ticks from each to the next.
std::vector<Coded> code(int seconds, const std::function<void(I420Picture&, int)>& paint,
                        const std::function<std::int64_t()>& interval, int& appended) {
    media::EncoderChoice choice;
    choice.useSoftware();
    media::VideoTrackSettings settings;
    settings.width = kWidth;
    settings.height = kHeight;
    settings.bitRate = kRate;
    auto opened = media::VideoEncoder::open(settings, choice);
    if (!std::get_if<0>(&opened)) return {};
    media::VideoEncoder& encoder = *std::get<0>(opened);
    media::KeyFrameClock keys;
    std::vector<Coded> coded;
    appended = 0;
    for (std::int64_t stamp = 0; stamp < seconds * kTicks; stamp += interval(), ++appended) {
        const auto picture = std::make_shared<I420Picture>(kWidth, kHeight);
        std::memset(picture->y(), 128, picture->byteCount());
        paint(*picture, appended);
        const auto failed = encoder.encode(picture, stamp, keys.next(stamp), [&](const media::EncodedPicture& made) {
            if (made.isKeyFrame) keys.sawKeyFrame(made.stamp);
            coded.push_back({made.stamp, 8.0 * static_cast<double>(made.bytes.size()), made.isKeyFrame});
        });
        EXPECT_FALSE(failed) << appended;
    }
    return coded;
}

/// Per second, in parts of the rate.
std::vector<double> bySeconds(const std::vector<Coded>& coded, std::size_t seconds) {
    std::vector<double> sums(seconds, 0);
    for (const Coded& picture : coded)
        sums[static_cast<std::size_t>(picture.stamp / kTicks)] += picture.bits / static_cast<double>(kRate);
    return sums;
}

TEST(Rate, OfNoiseIsACeilingAfterTheFirstSecond) {
    int appended = 0;
    const auto coded = code(
        6, paintRandomly, [] { return kTicks / 60; }, appended);
    auto seconds = bySeconds(coded, 6);
    EXPECT_LT(seconds[0], 3.5) << "what may be spent ahead, and the picture that goes beyond it";
    seconds.erase(seconds.begin());
    EXPECT_THAT(seconds, Each(Le(2.0)));
    EXPECT_LT(std::accumulate(seconds.begin(), seconds.end(), 0.0) / 5, 1.2);
    EXPECT_GE(std::count_if(coded.begin(), coded.end(), [](const Coded& picture) { return picture.isKeyFrame; }), 6)
        << "key frames are not left out";
}

TEST(Rate, OfAPageThatScrollsAtIrregularTimesIsUsedAndNotExceeded) {
    std::mt19937 random(5);
    int appended = 0;
    const auto coded = code(
        6, paintScrolledPage, [&] { return static_cast<std::int64_t>(1000 + random() % 90'000); }, appended);
    EXPECT_EQ(coded.size(), static_cast<std::size_t>(appended)) << "no picture of a page is left out";
    auto seconds = bySeconds(coded, 6);
    std::string text;
    for (const double second : seconds) text += std::to_string(second) + " ";
    EXPECT_LT(seconds[0], 2.2);
    seconds.erase(seconds.begin());
    EXPECT_THAT(seconds, Each(Le(1.2)));
    EXPECT_GT(std::accumulate(seconds.begin(), seconds.end(), 0.0) / 5, 0.6)
        << "rare pictures get the bits of the time that they stand for: " << text;
}

TEST(Ceiling, LetsASecondsWorthBeSpentAhead) {
    RateCeiling ceiling(8'000);  // a thousand bytes
    ASSERT_TRUE(ceiling.hasRoom(0));
    ceiling.spend(999);
    ASSERT_TRUE(ceiling.hasRoom(0));
    ceiling.spend(1);
    EXPECT_FALSE(ceiling.hasRoom(0));
}

TEST(Ceiling, HasRoomAgainAsTimeGoesBy) {
    RateCeiling ceiling(8'000);
    ASSERT_TRUE(ceiling.hasRoom(0));
    ceiling.spend(3'000);
    EXPECT_FALSE(ceiling.hasRoom(kTicks));
    EXPECT_FALSE(ceiling.hasRoom(2 * kTicks));
    EXPECT_TRUE(ceiling.hasRoom(2 * kTicks + kTicks / 100));
}

TEST(Ceiling, SavesNothingWhileNothingIsSpent) {
    RateCeiling ceiling(8'000);
    ASSERT_TRUE(ceiling.hasRoom(100 * kTicks));
    ceiling.spend(1'000);
    EXPECT_FALSE(ceiling.hasRoom(100 * kTicks));
}

}  // namespace
}  // namespace lumacast::testing
