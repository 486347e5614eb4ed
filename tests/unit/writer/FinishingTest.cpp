// Finishing a movie.

#include "tests/unit/writer/WriterWorld.h"

namespace lumacast {
namespace {

constexpr char kNoFirstSample[] =
    "LCMovieWriter: finishWritingWithHandler: first sample buffer was not processed or appended";

class MovieWriterFinishing : public WriterWorld {
protected:
    struct Answer {
        int count = 0;
        std::optional<URL> url;
    };
    std::shared_ptr<Answer> finish(const std::shared_ptr<LCMovieWriter>& writer) {
        auto answer = std::make_shared<Answer>();
        writer->finishWritingWithHandler([answer](std::optional<URL> url) {
            ++answer->count;
            answer->url = std::move(url);
        });
        return answer;
    }
    void append(LCMovieWriter& writer, std::int64_t value) { writer.appendVideoSampleBuffer(picture(value), {}); }
};

TEST_F(MovieWriterFinishing, AFinishedMovieIsHandedOverByItsURL) {
    const auto writer = makeReadyWriter();
    append(*writer, 100);
    append(*writer, 110);
    const auto answer = finish(writer);
    settle();
    EXPECT_EQ(answer->count, 1);
    EXPECT_EQ(answer->url, URL::file(path_));
    ASSERT_TRUE(fakes_.fileSystem.movie(path_));
    EXPECT_EQ(fakes_.fileSystem.movie(path_)->tracks.size(), 1u);
    EXPECT_FALSE(writer->didProcessFirstSample());
    EXPECT_TRUE(writer->isFinishingWriting());
    EXPECT_EQ(logged("LCMovieWriter: finishWritingWithHandler: status = 1"), 1u);
}

TEST_F(MovieWriterFinishing, TheSecondFinishIsNeverAnswered) {
    const auto writer = makeReadyWriter();
    append(*writer, 100);
    const auto first = finish(writer), second = finish(writer);
    settle();
    const auto third = finish(writer);
    settle();
    EXPECT_EQ(first->count, 1);
    EXPECT_EQ(second->count, 0);
    EXPECT_EQ(third->count, 0);
}

TEST_F(MovieWriterFinishing, WithoutAPictureThereIsNoURLAndALineSaysWhy) {
    const auto writer = makeReadyWriter();
    const auto answer = finish(writer);
    settle();
    EXPECT_EQ(answer->count, 1);
    EXPECT_FALSE(answer->url);
    EXPECT_EQ(fakes_.logSink.logged(),
              (std::vector<std::string>{"LCMovieWriter: finishWritingWithHandler: status = 0", kNoFirstSample}));
}

TEST_F(MovieWriterFinishing, AWriterThatWasNeverSetUpFinishesWithoutURL) {
    const auto writer = makeWriter();
    const auto answer = finish(writer);
    settle();
    EXPECT_EQ(answer->count, 1);
    EXPECT_FALSE(answer->url);
    EXPECT_EQ(logged(kNoFirstSample), 1u);
}

TEST_F(MovieWriterFinishing, AWriterThatFailedHandsItsURLOverAndLogsTheError) {
    const auto writer = makeReadyWriter();
    append(*writer, 100);
    recording().fail(Error("disk", 28));
    const auto answer = finish(writer);
    settle();
    EXPECT_EQ(answer->count, 1);
    EXPECT_EQ(answer->url, URL::file(path_));
    EXPECT_FALSE(writer->didProcessFirstSample());
    EXPECT_EQ(fakes_.logSink.logged(),
              (std::vector<std::string>{"LCMovieWriter: finishWritingWithHandler: status = 3",
                                        "not writing, returning video url set on assetwriter (most likely nil)",
                                        "asset writer error = 28"}));
}

TEST_F(MovieWriterFinishing, TheURLIsHandedOverWhateverTheFinalStatus) {
    const auto writer = makeReadyWriter();
    append(*writer, 100);
    fakes_.faults.failNext("ContainerWriter.finish");
    const auto answer = finish(writer);
    settle();
    EXPECT_EQ(recording().status(), ContainerStatus::Failed);
    EXPECT_EQ(answer->url, URL::file(path_));
}

TEST_F(MovieWriterFinishing, TheAnswerWaitsForTheContainerWriter) {
    const auto writer = makeReadyWriter();
    append(*writer, 100);
    recording().holdFinish(true);
    const auto answer = finish(writer);
    settle();
    EXPECT_EQ(answer->count, 0);
    EXPECT_TRUE(writer->didProcessFirstSample());
    recording().holdFinish(false);
    settle();
    EXPECT_EQ(answer->count, 1);
    EXPECT_FALSE(writer->didProcessFirstSample());
}

TEST_F(MovieWriterFinishing, SamplesThatStillWaitAreNotInTheMovie) {
    const auto writer = makeReadyWriter();
    append(*writer, 100);
    append(*writer, 110);
    recording().setReady(0, false);
    append(*writer, 120);
    recording().setReady(0, true);
    finish(writer);
    settle();
    EXPECT_EQ(ticks(0), (Ticks{100, 110}));
    append(*writer, 130);
    EXPECT_EQ(ticks(0), (Ticks{100, 110}));
    EXPECT_EQ(logged("appending video sample"), 1u);
}

TEST_F(MovieWriterFinishing, SamplesThatStillWaitAreForgottenWhenTheFinishBegins) {
    const auto writer = makeReadyWriter();
    append(*writer, 100);
    recording().setReady(0, false);
    append(*writer, 120);
    recording().holdFinish(true);
    finish(writer);
    settle();
    recording().setReady(0, true);
    append(*writer, 130);
    EXPECT_EQ(logged("appending video sample"), 1u) << "the late one alone";
    recording().holdFinish(false);
    settle();
}

TEST_F(MovieWriterFinishing, AWriterWithoutAPictureIsNeitherFinishedNorCancelled) {
    const auto writer = makeReadyWriter();
    finish(writer);
    settle();
    EXPECT_EQ(recording().status(), ContainerStatus::Unknown);
}

TEST_F(MovieWriterFinishing, TheHandlerComesBeforeTheFirstSampleIsForgotten) {
    for (const bool fails : {false, true}) {
        const auto writer = makeReadyWriter();
        append(*writer, 100);
        if (fails) recording().fail(Error("disk", 28));
        std::optional<bool> processed;
        writer->finishWritingWithHandler([&](std::optional<URL>) { processed = writer->didProcessFirstSample(); });
        settle();
        EXPECT_EQ(processed, true);
        EXPECT_FALSE(writer->didProcessFirstSample());
        fakes_.fileSystem.remove(path_);
    }
}

TEST_F(MovieWriterFinishing, AnAnnouncedStopCutsWhatCameAfterIt) {
    const auto writer = makeReadyWriter();
    for (const std::int64_t value : {100, 110, 120}) append(*writer, value);
    writer->notifyRecordingMayBeStopped();
    for (const std::int64_t value : {130, 140}) append(*writer, value);
    finish(writer);
    settle();
    const auto movie = fakes_.fileSystem.movie(path_);
    ASSERT_TRUE(movie);
    EXPECT_EQ(ticks(0), (Ticks{100, 110, 120}));
    EXPECT_EQ(compare(movie->end, MediaTime::make(120, kTimescale)), 0);
}

TEST_F(MovieWriterFinishing, AnAnnouncedStopThatIsTakenBackCutsNothing) {
    const auto writer = makeReadyWriter();
    for (const std::int64_t value : {100, 110}) append(*writer, value);
    writer->notifyRecordingMayBeStopped();
    append(*writer, 120);
    writer->notifyRecordingResumed();
    append(*writer, 130);
    finish(writer);
    settle();
    EXPECT_EQ(ticks(0), (Ticks{100, 110, 120, 130}));
}

TEST_F(MovieWriterFinishing, AStopAnnouncedBeforeASecondPictureCutsNothing) {
    // The first picture leaves the last time unset, so there is no time to cut at.
    const auto writer = makeReadyWriter();
    append(*writer, 100);
    writer->notifyRecordingMayBeStopped();
    append(*writer, 110);
    finish(writer);
    settle();
    EXPECT_EQ(ticks(0), (Ticks{100, 110}));
}

TEST_F(MovieWriterFinishing, ItsOwnWorkKeepsTheWriterAlive) {
    auto writer = makeReadyWriter();
    append(*writer, 100);
    const auto answer = finish(writer);
    const std::weak_ptr<LCMovieWriter> weak = writer;
    writer.reset();
    settle();
    EXPECT_EQ(answer->url, URL::file(path_));
    EXPECT_TRUE(weak.expired());
}

}  // namespace
}  // namespace lumacast
