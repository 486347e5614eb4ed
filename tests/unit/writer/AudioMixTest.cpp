#include <gtest/gtest.h>

#include "support/Localization.h"
#include "tests/fakes/FakePlatform.h"
#include "writer/LCAudioMixUtility.h"

namespace lumacast {
namespace {

class AudioMixing : public ::testing::Test {
protected:
    AudioMixing() { tempStore_._srSetupTempDirectory(); }
    ~AudioMixing() override { world_.scheduler.endWorld(); }

    /// A movie of three seconds with this many sound tracks.
    URL movie(int soundTracks) {
        const std::string path = tempStore_.pathFor("Player.mp4");
        auto content = std::make_shared<FakeMovie>();
        content->start = kZeroMediaTime;
        content->end = MediaTime::make(3, 1);
        content->finished = true;
        content->tracks.push_back({MediaType::Video, {}, {}});
        for (int i = 0; i < soundTracks; ++i) content->tracks.push_back({MediaType::Audio, {}, {}});
        auto file = fakes_.fileSystem.create(path);
        fakes_.fileSystem.setMovie(*std::get<0>(file), std::move(content));
        return URL::file(path);
    }
    struct Answer {
        int count = 0;
        std::optional<URL> url;
        std::int64_t error = 0;
    };
    std::shared_ptr<Answer> mix(const std::optional<URL>& url) {
        auto answer = std::make_shared<Answer>();
        exporter_ = mixer_.mixAudioForMovie(url, [answer](std::optional<URL> mixed, const std::optional<Error>& error) {
            ++answer->count;
            answer->url = std::move(mixed);
            answer->error = error ? error->code() : 0;
        });
        return answer;
    }
    void settle() { world_.scheduler.runUntilIdle(); }

    SimWorld world_{1};
    FakePlatform& fakes_ = world_.fakes;
    TempStore tempStore_{fakes_.platform()};
    Localization localization_{fakes_.bundles};
    RecordingErrors errors_{localization_};
    LCAudioMixUtility mixer_{fakes_.platform(), tempStore_, errors_};
    std::shared_ptr<MovieExporter> exporter_;
};

TEST_F(AudioMixing, WithoutAMovieItFailsAtOnceAndExportsNothing) {
    const auto answer = mix(std::nullopt);
    EXPECT_EQ(answer->count, 1);
    EXPECT_EQ(answer->error, -5818);
    EXPECT_FALSE(answer->url);
    EXPECT_FALSE(exporter_);
    EXPECT_TRUE(fakes_.movieExporters.presets().empty());
}

TEST_F(AudioMixing, TheMixedMovieIsNamedForTheSecondBehindADoubledSlash) {
    fakes_.clock.setWallTime(Date{1763270000.9});
    EXPECT_EQ(mixer_.tempFileURL(),
              URL("file:///private/var/mobile/Library/Lumacast//LCLuma_Final1763270000.mp4"));
    const auto answer = mix(movie(2));
    EXPECT_EQ(answer->count, 0) << "not inline";
    settle();
    EXPECT_EQ(answer->count, 1);
    EXPECT_EQ(answer->url, mixer_.tempFileURL());
    EXPECT_EQ(answer->error, 0);
    EXPECT_EQ(fakes_.movieExporters.presets(), std::vector{ExportPreset::HighestQuality});
}

TEST_F(AudioMixing, EverySoundTrackIsMixedInItsOrderAtItsOwnLevel) {
    mix(movie(2));
    settle();
    const std::vector<AudioMixInputParameters> expected{{.trackID = 2, .volume = 1}, {.trackID = 3, .volume = 1}};
    ASSERT_TRUE(fakes_.movieExporters.lastMix());
    EXPECT_EQ(fakes_.movieExporters.lastMix()->inputParameters, expected);
}

TEST_F(AudioMixing, OneSoundTrackIsOneSetOfParametersAndNoneAnEmptyMix) {
    mix(movie(1));
    settle();
    EXPECT_EQ(fakes_.movieExporters.lastMix()->inputParameters.size(), 1u);
    (void)fakes_.fileSystem.remove(tempStore_.pathFor("Player.mp4"));
    world_.scheduler.advance(std::chrono::seconds(1));
    mix(movie(0));
    settle();
    ASSERT_TRUE(fakes_.movieExporters.lastMix());
    EXPECT_TRUE(fakes_.movieExporters.lastMix()->inputParameters.empty());
}

TEST_F(AudioMixing, AFailedExportIsAFailureToSave) {
    fakes_.faults.failNext("MovieExporter.export");
    const auto answer = mix(movie(2));
    settle();
    EXPECT_EQ(answer->error, -5812);
    EXPECT_FALSE(answer->url);
    EXPECT_EQ(fakes_.logSink.printed(), std::vector<std::string>{"LCAudioMixUtility: MovieExporterFailed"});
}

TEST_F(AudioMixing, ACancelledExportIsAFailureToSaveToo) {
    const auto answer = mix(movie(2));
    exporter_->cancel();
    settle();
    EXPECT_EQ(answer->error, -5812);
    EXPECT_EQ(fakes_.logSink.printed(), std::vector<std::string>{"LCAudioMixUtility: MovieExporterStatusCancelled"});
}

TEST_F(AudioMixing, TwoWithinASecondHaveOneNameAndTheLaterFails) {
    const URL given = movie(2);
    const auto first = mix(given), second = mix(given);
    settle();
    EXPECT_EQ(first->error + second->error, -5812);
    EXPECT_EQ(first->count + second->count, 2);
    EXPECT_TRUE(fakes_.fileSystem.exists(given.path())) << "the movie itself is left alone";
}

}  // namespace
}  // namespace lumacast
