// What the daemon says by itself, and what it must not be able to say.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/socket.h>

#include <cstring>
#include <random>

#include "tests/client/StandInService.h"
#include "tests/client/WaitUntil.h"
#include "tests/contract/RawPeer.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::test {
namespace {

using client::AudioSample;
using client::Recorder;
using client::VideoSample;
using ::testing::ElementsAre;

template <class Record>
Data bytesOf(const Record& record) {
    Data bytes(sizeof record);
    std::memcpy(bytes.data(), &record, sizeof record);
    return bytes;
}

SampleTiming timingAt(std::int64_t milliseconds) {
    return {MediaTime::make(20, 1000), MediaTime::make(milliseconds, 1000), kInvalidMediaTime};
}

class Plane final : public SharedPlane {
public:
    Plane() : memory_(planeMemory(4 * 8 * 2, F_SEAL_SHRINK | F_SEAL_GROW)) {}
    std::int32_t width() const override { return 8; }
    std::int32_t height() const override { return 2; }
    std::size_t stride() const override { return 32; }
    std::span<const std::uint8_t> pixels() const override { return {}; }
    std::span<const PixelRect> damage() const override { return {}; }
    std::uint64_t pictureNumber() const override { return 5; }
    int descriptor() const override { return memory_.get(); }

private:
    Fd memory_;
};

/// A line for each event that came.
class Heard {
public:
    client::Events events() {
        client::Events events;
        events.recordingStateChanged = [this](bool on) { add(on ? "on" : "off"); };
        events.stopped = [this](const std::optional<Error>& error, const std::optional<URL>& movie) {
            add("stopped " + keyIn(error) + " " + (movie ? movie->path() : "no movie"));
        };
        events.broadcastServiceInfo = [this](const Value& info) { add("info " + describe(info)); };
        events.broadcastURL = [this](const std::optional<URL>& url) { add("url " + (url ? url->text() : "none")); };
        events.videoSample = [this](const VideoSample& sample) {
            add("video " + std::to_string(sample.timing.presentation.value) +
                (sample.plane ? " " + std::to_string(sample.plane->width()) + "x" +
                                    std::to_string(sample.plane->height())
                              : " without picture"));
        };
        events.audioSample = [this](const AudioSample& sample) {
            add((sample.source == AudioSample::Source::Microphone ? "microphone " : "sound ") +
                std::to_string(sample.format.sampleRate) + " " + std::to_string(sample.bytes.size()) + " " +
                std::to_string(sample.frames) + " " + std::to_string(sample.timing.presentation.value));
        };
        events.interrupted = [this](const Value& details) { add("interrupted " + describe(details)); };
        events.timerUpdated = [this](const Value& elapsed) { add("timer " + describe(elapsed)); };
        return events;
    }
    std::vector<std::string> all() const {
        const std::lock_guard lock(mutex_);
        return lines_;
    }

private:
    void add(std::string line) {
        const std::lock_guard lock(mutex_);
        lines_.push_back(std::move(line));
    }
    mutable std::mutex mutex_;
    std::vector<std::string> lines_;
};

class ClientEvents : public ::testing::Test {
protected:
    ClientEvents() {
        daemon_ = StandInService::make({.runtimeDirectory = scratch_.path("run")},
                                       [](DaemonMessage message, const Array&, const IpcReply& reply) {
                                           if (message == DaemonMessage::StartRecording)
                                               return reply({Value(), false, false});
                                           if (reply) reply({Dictionary()});
                                       });
        daemon_->run();
        recorder_ = std::make_unique<Recorder>(heard_.events(), scratch_.path("run"));
        (void)recorder_->stateAndWait();
    }
    /// All that was told has been heard once an answer that was asked for later has come.
    std::vector<std::string> heard() {
        (void)recorder_->stateAndWait();
        return heard_.all();
    }

