// Every question is answered exactly once, whatever becomes of the daemon and of the recorder.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>

#include <atomic>

#include "base/Limits.h"
#include "broadcast/ConfigurationArchive.h"
#include "linux/ipc/LinuxKeyedArchive.h"
#include "tests/checkers/tests/Child.h"
#include "tests/client/StandInService.h"
#include "tests/client/WaitUntil.h"
#include "tests/contract/RawPeer.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::test {
namespace {

using client::Recorder;
using client::StartAnswer;
using client::StateAnswer;
using client::StopAnswer;
using ::testing::ElementsAre;

class ClientAnswers : public ::testing::Test {
protected:
    std::string runtime() const { return scratch_.path("run"); }
    std::shared_ptr<StandInService> service(StandInService::Answer answer = {}) {
        const auto made = StandInService::make({.runtimeDirectory = runtime()}, std::move(answer));
        made->run();
        return made;
    }
    checkers::Child process(const std::string& kind = "silent") {
        return checkers::Child({LC_STAND_IN_DAEMON, runtime(), kind}, {}, scratch_.path("stand-in.log"));
    }

    ScratchDirectory scratch_;
};

/// One of each question.
struct Questions {
    Answers<StartAnswer> start;
    Answers<StopAnswer> stop, clip;
    Answers<std::optional<Error>> save, discard;
    Answers<StateAnswer> state;

