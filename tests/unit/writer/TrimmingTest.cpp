// Copying a part of a finished movie.

#include "tests/unit/writer/WriterWorld.h"

namespace lumacast {
namespace {

class MovieWriterTrimming : public WriterWorld {
protected:
    /// A finished movie from 5 s on its clock: one picture each second, for `seconds` seconds.
    void record(std::int64_t seconds) {
        const auto writer = makeReadyWriter();
        for (std::int64_t i = 0; i <= seconds; ++i)
            writer->appendVideoSampleBuffer(picture((5 + i) * kTimescale), {});
        writer->finishWritingWithHandler([](std::optional<URL>) {});
        settle();
        ASSERT_EQ(fakes_.fileSystem.movie(path_)->duration().seconds(), static_cast<double>(seconds));
        fakes_.logSink.clear();
    }
    /// Trims the recorded movie; the URLs it was answered with.
    std::vector<URL> trim(double start, double end) {
        auto answers = std::make_shared<std::vector<URL>>();
        makeWriter()->trimMovieWithURL(URL::file(path_), start, end, URL::file(clipPath_),
                                       [answers](URL url) { answers->push_back(std::move(url)); });
        settle();
        return *answers;
    }
    std::shared_ptr<const FakeMovie> clip() { return fakes_.fileSystem.movie(clipPath_); }
    double clipStart() { return clip()->start.seconds() - 5; }

    const std::string clipPath_ = tempStore_.pathFor("Player_trimmed.mp4");
};

TEST_F(MovieWriterTrimming, ThirtySecondsCutBy2Point4And5Point6StartAt2AndLast22) {
    record(30);
    EXPECT_EQ(trim(2.4, 5.6), std::vector<URL>{URL::file(clipPath_)});
    ASSERT_TRUE(clip());
    EXPECT_EQ(clipStart(), 2);
    EXPECT_EQ(clip()->duration().seconds(), 22);
    EXPECT_EQ(fakes_.logSink.logged(), std::vector<std::string>{"LCMovieWriter: Export Trim succeeded"});
}

TEST_F(MovieWriterTrimming, BothCutsZeroCopyTheWholeMovie) {
    record(30);
    EXPECT_EQ(trim(0, 0).size(), 1u);
    EXPECT_EQ(clipStart(), 0);
    EXPECT_EQ(clip()->duration().seconds(), 30);
}

TEST_F(MovieWriterTrimming, HalvesOfSecondsAreRoundedAwayFromZero) {
    record(30);
    trim(2.5, 5.5);
    EXPECT_EQ(clipStart(), 3);
    EXPECT_EQ(clip()->duration().seconds(), 21);
}

TEST_F(MovieWriterTrimming, AnOlderClipIsReplaced) {
    record(30);
    trim(1, 1);
    EXPECT_EQ(trim(10, 10).size(), 1u);
    EXPECT_EQ(clip()->duration().seconds(), 10);
}

TEST_F(MovieWriterTrimming, TheMovieItselfStaysAsItIs) {
    record(30);
    trim(10, 10);
    EXPECT_EQ(fakes_.fileSystem.movie(path_)->duration().seconds(), 30);
}

TEST_F(MovieWriterTrimming, AFailedExportIsLoggedAndNeverAnswered) {
    record(30);
    fakes_.faults.failNext("MovieExporter.export");
    EXPECT_TRUE(trim(1, 1).empty());
    EXPECT_EQ(fakes_.logSink.logged(),
              std::vector<std::string>{"LCMovieWriter: Export Trim Video Failed, due to error: 5"});
}

TEST_F(MovieWriterTrimming, CutsLongerThanTheMovieFail) {
    record(3);
    EXPECT_TRUE(trim(2, 2).empty());
    EXPECT_EQ(logged("LCMovieWriter: Export Trim Video Failed, due to error: 22"), 1u);
}

TEST_F(MovieWriterTrimming, AMovieThatCannotBeOpenedFailsWithALineOnly) {
    EXPECT_TRUE(trim(1, 1).empty());
    EXPECT_EQ(logged("LCMovieWriter: Export Trim Video Failed, due to error: 61"), 1u);
}

/// Cancels every export, and keeps what it was asked for.
class CancellingExporters final : public MovieExporters {
public:
    struct Asset final : MovieAsset {
        MediaTime duration() const override { return MediaTime::make(30, 1); }
        std::vector<std::int32_t> audioTracks() const override { return {}; }
    };
    struct Exporter final : MovieExporter {
        Exporter(CancellingExporters& theOwner, URL theURL) : owner(theOwner), url(std::move(theURL)) {}
        URL outputURL() const override { return url; }
        void setTimeRange(MediaTimeRange given) override { owner.range = given; }
        void setAudioMix(AudioMix) override {}
        void cancel() override {}
        double progress() const override { return 0; }
        void exportAsynchronously(Completion completion) override {
            completion(ExportStatus::Cancelled, Error("cancelled", 125));
        }
        CancellingExporters& owner;
        const URL url;
    };
    std::shared_ptr<MovieAsset> openMovie(const URL&) override { return std::make_shared<Asset>(); }
    std::shared_ptr<MovieExporter> makeExporter(std::shared_ptr<MovieAsset>, ExportPreset thePreset,
                                                const URL& url) override {
        preset = thePreset;
        return std::make_shared<Exporter>(*this, url);
    }
    std::optional<ExportPreset> preset;
    std::optional<MediaTimeRange> range;
};

TEST_F(MovieWriterTrimming, ACancelledPassThroughExportIsLoggedAndNeverAnswered) {
    CancellingExporters exporters;
    const Platform platform = platformWith(fakes_.containerWriters, exporters);
    int answers = 0;
    std::make_shared<LCMovieWriter>(platform, tempStore_, Size{640, 360}, path_)
        ->trimMovieWithURL(URL::file(path_), 2.4, 5.6, URL::file(clipPath_), [&](URL) { ++answers; });
    settle();
    EXPECT_EQ(answers, 0);
    EXPECT_EQ(fakes_.logSink.logged(), std::vector<std::string>{"LCMovieWriter: Export Trim Video Cancelled"});
    EXPECT_EQ(exporters.preset, ExportPreset::PassThrough);
    ASSERT_TRUE(exporters.range);
    EXPECT_EQ(exporters.range->start.seconds(), 2);
    EXPECT_EQ(exporters.range->duration.seconds(), 22);
}

}  // namespace
}  // namespace lumacast
