#include <gtest/gtest.h>

#include <cerrno>
#include <functional>
#include <memory>

#include "linux/media/LinuxContainerWriters.h"
#include "linux/media/LinuxMovieExporters.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/MediaWorld.h"
#include "tests/fakes/FakeContainerWriter.h"
#include "tests/fakes/FakeMovieExporter.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {
namespace {

using namespace lumacast::testing;

/// Exporters, and writers to make movies for them.
class ExporterWorld {
public:
    virtual ~ExporterWorld() = default;
    virtual ContainerWriters& writers() = 0;
    virtual MovieExporters& exporters() = 0;
    virtual bool fileExists(const URL& url) = 0;
    virtual URL url(const std::string& name) const = 0;

    HandClock clock;
};

class FakeExporterWorld final : public ExporterWorld {
public:
    FakeExporterWorld() { EXPECT_FALSE(files_.createDirectory(files_.temporaryDirectory())); }
    ContainerWriters& writers() override { return writers_; }
    MovieExporters& exporters() override { return exporters_; }
    bool fileExists(const URL& url) override { return files_.exists(url.path()); }
    URL url(const std::string& name) const override { return URL::file(files_.temporaryDirectory() + "/" + name); }

private:
    FaultPlan faults_;
    FakeFileSystem files_{clock, faults_};
    ThreadScheduler scheduler_{std::make_shared<ThreadLoop>()};
    FakeContainerWriters writers_{scheduler_, clock, files_, faults_};
    FakeMovieExporters exporters_{scheduler_, files_, faults_};
};

class PortExporterWorld final : public ExporterWorld {
public:
    ContainerWriters& writers() override { return writers_; }
    MovieExporters& exporters() override { return exporters_; }
    bool fileExists(const URL& url) override { return std::filesystem::exists(url.path()); }
    URL url(const std::string& name) const override { return URL::file(directory_.path(name)); }

private:
    ScratchDirectory directory_;
    LinuxContainerWriters writers_{clock};
    LinuxMovieExporters exporters_{std::make_shared<media::PosixMovieFiles>(), media::EncodingPriority::AsUsual};
};

using Maker = std::function<std::unique_ptr<ExporterWorld>()>;

/// What an export said when it ended.
struct Outcome {
    std::atomic<int> status{-1};
    std::atomic<bool> hasError{false};
    Happening done;
    MovieExporter::Completion completion() {
        return [this](ExportStatus ended, std::optional<Error> error) {
            status = static_cast<int>(ended);
            hasError = error.has_value();
            done.happen();
        };
    }
};

class MovieExporterContract : public ::testing::TestWithParam<Maker> {
protected:
    /// A movie of ten seconds, ten pictures a second, that begins at 3 s of its clock.
    void SetUp() override {
        world_->clock.startCaptureClock();
        record(movie_, 0);
    }

    /// The same with so many sound tracks.
    void record(const URL& url, int soundTracks) {
        auto made = world_->writers().make(url, ContainerType::Mpeg4);
        ASSERT_TRUE(std::get_if<0>(&made));
        ContainerWriter& writer = *std::get<0>(made);
        const auto input = writer.addVideoInput(videoSettings(64, 64));
        std::vector<std::shared_ptr<TrackInput>> sounds;
        for (int i = 0; i < soundTracks; ++i) sounds.push_back(writer.addAudioInput(audioSettings()));
        ASSERT_TRUE(writer.startWriting());
        writer.startSession(atSeconds(3));
        for (int i = 0; i < 100; ++i) {
            ASSERT_TRUE(eventually([&] { return input->isReadyForMoreMediaData(); }));
            ASSERT_TRUE(input->append(greyPicture(64, 64, static_cast<std::uint64_t>(i),
                                                  static_cast<std::uint8_t>(i + 50), atSeconds(3 + i * 0.1))));
        }
        for (const auto& sound : sounds) {
            const MediaTime length = MediaTime::make(44100, 44100);
            ASSERT_TRUE(sound->append(SampleBuffer::makeAudio(tapFormat(), Data(2 * 44100), 44100,
                                                              {length, atSeconds(3), kInvalidMediaTime})));
        }
        writer.endSession(atSeconds(13));
        Happening done;
        writer.finishWriting([&] { done.happen(); });
        ASSERT_TRUE(done.waitFor());
        ASSERT_EQ(writer.status(), ContainerStatus::Completed);
    }

