// What a player shows and plays of a copied range.

#include <gtest/gtest.h>

#include <atomic>
#include <cerrno>
#include <fstream>

#include "linux/media/LinuxMovieExporters.h"
#include "tests/unit/linux_media/FaultyFiles.h"
#include "tests/unit/linux_media/RecordedMovie.h"
#include "tests/unit/linux_media/Times.h"
#include "tests/unit/linux_media/Tones.h"

namespace lumacast::testing {
namespace {

/// 30 s at 20 pictures a second, each of another grey than those near it, with a tone on the application's track.
class Export : public ::testing::Test {
protected:
    static constexpr int kRate = 20;

    void SetUp() override { record({}); }

    void record(const AffineTransform& transform) {
        movie_ = std::make_unique<RecordedMovie>();
        movie_->video->setTransform(transform);
        movie_->start();
        for (int i = 0; i < 30 * kRate; ++i) {
            ASSERT_TRUE(movie_->appendGrey(greyOf(i), i * kSecond / kRate));
            if (i % 2 == 0) appendTone(*movie_->sound, tapFormat(), 0, i * 44100 / kRate, 2 * 44100 / kRate, 441, 50);
        }
        movie_->clock.advance(std::chrono::seconds(30));
        ASSERT_EQ(movie_->finish(), ContainerStatus::Completed);
    }

    static int greyOf(int picture) { return 40 + picture * 7 % 200; }

    std::string copyPath(const std::string& name = "copy.mp4") const { return directory_.path(name); }

    ExportStatus exportRange(double start, double duration, LinuxMovieExporters& exporters,
                             const std::string& name = "copy.mp4", const std::string& from = "") {
        const auto asset = exporters.openMovie(URL::file(from.empty() ? movie_->path() : from));
        const auto exporter = exporters.makeExporter(asset, ExportPreset::PassThrough, URL::file(copyPath(name)));
        exporter->setTimeRange({atSeconds(start), atSeconds(duration)});
        Happening done;
        std::atomic<int> status = -1;
        exporter->exportAsynchronously([&](ExportStatus ended, std::optional<Error> error) {
            status = static_cast<int>(ended);
            error_ = error;
            done.happen();
        });
        EXPECT_TRUE(done.waitFor());
        return static_cast<ExportStatus>(status.load());
    }

    /// Whether the copy of [start, end) shows what the movie showed then.
    void expectPictures(const std::string& path, double start, double end) {
        const auto from = static_cast<std::int64_t>(std::llround(start * 1e9)),
                   to = static_cast<std::int64_t>(std::llround(end * 1e9));
        EXPECT_NEAR(movieNanoseconds(path), to - from, kTick);
        const auto shown = shownPictures(path);
        const int first = static_cast<int>(from * kRate / kSecond);
        const int last = static_cast<int>((to * kRate + kSecond - 1) / kSecond);  // the one after
        ASSERT_EQ(shown.size(), static_cast<std::size_t>(last - first));
        for (std::size_t i = 0; i < shown.size(); ++i) {
            const int number = first + static_cast<int>(i);
            EXPECT_NEAR(shown[i].nanoseconds, std::max<std::int64_t>(0, number * kSecond / kRate - from), kTick) << i;
            EXPECT_NEAR(shown[i].luma, lumaOfGrey(greyOf(number)), 2) << i;
        }
    }