    void askAll(Recorder& recorder) {
        recorder.start({}, start.handler());
        recorder.stop(stop.handler());
        recorder.stopWithClip(1, 1, clip.handler());
        recorder.save(URL::file("/m.mp4"), save.handler());
        recorder.discard(discard.handler());
        recorder.state(state.handler());
    }
    static constexpr int kAll = 6;
    int total() const {
        return start.total() + stop.total() + clip.total() + save.total() + discard.total() + state.total();
    }
    bool eachOnce() const {
        return start.eachOnce() && stop.eachOnce() && clip.eachOnce() && save.eachOnce() && discard.eachOnce() &&
               state.eachOnce();
    }
    void expectAll(const std::string& key) const {
        EXPECT_TRUE(eachOnce());
        EXPECT_EQ(keyIn(start.last().error), key);
        EXPECT_EQ(keyIn(stop.last().error), key);
        EXPECT_EQ(keyIn(clip.last().error), key);
        EXPECT_EQ(keyIn(save.last()), key);
        EXPECT_EQ(keyIn(discard.last()), key);
        EXPECT_EQ(keyIn(state.last().error), key);
    }
};

TEST_F(ClientAnswers, OfAnIdleServiceComeWithTheirValues) {
    const Error declined(std::string(kRecordingErrorDomain), -5801,
                         {{std::string(kLocalizedDescriptionKey), "The user said no."}});
    const Error failed(std::string(kRecordingErrorDomain), -5812);
    const auto daemon = service([&](DaemonMessage message, const Array& arguments, const IpcReply& reply) {
        switch (message) {
            case DaemonMessage::StartRecording: return reply({Value(declined), true, false});
            case DaemonMessage::StopRecording: return reply({URL::file("/m.mp4"), Value()});
            case DaemonMessage::StopRecordingWithClipDurations: return reply({Value(), Value(declined)});
            case DaemonMessage::SaveVideoToCameraRoll:
                return reply({arguments[0] == Value(URL::file("/m.mp4")) ? Value() : Value(failed)});
            case DaemonMessage::DiscardRecording: return reply({});
            case DaemonMessage::SynchronousGetCurrentState:
                return reply({Dictionary{{"isRecording", true}, {"broadcastURL", URL("https://x")}}});
            default: return;
        }
    });
    Recorder recorder({}, runtime());
    const StartAnswer start = recorder.startAndWait({.windows = {ContextID{7}}, .size = {64, 48}, .camera = true});
    ASSERT_TRUE(start.error);
    EXPECT_EQ(client::recordingCodeOf(*start.error), RecordingErrorCode::UserDeclined);
    EXPECT_EQ(client::textOf(*start.error), "The user said no.");
    EXPECT_TRUE(start.microphoneRecording);
    EXPECT_FALSE(start.cameraRecording);
    EXPECT_EQ(recorder.stopAndWait().movie, URL::file("/m.mp4"));
    EXPECT_EQ(keyIn(recorder.stopWithClipAndWait(1, 2).error), "RECORDING_ERROR_USER_DECLINED");
    EXPECT_EQ(recorder.saveAndWait(URL::file("/m.mp4")), std::nullopt);
    EXPECT_EQ(keyIn(recorder.saveAndWait(URL::file("/other.mp4"))), "RECORDING_ERROR_FAILED_TO_SAVE");
    EXPECT_EQ(recorder.discardAndWait(), std::nullopt);
    const StateAnswer state = recorder.stateAndWait();
    ASSERT_TRUE(state.state);
    EXPECT_TRUE(client::recordingState(*state.state).isRecording);
    EXPECT_FALSE(client::recordingState(*state.state).isBroadcasting);
    EXPECT_EQ(client::recordingState(*state.state).broadcastURL, URL("https://x"));

    const auto received = daemon->received();
    ASSERT_EQ(received.size(), 7u);
    EXPECT_EQ(received[0].arguments, (Array{Array{std::uint64_t{7}}, Array{64.0, 48.0}, false, true, false, false,
                                            false, Value()}));
    EXPECT_EQ(received[2].arguments, (Array{1.0, 2.0}));
    EXPECT_EQ(received[3].arguments, (Array{URL::file("/m.mp4")}));
}

TEST_F(ClientAnswers, OfBroadcastsComeWithTheirValues) {
    const Error none(std::string(kRecordingErrorDomain), -5808);
    const auto daemon = service([&](DaemonMessage message, const Array& arguments, const IpcReply& reply) {
        switch (message) {
            case DaemonMessage::SetupBroadcast:
                return reply({arguments[1] == Value("org.example.Uploader.x") ? Value() : Value(none)});
            case DaemonMessage::GetSystemBroadcastExtensionInfo:
                return reply({Array{Dictionary{{"displayName", "Uploader"},
                                               {"extBundleID", "org.example.Uploader"},
                                               {"extAppImgData", Data{1, 2}}},
                                    7, Dictionary{{"extBundleID", "org.example.Nameless"}}},
                              Value(none)});
            case DaemonMessage::GetCurrentBroadcastImages: return reply({Value(), Data{3}});
            default: return;
        }
    });
    Recorder recorder({}, runtime());
    client::BroadcastSetup setup{BundleIdentifier("org.example.Player"), "org.example.Uploader.x",
                                 LCBroadcastConfiguration{2.5, {}}, {{"title", "Game night"}}};
    EXPECT_EQ(recorder.setUpBroadcastAndWait(setup), std::nullopt);
    setup.extension = "org.example.Missing.x";
    EXPECT_EQ(keyIn(recorder.setUpBroadcastAndWait(setup)), "RECORDING_ERROR_INVALID_BROADCAST_SESSION");
    const auto list = recorder.broadcastExtensionsAndWait();
    ASSERT_EQ(list.extensions.size(), 2u);
    EXPECT_EQ(list.extensions[0].displayName, "Uploader");
    EXPECT_EQ(list.extensions[0].identifier, BundleIdentifier("org.example.Uploader"));
    EXPECT_EQ(list.extensions[0].icon, (Data{1, 2}));
    EXPECT_EQ(list.extensions[1].displayName, "");
    EXPECT_TRUE(list.error);
    const auto images = recorder.broadcastImagesAndWait();
    EXPECT_TRUE(images.host.empty());
    EXPECT_EQ(images.extension, Data{3});

    const auto received = daemon->received();
    ASSERT_EQ(received.size(), 4u);
    EXPECT_EQ(received[0].arguments[0], Value("org.example.Player"));
    EXPECT_EQ(received[0].arguments[3], Value(Dictionary{{"title", "Game night"}}));
    LinuxKeyedArchive archives;
    const auto configuration = configurationIn(archives, *received[0].arguments[2].as<Data>());
    ASSERT_TRUE(configuration);
    EXPECT_EQ(configuration->clipDuration, 2.5);
}

TEST_F(ClientAnswers, ComeOnceWhenTheDaemonIsKilled) {
    auto daemon = process();
    ASSERT_EQ(daemon.readLine(), "ready");
    Comings comings;
    Recorder recorder(comings.events(), runtime());
    ASSERT_TRUE(waitUntil([&] { return !comings.all().empty(); }));
    Questions questions;
    questions.askAll(recorder);
    while (daemon.readLine() != "discardRecordingWithHandler:") {}
    EXPECT_EQ(daemon.readLine(), "synchronousGetCurrentState:");
    EXPECT_EQ(questions.total(), 0);
    ::kill(daemon.pid(), SIGKILL);
    ASSERT_TRUE(waitUntil([&] { return questions.total() >= Questions::kAll && comings.all().size() == 2; }));
    questions.expectAll("CONNECTION_ERROR_LOST");
    EXPECT_THAT(comings.all(), ElementsAre("connected", "disconnected"));
}

TEST_F(ClientAnswers, ComeOnceWhenNobodyListens) {
    Comings comings;
    Recorder recorder(comings.events(), runtime());
    Questions questions;
    questions.askAll(recorder);
    ASSERT_TRUE(waitUntil([&] { return questions.total() >= Questions::kAll && !comings.all().empty(); }));
    questions.expectAll("CONNECTION_ERROR_NOT_REACHED");
    EXPECT_THAT(comings.all(), ElementsAre("disconnected"));
}

TEST_F(ClientAnswers, ComeOnceWhenTheSocketIsOneThatNobodyServesAnyMore) {
    std::filesystem::create_directory(runtime());
    {
        const Fd left(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        const sockaddr_un address = socketAddress(runtime() + "/com.orvane.lumacastd.sock");
        ASSERT_EQ(bind(left.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    }
    Recorder recorder({}, runtime());
    Questions questions;
    questions.askAll(recorder);
    ASSERT_TRUE(waitUntil([&] { return questions.total() >= Questions::kAll; }));
    questions.expectAll("CONNECTION_ERROR_NOT_REACHED");
}

TEST_F(ClientAnswers, ComeOnceBeforeTheRecorderIsGone) {
    const auto daemon = service();
    Questions questions;
    {
        Recorder recorder({}, runtime());
        questions.askAll(recorder);
        ASSERT_TRUE(waitUntil([&] { return daemon->received().size() == Questions::kAll; }));
        EXPECT_EQ(questions.total(), 0);
    }
    questions.expectAll("CONNECTION_ERROR_CLOSED");
}

TEST_F(ClientAnswers, ComeOnceBeforeTheRecorderIsGoneThatWasNeverConnected) {
    for (int round = 0; round < 50; ++round) {
        Questions questions;
        {
            Recorder recorder({}, runtime());
            questions.askAll(recorder);
        }
        ASSERT_TRUE(questions.eachOnce()) << round;
    }
}

TEST_F(ClientAnswers, ComeBeforeTheRecorderIsGoneEvenWhenAHandlerDestroysIt) {
    const auto daemon = service([](DaemonMessage message, const Array&, const IpcReply& reply) {
        if (message == DaemonMessage::DiscardRecording) reply({});
    });
    auto recorder = std::make_unique<Recorder>(client::Events(), runtime());
    Questions questions;
    std::atomic<int> before{-1}, after{-1};
    recorder->stop(questions.stop.handler());
    recorder->discard([&](const std::optional<Error>&) {
        before = questions.stop.total() + questions.state.total();
        recorder->state(questions.state.handler());
        recorder.reset();
        after = questions.stop.total() + questions.state.total();
    });
    ASSERT_TRUE(waitUntil([&] { return after >= 0; }));
    EXPECT_EQ(before, 0);
    EXPECT_EQ(after, 2) << "answered before the destructor returned";
    EXPECT_EQ(keyIn(questions.state.last().error), "CONNECTION_ERROR_CLOSED");
}

TEST_F(ClientAnswers, ThatAHandlerAsksForWhileTheRecorderGoesComeToo) {
    const auto daemon = service();
    Questions questions;
    {
        Recorder recorder({}, runtime());
        recorder.stop([&](const StopAnswer&) { recorder.state(questions.state.handler()); });
        ASSERT_TRUE(waitUntil([&] { return daemon->hasReceived(DaemonMessage::StopRecording); }));
    }
    EXPECT_EQ(questions.state.counts(), std::vector<int>{1});
}

TEST_F(ClientAnswers, ThatTheDaemonGivesTwiceCountOnce) {
    const auto daemon = service([](DaemonMessage message, const Array&, const IpcReply& reply) {
        if (message == DaemonMessage::StopRecording)
            for (int i = 0; i < 2; ++i) reply({Value(), Value()});
        if (message == DaemonMessage::SynchronousGetCurrentState) reply({Dictionary()});
    });
    Recorder recorder({}, runtime());
    Questions questions;
    recorder.stop(questions.stop.handler());
    EXPECT_FALSE(recorder.stateAndWait().error);
    EXPECT_EQ(questions.stop.counts(), std::vector<int>{1});
}

TEST_F(ClientAnswers, AreErrorsAtOnceWhenTooManyWait) {
    std::vector<IpcReply> kept;
    const auto daemon = service([&](DaemonMessage, const Array&, const IpcReply& reply) { kept.push_back(reply); });
    Recorder recorder({}, runtime());
    ASSERT_TRUE(waitUntil([&] { return daemon->connections() == 1; }));
    Answers<StopAnswer> stops;
    for (std::size_t i = 0; i < 100; ++i) recorder.stop(stops.handler(i));
    ASSERT_TRUE(waitUntil([&] { return stops.total() >= 36; }));
    EXPECT_EQ(keyIn(stops.last().error), "CONNECTION_ERROR_BUSY");
}

TEST_F(ClientAnswers, ThatNeverComeTakeNoPlaceAndAreErrorsOnceWhenTheDaemonIsKilled) {
    auto daemon = process("serving");
    ASSERT_EQ(daemon.readLine(), "ready");
    Comings comings;
    Recorder recorder(comings.events(), runtime());
    ASSERT_TRUE(waitUntil([&] { return !comings.all().empty(); }));
    Answers<std::optional<Error>> discards;
    for (std::size_t i = 0; i < 1000; ++i) {
        recorder.discard(discards.handler(i));
        if (i % 50 != 49) continue;
        ASSERT_FALSE(recorder.stateAndWait().error) << i;
        while (daemon.readLine() != "synchronousGetCurrentState:") {}
    }
    EXPECT_EQ(discards.total(), 0);
    ::kill(daemon.pid(), SIGKILL);
    ASSERT_TRUE(waitUntil([&] { return discards.total() >= 1000 && comings.all().size() == 2; }));
    EXPECT_TRUE(discards.eachOnce());
    EXPECT_EQ(keyIn(discards.last()), "CONNECTION_ERROR_LOST");
}

TEST_F(ClientAnswers, ThatNeverComeAreNoneForTheOldestOfTooMany) {
    const auto daemon = service([](DaemonMessage message, const Array&, const IpcReply& reply) {
        if (message == DaemonMessage::SynchronousGetCurrentState) reply({Dictionary()});
    });
    Answers<std::optional<Error>> oldest, others;
    {
        Recorder recorder({}, runtime());
        recorder.discard(oldest.handler());
        for (std::size_t i = 0; i < limitOf(Limit::RequestsWithoutReply); ++i) {
            if (i % 50 == 0) { ASSERT_FALSE(recorder.stateAndWait().error) << i; }
            EXPECT_EQ(oldest.total(), 0);
            recorder.discard(others.handler(i));
        }
        ASSERT_TRUE(waitUntil([&] { return oldest.total() > 0; }));
        EXPECT_EQ(keyIn(oldest.last()), "CONNECTION_ERROR_NO_ANSWER");
        EXPECT_FALSE(recorder.stateAndWait().error);
        EXPECT_EQ(others.total(), 0);
    }
    EXPECT_TRUE(oldest.eachOnce());
    EXPECT_TRUE(others.eachOnce());
    EXPECT_EQ(keyIn(others.last()), "CONNECTION_ERROR_CLOSED");
}

TEST_F(ClientAnswers, AreErrorsWhenTheRequestCannotBeSent) {
    const auto daemon = service();
    Recorder recorder({}, runtime());
    client::StartOptions options;
    options.windows.resize(65);
    EXPECT_EQ(keyIn(recorder.startAndWait(options).error), "CONNECTION_ERROR_UNSENDABLE");
    EXPECT_TRUE(daemon->received().empty());
}

TEST_F(ClientAnswers, ThatDoNotComeEndACallThatWaits) {
    const auto daemon = service();
    Recorder recorder({}, runtime());
    constexpr std::chrono::milliseconds kSoon{30};
    EXPECT_EQ(keyIn(recorder.stopAndWait(kSoon).error), "CONNECTION_ERROR_NO_ANSWER");
    EXPECT_EQ(keyIn(recorder.stopWithClipAndWait(1, 1, kSoon).error), "CONNECTION_ERROR_NO_ANSWER");
    EXPECT_EQ(keyIn(recorder.saveAndWait(URL::file("/m.mp4"), kSoon)), "CONNECTION_ERROR_NO_ANSWER");
    EXPECT_EQ(keyIn(recorder.discardAndWait(kSoon)), "CONNECTION_ERROR_NO_ANSWER");
    EXPECT_EQ(keyIn(recorder.startAndWait({}, kSoon).error), "CONNECTION_ERROR_NO_ANSWER");
    EXPECT_EQ(keyIn(recorder.stateAndWait(kSoon).error), "CONNECTION_ERROR_NO_ANSWER");
}

TEST_F(ClientAnswers, AreNotWaitedForInAHandler) {
    const auto daemon = service([](DaemonMessage, const Array&, const IpcReply& reply) { reply({Dictionary()}); });
    Recorder recorder({}, runtime());
    Answers<StateAnswer> inner;
    recorder.state([&, handler = inner.handler()](const StateAnswer&) { handler(recorder.stateAndWait()); });
    ASSERT_TRUE(waitUntil([&] { return inner.total() == 1; }));
    EXPECT_EQ(keyIn(inner.last().error), "CONNECTION_ERROR_WOULD_BLOCK");
}

TEST_F(ClientAnswers, NeverComeFromWithinTheQuestion) {
    Recorder recorder({}, runtime());
    std::atomic<bool> asking{true}, inline_{false}, done{false};
    recorder.state([&](const StateAnswer&) {
        recorder.state([&](const StateAnswer&) {
            inline_ = asking.load();
            done = true;
        });
        asking = false;
    });
    ASSERT_TRUE(waitUntil([&] { return done.load(); }));
    EXPECT_FALSE(inline_);
}

TEST_F(ClientAnswers, EachMessageReachesTheDaemonAsWhatItIs) {
    const auto daemon = service([](DaemonMessage, const Array&, const IpcReply& reply) {
        if (reply) reply({Dictionary()});
    });
    Recorder recorder({}, runtime());
    recorder.pause();
    recorder.resume(ContextID{9});
    recorder.setMicrophoneEnabled(true);
    recorder.setProcessForAudioCapture(ProcessID{4711});
    recorder.didBecomeActive();
    recorder.didResignActive();
    recorder.setHasUserConsentForCamera(true);
    recorder.setHasUserConsentForMicrophone(false);
    recorder.setBroadcastURL(URL("https://x"));
    recorder.setBroadcastURL(std::nullopt);
    recorder.setMicrophoneEnabledPersistent(true);
    recorder.reportCameraUsage(-3);
    EXPECT_FALSE(recorder.stateAndWait().error);
    const std::vector<std::pair<DaemonMessage, Array>> expected{
        {DaemonMessage::PauseRecording, {}},
        {DaemonMessage::ResumeRecording, {std::uint64_t{9}}},
        {DaemonMessage::SetMicrophoneEnabled, {true}},
        {DaemonMessage::UpdateProcessIDForAudioCapture, {std::int64_t{4711}}},
        {DaemonMessage::ClientDidBecomeActive, {}},
        {DaemonMessage::ClientDidResignActive, {}},
        {DaemonMessage::SetHasUserConsentForCamera, {true}},
        {DaemonMessage::SetHasUserConsentForMicrophone, {false}},
        {DaemonMessage::SetBroadcastURL, {URL("https://x")}},
        {DaemonMessage::SetBroadcastURL, {Value()}},
        {DaemonMessage::SetMicrophoneEnabledPersistent, {true}},
        {DaemonMessage::ReportCameraUsage, {std::int64_t{-3}}},
        {DaemonMessage::SynchronousGetCurrentState, {}},
    };
    const auto received = daemon->received();
    ASSERT_EQ(received.size(), expected.size());
    for (std::size_t i = 0; i < expected.size(); ++i) {
        EXPECT_EQ(received[i].message, expected[i].first) << i;
        EXPECT_EQ(received[i].arguments, expected[i].second) << i;
    }
}

}  // namespace
}  // namespace lumacast::test
