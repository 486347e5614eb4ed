#pragma once
// One recording session in a simulation, without the manager: the test is the manager and the delegate.

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include "session/LCRecordingSession.h"
#include "tests/fakes/FakePlane.h"
#include "tests/fakes/FakePlatform.h"

namespace lumacast {

/// Remembers what a session reports.
class RecordingDelegate final : public LCRecordingSessionDelegate {
public:
    void recordingSessionStoppedWithError(const std::shared_ptr<LCRecordingSession>& session,
                                          const std::optional<Error>& error) override {
        wasOnWhenTold |= session->isRecording() || session->isBroadcasting();
        stops.push_back(error ? error->code() : 0);
    }
    void broadcastExtensionFailed(const std::shared_ptr<LCRecordingSession>&,
                                  const std::shared_ptr<LCBroadcastExtensionProxy>&, const Error&) override {}
    void broadcastSessionDidUpdateServiceInfo(const std::shared_ptr<LCRecordingSession>&, const Value& info) override {
        infos.push_back(info);
    }
    void broadcastSessionDidUpdateDuration(LCRecordingSession&, double seconds) override {
        durations.push_back(seconds);
    }

    std::vector<std::int64_t> stops;  ///< the codes of the errors, 0 for none
    std::vector<double> durations;
    std::vector<Value> infos;
    bool wasOnWhenTold = false;  ///< the session still counted as recording or broadcasting when it told of a stop
};

class SessionWorld : public ::testing::Test {
protected:
    static constexpr ContextID kWindow{7};

    SessionWorld() {
        fakes_.bundles.installApplication(id_, "Player");
        tempStore_._srSetupTempDirectory();
        fakes_.displayCapture.setPlanes(1 << 20);
        fakes_.log.setVerbose(true);
        session_ = makeSession();
        fakes_.logSink.clear();
    }
    ~SessionWorld() override { world_.scheduler.endWorld(); }

    std::shared_ptr<LCRecordingSession> makeSession() {
        auto session = std::make_shared<LCRecordingSession>(services_, id_);
        session->setDelegate(delegate_);
        session->setContextIDs({kWindow});
        session->setWindowSize({640, 360});
        return session;
    }

    void onRequestLane(const Task& task) { world_.scheduler.mainQueue().sync(task); }
    void settle() { world_.scheduler.runUntilIdle(); }
    void advance(std::chrono::nanoseconds duration) { world_.scheduler.advance(duration); }

    /// Starts the session as the manager does, up to its first picture.
    void start() {
        onRequestLane([&] {
            session_->setRecording(true);
            session_->startSessionWithHandler([this] { ++startAnswers_; });
        });
        settle();
    }
    void pause() {
        onRequestLane([&] { session_->pauseSession(); });
        settle();
    }
    void resume(ContextID window = kWindow) {
        onRequestLane([&] { session_->resumeSessionWithContextID(window); });
        settle();
    }
    struct Answer {
        int count = 0;
        std::optional<URL> url;
        std::optional<Error> error;
    };
    Answer finish(double startClip = 0, double endClip = 0) {
        auto answer = std::make_shared<Answer>();
        onRequestLane([&] {
            session_->finishSessionWithStartClipDuration(startClip, endClip, [answer](std::optional<URL> url,
                                                                                      std::optional<Error> error) {
                ++answer->count;
                answer->url = std::move(url);
                answer->error = std::move(error);
            });
        });
        settle();
        return *answer;
    }
    int cleanUp() {
        auto answers = std::make_shared<int>(0);
        onRequestLane([&] { session_->finishAndCleanupSessionFilesWithHandler([answers] { ++*answers; }); });
        settle();
        return *answers;
    }

    std::shared_ptr<FakeDisplayCaptureSource> source() { return fakes_.displayCapture.lastSource(); }
    /// A picture of the test's own, given to the session as a capture source would, on the test's thread.
    void deliver(std::int64_t value, std::uint32_t flags = 0) {
        auto plane = std::make_shared<FakePlane>(640, 360, 1, std::vector<PixelRect>{});
        const auto sample = SampleBuffer::makeVideo(PixelBuffer(std::move(plane)), MediaTime::make(value, 600),
                                                    MediaTime::make(10, 600));
        session_->screenCaptureControllerDidReceiveSampleBuffer(*source(), sample, flags);
    }
    FakeRecording& recording() { return *fakes_.containerWriters.lastRecording(); }
    std::vector<std::int64_t> ticks() {
        std::vector<std::int64_t> result;
        const FakeMovie movie = recording().movie();
        for (const SampleRef& sample : movie.tracks.at(0).samples)
            result.push_back(sample->presentationTime().value);
        return result;
    }
    using Ticks = std::vector<std::int64_t>;
    using Lines = std::vector<std::string>;

    std::size_t logged(std::string_view text) { return fakes_.logSink.count(text); }
    std::vector<FakeTelemetry::Event> events() { return fakes_.telemetry.events(); }
    Value metric(const FakeTelemetry::Event& event, std::string_view key) {
        const Value* value = event.payload.find(key);
        return value ? *value : Value("missing");
    }

    SimWorld world_{1};
    FakePlatform& fakes_ = world_.fakes;
    const BundleIdentifier id_{"org.example.Player"};
    TempStore tempStore_{fakes_.platform()};
    Localization localization_{fakes_.bundles};
    RecordingErrors errors_{localization_};
    struct Devices final : CaptureDevices {
        bool hasAudioCaptureDevice() const override { return there; }
        bool there = true;
    } devices_;
    const std::shared_ptr<LCCaptureManager> captureManager_ = LCCaptureManager::init(fakes_.platform());
    const SessionServices services_{fakes_.platform(), tempStore_,       localization_,
                                    errors_,           *captureManager_, &world_.scheduler.mainQueue(),
                                    &devices_};
    const std::shared_ptr<RecordingDelegate> delegate_ = std::make_shared<RecordingDelegate>();
    std::shared_ptr<LCRecordingSession> session_;
    int startAnswers_ = 0;

    const std::string path_ = "/private/var/mobile/Library/Lumacast//Player.mp4";
    const std::string clipPath_ = "/private/var/mobile/Library/Lumacast//Player_trimmed.mp4";
};

}  // namespace lumacast
