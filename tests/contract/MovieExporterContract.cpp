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
    URL url(const std::string& name) const override { return URL::file(directory_.file(name)); }

private:
    OwnDirectory directory_;
    LinuxContainerWriters writers_{clock};
    LinuxMovieExporters exporters_;
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
    void SetUp() override {
        // A movie of ten seconds, ten pictures a second, that begins at 3 s of its clock.
        world_->clock.startCaptureClock();
        auto made = world_->writers().make(movie_, ContainerType::Mpeg4);
        ASSERT_TRUE(std::get_if<0>(&made));
        ContainerWriter& writer = *std::get<0>(made);
        const auto input = writer.addVideoInput(videoSettings(64, 64));
        ASSERT_TRUE(writer.startWriting());
        writer.startSession(atSeconds(3));
        for (int i = 0; i < 100; ++i) {
            ASSERT_TRUE(eventually([&] { return input->isReadyForMoreMediaData(); }));
            ASSERT_TRUE(input->append(greyPicture(64, 64, static_cast<std::uint64_t>(i),
                                                  static_cast<std::uint8_t>(i + 50), atSeconds(3 + i * 0.1))));
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

INSTANTIATE_TEST_SUITE_P(Fake, MovieExporterContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeExporterWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, MovieExporterContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortExporterWorld>(); })));

}  // namespace
}  // namespace lumacast
