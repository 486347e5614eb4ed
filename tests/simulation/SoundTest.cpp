// Applications whose recordings have sound: taps that are retargeted, a microphone that is muted and interrupted, sound
// queues that fail, movies that are saved while the next recording is on, and deaths at any step, in every interleaving
// that a seed gives. LC_SEED=n replays one seed; LC_SEEDS=n runs so many.

#include <gtest/gtest.h>

#include <deque>
#include <map>
#include <set>

#include "tests/simulation/Seeds.h"
#include "tests/simulation/SimulatedApplication.h"
#include "tests/simulation/SimulatedDaemon.h"
#include "tests/simulation/Stillness.h"

namespace lumacast {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;
using Asked = SimulatedApplication::Asked;

constexpr int kBuffer = 20;  // milliseconds
constexpr std::uint8_t kSilence = 0, kVoice = 0x77;

/// This device has a microphone.
class Microphone final : public CaptureDevices {
public:
    bool hasAudioCaptureDevice() const override { return true; }
};

/// What the seeds did all together: a run that goes nowhere proves nothing.
struct Tally {
    int heard = 0, retargeted = 0, voices = 0, muted = 0, saved = 0, notSaved = 0, interruptions = 0, deaths = 0,
        recordedWhileSaving = 0;
    int othersHeard = 0;  ///< buffers of another application after its number was asked for
};

struct Player {
    Player(FakePlatform& machine, const std::string& name, int pid, std::uint32_t window, std::uint8_t tone)
        : application(machine, BundleIdentifier("org.example." + name), name, ProcessID{pid}, ContextID{window}),
          tone(tone) {
        machine.audioInputQueues.play(application.pid(), tone);
    }

    SimulatedApplication application;
    const std::uint8_t tone;     ///< the byte that it plays
    bool askedForOthers = false;  ///< it has named another process's number, so it may hold that sound
    std::vector<std::shared_ptr<Asked>> stops, saves;
};

class Concert {
public:
    Concert(std::uint64_t seed, Tally& tally)
        : daemon_(seed, &microphone_), random_(daemon_.world.scheduler.fork()), tally_(tally) {
        players_.emplace_back(fakes(), "Alpha", 500, 7, std::uint8_t{0x11});
        players_.emplace_back(fakes(), "Beta", 600, 8, std::uint8_t{0x22});
        fakes().audioInputQueues.hearAllTheTime(kBuffer);
        voice_ = daemon_.world.scheduler.timer(daemon_.world.scheduler.serialQueue("somebody who speaks"),
                                               milliseconds(kBuffer), [this] { speak(); });
        // A copy into the library takes its time, and the application records on.
        fakes().photoLibrary.setWhenCopying([this, library = daemon_.world.scheduler.fork()](const URL&) mutable {
            (void)daemon_.world.scheduler.semaphore(0)->waitFor(milliseconds(library.below(1500)));
        });
        faulty_ = random_.below(3) == 0;
        if (faulty_) fakes().faults.failAtRandom(random_.next(), 1, 80);
    }
    ~Concert() {
        daemon_.world.scheduler.endWorld();
        voice_.reset();
    }

    void run() {
        for (Player& player : players_) player.application.connect();
        const std::uint64_t steps = 8 + random_.below(30);
        for (std::uint64_t i = 0; i < steps && !::testing::Test::HasFailure(); ++i) {
            if (random_.below(8) == 0)
                disturb();
            else
                act(players_[random_.below(players_.size())]);
            goOn();
            checkAlways();
        }
        end();
    }
    std::uint64_t traceHash() const { return daemon_.world.scheduler.traceHash(); }
    std::vector<std::string> log() { return fakes().logSink.logged(); }

private:
    FakePlatform& fakes() { return daemon_.world.fakes; }

    void speak() {
        const auto session = fakes().deviceCapture.lastSession();
        const auto clock = fakes().clock.captureClock();
        if (!session || !clock || !clock->isRunning()) return;
        constexpr std::uint32_t kFrames = 44100 * kBuffer / 1000;
        AudioFormat format;
        format.sampleRate = 44100;
        format.formatFlags = 14;
        format.bytesPerPacket = format.bytesPerFrame = 2;
        format.framesPerPacket = format.channelsPerFrame = 1;
        format.bitsPerChannel = 16;
        session->deliver(SampleBuffer::makeAudio(
            format, Data(kFrames * 2, kVoice), kFrames,
            {MediaTime::make(kBuffer, 1000), clock->now(), kInvalidMediaTime}));
    }

