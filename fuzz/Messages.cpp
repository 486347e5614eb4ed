// The twenty messages of the clients, with any arguments, in any order, given to the whole daemon over the fakes and
// the simulated scheduler. The input is a story: a byte that seeds the order of the tasks, a byte of circumstances,
// then steps, each a byte that says what (see Story::step) and what that needs.

#include <algorithm>
#include <deque>
#include <set>

#include "base/Utf8.h"
#include "fuzz/Arguments.h"
#include "fuzz/Input.h"
#include "fuzz/Property.h"
#include "tests/fakes/FakeIpcConnection.h"
#include "tests/simulation/SimulatedApplication.h"
#include "tests/simulation/SimulatedDaemon.h"

namespace lumacast::fuzz {

namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

constexpr std::size_t kMaximumSteps = 64;
constexpr std::uint64_t kPlenty = 10'000'000'000;
constexpr double kLargestSide = 1920;

enum Circumstance : unsigned {
    kFaults = 1,          ///< one call of the platform in forty fails
    kMovingScreen = 2,    ///< each frame is a new picture
    kFullResolution = 4,  ///< the preference that lifts the limit of the size
    kAsking = 8,          ///< the preference that suppresses the question is not set: the user is asked
    kEntitled = 16,       ///< the first application may record the whole display
    kTablet = 32,
    kInterleaving = 64,  ///< tasks give way to each other in their midst, which costs a change of threads each time
};

class Story {
public:
    explicit Story(Input in) : in_(in), daemon_(in_.byte()), circumstances_(in_.byte()) {
        players_.emplace_back(fakes(), BundleIdentifier("org.example.Alpha"), "Alpha", ProcessID{500}, ContextID{7});
        players_.emplace_back(fakes(), BundleIdentifier("org.example.Beta"), "Beta", ProcessID{600}, ContextID{8});
        scheduler().setYieldOneIn(is(kInterleaving) ? 8 : 0);
        fakes().fileSystem.setFreeSize(kPlenty);
        fakes().displayCapture.setAutomatic(is(kMovingScreen));
        if (is(kFullResolution)) fakes().preferences.set(kPreferenceDomain, "LCFullResCapture", true);
        if (is(kAsking)) fakes().preferences.set(kPreferenceDomain, "LCSuppressAlert", false);
        if (is(kEntitled)) fakes().ipc.grant(ProcessID{500}, "com.orvane.private.luma-cast", true);
        if (is(kTablet)) {
            fakes().deviceInfo.setUserInterfaceIdiom(1);
            fakes().deviceInfo.setChipID(in_.byte());
            fakes().deviceInfo.setReducedCaptureChipID(3);
        }
        if (is(kFaults)) fakes().faults.failAtRandom(in_.byte(), 1, 40);
        for (SimulatedApplication& player : players_) player.connect();
    }

    void tell() {
        for (std::size_t i = 0; i < kMaximumSteps && !in_.isAtEnd(); ++i) {
            step();
            checkAlways();
        }
        end();
    }

private:
    FakePlatform& fakes() { return daemon_.world.fakes; }
    SimScheduler& scheduler() { return daemon_.world.scheduler; }
    bool is(Circumstance circumstance) const { return (circumstances_ & circumstance) != 0; }

    /// Like advance, but the driver waits: time then moves without a change of threads for everything that is due.
    void pass(std::chrono::nanoseconds duration) {
        (void)scheduler().semaphore(0)->waitFor(duration);
        scheduler().runUntilIdle();
    }

    void step() {
        const unsigned what = in_.byte();
        SimulatedApplication& player = players_[what & 1];
        if (!player.isAlive()) {
            player.startAgain(ProcessID{static_cast<std::int32_t>(1000 + ++incarnation_)});
            player.connect();
            return;
        }
        switch (what >> 1 & 0xF) {
            default: send(player); break;
            case 8: sendRaw(player); break;
            case 9: player.connect(); break;  // again, over the old connection
            case 10: player.die(); break;
            case 11:
            case 12:
                for (unsigned count = in_.byte(); count > 0 && scheduler().step();) --count;
                break;
            case 13: pass(milliseconds(in_.byte() * 2)); break;
            case 14: disturb(); break;
            case 15:
                send(player);
                pass(milliseconds(50));
                break;
        }
    }

