// Setting a movie writer up.

#include "tests/unit/writer/WriterWorld.h"

namespace lumacast {
namespace {

class MovieWriterSetup : public WriterWorld {};

TEST_F(MovieWriterSetup, ANewWriterHasWrittenNothing) {
    const auto writer = makeWriter({1281, 720});
    settle();
    EXPECT_TRUE(fakes_.fileSystem.files().empty());
    EXPECT_FALSE(writer->assetWriter());
    EXPECT_FALSE(writer->didProcessFirstSample());
    EXPECT_FALSE(writer->isFinishingWriting());
    EXPECT_EQ(writer->outputPath(), path_);
    EXPECT_EQ(writer->outputURL(), URL("file://" + path_));
    EXPECT_EQ(writer->windowSize(), (Size{1281, 720}));
    EXPECT_EQ(writer->movieWriterQueue().label(), "com.orvane.Lumacast.LCMovieWriterQueue");
}

TEST_F(MovieWriterSetup, AStartRemovesAStaleFileSetsUpAndThenAnswers) {
    fakes_.fileSystem.addFile(path_, 777);
    const auto writer = makeWriter();
    bool answered = false, wasSetUp = false;
    writer->startWritingHandler([&] {
        answered = true;
        wasSetUp = writer->assetWriter() != nullptr;
    });
    EXPECT_FALSE(answered);
    settle();
    EXPECT_TRUE(answered);
    EXPECT_TRUE(wasSetUp);
    EXPECT_EQ(std::get<FileAttributes>(fakes_.fileSystem.attributes(path_)).size, 0u);
    EXPECT_EQ(fakes_.logSink.logged(), (std::vector<std::string>{"LCMovieWriter: startWritingHandler",
                                                                 "LCMovieWriter: setupAssetWriter",
                                                                 "bit rate set to 3000000"}));
}

TEST_F(MovieWriterSetup, AStartSetsUpOnTheStoresQueueTheSynchronousFormOnTheWritersOwn) {
    const auto writer = makeWriter();
    std::vector<bool> onOwnQueue;
    fakes_.containerWriters.setWhenMade([&] { onOwnQueue.push_back(writer->movieWriterQueue().isCurrent()); });
    bool handlerOnOwnQueue = true;
    writer->startWritingHandler([&] { handlerOnOwnQueue = writer->movieWriterQueue().isCurrent(); });
    settle();
    EXPECT_FALSE(handlerOnOwnQueue);
    fakes_.fileSystem.remove(path_);
    writer->setupAssetWriter();
    EXPECT_EQ(onOwnQueue, (std::vector<bool>{false, true}));
}

TEST_F(MovieWriterSetup, AStartThatComesLateLeavesTheFileOfALaterWriterAlone) {
    const auto older = makeWriter(), later = makeWriter();
    older->setPathClaim(tempStore_.claimPath(path_));
    later->setPathClaim(tempStore_.claimPath(path_));
    later->startWritingHandler([] {});
    settle();
    const auto recording = fakes_.containerWriters.lastRecording();
    int answers = 0;
    older->startWritingHandler([&] { ++answers; });
    settle();
    EXPECT_EQ(answers, 1);
    EXPECT_FALSE(older->assetWriter());
    later->appendVideoSampleBuffer(picture(100), {});
    later->finishWritingWithHandler([](std::optional<URL>) {});
    settle();
    EXPECT_EQ(fakes_.containerWriters.lastRecording(), recording);
    EXPECT_TRUE(fakes_.fileSystem.movie(path_)) << "the later writer's movie is at its path";
}

TEST_F(MovieWriterSetup, AnEarlierStartsFileIsReplacedByTheLaterWriters) {
    const auto older = makeWriter(), later = makeWriter();
    older->setPathClaim(tempStore_.claimPath(path_));
    later->setPathClaim(tempStore_.claimPath(path_));
    older->startWritingHandler([] {});
    settle();
    ASSERT_TRUE(older->assetWriter());
    later->startWritingHandler([] {});
    settle();
    EXPECT_TRUE(later->assetWriter());
}

TEST_F(MovieWriterSetup, TheSynchronousFormKeepsAStaleFile) {
    fakes_.fileSystem.addFile(path_, 777);
    const auto writer = makeWriter();
    writer->setupAssetWriter();
    EXPECT_FALSE(writer->assetWriter());
    EXPECT_EQ(std::get<FileAttributes>(fakes_.fileSystem.attributes(path_)).size, 777u);
    EXPECT_EQ(logged("LCMovieWriter: setupAssetWriter error: 17"), 1u);
}

TEST_F(MovieWriterSetup, AFailedSetUpIsAnErrorLineAndTheStartIsAnsweredAllTheSame) {
    fakes_.faults.failNext("ContainerWriters.make");
    const auto writer = makeWriter();
    bool answered = false;
    writer->startWritingHandler([&] { answered = true; });
    settle();
    EXPECT_TRUE(answered);
    EXPECT_FALSE(writer->assetWriter());
    const FakeLogSink::Line expected{LogLevel::Error, "LCMovieWriter: setupAssetWriter error: 5"};
    const auto lines = fakes_.logSink.lines();
    EXPECT_EQ(std::count(lines.begin(), lines.end(), expected), 1);
    EXPECT_EQ(logged("bit rate set to 3000000"), 0u) << "no track is made after a failure";
}

TEST_F(MovieWriterSetup, SamplesForAWriterWithoutAContainerWriterAreDroppedSilently) {
    const auto writer = makeWriter();
    EXPECT_TRUE(writer->appendVideoSampleBuffer(picture(100), {}));
    writer->appendAudio1SampleBuffer(sound(100));
    writer->appendAudio2SampleBuffer(sound(100));
    EXPECT_FALSE(writer->didProcessFirstSample());
    EXPECT_TRUE(fakes_.logSink.logged().empty());
}

TEST_F(MovieWriterSetup, TheSystemRecordingFlagIsOnlyStored) {
    const auto writer = makeWriter();
    EXPECT_FALSE(writer->systemRecording());
    writer->setSystemRecording(true);
    EXPECT_TRUE(writer->systemRecording());
}

}  // namespace
}  // namespace lumacast