    void act(Player& player) {
        SimulatedApplication& application = player.application;
        if (!application.isAlive()) {
            application.startAgain(ProcessID{static_cast<std::int32_t>(1000 + ++incarnation_)});
            fakes().audioInputQueues.play(application.pid(), player.tone);
            application.connect();
            return;
        }
        switch (random_.below(16)) {
            case 0:
            case 1:
            case 2: application.start({application.window}, {.microphone = random_.below(2) == 0}); break;
            case 3: application.tell(DaemonMessage::PauseRecording); break;
            case 4:
            case 5: application.tell(DaemonMessage::ResumeRecording, {number(application.window)}); break;
            case 6:
            case 7: player.stops.push_back(application.ask(DaemonMessage::StopRecording)); break;
            case 8:
                player.stops.push_back(application.ask(DaemonMessage::StopRecordingWithClipDurations, {1.0, 1.0}));
                break;
            case 9: application.ask(DaemonMessage::DiscardRecording); break;
            case 10:
            case 11: retarget(player); break;
            case 12: application.tell(DaemonMessage::SetMicrophoneEnabled, {random_.below(2) == 0}); break;
            case 13:
            case 14: save(player); break;
            default:
                application.die();
                ++tally_.deaths;
        }
    }

    void retarget(Player& player) {
        const Player& other = players_[random_.below(players_.size())];
        std::int64_t pid = other.application.isAlive() ? number(other.application.pid()) : 999;
        if (random_.below(4) == 0) pid = random_.below(2) == 0 ? 0 : -5;
        player.askedForOthers |= &other != &player;
        player.application.tell(DaemonMessage::UpdateProcessIDForAudioCapture, {pid});
        ++tally_.retargeted;
    }

    /// What it was given last, or something that it was never given.
    void save(Player& player) {
        Value movie;
        for (const auto& stop : player.stops)
            if (stop->answers == 1 && stop->values[0].as<URL>()) movie = stop->values[0];
        if (random_.below(6) == 0) movie = Value(URL("file:///home/somebody/else.mp4"));
        player.saves.push_back(player.application.ask(DaemonMessage::SaveVideoToCameraRoll, {movie}));
    }

    void disturb() {
        switch (random_.below(5)) {
            case 0:
            case 1:
                fakes().deviceCapture.sharedAudioSession().interrupt(random_.below(2));
                ++tally_.interruptions;
                break;
            case 2: fakes().deviceCapture.setMicrophone(random_.below(2) == 0); break;
            case 3: fakes().deviceCapture.setAccepts(random_.below(3) != 0); break;
            default:
                for (const auto& source : fakes().displayCapture.sources())
                    if (source->isRunning()) source->fail(-3);
        }
    }

    void goOn() {
        for (std::uint64_t i = random_.below(60); i > 0; --i)
            if (!daemon_.world.scheduler.step()) break;
        if (random_.below(2) == 0) daemon_.world.scheduler.advance(milliseconds(random_.below(1500)));
    }

    void checkAlways() {
        for (const Player& player : players_)
            for (const auto& asked : player.application.asked()) EXPECT_LE(asked->answers + asked->failures, 1);
        expectMoviesInTheirFiles(daemon_);
        if (faulty_) return;
        // The one in use, and one that was replaced and is running dry.
        int running = 0;
        for (const auto& queue : fakes().audioInputQueues.queues()) running += queue->isRunning() ? 1 : 0;
        EXPECT_LE(running, 2);
    }