    void send(SimulatedApplication& player) {
        constexpr ContextID kWindows[] = {ContextID{7}, ContextID{8}, ContextID{0}};
        const std::uint16_t message = static_cast<std::uint16_t>(in_.below(static_cast<unsigned>(daemonProtocol().messages.size())));
        const MessageDeclaration& declaration = daemonProtocol().messages[message];
        Array arguments = argumentsFor(declaration, kWindows, in_);
        require(matches(arguments, declaration.arguments), "arguments are what the table declares");
        if (declaration.reply == Reply::Expected)
            player.ask(static_cast<DaemonMessage>(message), std::move(arguments));
        else
            player.tell(static_cast<DaemonMessage>(message), std::move(arguments));
    }

    /// What no library sends: any number, any bytes, wanting a reply or not.
    void sendRaw(SimulatedApplication& player) {
        const auto message = static_cast<std::uint16_t>(in_.byte());
        const bool asRequest = in_.flag();
        const Bytes bytes = in_.bytes(in_.byte());
        std::static_pointer_cast<FakeIpcConnection>(player.connection())
            ->sendRaw(message, Data(bytes.begin(), bytes.end()), asRequest);
    }

    /// The device does something.
    void disturb() {
        const unsigned what = in_.byte();
        if (what >= 250) return answerTheQuestion(what % 3);
        const auto source = fakes().displayCapture.lastSource();
        switch (what % 10) {
            case 0: fakes().storagePurge.requestPurge(what / 10 % 5, [](const std::optional<PurgeRecord>&) {}); break;
            case 1: fakes().storagePurge.passDay(); break;
            case 2: fakes().appStateMonitor.setState(players_[what / 10 % 2].identifier, what / 20); break;
            case 3: fakes().fileSystem.setFreeSize(0); break;
            case 4: fakes().fileSystem.setFreeSize(kPlenty); break;
            case 5:
                if (source && source->isRunning()) source->fail(-3);
                break;
            case 6:
                if (source && source->isRunning()) source->preempt();
                break;
            case 7:
                if (source && source->isRunning()) source->mediaServicesWereReset();
                break;
            case 8: fakes().storagePurge.setShortage(what / 10 % 4); break;
            default: fakes().displayCapture.deliverFrames();
        }
    }

    void answerTheQuestion(unsigned button) {
        const auto response = static_cast<UserAlert::Response>(button);
        if (fakes().userAlerts.answer(response) && response != UserAlert::Response::OtherButton) userHasGranted_ = true;
    }

    void checkAlways() {
        require(fakes().userAlerts.standing() <= 1, "the user is asked one thing at a time");
        require(!fakes().keepAlive.endedWithoutBegin(), "a transaction ends once");
        int running = 0;
        for (const auto& source : fakes().displayCapture.sources()) {
            running += source->isRunning() ? 1 : 0;
            require(source->size().width >= 1 && source->size().height >= 1,
                    "a capture source, which keeps its size, has one that a picture can have");
        }
        require(running <= 1, "one application is captured at a time");
        for (const SimulatedApplication& player : players_) {
            for (const auto& asked : player.asked())
                require(asked->answers + asked->failures <= 1, "a request is answered once at most");
            for (const auto& told : player.told())
                require(matches(told.arguments,
                                clientProtocol().messages[static_cast<std::size_t>(told.message)].arguments),
                        "what a client is told is what the table declares");
        }
    }

    /// A clip that could not be made leaves its stop unanswered, and with it its transaction.
    bool anUnansweredClip() const {
        for (const SimulatedApplication& player : players_)
            for (const auto& asked : player.asked())
                if (asked->message == DaemonMessage::StopRecordingWithClipDurations && asked->answers == 0) return true;
        return false;
    }

    void checkNobodyWaits() {
        for (const SimBlockedTask& task : scheduler().blockedTasks())
            require(false, task.lane + " waits for ever for " + task.waitsFor);
    }

