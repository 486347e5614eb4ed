#include <gtest/gtest.h>

#include <functional>
#include <memory>

#include "linux/media/LinuxContainerWriters.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/MediaWorld.h"
#include "tests/fakes/FakeContainerWriter.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {
namespace {

using namespace lumacast::testing;

/// Container writers and what a test sees of the world around them.
class WriterWorld {
public:
    virtual ~WriterWorld() = default;
    virtual ContainerWriters& writers() = 0;
    virtual bool fileExists(const URL& url) = 0;
    virtual URL url(const std::string& name = "movie.mp4") const = 0;

    HandClock clock;
};

class FakeWriterWorld final : public WriterWorld {
public:
    FakeWriterWorld() { EXPECT_FALSE(files_.createDirectory(files_.temporaryDirectory())); }
    ContainerWriters& writers() override { return writers_; }
    bool fileExists(const URL& url) override { return files_.exists(url.path()); }
    URL url(const std::string& name) const override { return URL::file(files_.temporaryDirectory() + "/" + name); }

private:
    FaultPlan faults_;
    FakeFileSystem files_{clock, faults_};
    ThreadScheduler scheduler_{std::make_shared<ThreadLoop>()};
    FakeContainerWriters writers_{scheduler_, clock, files_, faults_};
};

class PortWriterWorld final : public WriterWorld {
public:
    ContainerWriters& writers() override { return writers_; }
    bool fileExists(const URL& url) override { return std::filesystem::exists(url.path()); }
    URL url(const std::string& name) const override { return URL::file(directory_.path(name)); }

private:
    ScratchDirectory directory_;
    LinuxContainerWriters writers_{clock};
};

using Maker = std::function<std::unique_ptr<WriterWorld>()>;

class ContainerWriterContract : public ::testing::TestWithParam<Maker> {
protected:
    static constexpr int kWidth = 128, kHeight = 96;

    void SetUp() override { world_->clock.startCaptureClock(); }

    std::unique_ptr<ContainerWriter> make(const std::string& name = "movie.mp4") {
        auto made = world_->writers().make(world_->url(name), ContainerType::Mpeg4);
        auto* const writer = std::get_if<0>(&made);
        EXPECT_TRUE(writer) << "the file could not be made";
        return writer ? std::move(*writer) : nullptr;
    }
    SampleRef pictureAt(double seconds) { return greyPicture(kWidth, kHeight, number_++, 100, atSeconds(seconds)); }
    void finish(ContainerWriter& writer) {
        Happening done;
        writer.finishWriting([&] { done.happen(); });
        EXPECT_TRUE(done.waitFor());
    }

