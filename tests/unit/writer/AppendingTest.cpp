// Appending samples to a movie writer, and their order.

#include "tests/unit/writer/WriterWorld.h"

namespace lumacast {
namespace {

constexpr char kDiscarded[] = "discarding video sample buffer due to timestamp earlier than previous";
constexpr char kCannotStart[] = "ERROR starting asset writer";

class MovieWriterAppending : public WriterWorld {
protected:
    void append(std::int64_t value) { writer_->appendVideoSampleBuffer(picture(value), {}); }
    const std::shared_ptr<LCMovieWriter> writer_ = makeReadyWriter();
};

TEST_F(MovieWriterAppending, TheFirstPictureStartsTheMovieAtItsOwnTime) {
    EXPECT_EQ(recording().status(), ContainerStatus::Unknown);
    append(1000);
    EXPECT_EQ(recording().status(), ContainerStatus::Writing);
    EXPECT_EQ(compare(recording().movie().start, MediaTime::make(1000, kTimescale)), 0);
    EXPECT_EQ(ticks(0), Ticks{1000});
    EXPECT_TRUE(writer_->didProcessFirstSample());
}

TEST_F(MovieWriterAppending, TheWindowTransformOfTheFirstPictureBecomesTheTracks) {
    const AffineTransform first{0, 1, -1, 0, 0, 0}, second{-1, 0, 0, 1, 0, 0};
    writer_->appendVideoSampleBuffer(picture(100), first);
    writer_->appendVideoSampleBuffer(picture(110), second);
    EXPECT_EQ(recording().transform(0), first);
}

TEST_F(MovieWriterAppending, AMissingPictureIsIgnored) {
    writer_->appendVideoSampleBuffer(nullptr, {});
    EXPECT_EQ(recording().status(), ContainerStatus::Unknown);
    EXPECT_TRUE(fakes_.logSink.logged().empty());
}

TEST_F(MovieWriterAppending, LaterPicturesAreAppendedAndLogged) {
    append(100);
    EXPECT_EQ(logged("appending video sample"), 0u) << "the first picture passes by the queue";
    append(110);
    append(120);
    EXPECT_EQ(ticks(0), (Ticks{100, 110, 120}));
    EXPECT_EQ(logged("appending video sample"), 2u);
}

TEST_F(MovieWriterAppending, AnInvalidTimeStartsNoSessionAndDoesNotCountAsTheFirstPicture) {
    writer_->appendVideoSampleBuffer(picture(MediaTime{100, kTimescale, 0, 0}), {});
    EXPECT_EQ(recording().status(), ContainerStatus::Writing) << "the writer was started before the time was looked at";
    EXPECT_FALSE(recording().movie().start.isValid());
    EXPECT_FALSE(writer_->didProcessFirstSample());
    EXPECT_TRUE(ticks(0).empty());
}

TEST_F(MovieWriterAppending, AFirstPictureWithoutATimeLeavesTheRecordingEmpty) {
    writer_->appendVideoSampleBuffer(picture(kInvalidMediaTime), {});
    EXPECT_EQ(logged(kCannotStart), 0u);
    append(110);
    append(120);
    EXPECT_EQ(logged(kCannotStart), 2u) << "the writer was started by the first picture, and starts only once";
    EXPECT_TRUE(ticks(0).empty());
    EXPECT_FALSE(writer_->didProcessFirstSample());
}

TEST_F(MovieWriterAppending, APictureAfterTheFinishBeganStillReachesTheContainerWriter) {
    append(100);
    append(110);
    recording().holdFinish(true);
    writer_->finishWritingWithHandler([](std::optional<URL>) {});
    settle();
    fakes_.logSink.clear();
    append(120);
    EXPECT_EQ(logged("appending video sample") + logged(kCannotStart), 1u) << "the writer itself does not look";
    recording().holdFinish(false);
    settle();
    EXPECT_EQ(ticks(0), (Ticks{100, 110})) << "the container writer refuses it";
}

TEST_F(MovieWriterAppending, APictureWithTheTimeOfTheOneBeforeIsDiscarded) {
    append(100);
    append(110);
    append(110);
    append(105);
    EXPECT_EQ(logged(kDiscarded), 2u);
    append(120);
    EXPECT_EQ(ticks(0), (Ticks{100, 110, 120}));
}

TEST_F(MovieWriterAppending, TheFirstPictureDoesNotBecomeTheLastTime) {
    append(100);
    append(100);
    EXPECT_EQ(logged(kDiscarded), 0u) << "the writer's own test does not know the first picture's time";
    EXPECT_EQ(logged("appending video sample"), 1u);
    append(100);
    EXPECT_EQ(logged(kDiscarded), 1u);
}

TEST_F(MovieWriterAppending, TheOrderIsThatOfTheRawTicks) {
    append(100);
    append(200);
    writer_->appendVideoSampleBuffer(picture(MediaTime::make(150, 1)), {});  // much later, but fewer ticks
    EXPECT_EQ(logged(kDiscarded), 1u);
    EXPECT_EQ(ticks(0), (Ticks{100, 200}));
}

TEST_F(MovieWriterAppending, PicturesBehindADiscardedOneWaitForTheNextCall) {
    append(100);
    append(110);
    recording().setReady(0, false);
    append(110);
    append(120);
    append(130);
    EXPECT_EQ(ticks(0), (Ticks{100, 110}));
    recording().setReady(0, true);
    append(140);
    EXPECT_EQ(logged(kDiscarded), 1u);
    EXPECT_EQ(ticks(0), (Ticks{100, 110})) << "the discarded picture ended this call";
    append(150);
    EXPECT_EQ(ticks(0), (Ticks{100, 110, 120, 130, 140, 150}));
}

TEST_F(MovieWriterAppending, SamplesWaitWithoutLimitWhileTheTrackIsNotReady) {
    append(100);
    writer_->appendAudio1SampleBuffer(sound(100));
    recording().setReady(0, false);
    recording().setReady(1, false);
    for (std::int64_t i = 1; i <= 5000; ++i) {
        append(100 + i);
        writer_->appendAudio1SampleBuffer(sound(100 + i));
    }
    EXPECT_EQ(ticks(0).size(), 1u);
    EXPECT_EQ(ticks(1).size(), 1u);
    recording().setReady(0, true);
    recording().setReady(1, true);
    append(5101);
    writer_->appendAudio1SampleBuffer(sound(5101));
    for (const std::size_t track : {0u, 1u}) {
        const Ticks all = ticks(track);
        ASSERT_EQ(all.size(), 5002u);
        EXPECT_TRUE(std::is_sorted(all.begin(), all.end()));
    }
}

TEST_F(MovieWriterAppending, AStartThatFailsDropsThePictureAndSaysSo) {
    fakes_.faults.failNext("ContainerWriter.startWriting");
    append(100);
    EXPECT_EQ(logged(kCannotStart), 1u);
    EXPECT_FALSE(writer_->didProcessFirstSample());
    append(110);
    EXPECT_EQ(logged(kCannotStart), 2u);
}

TEST_F(MovieWriterAppending, AWriterThatFailsWhileWritingTakesTheStartPathAgain) {
    append(100);
    recording().fail(Error("disk", 28));
    append(110);
    EXPECT_EQ(logged(kCannotStart), 1u);
    EXPECT_EQ(ticks(0), Ticks{100});
}

TEST_F(MovieWriterAppending, SoundBeforeTheFirstPictureIsDropped) {
    writer_->appendAudio1SampleBuffer(sound(90));
    writer_->appendAudio2SampleBuffer(sound(90));
    EXPECT_EQ(recording().status(), ContainerStatus::Unknown) << "sound never starts the movie";
    append(100);
    writer_->appendAudio1SampleBuffer(sound(110));
    writer_->appendAudio2SampleBuffer(sound(120));
    EXPECT_EQ(ticks(1), Ticks{110});
    EXPECT_EQ(ticks(2), Ticks{120});
}

TEST_F(MovieWriterAppending, SoundIsLoggedWithItsTimeAndDuration) {
    append(100);
    writer_->appendAudio1SampleBuffer(sound(110, 21));
    writer_->appendAudio2SampleBuffer(sound(120, 22));
    EXPECT_EQ(logged("appending audio 1 sample with timestamp:110 duration:21"), 1u);
    EXPECT_EQ(logged("appending audio 2 sample with timestamp:120 duration:22"), 1u);
}

TEST_F(MovieWriterAppending, SoundThatIsNotLaterIsDiscardedOnItsOwnTrackOnly) {
    append(100);
    writer_->appendAudio1SampleBuffer(sound(110));
    writer_->appendAudio1SampleBuffer(sound(110));
    writer_->appendAudio2SampleBuffer(sound(105));
    writer_->appendAudio2SampleBuffer(sound(104));
    EXPECT_EQ(logged("discarding audio 1 sample buffer due to timestamp earlier than previous"), 1u);
    EXPECT_EQ(logged("discarding audio 2 sample buffer due to timestamp earlier than previous"), 1u);
    EXPECT_EQ(ticks(1), Ticks{110});
    EXPECT_EQ(ticks(2), Ticks{105});
}

TEST_F(MovieWriterAppending, SoundBehindADiscardedOneWaitsForTheNextCall) {
    append(100);
    writer_->appendAudio1SampleBuffer(sound(110));
    recording().setReady(1, false);
    for (const std::int64_t value : {110, 120, 130}) writer_->appendAudio1SampleBuffer(sound(value));
    recording().setReady(1, true);
    writer_->appendAudio1SampleBuffer(sound(140));
    EXPECT_EQ(ticks(1), Ticks{110}) << "the discarded one ended this call";
    writer_->appendAudio1SampleBuffer(sound(150));
    EXPECT_EQ(ticks(1), (Ticks{110, 120, 130, 140, 150}));
}

TEST_F(MovieWriterAppending, SoundIsDroppedWhileNoPictureWasProcessedThoughTheWriterWrites) {
    writer_->appendVideoSampleBuffer(picture(kInvalidMediaTime), {});
    ASSERT_EQ(recording().status(), ContainerStatus::Writing);
    writer_->appendAudio1SampleBuffer(sound(110));
    writer_->appendAudio2SampleBuffer(sound(110));
    EXPECT_EQ(logged("appending audio 1 sample with timestamp:110 duration:20"), 0u);
    EXPECT_EQ(logged("appending audio 2 sample with timestamp:110 duration:20"), 0u);
}

TEST_F(MovieWriterAppending, AMissingSoundIsIgnored) {
    append(100);
    writer_->appendAudio1SampleBuffer(nullptr);
    writer_->appendAudio2SampleBuffer(nullptr);
    EXPECT_EQ(logged("ERROR Enqueing the Sample Audio Buffer"), 0u);
}

/// A track that is not ready for its first sample, as no track of the contract is.
class UnreadyWriters final : public ContainerWriters {
public:
    struct Input final : TrackInput {
        explicit Input(std::vector<std::int64_t>& theAppended) : appended(theAppended) {}
        void setExpectsMediaInRealTime(bool realTime) override { isRealTime = realTime; }
        void setTransform(const AffineTransform& transform) override { transforms.push_back(transform); }
        bool isReadyForMoreMediaData() const override { return ready; }
        bool append(const SampleRef& sample) override {
            appended.push_back(sample->presentationTime().value);
            return true;
        }
        std::vector<std::int64_t>& appended;
        std::vector<AffineTransform> transforms;
        bool ready = false;
        bool isRealTime = false;
    };
    struct Writer final : ContainerWriter {
        Writer(UnreadyWriters& theOwner, URL theURL) : owner(theOwner), url(std::move(theURL)) {}
        std::shared_ptr<TrackInput> addVideoInput(const Dictionary&) override { return add(); }
        std::shared_ptr<TrackInput> addAudioInput(const Dictionary&) override { return add(); }
        std::shared_ptr<TrackInput> add() {
            owner.inputs.push_back(std::make_shared<Input>(owner.appended));
            return owner.inputs.back();
        }
        ContainerStatus status() const override { return state; }
        std::optional<Error> error() const override { return std::nullopt; }
        URL outputURL() const override { return url; }
        bool startWriting() override {
            if (state != ContainerStatus::Unknown) return false;
            state = ContainerStatus::Writing;
            return true;
        }
        void startSession(MediaTime time) override { owner.sessions.push_back(time.value); }
        void endSession(MediaTime) override {}
        void finishWriting(std::function<void()> completion) override { completion(); }
        std::uint64_t bytesWritten() const override { return 0; }
        std::uint64_t picturesTaken() const override { return owner.appended.size(); }
        UnreadyWriters& owner;
        const URL url;
        ContainerStatus state = ContainerStatus::Unknown;
    };
    std::variant<std::unique_ptr<ContainerWriter>, Error> make(const URL& url, ContainerType type) override {
        isMpeg4 = type == ContainerType::Mpeg4;
        return std::make_unique<Writer>(*this, url);
    }
    std::vector<std::shared_ptr<Input>> inputs;
    std::vector<std::int64_t> appended, sessions;
    bool isMpeg4 = false;
};

class MovieWriterWithUnreadyTracks : public WriterWorld {
protected:
    UnreadyWriters writers_;
    const Platform platform_ = platformWith(writers_, fakes_.movieExporters);
    const std::shared_ptr<LCMovieWriter> writer_ =
        std::make_shared<LCMovieWriter>(platform_, tempStore_, Size{640, 360}, path_);
};

TEST_F(MovieWriterWithUnreadyTracks, EveryTrackExpectsMediaInRealTimeInAnMpeg4Movie) {
    writer_->setupAssetWriter();
    ASSERT_EQ(writers_.inputs.size(), 3u);
    for (const auto& input : writers_.inputs) EXPECT_TRUE(input->isRealTime);
    EXPECT_TRUE(writers_.isMpeg4);
}

TEST_F(MovieWriterWithUnreadyTracks, EveryPictureOfTheStartPathSetsTheTransformAndNoLaterOne) {
    const AffineTransform turned{0, 1, -1, 0, 0, 0}, mirrored{-1, 0, 0, 1, 0, 0};
    writer_->setupAssetWriter();
    writer_->appendVideoSampleBuffer(picture(100), turned);
    writer_->appendVideoSampleBuffer(picture(110), mirrored);
    EXPECT_EQ(writers_.inputs[0]->transforms, (std::vector<AffineTransform>{turned, mirrored}));
    const auto other = std::make_shared<LCMovieWriter>(platform_, tempStore_, Size{640, 360}, path_);
    other->setupAssetWriter();
    writers_.inputs[3]->ready = true;
    other->appendVideoSampleBuffer(picture(100), turned);
    other->appendVideoSampleBuffer(picture(110), mirrored);
    EXPECT_EQ(writers_.inputs[3]->transforms, std::vector<AffineTransform>{turned});
}

TEST_F(MovieWriterWithUnreadyTracks, AFirstPictureThatFindsNoRoomLeavesTheRecordingEmpty) {
    writer_->setupAssetWriter();
    writer_->appendVideoSampleBuffer(picture(100), {});
    EXPECT_EQ(writers_.sessions, std::vector<std::int64_t>{100}) << "the session has started";
    EXPECT_FALSE(writer_->didProcessFirstSample());
    EXPECT_EQ(logged(kCannotStart), 0u);
    writers_.inputs[0]->ready = true;
    writer_->appendVideoSampleBuffer(picture(110), {});
    writer_->appendVideoSampleBuffer(picture(120), {});
    EXPECT_EQ(logged(kCannotStart), 2u) << "every later picture takes the start path, which fails";
    EXPECT_TRUE(writers_.appended.empty());
    int answers = 0;
    std::optional<URL> url;
    writer_->finishWritingWithHandler([&](std::optional<URL> answer) {
        ++answers;
        url = answer;
    });
    settle();
    EXPECT_EQ(answers, 1);
    EXPECT_FALSE(url);
}

}  // namespace
}  // namespace lumacast
