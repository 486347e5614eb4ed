// Movies in memory: what the writer keeps and the exporter copies.

#include <gtest/gtest.h>

#include "tests/fakes/FakePlatform.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;

class FakeMoviesTest : public ::testing::Test {
protected:
    FakeMoviesTest() {
        EXPECT_FALSE(world.fakes.fileSystem.createDirectory(world.fakes.fileSystem.temporaryDirectory()));
        world.fakes.clock.startCaptureClock();
    }
    ~FakeMoviesTest() override { world.scheduler.endWorld(); }

    URL url(const std::string& name) const {
        return URL::file(world.fakes.fileSystem.temporaryDirectory() + "/" + name);
    }
    static Dictionary videoSettings() {
        return {{std::string(VideoSettings::kCodec), "avc1"},
                {std::string(VideoSettings::kWidth), 64.0},
                {std::string(VideoSettings::kHeight), 64.0}};
    }
    static Dictionary audioSettings() {
        return {{std::string(AudioSettings::kFormatID), std::uint64_t{kAudioFormatAAC}}};
    }
    static MediaTime seconds(double value) { return MediaTime::fromSeconds(value, 1'000'000'000); }
    static SampleRef picture(double at) { return SampleBuffer::makeVideo(PixelBuffer(), seconds(at), seconds(0.01)); }

    /// A finished movie with a picture every 100 ms, from `start` on.
    std::shared_ptr<FakeRecording> record(const std::string& name, double start, int pictures, double sessionEnd) {
        auto made = world.fakes.containerWriters.make(url(name), ContainerType::Mpeg4);
        const auto writer = std::get<0>(std::move(made));
        const auto video = writer->addVideoInput(videoSettings());
        const auto silent = writer->addAudioInput(audioSettings());
        EXPECT_TRUE(writer->startWriting());
        writer->startSession(seconds(start));
        for (int i = 0; i < pictures; ++i) EXPECT_TRUE(video->append(picture(start + 0.1 * i)));
        if (sessionEnd > 0) writer->endSession(seconds(sessionEnd));
        bool done = false;
        writer->finishWriting([&] { done = true; });
        EXPECT_FALSE(done) << "not inline";
        world.scheduler.runUntilIdle();
        EXPECT_TRUE(done);
        return world.fakes.containerWriters.lastRecording();
    }
    MediaTime duration(const std::string& name) { return world.fakes.movieExporters.openMovie(url(name))->duration(); }

    struct Exported {
        int calls = 0;
        ExportStatus status = ExportStatus::Cancelled;
    };
    Exported exportPart(const std::string& from, const std::string& to, std::optional<MediaTimeRange> range) {
        Exported result;
        const auto exporter = world.fakes.movieExporters.makeExporter(world.fakes.movieExporters.openMovie(url(from)),
                                                                      ExportPreset::PassThrough, url(to));
        if (range) exporter->setTimeRange(*range);
        exporter->exportAsynchronously([&](ExportStatus status, std::optional<Error> error) {
            ++result.calls;
            result.status = status;
            EXPECT_EQ(status == ExportStatus::Completed, !error);
        });
        EXPECT_EQ(result.calls, 0);
        world.scheduler.runUntilIdle();
        return result;
    }

    SimWorld world{1};
};

TEST_F(FakeMoviesTest, AMovieLastsToTheEndOfItsSession) {
    record("a.mp4", 5, 10, 7);
    EXPECT_EQ(compare(duration("a.mp4"), seconds(2)), 0);
}

TEST_F(FakeMoviesTest, WithoutAnEndItLastsToTheTimeOfItsOwnClock) {
    world.fakes.clock.captureClock()->run();
    world.scheduler.advance(3s);
    record("a.mp4", 0, 10, 0);
    EXPECT_EQ(compare(duration("a.mp4"), seconds(3)), 0);
}

TEST_F(FakeMoviesTest, WhatWasAppendedBehindTheEndIsNotInIt) {
    const auto recording = record("a.mp4", 0, 10, 0.45);
    ASSERT_EQ(recording->movie().tracks.size(), 1u) << "a track without a sample is not in the movie";
    EXPECT_EQ(recording->movie().tracks[0].samples.size(), 5u);
    EXPECT_EQ(compare(duration("a.mp4"), seconds(0.45)), 0);
}

TEST_F(FakeMoviesTest, ATracksBufferCanBeFullButNotBeforeItsFirstSample) {
    auto made = world.fakes.containerWriters.make(url("a.mp4"), ContainerType::Mpeg4);
    const auto& writer = std::get<0>(made);
    const auto video = writer->addVideoInput(videoSettings());
    ASSERT_TRUE(writer->startWriting());
    writer->startSession(kZeroMediaTime);
    world.fakes.containerWriters.lastRecording()->setReady(0, false);
    EXPECT_TRUE(video->isReadyForMoreMediaData());
    EXPECT_TRUE(video->append(picture(0)));
    EXPECT_FALSE(video->isReadyForMoreMediaData());
    EXPECT_FALSE(video->append(picture(1)));
    world.fakes.containerWriters.lastRecording()->setReady(0, true);
    EXPECT_TRUE(video->append(picture(1)));
}

TEST_F(FakeMoviesTest, AFullDiskFailsTheWriter) {
    auto made = world.fakes.containerWriters.make(url("a.mp4"), ContainerType::Mpeg4);
    const auto& writer = std::get<0>(made);
    const auto video = writer->addVideoInput(videoSettings());
    ASSERT_TRUE(writer->startWriting());
    writer->startSession(kZeroMediaTime);
    world.fakes.fileSystem.setFreeSize(1500);
    EXPECT_TRUE(video->append(picture(0)));
    EXPECT_EQ(writer->status(), ContainerStatus::Writing);
    (void)video->append(picture(1));
    EXPECT_EQ(writer->status(), ContainerStatus::Failed);
    ASSERT_TRUE(writer->error());
    EXPECT_FALSE(video->append(picture(2)));
}

TEST_F(FakeMoviesTest, AHeldFinishEndsWhenItIsReleased) {
    auto made = world.fakes.containerWriters.make(url("a.mp4"), ContainerType::Mpeg4);
    const auto& writer = std::get<0>(made);
    const auto video = writer->addVideoInput(videoSettings());
    ASSERT_TRUE(writer->startWriting());
    writer->startSession(kZeroMediaTime);
    ASSERT_TRUE(video->append(picture(0)));
    const auto recording = world.fakes.containerWriters.lastRecording();
    recording->holdFinish(true);
    int done = 0;
    writer->finishWriting([&] { ++done; });
    world.scheduler.advance(10s);
    EXPECT_EQ(done, 0);
    EXPECT_EQ(writer->status(), ContainerStatus::Writing);
    recording->holdFinish(false);
    world.scheduler.runUntilIdle();
    EXPECT_EQ(done, 1);
    EXPECT_EQ(writer->status(), ContainerStatus::Completed);
}

TEST_F(FakeMoviesTest, AMoviesFileIsMovedWithItsMovie) {
    record("a.mp4", 0, 3, 1);
    ASSERT_FALSE(world.fakes.fileSystem.move(url("a.mp4").path(), url("b.mp4").path()));
    EXPECT_EQ(compare(duration("b.mp4"), seconds(1)), 0);
    EXPECT_EQ(compare(duration("a.mp4"), kZeroMediaTime), 0);
}

TEST_F(FakeMoviesTest, AnExportCopiesItsPartAndBeginsWithThePictureThatWasShown) {
    record("a.mp4", 2, 20, 4);
    EXPECT_EQ(exportPart("a.mp4", "b.mp4", MediaTimeRange{seconds(0.55), seconds(1)}).status, ExportStatus::Completed);
    EXPECT_EQ(compare(duration("b.mp4"), seconds(1)), 0);
    const auto copy = world.fakes.fileSystem.movie(url("b.mp4").path());
    ASSERT_TRUE(copy);
    const auto& samples = copy->tracks.at(0).samples;
    EXPECT_EQ(samples.size(), 11u);
    EXPECT_EQ(compare(samples[0]->presentationTime(), seconds(2.55)), 0);
    EXPECT_EQ(compare(samples[1]->presentationTime(), seconds(2.6)), 0);
}

TEST_F(FakeMoviesTest, ExportsThatMakeNoSenseFailAndLeaveNoFile) {
    record("a.mp4", 0, 20, 2);
    const auto part = [](double start, double length) { return MediaTimeRange{seconds(start), seconds(length)}; };
    for (const auto& range : {part(0, 0), part(-1, 1), part(0, -1), part(2, 1), part(1, 1.5),
                              MediaTimeRange{kInvalidMediaTime, seconds(1)}}) {
        EXPECT_EQ(exportPart("a.mp4", "b.mp4", range).status, ExportStatus::Failed);
        EXPECT_FALSE(world.fakes.fileSystem.exists(url("b.mp4").path()));
    }
    EXPECT_EQ(exportPart("missing.mp4", "b.mp4", {}).status, ExportStatus::Failed);
    EXPECT_EQ(exportPart("a.mp4", "a.mp4", {}).status, ExportStatus::Failed) << "it exists";
    EXPECT_EQ(compare(duration("a.mp4"), seconds(2)), 0);
    EXPECT_EQ(exportPart("a.mp4", "b.mp4", {}).status, ExportStatus::Completed);
}

TEST_F(FakeMoviesTest, AnExporterThatIsReleasedCancelsItsExport) {
    record("a.mp4", 0, 20, 2);
    std::optional<ExportStatus> status;
    auto exporter = world.fakes.movieExporters.makeExporter(world.fakes.movieExporters.openMovie(url("a.mp4")),
                                                            ExportPreset::PassThrough, url("b.mp4"));
    exporter->exportAsynchronously([&](ExportStatus ended, std::optional<Error>) { status = ended; });
    exporter.reset();
    world.scheduler.runUntilIdle();
    EXPECT_EQ(status, ExportStatus::Cancelled);
    EXPECT_FALSE(world.fakes.fileSystem.exists(url("b.mp4").path()));
}

}  // namespace
}  // namespace lumacast