    ScratchDirectory scratch_;
    Heard heard_;
    std::shared_ptr<StandInService> daemon_;
    std::unique_ptr<Recorder> recorder_;
};

TEST_F(ClientEvents, EachOfTheEightMessagesIsToldAsWhatItIs) {
    const Error full(std::string(kRecordingErrorDomain), -5805);
    AudioFormat format;
    format.sampleRate = 48000;
    daemon_->tell(ClientMessage::UpdateScreenRecordingState, {true});
    daemon_->tell(ClientMessage::StopRecordingWithError, {Value(full), URL::file("/m.mp4")});
    daemon_->tell(ClientMessage::StopRecordingWithError, {Value(), Value()});
    daemon_->tell(ClientMessage::UpdateBroadcastServiceInfo, {Dictionary{{"viewers", 3}}});
    daemon_->tell(ClientMessage::UpdateBroadcastURL, {URL("https://x")});
    daemon_->tell(ClientMessage::UpdateBroadcastURL, {Value()});
    daemon_->tell(ClientMessage::CaptureHandlerWithSample,
                  {Value(std::shared_ptr<SharedPlane>(std::make_shared<Plane>())), bytesOf(timingAt(40))});
    daemon_->tell(ClientMessage::CaptureHandlerWithSample, {Value(), bytesOf(timingAt(60))});
    daemon_->tell(ClientMessage::CaptureHandlerWithAudioSample,
                  {Data(960), bytesOf(format), std::int64_t{480}, std::int64_t{2}, bytesOf(timingAt(7))});
    daemon_->tell(ClientMessage::CaptureHandlerWithAudioSample,
                  {Data(4), bytesOf(format), std::int64_t{1}, std::int64_t{3}, bytesOf(timingAt(8))});
    daemon_->tell(ClientMessage::RecordingLockInterrupted, {"locked"});
    daemon_->tell(ClientMessage::RecordingTimerDidUpdate, {12.5});
    EXPECT_THAT(heard(),
                ElementsAre("on", "stopped RECORDING_ERROR_INSUFFICIENT_STORAGE /m.mp4", "stopped no error no movie",
                            "info " + describe(Dictionary{{"viewers", 3}}), "url https://x", "url none",
                            "video 40 8x2", "video 60 without picture", "sound 48000.000000 960 480 7",
                            "microphone 48000.000000 4 1 8", "interrupted " + describe(Value("locked")),
                            "timer " + describe(Value(12.5))));
}

TEST_F(ClientEvents, APictureThatIsRepeatedWithItsStampIsToldOnceUnlessARecordingBegan) {
    for (const std::int64_t at : {0, 20, 20, 40})
        daemon_->tell(ClientMessage::CaptureHandlerWithSample, {Value(), bytesOf(timingAt(at))});
    EXPECT_EQ(heard().size(), 3u);
    (void)recorder_->startAndWait({});
    for (const std::int64_t at : {40, 40})
        daemon_->tell(ClientMessage::CaptureHandlerWithSample, {Value(), bytesOf(timingAt(at))});
    EXPECT_EQ(heard().size(), 4u);
}

TEST_F(ClientEvents, SamplesWithRecordsOfTheWrongSizeAreDropped) {
    const Data timing = bytesOf(timingAt(0)), format = bytesOf(AudioFormat());
    for (const std::size_t size : {0u, 71u, 73u, 4000u})
        daemon_->tell(ClientMessage::CaptureHandlerWithSample, {Value(), Data(size)});
    daemon_->tell(ClientMessage::CaptureHandlerWithAudioSample,
                  {Data(), Data(39), std::int64_t{0}, std::int64_t{2}, timing});
    daemon_->tell(ClientMessage::CaptureHandlerWithAudioSample,
                  {Data(), format, std::int64_t{0}, std::int64_t{2}, Data(71)});
    daemon_->tell(ClientMessage::CaptureHandlerWithAudioSample,
                  {Data(), format, std::int64_t{0}, std::int64_t{1}, timing});
    EXPECT_THAT(heard(), ElementsAre());
}

TEST_F(ClientEvents, ThatNobodyWantsAreNoHarm) {
    recorder_ = std::make_unique<Recorder>(client::Events(), scratch_.path("run"));
    (void)recorder_->stateAndWait();
    daemon_->tell(ClientMessage::UpdateScreenRecordingState, {true});
    daemon_->tell(ClientMessage::StopRecordingWithError, {Value(), Value()});
    daemon_->tell(ClientMessage::CaptureHandlerWithSample, {Value(), bytesOf(timingAt(0))});
    daemon_->tell(ClientMessage::RecordingTimerDidUpdate, {12.5});
    EXPECT_FALSE(recorder_->stateAndWait().error);
}

TEST_F(ClientEvents, AHandlerMayDestroyTheRecorder) {
    std::atomic<int> told{0};
    client::Events events;
    events.stopped = [&](const std::optional<Error>&, const std::optional<URL>&) {
        recorder_.reset();
        ++told;
    };
    recorder_.reset();
    recorder_ = std::make_unique<Recorder>(std::move(events), scratch_.path("run"));
    (void)recorder_->stateAndWait();
    for (int i = 0; i < 3; ++i) daemon_->tell(ClientMessage::StopRecordingWithError, {Value(), Value()});
    ASSERT_TRUE(waitUntil([&] { return told >= 1; }));
    EXPECT_EQ(told, 1) << "nothing is told after it is gone";
}

/// A daemon that speaks bytes of the test's choice.
class HostileDaemon {
public:
    explicit HostileDaemon(const std::string& runtime) : listening_(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        std::filesystem::create_directory(runtime);
        const sockaddr_un address = socketAddress(runtime + "/com.orvane.lumacastd.sock");
        EXPECT_EQ(bind(listening_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        EXPECT_EQ(listen(listening_.get(), 16), 0);
    }
    RawPeer accept() {
        pollfd wait{listening_.get(), POLLIN, 0};
        EXPECT_EQ(::poll(&wait, 1, 60'000), 1);
        return RawPeer(Fd(::accept(listening_.get(), nullptr, nullptr)));
    }

private:
    Fd listening_;
};

/// The answer to the connection's first question.
Data firstAnswer() {
    return rawFrame(messageHeader(FrameKind::Reply, 0, 1), encoded(Value(Array{Dictionary()})));
}

TEST(ClientOfAHostileDaemon, AnswersEachQuestionOnceWhateverIsSaid) {
    const ScratchDirectory scratch;
    HostileDaemon daemon(scratch.path("run"));
    const auto message = [](std::uint16_t number, const Value& arguments, std::uint64_t sequence = 1) {
        return rawFrame(messageHeader(FrameKind::Message, number, sequence), encoded(arguments));
    };
    const auto reply = [](std::uint64_t to, const Value& values) {
        return rawFrame(messageHeader(FrameKind::Reply, 0, to), encoded(values));
    };
    const auto both = [](Data first, const Data& second) {
        first.insert(first.end(), second.begin(), second.end());
        return first;
    };
    const auto twice = [&](const Data& bytes) { return both(bytes, bytes); };
    FrameHeader vast = messageHeader(FrameKind::Message, 0, 1);
    vast.valueBytes = 0xFFFFFFFF;
    Value deep = Array();
    for (int i = 0; i < 40; ++i) deep = Array{deep};
    Data half = message(1, Array{Value(), Value()});
    half.resize(half.size() - 3);
    struct Said {
        const char* what;
        bool greets;
        Data bytes;
        const char* key;
    };
    const std::vector<Said> said{
        {"no hello", false, Data(64, 'x'), "CONNECTION_ERROR_NOT_REACHED"},
        {"zeros for frames", true, Data(200), "CONNECTION_ERROR_NOT_REACHED"},
        {"a vast frame", true, rawFrame(vast, {}, {}, true), "CONNECTION_ERROR_NOT_REACHED"},
        {"half a frame", true, half, "CONNECTION_ERROR_NOT_REACHED"},
        {"an unknown message", true, message(999, Array()), "CONNECTION_ERROR_NOT_REACHED"},
        {"arguments of other types", true, message(0, Array{"yes"}), "CONNECTION_ERROR_NOT_REACHED"},
        {"too few arguments", true, message(1, Array()), "CONNECTION_ERROR_NOT_REACHED"},
        {"a value too deep", true, message(7, Array{deep}), "CONNECTION_ERROR_NOT_REACHED"},
        {"a message out of sequence", true, message(0, Array{true}, 9), "CONNECTION_ERROR_NOT_REACHED"},
        {"a reply to nothing", true, reply(77, Array()), "CONNECTION_ERROR_NOT_REACHED"},
        {"a plane given back that was not lent", true, rawFrame(messageHeader(FrameKind::PlaneReturned, 0, 3), {}),
         "CONNECTION_ERROR_NOT_REACHED"},
        {"a wrong first answer", true, reply(1, Array{12}), "CONNECTION_ERROR_NOT_REACHED"},
        {"a stop's answer of other types", true, reply(2, Array{true, false}), "CONNECTION_ERROR_BAD_ANSWER"},
        {"twice that there is no answer", true, twice(rawFrame(messageHeader(FrameKind::NoReply, 0, 2), {})),
         "CONNECTION_ERROR_NOT_REACHED"},
        {"an answer after it said that there is none", true,
         both(rawFrame(messageHeader(FrameKind::NoReply, 0, 2), {}), reply(2, Array{Value(), Value()})),
         "CONNECTION_ERROR_NOT_REACHED"},
        {"no answer to what was not asked", true, rawFrame(messageHeader(FrameKind::NoReply, 0, 3), {}),
         "CONNECTION_ERROR_NOT_REACHED"},
        {"that there is no answer", true, rawFrame(messageHeader(FrameKind::NoReply, 9999, 2), {}),
         "CONNECTION_ERROR_BAD_ANSWER"},
    };
    for (const Said& one : said) {
        SCOPED_TRACE(one.what);
        Answers<client::StopAnswer> stop;
        Recorder recorder({}, scratch.path("run"));
        recorder.stop(stop.handler());
        RawPeer peer = daemon.accept();
        // Both of its questions are here.
        EXPECT_EQ(peer.read(kHelloBytes + 2 * kFrameHeaderBytes).size(), kHelloBytes + 2 * kFrameHeaderBytes);
        if (one.greets) {
            EXPECT_TRUE(peer.hello());
        }
        EXPECT_TRUE(peer.send(one.bytes));
        if (std::strcmp(one.what, "half a frame") == 0) peer.close();
        ASSERT_TRUE(waitUntil([&] { return stop.total() >= 1; }));
        EXPECT_EQ(keyIn(stop.last().error), one.key);
        EXPECT_TRUE(stop.eachOnce());
    }
}

TEST(ClientOfAHostileDaemon, SurvivesNoise) {
    const ScratchDirectory scratch;
    HostileDaemon daemon(scratch.path("run"));
    std::mt19937 random(20260704);
    const auto number = [&](std::uint32_t below) { return static_cast<std::uint32_t>(random() % below); };
    for (int round = 0; round < 300; ++round) {
        SCOPED_TRACE(round);
        Answers<client::StopAnswer> stop;
        {
            Heard heard;
            Recorder recorder(heard.events(), scratch.path("run"));
            recorder.stop(stop.handler());
            RawPeer peer = daemon.accept();
            EXPECT_TRUE(peer.hello());
            Data bytes = firstAnswer();
            for (std::uint64_t sequence = 1; sequence <= 8; ++sequence) {
                // Frames with good headers and noise in the value; some bits of all of it flipped at the end.
                Data value(number(120));
                for (std::uint8_t& byte : value) byte = static_cast<std::uint8_t>(number(256));
                if (number(2) == 0) value = encoded(Value(Array{Value(), Value()}));
                const auto kind = static_cast<FrameKind>(1 + number(5));
                const Data frame =
                    rawFrame(messageHeader(kind, static_cast<std::uint16_t>(number(9)), 1 + number(8)), value);
                bytes.insert(bytes.end(), frame.begin(), frame.end());
            }
            for (std::uint32_t flips = number(4); flips > 0; --flips)
                bytes[number(static_cast<std::uint32_t>(bytes.size()))] ^= static_cast<std::uint8_t>(1u << number(8));
            (void)peer.send(bytes);
            peer.close();
            ASSERT_TRUE(waitUntil([&] { return stop.total() >= 1; }));
        }
        EXPECT_TRUE(stop.eachOnce());
    }
}

}  // namespace
}  // namespace lumacast::test