    /// What must hold when nothing is under way any more.
    void checkAtRest() {
        const Dictionary snapshot = daemon_.snapshot();
        int recording = 0;
        for (const Value& entry : *snapshot.find("sessions")->as<Array>()) {
            const Dictionary& session = *entry.as<Dictionary>();
            const bool records = *session.find("recording")->as<bool>();
            recording += records ? 1 : 0;
            require(anUnansweredClip() || *session.find("transactionOpen")->as<bool>() == records,
                    "a transaction is open while a recording is, and no longer");
        }
        require(recording <= 1, "one application records at a time");
        require(recording == 0 || !is(kAsking) || userHasGranted_, "nobody records without having been asked");
        require(anUnansweredClip() || fakes().keepAlive.open() == recording,
                "a transaction is open while a recording is, and no longer");
        checkNobodyWaits();
    }

    void checkMovies() {
        for (const auto& recording : fakes().containerWriters.recordings()) {
            for (const FakeTrack& track : recording->movie().tracks) {
                if (track.type != MediaType::Video) continue;
                for (const std::string_view side : {VideoSettings::kWidth, VideoSettings::kHeight}) {
                    const Value* setting = track.settings.find(side);
                    const double length = setting && setting->as<double>() ? *setting->as<double>() : 0;
                    require(length >= 2 && (is(kFullResolution) || length <= kLargestSide),
                            "a movie has a size that a picture can have");
                }
            }
        }
    }

    /// A recording of the whole display outlives its client, and so does the session of one that has ended.
    std::size_t wholeDisplaySessions() {
        const Dictionary snapshot = daemon_.snapshot();
        const Array& sessions = *snapshot.find("sessions")->as<Array>();
        return static_cast<std::size_t>(std::count_if(sessions.begin(), sessions.end(), [](const Value& entry) {
            return *entry.as<Dictionary>()->find("wholeDisplay")->as<bool>();
        }));
    }
    void endSystemRecording() {
        if (wholeDisplaySessions() == 0) return;
        SimulatedApplication& player = players_.front();
        if (!player.isAlive()) player.startAgain(ProcessID{static_cast<std::int32_t>(1000 + ++incarnation_)});
        player.connect();
        player.ask(DaemonMessage::StopRecording);
        pass(milliseconds(300));
    }

    void checkFiles() {
        const std::string folder = fakes().fileSystem.temporaryDirectory() + "/";
        std::set<std::string> allowed;
        for (const char* name : {"Alpha", "Beta"})
            for (const char* ending : {".mp4", "_trimmed.mp4"}) allowed.insert(folder + name + ending);
        for (const std::string& path : fakes().fileSystem.files())
            require(allowed.contains(path) || path.starts_with(folder + "ScreenRecording_"),
                    "no message makes a file with another name");
    }

    /// Nothing stands in the way any more; then everybody goes.
    void end() {
        fakes().faults.clear();
        fakes().fileSystem.setFreeSize(kPlenty);
        pass(milliseconds(300));  // each frame of a recording costs, and nothing takes longer
        // The user refuses whatever is asked still.
        while (fakes().userAlerts.answer(UserAlert::Response::OtherButton)) pass(milliseconds(10));
        checkAlways();
        checkAtRest();
        endSystemRecording();
        for (SimulatedApplication& player : players_) player.die();
        pass(seconds(2));
        checkAlways();
        checkNobodyWaits();
        require(fakes().keepAlive.open() == 0, "no transaction is left open");
        require(fakes().renderServer.portsOpen() == 0, "no port is left open");
        require(daemon_.sessionCount() == wholeDisplaySessions(), "no session is left");
        for (const auto& source : fakes().displayCapture.sources())
            require(!source->isRunning(), "nothing is captured for nobody");
        checkMovies();
        checkFiles();
        for (const std::string& line : fakes().logSink.logged()) require(isValidUtf8(line), "the log is text");
    }

    Input in_;
    SimulatedDaemon daemon_;
    const unsigned circumstances_;
    std::deque<SimulatedApplication> players_;
    int incarnation_ = 0;
    bool userHasGranted_ = false;
};

}  // namespace

void messages(Bytes input) {
    Story(Input(input)).tell();
}

}  // namespace lumacast::fuzz