    /// Whatever happened before, the application can record its own sound, and save the movie.
    void recordOnceMore(Player& player) {
        SimulatedApplication& application = player.application;
        if (!application.isAlive()) return;
        fakes().deviceCapture.setMicrophone(true);
        fakes().deviceCapture.setAccepts(true);
        application.die();  // with what it named and what it holds
        daemon_.world.scheduler.advance(seconds(1));
        application.startAgain(ProcessID{static_cast<std::int32_t>(1000 + ++incarnation_)});
        fakes().audioInputQueues.play(application.pid(), player.tone);
        application.connect();
        daemon_.world.scheduler.advance(milliseconds(100));
        const auto start = application.start({application.window}, {.microphone = true});
        daemon_.world.scheduler.advance(seconds(1));
        ASSERT_EQ(start->answers, 1);
        ASSERT_TRUE(start->values[0].isNull()) << describe(start->values[0]);
        application.tell(DaemonMessage::PauseRecording);
        daemon_.world.scheduler.advance(seconds(2));
        application.tell(DaemonMessage::ResumeRecording, {number(application.window)});
        daemon_.world.scheduler.advance(seconds(1));
        application.tell(DaemonMessage::SetMicrophoneEnabled, {false});
        daemon_.world.scheduler.advance(seconds(1));
        const auto stop = application.ask(DaemonMessage::StopRecording);
        daemon_.world.scheduler.advance(seconds(1));
        ASSERT_EQ(stop->answers, 1);
        const URL* url = stop->values[0].as<URL>();
        ASSERT_TRUE(url);
        const auto movie = fakes().fileSystem.movie(url->path());
        ASSERT_TRUE(movie);
        ASSERT_EQ(movie->tracks.size(), 3u);
        judgeTrack(movie->tracks[1], {player.tone, kSilence}, true);
        EXPECT_NEAR(soundOf(movie->tracks[1], player.tone), 3.0, 0.15);
        judgeTrack(movie->tracks[2], {kVoice, kSilence}, false);
        EXPECT_NEAR(soundOf(movie->tracks[2], kVoice), 2.0, 0.25) << "its microphone was on for so long";
        EXPECT_NEAR(soundOf(movie->tracks[2], kSilence), 1.0, 0.25) << "and then muted";
        if (random_.below(3) == 0) return recordWhileSaving(application, *url);
        const std::size_t before = fakes().photoLibrary.assets().size();
        const auto saved = application.ask(DaemonMessage::SaveVideoToCameraRoll, {*url});
        daemon_.world.scheduler.advance(seconds(2));
        ASSERT_EQ(saved->answers, 1);
        EXPECT_TRUE(saved->values[0].isNull()) << describe(saved->values[0]);
        ASSERT_EQ(fakes().photoLibrary.assets().size(), before + 1);
        const auto asset = fakes().photoLibrary.assets().back();
        EXPECT_EQ(asset.content->tracks.size(), 2u) << "one of the picture, one of all the sound";
        EXPECT_NEAR(asset.content->duration().seconds(), 3.0, 0.15);
        EXPECT_FALSE(fakes().fileSystem.exists(url->path()));
    }

    /// The next recording has the name of the movie that is being saved, and its movie is whole.
    void recordWhileSaving(SimulatedApplication& application, const URL& movie) {
        const auto saved = application.ask(DaemonMessage::SaveVideoToCameraRoll, {movie});
        for (std::uint64_t i = random_.below(60); i > 0; --i)
            if (!daemon_.world.scheduler.step()) break;
        const auto start = application.start();
        daemon_.world.scheduler.advance(seconds(2));
        ASSERT_EQ(start->answers, 1);
        ASSERT_EQ(saved->answers, 1);
        ++tally_.recordedWhileSaving;
        const auto stop = application.ask(DaemonMessage::StopRecording);
        daemon_.world.scheduler.advance(seconds(1));
        ASSERT_EQ(stop->answers, 1);
        const URL* url = stop->values[0].as<URL>();
        const auto next = url ? fakes().fileSystem.movie(url->path()) : nullptr;
        ASSERT_TRUE(next);
        EXPECT_TRUE(next->finished);
        EXPECT_NEAR(next->duration().seconds(), 2.0, 0.15);
    }

    /// Seconds of a byte in a track.
    static double soundOf(const FakeTrack& track, std::uint8_t byte) {
        std::size_t bytes = 0;
        for (const SampleRef& sample : track.samples)
            if (!sample->data()->empty() && sample->data()->front() == byte) bytes += sample->data()->size();
        return static_cast<double>(bytes) / (2 * 44100.0);
    }

    /// In order, without a hole, and nothing in it but what is `allowed`.
    static void judgeTrack(const FakeTrack& track, const std::set<std::uint8_t>& allowed, bool isWhole) {
        std::optional<double> end;
        for (const SampleRef& sample : track.samples) {
            for (const std::uint8_t byte : *sample->data())
                if (!allowed.contains(byte)) {
                    ADD_FAILURE() << "heard " << int{byte};
                    return;
                }
            const double begin = sample->presentationTime().seconds();
            if (end && isWhole) {
                EXPECT_LT(begin - *end, 0.061);
            }
            if (end) {
                EXPECT_GT(begin - *end, -0.03) << "sound over sound";
            }
            end = begin + static_cast<double>(sample->data()->size()) / (2 * 44100.0);
        }
    }

