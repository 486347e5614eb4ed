#include "writer/MovieSettings.h"

#include "tests/unit/writer/WriterWorld.h"

namespace lumacast {
namespace {

class MovieSettings : public WriterWorld {
protected:
    std::int64_t bitRate(Size size) { return averageVideoBitRate(fakes_.preferences, fakes_.deviceInfo, size); }
    static Value at(const Dictionary& settings, std::string_view key) {
        const Value* value = settings.find(key);
        return value ? *value : Value("missing");
    }
    static Dictionary compressionOf(const Dictionary& settings) {
        const Value* value = settings.find(VideoSettings::kCompressionProperties);
        const Dictionary* found = value ? value->as<Dictionary>() : nullptr;
        return found ? *found : Dictionary();
    }
};

TEST_F(MovieSettings, AWindowThatIs1920LongInEitherDirectionGetsFiveMegabits) {
    EXPECT_EQ(bitRate({1920, 1080}), 5000000);
    EXPECT_EQ(bitRate({1080, 1920}), 5000000);
    EXPECT_EQ(bitRate({1919, 1079}), 3000000);
    EXPECT_EQ(bitRate({1919.9, 1919.9}), 3000000);
}

TEST_F(MovieSettings, ATabletGetsSevenMegabitsWhateverTheWindow) {
    fakes_.deviceInfo.setUserInterfaceIdiom(1);
    EXPECT_EQ(bitRate({640, 360}), 7000000);
    EXPECT_EQ(bitRate({1920, 1080}), 7000000);
}

TEST_F(MovieSettings, ADeviceOfAnotherClassOrWithoutAnswerIsNoTablet) {
    EXPECT_EQ(bitRate({640, 360}), 3000000);
    fakes_.deviceInfo.setUserInterfaceIdiom(2);
    EXPECT_EQ(bitRate({640, 360}), 3000000);
    EXPECT_EQ(bitRate({1920, 1080}), 5000000);
}

TEST_F(MovieSettings, ThePreferenceReplacesTheBitRateOfAnyDeviceAndSize) {
    fakes_.preferences.set(kPreferenceDomain, "LCBitRateOverride", std::int64_t{1000000});
    EXPECT_EQ(bitRate({3840, 2160}), 1000000);
    fakes_.deviceInfo.setUserInterfaceIdiom(1);
    EXPECT_EQ(bitRate({640, 360}), 1000000);
}

TEST_F(MovieSettings, ThePreferenceIsTakenAsItsIntegerValue) {
    const std::vector<std::pair<Value, std::int64_t>> cases{
        {Value("2500000"), 2500000}, {Value(2500000.9), 2500000}, {Value(true), 1}, {Value("fast"), 0}};
    for (const auto& [preference, rate] : cases) {
        fakes_.preferences.set(kPreferenceDomain, "LCBitRateOverride", preference);
        EXPECT_EQ(bitRate({640, 360}), rate) << describe(preference);
    }
}

TEST_F(MovieSettings, LengthsAreTruncatedAndThenRoundedUpToEvenOnes) {
    EXPECT_EQ(evenLength(1279.6), 1280);
    EXPECT_EQ(evenLength(719.2), 720);
    EXPECT_EQ(evenLength(1281), 1282);
    EXPECT_EQ(evenLength(1280), 1280);
    EXPECT_EQ(evenLength(1280.9), 1280);
}

TEST_F(MovieSettings, ThePictureTrackIsH264HighAtTheWindowsSize) {
    const Dictionary settings = videoSettings(fakes_.platform(), {1279.6, 719.2}, std::nullopt);
    EXPECT_EQ(at(settings, VideoSettings::kCodec), Value("avc1"));
    EXPECT_EQ(at(settings, VideoSettings::kWidth), Value(1280.0));
    EXPECT_EQ(at(settings, VideoSettings::kHeight), Value(720.0));
    EXPECT_EQ(compressionOf(settings),
              (Dictionary{{"ExpectedSourceFrameRate", std::int64_t{60}},
                          {"MaxKeyFrameInterval", std::int64_t{60}},
                          {"ProfileLevel", "H264_High_AutoLevel"},
                          {"AverageBitRate", std::int64_t{3000000}}}));
    EXPECT_EQ(fakes_.logSink.logged(), std::vector<std::string>{"bit rate set to 3000000"});
}

TEST_F(MovieSettings, PropertiesOfTheConfigurationWinOverTheDefaultAndThePreference) {
    fakes_.preferences.set(kPreferenceDomain, "LCBitRateOverride", std::int64_t{1000000});
    LCBroadcastConfiguration config;
    config.videoCompressionProperties = Dictionary{{"AverageBitRate", std::int64_t{900000}}, {"Own", "kept"}};
    const Dictionary compression = compressionOf(videoSettings(fakes_.platform(), {640, 360}, config));
    EXPECT_EQ(at(compression, VideoSettings::kAverageBitRate), Value(std::int64_t{900000}));
    EXPECT_EQ(at(compression, "Own"), Value("kept"));
    EXPECT_EQ(at(compression, VideoSettings::kExpectedSourceFrameRate), Value(std::int64_t{60}));
    EXPECT_EQ(fakes_.logSink.logged(),
              (std::vector<std::string>{"bit rate set to 1000000", "using custom video compression properties"}));
}

TEST_F(MovieSettings, AnEmptyDictionaryOfTheConfigurationStillCountsAsCustom) {
    LCBroadcastConfiguration config;
    (void)videoSettings(fakes_.platform(), {640, 360}, config);
    EXPECT_EQ(logged("using custom video compression properties"), 0u);
    config.videoCompressionProperties = Dictionary();
    const Dictionary compression = compressionOf(videoSettings(fakes_.platform(), {640, 360}, config));
    EXPECT_EQ(logged("using custom video compression properties"), 1u);
    EXPECT_EQ(compression.size(), 4u);
}

TEST_F(MovieSettings, BothSoundTracksAreStereoAACAt128Kilobits) {
    const Dictionary settings = audioSettings();
    EXPECT_EQ(at(settings, AudioSettings::kFormatID), Value(std::uint64_t{0x61616320}));  // "aac "
    EXPECT_EQ(at(settings, AudioSettings::kNumberOfChannels), Value(std::int64_t{2}));
    EXPECT_EQ(at(settings, AudioSettings::kSampleRate), Value(44100.0));
    EXPECT_EQ(at(settings, AudioSettings::kBitRate), Value(std::int64_t{128000}));
    Data layout(32, 0);
    layout[0] = 0x02;
    layout[2] = 0x65;
    EXPECT_EQ(at(settings, AudioSettings::kChannelLayout), Value(layout));
}

TEST_F(MovieSettings, TheWriterGivesTheSettingsToItsThreeTracks) {
    const auto writer = makeReadyWriter({1920, 1080});
    const FakeMovie movie = recording().movie();
    ASSERT_EQ(movie.tracks.size(), 3u);
    EXPECT_EQ(movie.tracks[0].type, MediaType::Video);
    EXPECT_EQ(at(compressionOf(movie.tracks[0].settings), VideoSettings::kAverageBitRate),
              Value(std::int64_t{5000000}));
    EXPECT_EQ(movie.tracks[1].settings, audioSettings());
    EXPECT_EQ(movie.tracks[2].settings, audioSettings());
}

TEST_F(MovieSettings, TheWriterPassesTheConfigurationsPropertiesOn) {
    LCBroadcastConfiguration config;
    config.videoCompressionProperties = Dictionary{{"AverageBitRate", std::int64_t{900000}}};
    const auto writer = makeWriter();
    writer->setBroadcastConfig(config);
    writer->setupAssetWriter();
    EXPECT_EQ(at(compressionOf(recording().movie().tracks[0].settings), VideoSettings::kAverageBitRate),
              Value(std::int64_t{900000}));
}

}  // namespace
}  // namespace lumacast