    std::shared_ptr<MovieExporter> exporter(const URL& output) {
        return world_->exporters().makeExporter(world_->exporters().openMovie(movie_), ExportPreset::PassThrough,
                                                output);
    }
    ExportStatus exportRange(std::optional<MediaTimeRange> range, const URL& output) {
        const auto made = exporter(output);
        if (range) made->setTimeRange(*range);
        Outcome outcome;
        made->exportAsynchronously(outcome.completion());
        EXPECT_TRUE(outcome.done.waitFor());
        EXPECT_EQ(outcome.hasError, outcome.status != static_cast<int>(ExportStatus::Completed));
        return static_cast<ExportStatus>(outcome.status.load());
    }
    double durationOf(const URL& url) { return world_->exporters().openMovie(url)->duration().seconds(); }

    std::unique_ptr<ExporterWorld> world_ = GetParam()();
    const URL movie_ = world_->url("movie.mp4");
    const URL copy_ = world_->url("copy.mp4");
};

TEST_P(MovieExporterContract, AMovieKnowsItsDuration) { EXPECT_DOUBLE_EQ(durationOf(movie_), 10.0); }

TEST_P(MovieExporterContract, WhatIsNoMovieLastsNothing) {
    const auto missing = world_->exporters().openMovie(world_->url("missing.mp4"));
    ASSERT_TRUE(missing);
    EXPECT_EQ(compare(missing->duration(), kZeroMediaTime), 0);
    EXPECT_EQ(compare(world_->exporters().openMovie(URL("https://example.org/movie.mp4"))->duration(), kZeroMediaTime),
              0);
}

TEST_P(MovieExporterContract, WithoutARangeTheWholeMovieIsCopied) {
    EXPECT_EQ(exportRange(std::nullopt, copy_), ExportStatus::Completed);
    EXPECT_DOUBLE_EQ(durationOf(copy_), 10.0);
    EXPECT_DOUBLE_EQ(durationOf(movie_), 10.0);
}

TEST_P(MovieExporterContract, TheRangeIsAsLongAsItSays) {
    const MediaTimeRange range{MediaTime::make(2, 1), MediaTime::make(5, 1)};
    EXPECT_EQ(exportRange(range, copy_), ExportStatus::Completed);
    EXPECT_DOUBLE_EQ(durationOf(copy_), 5.0);
}

TEST_P(MovieExporterContract, TheWholeMovieIsARangeOfIt) {
    const auto asset = world_->exporters().openMovie(movie_);
    const MediaTimeRange range{MediaTime::make(0, 1), subtract(asset->duration(), MediaTime::make(0, 1))};
    EXPECT_EQ(exportRange(range, copy_), ExportStatus::Completed);
    EXPECT_DOUBLE_EQ(durationOf(copy_), 10.0);
}

TEST_P(MovieExporterContract, ACopyCanBeCopied) {
    EXPECT_EQ(exportRange(MediaTimeRange{atSeconds(2.34), atSeconds(5)}, copy_), ExportStatus::Completed);
    const auto again = world_->exporters().makeExporter(world_->exporters().openMovie(copy_), ExportPreset::PassThrough,
                                                        world_->url("again.mp4"));
    again->setTimeRange({atSeconds(1), atSeconds(2)});
    Outcome outcome;
    again->exportAsynchronously(outcome.completion());
    ASSERT_TRUE(outcome.done.waitFor());
    EXPECT_EQ(outcome.status, static_cast<int>(ExportStatus::Completed));
    EXPECT_DOUBLE_EQ(durationOf(world_->url("again.mp4")), 2.0);
}

TEST_P(MovieExporterContract, ARangeThatIsNotInTheMovieFailsAndLeavesNoFile) {
    const MediaTimeRange wrong[] = {
        {atSeconds(2), atSeconds(0)},  {atSeconds(2), atSeconds(-1)}, {atSeconds(-1), atSeconds(5)},
        {atSeconds(8), atSeconds(3)},  {atSeconds(10), atSeconds(1)}, {atSeconds(0), atSeconds(10.001)},
        {kInvalidMediaTime, atSeconds(1)}, {atSeconds(1), kInvalidMediaTime},
        {atSeconds(1), MediaTime::fromSeconds(1e300, 1)},
    };
    for (const MediaTimeRange& range : wrong) {
        EXPECT_EQ(exportRange(range, copy_), ExportStatus::Failed)
            << range.start.seconds() << " " << range.duration.seconds();
        EXPECT_FALSE(world_->fileExists(copy_));
    }
}

TEST_P(MovieExporterContract, ADestinationThatExistsFailsAndStays) {
    EXPECT_EQ(exportRange(std::nullopt, copy_), ExportStatus::Completed);
    EXPECT_EQ(exportRange(MediaTimeRange{atSeconds(0), atSeconds(1)}, copy_), ExportStatus::Failed);
    EXPECT_TRUE(world_->fileExists(copy_));
    EXPECT_DOUBLE_EQ(durationOf(copy_), 10.0);
    EXPECT_EQ(exportRange(std::nullopt, movie_), ExportStatus::Failed) << "onto itself";
    EXPECT_DOUBLE_EQ(durationOf(movie_), 10.0);
}

TEST_P(MovieExporterContract, AMovieThatCannotBeReadFails) {
    const auto made = world_->exporters().makeExporter(world_->exporters().openMovie(world_->url("missing.mp4")),
                                                       ExportPreset::PassThrough, copy_);
    EXPECT_EQ(made->outputURL(), copy_);
    Outcome outcome;
    made->exportAsynchronously(outcome.completion());
    ASSERT_TRUE(outcome.done.waitFor());
    EXPECT_EQ(outcome.status, static_cast<int>(ExportStatus::Failed));
    EXPECT_TRUE(outcome.hasError);
    EXPECT_FALSE(world_->fileExists(copy_));
}

TEST_P(MovieExporterContract, TheCompletionIsNotInline) {
    const auto made = exporter(copy_);
    Outcome outcome;
    made->exportAsynchronously(outcome.completion());
    ASSERT_TRUE(outcome.done.waitFor());
    EXPECT_NE(outcome.done.thread(), std::this_thread::get_id());
    EXPECT_EQ(outcome.done.count(), 1);
}

TEST_P(MovieExporterContract, AnExporterMayBeLetGoOfAtAnyMomentAndStillEndsOnce) {
    for (int round = 0; round < 20; ++round) {
        const URL output = world_->url("copy" + std::to_string(round) + ".mp4");
        auto made = exporter(output);
        Outcome outcome;
        made->exportAsynchronously(outcome.completion());
        made.reset();
        ASSERT_TRUE(outcome.done.waitFor());
        const bool completed = outcome.status == static_cast<int>(ExportStatus::Completed);
        EXPECT_TRUE(completed || outcome.status == static_cast<int>(ExportStatus::Cancelled));
        EXPECT_EQ(world_->fileExists(output), completed);
    }
}

TEST_P(MovieExporterContract, AnExporterCanBeLetGoOfInItsCompletion) {
    auto made = exporter(copy_);
    Happening done;
    made->exportAsynchronously([&](ExportStatus, std::optional<Error>) {
        made.reset();
        done.happen();
    });
    EXPECT_TRUE(done.waitFor());
}

TEST_P(MovieExporterContract, SoundTracksAreToldApart) {
    EXPECT_TRUE(world_->exporters().openMovie(movie_)->audioTracks().empty());
    EXPECT_TRUE(world_->exporters().openMovie(world_->url("missing.mp4"))->audioTracks().empty());
    record(copy_, 2);
    const auto tracks = world_->exporters().openMovie(copy_)->audioTracks();
    ASSERT_EQ(tracks.size(), 2u);
    EXPECT_NE(tracks[0], tracks[1]);
}

TEST_P(MovieExporterContract, AMixHasOneTrackForAllThatItNamesOrNone) {
    const URL source = world_->url("sound.mp4");
    record(source, 2);
    const auto movie = world_->exporters().openMovie(source);
    const auto tracks = movie->audioTracks();
    ASSERT_EQ(tracks.size(), 2u);
    struct Case {
        ExportPreset preset;
        std::optional<AudioMix> mix;
        std::size_t sounds;
    };
    const AudioMix both{{{tracks[0]}, {tracks[1]}}}, twice{{{tracks[1]}, {tracks[1]}}}, none{}, unknown{{{4711}}};
    const Case cases[] = {{ExportPreset::HighestQuality, both, 1},    {ExportPreset::HighestQuality, twice, 1},
                          {ExportPreset::HighestQuality, none, 0},    {ExportPreset::HighestQuality, unknown, 0},
                          {ExportPreset::HighestQuality, std::nullopt, 2}, {ExportPreset::PassThrough, none, 2}};
    int number = 0;
    for (const Case& each : cases) {
        SCOPED_TRACE(number);
        const URL output = world_->url("mix" + std::to_string(number++) + ".mp4");
        const auto made = world_->exporters().makeExporter(movie, each.preset, output);
        if (each.mix) made->setAudioMix(*each.mix);
        Outcome outcome;
        made->exportAsynchronously(outcome.completion());
        ASSERT_TRUE(outcome.done.waitFor());
        EXPECT_EQ(outcome.status, static_cast<int>(ExportStatus::Completed));
        EXPECT_EQ(world_->exporters().openMovie(output)->audioTracks().size(), each.sounds);
        EXPECT_NEAR(durationOf(output), 10.0, 1e-5);
    }
    EXPECT_EQ(world_->exporters().openMovie(source)->audioTracks(), tracks);
}

TEST_P(MovieExporterContract, CancellingBeforeTheBeginningAndAfterTheEndDoesNothing) {
    const auto made = exporter(copy_);
    made->cancel();
    EXPECT_EQ(made->progress(), 0);
    Outcome outcome;
    made->exportAsynchronously(outcome.completion());
    ASSERT_TRUE(outcome.done.waitFor());
    EXPECT_EQ(outcome.status, static_cast<int>(ExportStatus::Completed));
    EXPECT_EQ(made->progress(), 1);
    made->cancel();
    EXPECT_EQ(made->progress(), 1);
    EXPECT_TRUE(world_->fileExists(copy_));
    EXPECT_EQ(outcome.done.count(), 1);
}

TEST_P(MovieExporterContract, ACancelledExportEndsOnceAndLeavesNoFile) {
    for (int round = 0; round < 10; ++round) {
        const URL output = world_->url("copy" + std::to_string(round) + ".mp4");
        const auto made = world_->exporters().makeExporter(world_->exporters().openMovie(movie_),
                                                           ExportPreset::HighestQuality, output);
        Outcome outcome;
        made->exportAsynchronously(outcome.completion());
        made->cancel();
        ASSERT_TRUE(outcome.done.waitFor());
        const bool completed = outcome.status == static_cast<int>(ExportStatus::Completed);
        EXPECT_TRUE(completed || outcome.status == static_cast<int>(ExportStatus::Cancelled));
        EXPECT_EQ(outcome.hasError, !completed);
        EXPECT_EQ(world_->fileExists(output), completed);
    }
}

TEST_P(MovieExporterContract, ASecondExportOfAnExporterFails) {
    const auto made = exporter(copy_);
    Outcome first, second;
    made->exportAsynchronously(first.completion());
    made->exportAsynchronously(second.completion());
    ASSERT_TRUE(first.done.waitFor());
    ASSERT_TRUE(second.done.waitFor());
    EXPECT_EQ(first.status, static_cast<int>(ExportStatus::Completed));
    EXPECT_EQ(second.status, static_cast<int>(ExportStatus::Failed));
    EXPECT_TRUE(world_->fileExists(copy_));
}

INSTANTIATE_TEST_SUITE_P(Fake, MovieExporterContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeExporterWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, MovieExporterContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortExporterWorld>(); })));

}  // namespace
}  // namespace lumacast
