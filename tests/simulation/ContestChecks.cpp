// What must hold in a contest, always and when it has come to rest.

#include <gtest/gtest.h>

#include <algorithm>
#include <set>

#include "tests/simulation/Contest.h"
#include "tests/simulation/JudgePictures.h"
#include "tests/simulation/Stillness.h"

namespace lumacast {

using std::chrono::milliseconds;
using std::chrono::seconds;

bool Contest::aStartIsOpen(const Player& player) {
    return std::any_of(player.starts.begin(), player.starts.end(),
                       [](const auto& start) { return start->answers + start->failures == 0; });
}

void Contest::checkAlways() {
    EXPECT_FALSE(fakes().keepAlive.endedWithoutBegin());
    const auto sources = fakes().displayCapture.sources();
    EXPECT_LE(std::count_if(sources.begin(), sources.end(), [](const auto& source) { return source->isRunning(); }),
              1)
        << "two applications are captured at a time";
    expectMoviesInTheirFiles(daemon_);
    checkWindows();
    EXPECT_LE(fakes().userAlerts.standing(), 1u) << "the user is asked two things at a time";
    for (Player& player : players_) {
        checkForbidden(player);
        for (const auto& asked : player.application.asked()) {
            EXPECT_LE(asked->answers + asked->failures, 1)
                << daemonProtocol().messages[static_cast<std::size_t>(asked->message)].name;
        }
        checkTold(player);
        if (!player.application.isAlive()) {
            EXPECT_EQ(player.application.told().size(), player.toldWhenItDied) << "told after its death";
        }
    }
}

void Contest::checkTold(const Player& player) {
    // Who loses its recording to another start hears why, and its movie is not handed out.
    std::multiset<std::string> kept;
    for (const auto& told : player.application.told()) {
        ASSERT_EQ(told.message, ClientMessage::StopRecordingWithError);
        const Error* error = told.arguments[0].asError();
        const URL* url = told.arguments[1].as<URL>();
        if (!error) {
            // But to one that the user let begin meanwhile: then without an error, and with its movie.
            EXPECT_TRUE(url);
            if (url) kept.insert(url->path());
            ++tally_.interrupted;
        } else if (error->code() == -5806 && url) {
            // It hears of that movie once more when it becomes active.
            const auto found = kept.find(url->path());
            ASSERT_TRUE(found != kept.end()) << url->path();
            kept.erase(found);
        } else if (error->code() != -5816) {  // that was its own doing: it has the movie
            EXPECT_FALSE(url);
        }
    }
}

void Contest::checkForbidden(Player& player) {
    std::erase_if(player.forbidden, [&](const ContestPlayer::Forbidden& forbidden) {
        const bool isStill = forbidden.changes == ContestPlayer::kNever || forbidden.changes == changes_;
        if (!isStill || forbidden.start->failures > 0) return true;
        if (forbidden.start->answers == 0) return false;
        EXPECT_TRUE(forbidden.start->values[0].asError()) << player.application.name << " may record though "
                                                          << forbidden.why;
        return true;
    });
}

void Contest::checkStops(const Player& player) {
    const std::string& name = player.application.name;
    for (const auto& stop : player.stops) {
        const URL* url = stop->answers == 1 ? stop->values[0].as<URL>() : nullptr;
        if (!url) continue;
        const std::string path = url->path();
        EXPECT_TRUE(path.ends_with("/" + name + ".mp4") || path.ends_with("/" + name + "_trimmed.mp4") ||
                    (isPrivileged(player) && path.find("/ScreenRecording_") != std::string::npos))
            << name << " is handed " << path;
    }
    if (faulty_ || diskWasFull_ || !player.application.isAlive()) return;
    for (const ContestPlayer::Awaited& awaited : player.awaited) {
        if (awaited.connection != player.application.firstOfConnection()) continue;
        EXPECT_TRUE(awaited.stop->answers == 1 || player.application.told().size() > awaited.told)
            << "a stop of " << name << " is not answered";
    }
}

void Contest::checkWindows() {
    if (fakes().displayCloneControl.mode() != DisplayCloneControl::kCloneContexts) return;
    for (const Player& player : players_) {
        const auto session = daemon_.process->manager().registeredSession(player.application.identifier);
        const auto source = session ? session->screenCaptureController() : nullptr;
        const auto* fake = dynamic_cast<const FakeDisplayCaptureSource*>(source.get());
        if (!fake || !fake->isRunning()) continue;
        for (const ContextID window : fakes().displayCloneControl.contexts())
            for (const Player& other : players_)
                EXPECT_TRUE(&other == &player || other.application.window != window)
                    << player.application.name << " records a window of " << other.application.name;
    }
}

void Contest::checkAtRest() {
    std::set<std::string> connected;
    bool anUnansweredClip = false;
    for (const Player& player : players_) {
        const auto& all = player.application.asked();
        for (std::size_t i = player.application.firstOfConnection(); i < all.size(); ++i) {
            const auto& asked = all[i];
            if (!player.application.isAlive() || (asked->message != DaemonMessage::StartRecording &&
                                                  asked->message != DaemonMessage::SynchronousGetCurrentState))
                continue;
            EXPECT_EQ(asked->answers + asked->failures, 1)
                << daemonProtocol().messages[static_cast<std::size_t>(asked->message)].name;
        }
        if (player.application.isAlive()) connected.insert(player.application.identifier.text());
        for (const auto& stop : player.stops)
            anUnansweredClip |= stop->message == DaemonMessage::StopRecordingWithClipDurations && !stop->answers;
    }
    const Dictionary snapshot = daemon_.snapshot();
    int recording = 0;
    for (const Value& entry : *snapshot.find("sessions")->as<Array>()) {
        const Dictionary& session = *entry.as<Dictionary>();
        const std::string identifier = *session.find("bundleID")->as<std::string>();
        EXPECT_TRUE(connected.contains(identifier) || *session.find("wholeDisplay")->as<bool>()) << describe(entry);
        const bool records = *session.find("recording")->as<bool>();
        recording += records ? 1 : 0;
        if (!anUnansweredClip) {
            EXPECT_EQ(*session.find("transactionOpen")->as<bool>(), records) << describe(entry);
        }
    }
    EXPECT_LE(recording, 1);
    if (!anUnansweredClip) {
        EXPECT_EQ(fakes().keepAlive.open(), recording);
    }
    for (const SimBlockedTask& task : daemon_.world.scheduler.blockedTasks())
        ADD_FAILURE() << task.lane << " waits for " << task.waitsFor;
    expectStillness(daemon_, faulty_);
    checkWindows();
    for (const Player& player : players_) checkStops(player);
    if (faulty_) return;
    for (const Player& player : players_) {
        // After a recording of the whole display another file is meant.
        if (isPrivileged(player)) continue;
        if (player.lastDiscard && player.lastDiscard->answers == 1 && player.application.isAlive()) {
            EXPECT_FALSE(fakes().fileSystem.exists(fakes().fileSystem.temporaryDirectory() + "/" +
                                                   player.application.name + ".mp4"));
        }
    }
    // The URL of a movie that could not be written is handed out too.
    if (diskWasFull_) return;
    for (const Player& player : players_) {
        if (!player.lastStop || player.lastStop->answers != 1) continue;
        if (const URL* url = player.lastStop->values[0].as<URL>()) {
            const auto movie = fakes().fileSystem.movie(url->path());
            ASSERT_TRUE(movie) << url->path() << " was handed out and is not there";
            EXPECT_TRUE(movie->finished);
        }
    }
}

void Contest::end() {
    fakes().faults.clear();
    setFreeSize(kPlenty);
    daemon_.world.scheduler.runUntilIdle();
    for (const Player& player : players_)
        EXPECT_FALSE(fakes().userAlerts.standingAbout() == player.application.identifier && !player.application.isAlive())
            << "the user is asked about " << player.application.name << ", which has gone";
    fakes().preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
    fakes().userAlerts.setUser([](const AlertContent&) { return UserAlert::Response::DefaultButton; });
    fakes().userAlerts.answer(UserAlert::Response::DefaultButton);
    daemon_.world.scheduler.advance(seconds(5));
    EXPECT_EQ(fakes().userAlerts.standing(), 0u);
    checkAtRest();
    for (Player& player : players_) setForeground(player, AppStateMonitor::kRunningForeground);
    if (!faulty_) {
        for (Player& player : players_) recordOnceMore(player);
        if (random_.below(2) == 0) checkExemption(players_[random_.below(players_.size())]);
        if (random_.below(4) == 0) {
            Player& player = players_[random_.below(players_.size())];
            checkInterruption(player, players_[random_.below(players_.size())]);
        }
    }
    endSystemRecordings();
    for (Player& player : players_) {
        for (const auto& start : player.starts) {
            if (const Error* error = start->answers == 1 ? start->values[0].asError() : nullptr)
                ++tally_.refused[error->code()];
        }
        for (const auto& stop : player.stops) {
            if (stop->answers != 1 || !stop->values[0].as<URL>()) continue;
            ++(stop->message == DaemonMessage::StopRecording ? tally_.movies : tally_.clips);
        }
        for (const auto& told : player.application.told()) {
            if (const Error* error = told.arguments[0].asError()) ++tally_.told[error->code()];
        }
        player.application.die();
    }
    daemon_.world.scheduler.advance(seconds(5));
    EXPECT_EQ(fakes().keepAlive.open(), 0);
    EXPECT_EQ(fakes().renderServer.portsOpen(), 0);
    EXPECT_EQ(daemon_.sessionCount(), 0u);
    const std::size_t assets = fakes().photoLibrary.assets().size();
    tally_.inLibrary += static_cast<int>(assets);
    // What could not be written is handed over too.
    for (const auto& asset : fakes().photoLibrary.assets()) {
        EXPECT_TRUE(faulty_ || diskWasFull_ || (asset.content && asset.content->finished)) << asset.movie.path();
    }
    for (const auto& source : fakes().displayCapture.sources()) EXPECT_FALSE(source->isRunning());
    for (const SimBlockedTask& task : daemon_.world.scheduler.blockedTasks())
        ADD_FAILURE() << task.lane << " waits for " << task.waitsFor;
    checkFiles();
    expectStillness(daemon_, faulty_);
    if (!faulty_) judgeRecordings(fakes().containerWriters.recordings(), kPrivileged);
}

void Contest::endSystemRecordings() {
    for (Player& player : players_) {
        if (!isPrivileged(player)) continue;
        if (!player.application.isAlive()) startProcess(player);
        player.application.connect();
        player.application.ask(DaemonMessage::StopRecording);
        daemon_.world.scheduler.advance(seconds(2));
        for (const auto& start : player.starts)
            tally_.systemRecordings += start->answers == 1 && start->values[0].isNull() ? 1 : 0;
        player.application.start();
        daemon_.world.scheduler.advance(seconds(2));
    }
}

void Contest::checkFiles() {
    const std::string folder = fakes().fileSystem.temporaryDirectory() + "/";
    std::set<std::string> allowed;
    for (const char* name : {"Alpha", "Beta", "Gamma", kPrivileged})
        for (const char* end : {".mp4", "_trimmed.mp4"}) allowed.insert(folder + name + end);
    for (const std::string& path : fakes().fileSystem.files())
        EXPECT_TRUE(allowed.contains(path) || path.starts_with(folder + "ScreenRecording_")) << path;
}

void Contest::recordOnceMore(Player& player) {
    SimulatedApplication& application = player.application;
    if (!application.isAlive()) return;
    application.connect();
    daemon_.world.scheduler.advance(milliseconds(100));
    if (const auto dead = player.deadSession.lock()) {
        std::shared_ptr<LCRecordingSession> session;
        daemon_.world.scheduler.mainQueue().sync(
            [&] { session = daemon_.process->manager().registeredSession(application.identifier); });
        if (session == dead) return;  // until the application itself goes
    }
    const std::size_t told = application.told().size();
    const bool isPurged = random_.below(3) == 0;
    if (isPurged) {
        purge(3);
        goOnUpTo(8);
    }
    const auto start = application.start();
    daemon_.world.scheduler.advance(seconds(2));
    ASSERT_EQ(start->answers, 1);
    if (isPurged && application.told().size() > told) {
        const Error* error = application.told().back().arguments[0].asError();
        ASSERT_TRUE(error && error->code() == -5805) << describe(application.told().back().arguments[0]);
        ++tally_.purgedAway;
        return;
    }
    if (isPurged) ++tally_.begunInThePurge;
    ASSERT_TRUE(start->values[0].isNull()) << describe(start->values[0]);
    const auto stop = application.ask(DaemonMessage::StopRecording);
    daemon_.world.scheduler.advance(seconds(1));
    ASSERT_EQ(stop->answers, 1);
    const URL* url = stop->values[0].as<URL>();
    ASSERT_TRUE(url) << describe(stop->values[1]);
    const auto movie = fakes().fileSystem.movie(url->path());
    ASSERT_TRUE(movie);
    EXPECT_TRUE(movie->finished);
    EXPECT_NEAR(movie->duration().seconds(), 2.0, 0.1);
}

bool Contest::isAskedAbout(Player& player) {
    const std::size_t before = fakes().userAlerts.shown().size();
    const auto start = player.application.start();
    daemon_.world.scheduler.advance(milliseconds(300));
    EXPECT_EQ(start->answers, 1);
    player.application.ask(DaemonMessage::StopRecording);
    daemon_.world.scheduler.advance(milliseconds(300));
    return fakes().userAlerts.shown().size() > before;
}

void Contest::checkExemption(Player& player) {
    SimulatedApplication& application = player.application;
    if (!application.isAlive() || player.deadSession.lock()) return;
    const auto pass = [&](double seconds) {
        daemon_.world.scheduler.runUntilIdle();  // what was asked for has arrived
        fakes().clock.setWallTime(Date{fakes().clock.now().secondsSince1970 + seconds});
    };
    fakes().preferences.set(kPreferenceDomain, "LCSuppressAlert", false);
    application.connect();
    // What was before is over.
    application.tell(DaemonMessage::ClientDidResignActive);
    pass(500);
    application.tell(DaemonMessage::ClientDidBecomeActive);
    EXPECT_TRUE(isAskedAbout(player)) << application.name << " records without having been asked about";
    EXPECT_FALSE(isAskedAbout(player)) << application.name << " is asked about twice";
    application.tell(DaemonMessage::ClientDidResignActive);
    pass(300);
    application.tell(DaemonMessage::ClientDidBecomeActive);
    EXPECT_FALSE(isAskedAbout(player)) << application.name << " is asked about again after a short while";
    application.tell(DaemonMessage::ClientDidResignActive);
    pass(300);
    application.tell(DaemonMessage::ClientDidBecomeActive);
    EXPECT_TRUE(isAskedAbout(player)) << application.name << " was in the background for long";
    fakes().preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
}

void Contest::interrupt(Player& player, Player& other) {
    const auto pass = [&] { daemon_.world.scheduler.advance(milliseconds(300)); };
    fakes().userAlerts.setUser({});
    fakes().preferences.set(kPreferenceDomain, "LCSuppressAlert", false);
    other.application.tell(DaemonMessage::ClientDidResignActive);
    pass();
    fakes().clock.setWallTime(Date{fakes().clock.now().secondsSince1970 + 500});
    other.application.tell(DaemonMessage::ClientDidBecomeActive);
    other.application.start();
    pass();
    EXPECT_EQ(fakes().userAlerts.standingAbout(), other.application.identifier);
    fakes().preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
    player.application.start();
    pass();
    EXPECT_TRUE(isRecording(player)) << "a question about another is in its way";
    fakes().userAlerts.answer(UserAlert::Response::DefaultButton);
    pass();
    EXPECT_TRUE(isRecording(other) && !isRecording(player)) << "the user has let the other one begin";
    fakes().userAlerts.setUser([](const AlertContent&) { return UserAlert::Response::DefaultButton; });
}

void Contest::checkInterruption(Player& player, Player& other) {
    SimulatedApplication& application = player.application;
    for (const Player* each : {&player, &other})
        if (&player == &other || !each->application.isAlive() || each->deadSession.lock()) return;
    application.connect();
    other.application.connect();
    std::size_t told = application.told().size();
    interrupt(player, other);
    ASSERT_EQ(application.told().size(), ++told);
    const URL* movie = application.told().back().arguments[1].as<URL>();
    ASSERT_TRUE(movie) << application.name << " is not told of its movie";
    const std::string path = movie->path();
    application.start();
    for (const bool isFirst : {true, false, false}) {
        daemon_.world.scheduler.advance(milliseconds(300));
        EXPECT_TRUE(isRecording(player));
        application.tell(DaemonMessage::ClientDidBecomeActive);
        daemon_.world.scheduler.advance(milliseconds(300));
        ASSERT_EQ(application.told().size(), told += isFirst ? 1 : 0) << "told again of an interruption";
        const auto& arguments = application.told().back().arguments;
        EXPECT_TRUE(arguments[0].asError() && arguments[0].asError()->code() == -5806);
        EXPECT_TRUE(arguments[1].as<URL>() && arguments[1].as<URL>()->path() == path);
        application.tell(DaemonMessage::ClientDidResignActive);
    }
    application.ask(DaemonMessage::StopRecording);
    daemon_.world.scheduler.advance(milliseconds(300));
    ++tally_.interruptionsChecked;
}

}  // namespace lumacast
