// What a player shows of the pictures that were appended.

#include <gtest/gtest.h>

#include <algorithm>
#include <random>

#include "linux/media/AvHandles.h"
#include "tests/unit/linux_media/RecordedMovie.h"
#include "tests/unit/linux_media/Times.h"

namespace lumacast::testing {
namespace {

TEST(Pictures, AppearAtTheirStampsInTheirOrder) {
    RecordedMovie movie;
    const std::int64_t zero = 5 * kSecond + 123;
    movie.start(zero);
    std::mt19937 random(7);
    std::vector<std::int64_t> stamps{zero};
    for (int i = 1; i < 100; ++i) stamps.push_back(stamps.back() + 1 * kMillisecond + random() % 90'000'000);
    for (std::size_t i = 0; i < stamps.size(); ++i)
        ASSERT_TRUE(movie.appendGrey(static_cast<int>(i * 2 + 20), stamps[i]));
    movie.clock.advance(std::chrono::nanoseconds(stamps.back() + kSecond));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);

    const auto shown = shownPictures(movie.path());
    ASSERT_EQ(shown.size(), stamps.size());
    for (std::size_t i = 0; i < shown.size(); ++i) {
        EXPECT_NEAR(shown[i].nanoseconds, stamps[i] - zero, kTick) << i;
        EXPECT_NEAR(shown[i].luma, lumaOfGrey(static_cast<int>(i * 2 + 20)), 1) << i;
    }
}

TEST(Pictures, WithStampsNotLaterThanTheOneBeforeAreLeftOut) {
    RecordedMovie movie;
    movie.start();
    EXPECT_TRUE(movie.appendGrey(50, 0));
    EXPECT_TRUE(movie.appendGrey(100, 40 * kMillisecond));
    EXPECT_TRUE(movie.appendGrey(200, 40 * kMillisecond));
    EXPECT_TRUE(movie.appendGrey(220, 39 * kMillisecond));
    EXPECT_TRUE(movie.appendGrey(150, 80 * kMillisecond));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    const auto shown = shownPictures(movie.path());
    ASSERT_EQ(shown.size(), 3u);
    EXPECT_NEAR(shown[1].luma, lumaOfGrey(100), 1);
    EXPECT_NEAR(shown[2].luma, lumaOfGrey(150), 1);
}

TEST(Pictures, FromBeforeTheSessionAreLeftOut) {
    RecordedMovie movie;
    movie.start(kSecond);
    EXPECT_TRUE(movie.appendGrey(50, kSecond - 1));
    EXPECT_TRUE(movie.appendGrey(100, kSecond));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    const auto shown = shownPictures(movie.path());
    ASSERT_EQ(shown.size(), 1u);
    EXPECT_NEAR(shown[0].luma, lumaOfGrey(100), 1);
}

TEST(Pictures, OfAStillWindowGiveAMovieAsLongAsTheRecording) {
    RecordedMovie movie;
    movie.start();
    for (int second = 0; second < 10; ++second) {
        ASSERT_TRUE(movie.appendGrey(100, second * kSecond));
        movie.clock.advance(std::chrono::seconds(1));
    }
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    EXPECT_EQ(movieNanoseconds(movie.path()), 10 * kSecond);
    EXPECT_EQ(shownPictures(movie.path()).size(), 10u);
}

TEST(Pictures, OfWhichThereIsOneLastUntilTheClocksTime) {
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    movie.clock.advance(std::chrono::milliseconds(1234));
    movie.clock.captureClock()->stand();
    movie.clock.advance(std::chrono::seconds(5));  // a clock that stands does not lengthen the movie
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    EXPECT_EQ(movieNanoseconds(movie.path()), 1234 * kMillisecond);
}

TEST(Pictures, LastUntilTheTimeOfTheirOwnRecordingsClock) {
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    movie.clock.advance(std::chrono::seconds(2));
    movie.clock.startCaptureClock();  // the next recording's: stands at zero
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    EXPECT_EQ(movieNanoseconds(movie.path()), 2 * kSecond);
}

TEST(Pictures, AfterTheEndOfTheSessionAreNotInTheMovie) {
    RecordedMovie movie;
    movie.start();
    for (int i = 0; i < 20; ++i) ASSERT_TRUE(movie.appendGrey(20 + i * 10, i * 100 * kMillisecond));
    EXPECT_TRUE(eventually([&] { return movie.writer->bytesWritten() > 1000; }));  // some are in the file already
    movie.writer->endSession(atNanoseconds(950 * kMillisecond));
    EXPECT_TRUE(movie.appendGrey(255, 2 * kSecond));
    movie.clock.advance(std::chrono::seconds(30));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    EXPECT_EQ(movieNanoseconds(movie.path()), 950 * kMillisecond);
    const auto shown = shownPictures(movie.path());
    ASSERT_EQ(shown.size(), 10u);
    EXPECT_NEAR(shown.back().luma, lumaOfGrey(110), 1);
}

TEST(Pictures, AtTheVeryEndOfTheSessionStay) {
    RecordedMovie movie;
    movie.start();
    for (int i = 0; i < 5; ++i) ASSERT_TRUE(movie.appendGrey(20 + i * 10, i * 100 * kMillisecond));
    movie.writer->endSession(atNanoseconds(200 * kMillisecond));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    EXPECT_NEAR(movieNanoseconds(movie.path()), 200 * kMillisecond, kTick);
    EXPECT_EQ(shownPictures(movie.path()).size(), 3u);
}

TEST(Pictures, AreShownLongerWhenTheSessionEndsLater) {
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    movie.writer->endSession(atNanoseconds(3 * kSecond));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    EXPECT_EQ(movieNanoseconds(movie.path()), 3 * kSecond);
}

TEST(Pictures, OfAnotherSizeAreScaledToTheTrack) {
    RecordedMovie movie(128, 96);
    movie.start();
    ASSERT_TRUE(movie.append(greyPicture(128, 96, 1, 100, atNanoseconds(0))));
    ASSERT_TRUE(movie.append(greyPicture(64, 200, 2, 150, atNanoseconds(kSecond))));
    ASSERT_TRUE(movie.append(greyPicture(127, 95, 3, 200, atNanoseconds(2 * kSecond))));
    ASSERT_TRUE(movie.append(greyPicture(128, 96, 4, 30, atNanoseconds(3 * kSecond))));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    const auto shown = shownPictures(movie.path());
    ASSERT_EQ(shown.size(), 4u);
    const int greys[] = {100, 150, 200, 30};
    for (std::size_t i = 0; i < 4; ++i) EXPECT_NEAR(shown[i].luma, lumaOfGrey(greys[i]), 1);
}

TEST(Pictures, AreTurnedByTheTracksTransform) {
    RecordedMovie movie(128, 96);
    AffineTransform quarter;  // clockwise: (x, y) becomes (height - y, x)
    quarter.a = 0;
    quarter.b = 1;
    quarter.c = -1;
    quarter.d = 0;
    quarter.tx = 96;
    movie.video->setTransform(quarter);
    movie.start();
    movie.video->setTransform({});  // too late to count
    ASSERT_TRUE(movie.appendGrey(100, 0));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    checkers::MovieReader reader(movie.path());
    ASSERT_EQ(reader.videoTracks().size(), 1u);
    EXPECT_EQ(reader.videoTracks()[0].rotation, 90);
}

TEST(Pictures, AreHighProfileAndTaggedBt601) {
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    ASSERT_TRUE(movie.appendGrey(120, kSecond));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    AVFormatContext* opened = nullptr;
    ASSERT_EQ(avformat_open_input(&opened, movie.path().c_str(), nullptr, nullptr), 0);
    const media::AvOwned<AVFormatContext> file(opened);
    ASSERT_GE(avformat_find_stream_info(opened, nullptr), 0);
    ASSERT_EQ(opened->nb_streams, 1u) << "sound tracks without a sample are not in the movie";
    const AVCodecParameters& parameters = *opened->streams[0]->codecpar;
    EXPECT_EQ(parameters.profile, FF_PROFILE_H264_HIGH);
    EXPECT_EQ(parameters.codec_tag, MKTAG('a', 'v', 'c', '1'));
    EXPECT_EQ(parameters.color_space, AVCOL_SPC_SMPTE170M);
    EXPECT_EQ(parameters.color_primaries, AVCOL_PRI_SMPTE170M);
    EXPECT_EQ(parameters.color_trc, AVCOL_TRC_SMPTE170M);
    EXPECT_EQ(parameters.color_range, AVCOL_RANGE_MPEG);
    EXPECT_EQ(parameters.video_delay, 0) << "no picture is shown out of order";
    // High with nothing of it used would be decoded by less: the 8x8 transform is what needs it.
    const auto* const bytes = parameters.extradata;
    ASSERT_GT(parameters.extradata_size, 4);
    EXPECT_EQ(bytes[1], 100) << "the profile in the sequence parameter set";
    EXPECT_EQ(bytes[2] & 0xC0, 0) << "no constraint to the Baseline or Main profile";
}

/// Stamps of the key frames, nanoseconds.
std::vector<std::int64_t> keyFrames(const std::string& path) {
    std::vector<std::int64_t> keys;
    AVFormatContext* opened = nullptr;
    if (avformat_open_input(&opened, path.c_str(), nullptr, nullptr) != 0) return keys;
    const media::AvOwned<AVFormatContext> file(opened);
    const media::AvOwned<AVPacket> packet(av_packet_alloc());
    while (av_read_frame(opened, packet.get()) == 0) {
        if (packet->flags & AV_PKT_FLAG_KEY) {
            keys.push_back(
                av_rescale_q(packet->pts, opened->streams[packet->stream_index]->time_base, {1, 1'000'000'000}));
        }
        av_packet_unref(packet.get());
    }
    return keys;
}

class KeyFrameSpacing : public ::testing::TestWithParam<int> {};

TEST_P(KeyFrameSpacing, IsASecondOfMediaTimeAtMost) {
    const int rate = GetParam();
    RecordedMovie movie;
    movie.start();
    for (int i = 0; i < 4 * rate; ++i) ASSERT_TRUE(movie.appendGrey(20 + i % 200, i * kSecond / rate));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    const auto keys = keyFrames(movie.path());
    ASSERT_GE(keys.size(), 4u);
    EXPECT_EQ(keys.front(), 0);
    for (std::size_t i = 1; i < keys.size(); ++i) EXPECT_LE(keys[i] - keys[i - 1], kSecond + kTick) << i;
    const int pictures = 4 * rate;
    EXPECT_LE(keys.size(), static_cast<std::size_t>(std::max(5, pictures / 60 + 1))) << "and not much more often";
}
INSTANTIATE_TEST_SUITE_P(Rates, KeyFrameSpacing, ::testing::Values(1, 7, 24, 30, 60, 144));

TEST(Pictures, KeepToTheBitRateWhenTheyAreNoise) {
    RecordedMovie movie(640, 480, 1'000'000);
    movie.start();
    std::mt19937 random(3);
    for (int i = 0; i < 240; ++i) {
        auto plane = std::make_shared<PaintedPlane>(640, 480, static_cast<std::uint64_t>(i));
        for (int y = 0; y < 480; ++y) {
            for (int x = 0; x < 640; ++x) {
                const auto grey = static_cast<std::uint8_t>(random());
                plane->setPixel(x, y, grey, grey, grey);
            }
        }
        ASSERT_TRUE(movie.append(picture(std::move(plane), atNanoseconds(i * kSecond / 60))));
    }
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    const double bits = 8.0 * static_cast<double>(movie.writer->bytesWritten());
    EXPECT_LT(bits / 4, 1.5e6) << "the average over four seconds, what is spent ahead included (RateTest.cpp)";
    EXPECT_GT(bits / 4, 0.8e6);
}

}  // namespace
}  // namespace lumacast::testing