    std::unique_ptr<WriterWorld> world_ = GetParam()();
    std::uint64_t number_ = 1;
};

TEST_P(ContainerWriterContract, TheFileAppearsWhenTheWriterIsMade) {
    const auto writer = make();
    ASSERT_TRUE(writer);
    EXPECT_TRUE(world_->fileExists(world_->url()));
    EXPECT_EQ(writer->outputURL(), world_->url());
    EXPECT_EQ(writer->status(), ContainerStatus::Unknown);
    EXPECT_FALSE(writer->error());
    EXPECT_EQ(writer->bytesWritten(), 0u);
}

TEST_P(ContainerWriterContract, AFileThatExistsAlreadyIsAnErrorAndStaysAsItIs) {
    const auto first = make();
    const auto second = world_->writers().make(world_->url(), ContainerType::Mpeg4);
    ASSERT_TRUE(std::holds_alternative<Error>(second));
    EXPECT_EQ(std::get<Error>(second).domain(), kSystemErrorDomain);
    EXPECT_EQ(std::get<Error>(second).code(), EEXIST);
    EXPECT_TRUE(world_->fileExists(world_->url()));
}

TEST_P(ContainerWriterContract, AFileThatCannotBeMadeIsAnError) {
    const auto made = world_->writers().make(world_->url("missing/movie.mp4"), ContainerType::Mpeg4);
    ASSERT_TRUE(std::holds_alternative<Error>(made));
    EXPECT_EQ(std::get<Error>(made).code(), ENOENT);
}

TEST_P(ContainerWriterContract, SettingsThatNoEncoderTakesGiveNoTrack) {
    const auto writer = make();
    EXPECT_FALSE(writer->addVideoInput({}));
    EXPECT_FALSE(writer->addVideoInput(videoSettings(0, 100)));
    Dictionary foreign = videoSettings(kWidth, kHeight);
    foreign.set(std::string(VideoSettings::kCodec), Value("hvc1"));
    EXPECT_FALSE(writer->addVideoInput(foreign));
    EXPECT_FALSE(writer->addAudioInput({}));
    Dictionary crowded = audioSettings();
    crowded.set(std::string(AudioSettings::kNumberOfChannels), Value(std::int64_t{90}));
    EXPECT_FALSE(writer->addAudioInput(crowded));
    EXPECT_TRUE(writer->addVideoInput(videoSettings(kWidth, kHeight)));
    EXPECT_TRUE(writer->addAudioInput(audioSettings()));
    EXPECT_TRUE(writer->addAudioInput(audioSettings()));
    EXPECT_FALSE(writer->addVideoInput(videoSettings(kWidth, kHeight))) << "a second video track";
}

TEST_P(ContainerWriterContract, WritingStartsOnceAndNotWithoutATrack) {
    const auto writer = make();
    EXPECT_FALSE(writer->startWriting());
    EXPECT_EQ(writer->status(), ContainerStatus::Unknown);
    const auto input = writer->addVideoInput(videoSettings(kWidth, kHeight));
    ASSERT_TRUE(input);
    EXPECT_TRUE(writer->startWriting());
    EXPECT_EQ(writer->status(), ContainerStatus::Writing);
    EXPECT_FALSE(writer->startWriting());
    EXPECT_EQ(writer->status(), ContainerStatus::Writing);
}

TEST_P(ContainerWriterContract, AnInputIsReadyBeforeItsFirstSample) {
    const auto writer = make();
    const auto video = writer->addVideoInput(videoSettings(kWidth, kHeight));
    const auto audio = writer->addAudioInput(audioSettings());
    EXPECT_TRUE(video->isReadyForMoreMediaData());
    EXPECT_TRUE(audio->isReadyForMoreMediaData());
    ASSERT_TRUE(writer->startWriting());
    EXPECT_TRUE(video->isReadyForMoreMediaData());
    writer->startSession(atSeconds(0));
    EXPECT_TRUE(video->isReadyForMoreMediaData());
    EXPECT_TRUE(video->append(pictureAt(0)));
    EXPECT_TRUE(audio->isReadyForMoreMediaData());
}

TEST_P(ContainerWriterContract, SamplesNeedASession) {
    const auto writer = make();
    const auto input = writer->addVideoInput(videoSettings(kWidth, kHeight));
    EXPECT_FALSE(input->append(pictureAt(0))) << "not started";
    ASSERT_TRUE(writer->startWriting());
    EXPECT_FALSE(input->append(pictureAt(0))) << "no session";
    writer->startSession(atSeconds(1));
    EXPECT_TRUE(input->append(pictureAt(1)));
}

TEST_P(ContainerWriterContract, SamplesThatCannotBeTakenAreRefused) {
    const auto writer = make();
    const auto video = writer->addVideoInput(videoSettings(kWidth, kHeight));
    const auto audio = writer->addAudioInput(audioSettings());
    ASSERT_TRUE(writer->startWriting());
    writer->startSession(atSeconds(0));
    EXPECT_FALSE(video->append(nullptr));
    EXPECT_FALSE(video->append(greyPicture(kWidth, kHeight, 1, 0, kInvalidMediaTime)));
    EXPECT_FALSE(audio->append(pictureAt(0)));
    EXPECT_TRUE(video->append(pictureAt(0)));
    EXPECT_TRUE(video->append(pictureAt(0))) << "a repeated stamp is dropped, which is no failure";
    EXPECT_EQ(writer->status(), ContainerStatus::Writing);
}

TEST_P(ContainerWriterContract, CountsThePicturesThatTheMovieKeeps) {
    const auto writer = make();
    const auto video = writer->addVideoInput(videoSettings(kWidth, kHeight));
    const auto audio = writer->addAudioInput(audioSettings());
    EXPECT_FALSE(video->append(pictureAt(0))) << "refused";
    EXPECT_EQ(writer->picturesTaken(), 0u);
    ASSERT_TRUE(writer->startWriting());
    writer->startSession(atSeconds(1));
    EXPECT_TRUE(video->append(pictureAt(0))) << "before the session: dropped";
    EXPECT_EQ(writer->picturesTaken(), 0u);
    EXPECT_TRUE(video->append(pictureAt(1)));
    EXPECT_TRUE(video->append(pictureAt(1))) << "repeated: dropped";
    EXPECT_TRUE(video->append(pictureAt(2)));
    EXPECT_FALSE(audio->append(pictureAt(3))) << "refused";
    EXPECT_EQ(writer->picturesTaken(), 2u);
    finish(*writer);
    EXPECT_EQ(writer->picturesTaken(), 2u) << "they stay counted";
}

TEST_P(ContainerWriterContract, FinishingCompletesTheMovieOnceAndNotInline) {
    const auto writer = make();
    const auto input = writer->addVideoInput(videoSettings(kWidth, kHeight));
    ASSERT_TRUE(writer->startWriting());
    writer->startSession(atSeconds(0));
    ASSERT_TRUE(input->append(pictureAt(0)));
    Happening done;
    writer->finishWriting([&] {
        EXPECT_EQ(writer->status(), ContainerStatus::Completed);
        done.happen();
    });
    ASSERT_TRUE(done.waitFor());
    EXPECT_NE(done.thread(), std::this_thread::get_id());
    EXPECT_FALSE(writer->error());
    EXPECT_GT(writer->bytesWritten(), 0u);
    finish(*writer);
    EXPECT_EQ(done.count(), 1);
}

TEST_P(ContainerWriterContract, AMovieWithoutASampleFails) {
    const auto writer = make();
    const auto input = writer->addVideoInput(videoSettings(kWidth, kHeight));
    ASSERT_TRUE(writer->startWriting());
    writer->startSession(atSeconds(0));
    finish(*writer);
    EXPECT_EQ(writer->status(), ContainerStatus::Failed);
    ASSERT_TRUE(writer->error());
}

TEST_P(ContainerWriterContract, AWriterCanBeLetGoOfInItsCompletion) {
    auto writer = make();
    const auto input = writer->addVideoInput(videoSettings(kWidth, kHeight));
    ASSERT_TRUE(writer->startWriting());
    writer->startSession(atSeconds(0));
    ASSERT_TRUE(input->append(pictureAt(0)));
    Happening done;
    writer->finishWriting([&] {
        writer.reset();
        done.happen();
    });
    EXPECT_TRUE(done.waitFor());
}

TEST_P(ContainerWriterContract, ACompletionMayHoldTheLastReferenceToTheWriter) {
    std::shared_ptr<ContainerWriter> writer = make();
    const auto input = writer->addVideoInput(videoSettings(kWidth, kHeight));
    ASSERT_TRUE(writer->startWriting());
    writer->startSession(atSeconds(0));
    ASSERT_TRUE(input->append(pictureAt(0)));
    Happening gone;
    struct AtEnd {
        Happening& happening;
        ~AtEnd() { happening.happen(); }
    };
    auto atEnd = std::make_shared<AtEnd>(gone);
    ContainerWriter& finishing = *writer;
    finishing.finishWriting([atEnd, held = std::move(writer)] {});  // `held` goes first
    atEnd.reset();
    ASSERT_TRUE(gone.waitFor());
    // Others still go on: nobody holds a lock of the one that has gone.
    EXPECT_TRUE(make("another.mp4"));
}

TEST_P(ContainerWriterContract, AWriterThatIsLetGoOfWhileFinishingStillCompletes) {
    auto writer = make();
    const auto input = writer->addVideoInput(videoSettings(kWidth, kHeight));
    ASSERT_TRUE(writer->startWriting());
    writer->startSession(atSeconds(0));
    ASSERT_TRUE(input->append(pictureAt(0)));
    Happening done;
    writer->finishWriting([&] { done.happen(); });
    writer.reset();
    EXPECT_TRUE(done.waitFor());
}

TEST_P(ContainerWriterContract, DestroyingAWriterLeavesItsFile) {
    make().reset();
    EXPECT_TRUE(world_->fileExists(world_->url()));
    auto started = make("started.mp4");
    const auto input = started->addVideoInput(videoSettings(kWidth, kHeight));
    ASSERT_TRUE(started->startWriting());
    started.reset();
    EXPECT_TRUE(world_->fileExists(world_->url("started.mp4")));
    EXPECT_FALSE(input->append(pictureAt(0))) << "an input that outlives its writer takes nothing";
}

/// Every operation in every state: what it answers and which state follows.
TEST_P(ContainerWriterContract, EveryOperationInEveryStateDoesWhatTheTableSays) {
    using Status = ContainerStatus;
    enum class Call { AddVideo, AddAudio, Start, StartSession, EndSession, Append, Finish };
    struct Row {
        Status before;
        Call call;
        bool answer;
        Status after;
    };
    const Row table[] = {
        {Status::Unknown, Call::AddVideo, false, Status::Unknown},  // there is one
        {Status::Unknown, Call::AddAudio, true, Status::Unknown},
        {Status::Unknown, Call::Start, true, Status::Writing},
        {Status::Unknown, Call::StartSession, true, Status::Unknown},
        {Status::Unknown, Call::EndSession, true, Status::Unknown},
        {Status::Unknown, Call::Append, false, Status::Unknown},
        {Status::Unknown, Call::Finish, true, Status::Failed},
        {Status::Writing, Call::AddVideo, false, Status::Writing},
        {Status::Writing, Call::AddAudio, false, Status::Writing},
        {Status::Writing, Call::Start, false, Status::Writing},
        {Status::Writing, Call::StartSession, true, Status::Writing},
        {Status::Writing, Call::EndSession, true, Status::Writing},
        {Status::Writing, Call::Append, true, Status::Writing},
        {Status::Writing, Call::Finish, true, Status::Completed},
        {Status::Completed, Call::AddVideo, false, Status::Completed},
        {Status::Completed, Call::AddAudio, false, Status::Completed},
        {Status::Completed, Call::Start, false, Status::Completed},
        {Status::Completed, Call::StartSession, true, Status::Completed},
        {Status::Completed, Call::EndSession, true, Status::Completed},
        {Status::Completed, Call::Append, false, Status::Completed},
        {Status::Completed, Call::Finish, true, Status::Completed},
        {Status::Failed, Call::AddVideo, false, Status::Failed},
        {Status::Failed, Call::AddAudio, false, Status::Failed},
        {Status::Failed, Call::Start, false, Status::Failed},
        {Status::Failed, Call::StartSession, true, Status::Failed},
        {Status::Failed, Call::EndSession, true, Status::Failed},
        {Status::Failed, Call::Append, false, Status::Failed},
        {Status::Failed, Call::Finish, true, Status::Failed},
    };
    int number = 0;
    for (const Row& row : table) {
        SCOPED_TRACE("row " + std::to_string(number));
        const auto writer = make(std::to_string(number++) + ".mp4");
        ASSERT_TRUE(writer);
        const auto input = writer->addVideoInput(videoSettings(kWidth, kHeight));
        if (row.before == Status::Failed) finish(*writer);  // nothing was written
        if (row.before == Status::Writing || row.before == Status::Completed) {
            ASSERT_TRUE(writer->startWriting());
            writer->startSession(atSeconds(0));
            ASSERT_TRUE(input->append(pictureAt(0)));
        }
        if (row.before == Status::Completed) finish(*writer);
        ASSERT_EQ(writer->status(), row.before);

        bool answer = true;
        switch (row.call) {
            case Call::AddVideo: answer = writer->addVideoInput(videoSettings(kWidth, kHeight)) != nullptr; break;
            case Call::AddAudio: answer = writer->addAudioInput(audioSettings()) != nullptr; break;
            case Call::Start: answer = writer->startWriting(); break;
            case Call::StartSession: writer->startSession(atSeconds(0)); break;
            case Call::EndSession: writer->endSession(atSeconds(1)); break;
            case Call::Append: answer = input->append(pictureAt(0.5)); break;
            case Call::Finish: finish(*writer); break;
        }
        EXPECT_EQ(answer, row.answer);
        EXPECT_EQ(writer->status(), row.after);
    }
}

INSTANTIATE_TEST_SUITE_P(Fake, ContainerWriterContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeWriterWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, ContainerWriterContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortWriterWorld>(); })));

}  // namespace
}  // namespace lumacast
