// What the end of the process does to exports under way.

#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>

#include "linux/media/LinuxMovieExporters.h"
#include "tests/unit/linux_media/RecordedMovie.h"

namespace lumacast::testing {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

/// Files that take nothing until they may.
class StuckFiles final : public media::MovieFiles {
public:
    std::variant<std::unique_ptr<media::MovieFile>, int> create(const std::string& path) override {
        auto made = media::PosixMovieFiles().create(path);
        if (auto* const error = std::get_if<int>(&made)) return *error;
        return std::make_unique<File>(*this, std::move(std::get<0>(made)));
    }
    /// Whether somebody waits to write.
    bool isHolding() const {
        const std::lock_guard lock(mutex_);
        return isHolding_;
    }
    void goOn() {
        const std::lock_guard lock(mutex_);
        isStuck_ = false;
        changed_.notify_all();
    }

private:
    class File final : public media::MovieFile {
    public:
        File(StuckFiles& disk, std::unique_ptr<media::MovieFile> real) : disk_(disk), real_(std::move(real)) {}
        int write(std::uint64_t offset, std::span<const std::uint8_t> bytes) override {
            std::unique_lock lock(disk_.mutex_);
            disk_.isHolding_ = disk_.isStuck_;
            disk_.changed_.wait(lock, [this] { return !disk_.isStuck_; });
            return real_->write(offset, bytes);
        }
        int sync() override { return 0; }
        void removeName(const std::string& path) override { real_->removeName(path); }

    private:
        StuckFiles& disk_;
        const std::unique_ptr<media::MovieFile> real_;
    };

    mutable std::mutex mutex_;
    std::condition_variable changed_;
    bool isStuck_ = true, isHolding_ = false;
};

class EndingExport : public ::testing::TestWithParam<ExportPreset> {
protected:
    EndingExport() {
        movie_.start();
        for (int i = 0; i < 40; ++i) EXPECT_TRUE(movie_.appendGrey(40 + i, i * std::int64_t{50'000'000}));
        movie_.clock.advance(seconds(2));
        EXPECT_EQ(movie_.finish(), ContainerStatus::Completed);
    }
    /// An export that counts what it is told.
    void run(LinuxMovieExporters& exporters, const std::string& name) {
        auto exporter =
            exporters.makeExporter(exporters.openMovie(URL::file(movie_.path())), GetParam(), URL::file(path(name)));
        exporter->exportAsynchronously([this](ExportStatus, std::optional<Error>) { ++told_; });
        running_.push_back(std::move(exporter));
    }
    std::string path(const std::string& name) const { return directory_.path(name); }
    bool exists(const std::string& name) const { return std::filesystem::exists(path(name)); }

    ScratchDirectory directory_;
    RecordedMovie movie_;
    std::atomic<int> told_{0};
    std::vector<std::shared_ptr<MovieExporter>> running_;
};

TEST_P(EndingExport, ThatIsStuckLosesItsHalfMadeFileAndNobodyHears) {
    const auto files = std::make_shared<StuckFiles>();
    {
        LinuxMovieExporters exporters(files, media::EncodingPriority::AsUsual);
        run(exporters, "first.mp4");
        run(exporters, "second.mp4");  // of encodings one that waits
        ASSERT_TRUE(eventually([&] { return files->isHolding(); }));
        exporters.forgetAll();
        exporters.removeUnfinished(milliseconds(0));
        EXPECT_FALSE(exists("first.mp4"));
        EXPECT_FALSE(exists("second.mp4"));
        files->goOn();
        running_.clear();
    }
    EXPECT_FALSE(exists("first.mp4") || exists("second.mp4"));
    EXPECT_EQ(told_, 0);
    EXPECT_TRUE(std::filesystem::exists(movie_.path()));
}

TEST_P(EndingExport, ThatSeesItInTimeIsNotWaitedForAnyLonger) {
    const auto files = std::make_shared<StuckFiles>();
    LinuxMovieExporters exporters(files, media::EncodingPriority::AsUsual);
    run(exporters, "first.mp4");
    ASSERT_TRUE(eventually([&] { return files->isHolding(); }));
    exporters.forgetAll();
    files->goOn();
    const auto before = std::chrono::steady_clock::now();
    exporters.removeUnfinished(seconds(60));
    EXPECT_LT(std::chrono::steady_clock::now() - before, seconds(30));
    EXPECT_FALSE(exists("first.mp4"));
    EXPECT_EQ(told_, 0);
    running_.clear();
}

TEST_P(EndingExport, ThatIsAskedForLaterIsNotBegun) {
    {
        LinuxMovieExporters exporters(std::make_shared<media::PosixMovieFiles>(), media::EncodingPriority::AsUsual);
        exporters.forgetAll();
        run(exporters, "late.mp4");
        running_.clear();
    }
    EXPECT_FALSE(exists("late.mp4"));
    EXPECT_EQ(told_, 0);
}

INSTANTIATE_TEST_SUITE_P(Kinds, EndingExport,
                         ::testing::Values(ExportPreset::PassThrough, ExportPreset::HighestQuality),
                         [](const auto& preset) {
                             return std::string(preset.param == ExportPreset::PassThrough ? "Copy" : "Encoding");
                         });

}  // namespace
}  // namespace lumacast::testing