    void judgeMovies() {
        for (const auto& recording : fakes().containerWriters.recordings()) {
            for (const Player& player : players_) {
                if (recording->outputURL().path().find("/" + player.application.name + ".mp4") == std::string::npos)
                    continue;
                const FakeMovie movie = recording->movie();
                std::set<std::uint8_t> allowed{player.tone, kSilence};
                if (player.askedForOthers)
                    for (const Player& other : players_) allowed.insert(other.tone);
                // A finished movie has no track of an application that was not tapped at all.
                for (std::size_t i = 1; i < movie.tracks.size(); ++i) {
                    const bool isVoice = i == 2 || soundOf(movie.tracks[i], kVoice) > 0;
                    judgeTrack(movie.tracks[i], isVoice ? std::set<std::uint8_t>{kVoice, kSilence} : allowed, false);
                }
                if (movie.tracks.size() < 3) continue;
                tally_.heard += soundOf(movie.tracks[1], player.tone) > 0 ? 1 : 0;
                tally_.voices += soundOf(movie.tracks[2], kVoice) > 0 ? 1 : 0;
                tally_.muted += soundOf(movie.tracks[2], kSilence) > 0 ? 1 : 0;
                for (const Player& other : players_)
                    if (&other != &player && soundOf(movie.tracks[1], other.tone) > 0) ++tally_.othersHeard;
            }
        }
    }

    void end() {
        fakes().faults.clear();
        daemon_.world.scheduler.advance(seconds(5));
        expectStillness(daemon_, faulty_);
        if (!faulty_)
            for (Player& player : players_) recordOnceMore(player);
        for (Player& player : players_) {
            for (const auto& save : player.saves) {
                if (save->answers == 1) ++(save->values[0].isNull() ? tally_.saved : tally_.notSaved);
            }
            player.application.die();
        }
        daemon_.world.scheduler.advance(seconds(5));
        // One that refused to be disposed of has no other end.
        if (!faulty_) {
            EXPECT_TRUE(fakes().audioInputQueues.queues().empty()) << "a tap is left";
        }
        EXPECT_EQ(fakes().keepAlive.open(), 0);
        EXPECT_EQ(daemon_.sessionCount(), 0u);
        expectStillness(daemon_, faulty_);
        for (const SimBlockedTask& task : daemon_.world.scheduler.blockedTasks())
            ADD_FAILURE() << task.lane << " waits for " << task.waitsFor;
        // What the disk refused to remove is not tried again: it goes with the old files, a day later.
        for (const std::string& path : fakes().fileSystem.files())
            EXPECT_TRUE(path.find("LCLuma_Final") == std::string::npos || fakes().fileSystem.removalHasFailed(path))
                << path << " is left of a save";
        judgeMovies();
        if (faulty_) return;
        // One that could not be mixed is saved as it is, whatever that is.
        for (const auto& asset : fakes().photoLibrary.assets())
            EXPECT_TRUE(asset.movie.text().find("LCLuma_Final") == std::string::npos ||
                        (asset.content && asset.content->finished))
                << asset.movie.text();
    }

    const Microphone microphone_;
    SimulatedDaemon daemon_;
    SimRandom random_;
    std::deque<Player> players_;
    std::unique_ptr<Timer> voice_;
    Tally& tally_;
    bool faulty_ = false;
    int incarnation_ = 0;
};

TEST(Sound, IsTheApplicationsOwnInAnyOfManySeeds) {
    Tally tally;
    const Seeds seeds(500);
    for (std::uint64_t seed = seeds.first; seed <= seeds.last; ++seed) {
        Seeds::begin(seed);
        SCOPED_TRACE("LC_SEED=" + std::to_string(seed));
        Concert concert(seed, tally);
        concert.run();
        if (HasFailure()) {
            if (!seeds.isOne()) FAIL() << "seed " << seed;
            for (const std::string& line : concert.log()) ADD_FAILURE() << line;
            return;
        }
    }
    if (!seeds.areAllOrdinary()) return;
    // The seeds really went everywhere.
    EXPECT_GT(tally.heard, 100);
    EXPECT_GT(tally.othersHeard, 10);
    EXPECT_GT(tally.retargeted, 100);
    EXPECT_GT(tally.voices, 50);
    EXPECT_GT(tally.muted, 10);
    EXPECT_GT(tally.saved, 50);
    EXPECT_GT(tally.notSaved, 50);
    EXPECT_GT(tally.interruptions, 50);
    EXPECT_GT(tally.recordedWhileSaving, 50);
    EXPECT_GT(tally.deaths, 50);
}

TEST(Sound, ASeedReplaysExactly) {
    for (const std::uint64_t seed : {3u, 77u}) {
        Tally tally;
        Concert once(seed, tally);
        once.run();
        Concert again(seed, tally);
        again.run();
        EXPECT_EQ(once.traceHash(), again.traceHash());
        EXPECT_EQ(once.log(), again.log());
    }
}

}  // namespace
}  // namespace lumacast