    ScratchDirectory directory_;
    std::unique_ptr<RecordedMovie> movie_;
    LinuxMovieExporters exporters_;
    std::optional<Error> error_;
};

TEST_F(Export, FromTwoToTwentyFourSecondsBeginsWithTheRightPicture) {
    ASSERT_EQ(exportRange(2, 22, exporters_), ExportStatus::Completed);
    expectPictures(copyPath(), 2, 24);
}

TEST_F(Export, BeginsBetweenKeyFramesAndBetweenPictures) {
    const std::pair<double, double> ranges[] = {{0, 30},      {0, 0.05},  {0.5, 1.5},   {3.45, 7.2},
                                                {3.46, 7.23}, {29.9, 30}, {12.5, 12.51}};
    int number = 0;
    for (const auto& [start, end] : ranges) {
        SCOPED_TRACE(start);
        const std::string name = std::to_string(number++) + ".mp4";
        ASSERT_EQ(exportRange(start, end - start, exporters_, name), ExportStatus::Completed);
        expectPictures(copyPath(name), start, end);
    }
}

TEST_F(Export, KeepsTheSoundWithThePicture) {
    ASSERT_EQ(exportRange(2.345, 10, exporters_), ExportStatus::Completed);
    checkers::MovieReader reader(copyPath());
    ASSERT_EQ(reader.audioTracks().size(), 1u);
    EXPECT_NEAR(static_cast<double>(reader.audioTracks()[0].duration.count()), 10e9, 1e8);
    const auto sound = reader.readSound();
    ASSERT_TRUE(sound);
    // The tone's phase at the start of the range, as a delay.
    const double period = 1000.0 / 441;
    const double expected = std::remainder(-2345.0, period);
    EXPECT_NEAR(std::remainder(phaseDelay(*sound, 0.1, 9.9) - expected, period), 0, 0.1);
    EXPECT_NEAR(loudness(*sound, 0.0, 0.1), kToneLoudness, 0.02) << "the decoder had its lead";
    EXPECT_NEAR(loudness(*sound, 9.8, 9.98), kToneLoudness, 0.02);
}

TEST_F(Export, OfAnExportIsExactToo) {
    ASSERT_EQ(exportRange(2.34, 20, exporters_), ExportStatus::Completed);
    ASSERT_EQ(exportRange(1, 2, exporters_, "again.mp4", copyPath()), ExportStatus::Completed);
    const auto shown = shownPictures(copyPath("again.mp4"));
    EXPECT_NEAR(movieNanoseconds(copyPath("again.mp4")), 2 * kSecond, kTick);
    ASSERT_EQ(shown.size(), 41u);  // the first one only from its middle on
    EXPECT_NEAR(shown[0].luma, lumaOfGrey(greyOf(66)), 2);
    EXPECT_NEAR(shown[1].nanoseconds, 10 * kMillisecond, kTick);
}

TEST_F(Export, KeepsTheTransformAndTheProfile) {
    AffineTransform quarter;
    quarter.a = 0;
    quarter.b = 1;
    quarter.c = -1;
    quarter.d = 0;
    quarter.tx = 96;
    record(quarter);
    ASSERT_EQ(exportRange(2, 3, exporters_), ExportStatus::Completed);
    checkers::MovieReader reader(copyPath());
    ASSERT_EQ(reader.videoTracks().size(), 1u);
    EXPECT_EQ(reader.videoTracks()[0].rotation, 90);
    EXPECT_EQ(reader.videoTracks()[0].profile, "High");
}

TEST_F(Export, OntoAFullDiskLeavesNoFile) {
    const auto disk = std::make_shared<FaultyFiles>();
    LinuxMovieExporters exporters(disk);
    for (std::uint64_t bytes = 0; bytes < 60'000; bytes += 9'000) {
        disk->failAfter(bytes, ENOSPC);
        EXPECT_EQ(exportRange(2, 22, exporters), ExportStatus::Failed) << bytes;
        ASSERT_TRUE(error_);
        EXPECT_EQ(error_->code(), ENOSPC);
        EXPECT_FALSE(std::filesystem::exists(copyPath()));
    }
    disk->failAfter(UINT64_MAX, 0);
    disk->failSync(EIO);
    EXPECT_EQ(exportRange(2, 22, exporters), ExportStatus::Failed);
    EXPECT_EQ(error_->code(), EIO);
    EXPECT_FALSE(std::filesystem::exists(copyPath()));
}

TEST_F(Export, OfAMovieThatIsCutOffFailsAndLeavesNoFile) {
    const std::string path = copyPath("cut.mp4");
    std::filesystem::copy_file(movie_->path(), path);
    std::filesystem::resize_file(path, std::filesystem::file_size(path) / 2);
    EXPECT_EQ(exportRange(2, 22, exporters_, "copy.mp4", path), ExportStatus::Failed);
    EXPECT_FALSE(std::filesystem::exists(copyPath()));
}

TEST_F(Export, OfSomethingElseFails) {
    const std::string path = copyPath("text.mp4");
    std::ofstream(path) << "no movie at all";
    EXPECT_EQ(exporters_.openMovie(URL::file(path))->duration().value, 0);
    EXPECT_EQ(exportRange(0, 1, exporters_, "copy.mp4", path), ExportStatus::Failed);
    EXPECT_FALSE(std::filesystem::exists(copyPath()));
}

TEST_F(Export, ThatIsCancelledLeavesNoFileAndSaysSo) {
    const auto disk = std::make_shared<FaultyFiles>();
    LinuxMovieExporters exporters(disk);
    auto exporter = exporters.makeExporter(exporters.openMovie(URL::file(movie_->path())), ExportPreset::PassThrough,
                                           URL::file(copyPath()));
    Happening done;
    std::atomic<int> status = -1;
    disk->freeze();
    exporter->exportAsynchronously([&](ExportStatus ended, std::optional<Error>) {
        status = static_cast<int>(ended);
        done.happen();
    });
    exporter.reset();
    EXPECT_EQ(done.count(), 0);
    disk->thaw();
    ASSERT_TRUE(done.waitFor());
    EXPECT_EQ(status, static_cast<int>(ExportStatus::Cancelled));
    EXPECT_FALSE(std::filesystem::exists(copyPath()));
}

TEST_F(Export, SecondOnTheSameObjectFails) {
    const auto exporter = exporters_.makeExporter(exporters_.openMovie(URL::file(movie_->path())),
                                                  ExportPreset::PassThrough, URL::file(copyPath()));
    Happening done;
    std::atomic<int> status[2] = {-1, -1};
    for (auto& each : status) {
        exporter->exportAsynchronously([&](ExportStatus ended, std::optional<Error>) {
            each = static_cast<int>(ended);
            done.happen();
        });
    }
    ASSERT_TRUE(done.waitFor(2));
    EXPECT_EQ(status[0], static_cast<int>(ExportStatus::Completed));
    EXPECT_EQ(status[1], static_cast<int>(ExportStatus::Failed));
    expectPictures(copyPath(), 0, 30);
}

TEST_F(Export, LeavesTheMovieAsItWas) {
    const auto size = std::filesystem::file_size(movie_->path());
    ASSERT_EQ(exportRange(2, 22, exporters_), ExportStatus::Completed);
    EXPECT_EQ(std::filesystem::file_size(movie_->path()), size);
    EXPECT_EQ(std::filesystem::status(copyPath()).permissions(),
              std::filesystem::perms::owner_read | std::filesystem::perms::owner_write);
}

}  // namespace
}  // namespace lumacast::testing
