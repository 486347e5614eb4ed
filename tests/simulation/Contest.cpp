// What the applications and the device of a contest do.

#include "tests/simulation/Contest.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <limits>

namespace lumacast {

using std::chrono::milliseconds;

Contest::Contest(std::uint64_t seed, ContestTally& tally)
    : daemon_(seed), random_(daemon_.world.scheduler.fork()), tally_(tally) {
    players_.emplace_back(fakes(), "Alpha", 500, 7);
    players_.emplace_back(fakes(), "Beta", 600, 8);
    players_.emplace_back(fakes(), "Gamma", 700, 9);
    players_.emplace_back(fakes(), kPrivileged, 800, 10);
    entitle(players_.back());
    fakes().preferences.set(kPreferenceDomain, "LCSuppressAlert", random_.below(2) != 0);
    fakes().deviceInfo.setRegionalRule("RegionalBehaviorShutterClick", random_.below(2) == 0);
    fakes().userAlerts.setUser([this, user = daemon_.world.scheduler.fork()](const AlertContent&) mutable {
        return answerOf(user.below(8));
    });
    faulty_ = random_.below(3) == 0;
    if (faulty_) fakes().faults.failAtRandom(random_.next(), 1, 80);
}

void Contest::run() {
    for (Player& player : players_) player.application.connect();
    const std::uint64_t steps = 8 + random_.below(40);
    for (std::uint64_t i = 0; i < steps && !::testing::Test::HasFailure(); ++i) {
        if (random_.below(6) == 0)
            disturb();
        else
            act(players_[random_.below(players_.size())]);
        goOn();
        checkAlways();
    }
    end();
}

void Contest::entitle(const Player& player) {
    fakes().ipc.grant(player.application.pid(), "com.orvane.private.luma-cast", true);
    fakes().appStateMonitor.setProcess(player.application.identifier, player.application.pid());
}

std::optional<UserAlert::Response> Contest::answerOf(std::uint64_t mood) {
    switch (mood) {
        case 0:
        case 1: ++tally_.refusedByUser; return UserAlert::Response::OtherButton;
        case 2:
        case 3: ++tally_.leftStanding; return std::nullopt;
        case 4: ++tally_.granted; return UserAlert::Response::AlternateButton;
        default: ++tally_.granted; return UserAlert::Response::DefaultButton;
    }
}

void Contest::startProcess(Player& player) {
    player.application.startAgain(ProcessID{static_cast<std::int32_t>(1000 + ++incarnation_)});
    if (isPrivileged(player)) entitle(player);
    player.application.connect();
}

bool Contest::isRecording(const Player& player) {
    const auto session = daemon_.process->manager().registeredSession(player.application.identifier);
    return session && session->isRecording();
}

void Contest::noteForbidden(Player& player, const char* why) {
    if (!why && diskIsFull_) why = "the disk is full";
    if (!why && !player.isInForeground) why = "it is in the background";
    if (why) player.forbidden.push_back({player.starts.back(), why, changes_});
}

void Contest::stop(Player& player, DaemonMessage message, Array arguments) {
    SimulatedApplication& application = player.application;
    const bool isFirst = std::none_of(player.stops.begin(), player.stops.end(),
                                      [](const auto& stop) { return stop->answers + stop->failures == 0; });
    const bool isAwaited = isFirst && !aStartIsOpen(player) && isRecording(player);
    player.stops.push_back(application.ask(message, std::move(arguments)));
    if (isAwaited && message == DaemonMessage::StopRecording)
        player.awaited.push_back({player.stops.back(), application.firstOfConnection(), application.told().size()});
}

void Contest::setForeground(Player& player, std::uint32_t state) {
    fakes().appStateMonitor.setState(player.application.identifier, state);
    player.isInForeground = state == AppStateMonitor::kRunningForeground;
    ++changes_;
}

void Contest::setFreeSize(std::uint64_t bytes) {
    fakes().fileSystem.setFreeSize(bytes);
    diskIsFull_ = bytes == 0;
    diskWasFull_ |= diskIsFull_;
    ++changes_;
}

void Contest::handWindowOver() {
    if (faulty_) return;
    const auto asked = fakes().userAlerts.standingAbout();
    Player& other = players_[random_.below(players_.size())];
    for (Player& player : players_) {
        if (!asked || player.application.identifier != *asked || &player == &other) continue;
        // What it records already it has begun with its own window.
        if (!player.application.isAlive() || !other.application.isAlive() || isRecording(player)) return;
        fakes().renderServer.addLayer(player.application.window, other.application.pid());
        fakes().userAlerts.answer(UserAlert::Response::DefaultButton);
        daemon_.world.scheduler.runUntilIdle();
        if (isRecording(player)) {
            EXPECT_FALSE(fakes().displayCloneControl.mode() == DisplayCloneControl::kCloneContexts &&
                         fakes().displayCloneControl.contexts().contains(player.application.window))
                << player.application.name << " records a window that is not its own any more";
        }
        fakes().renderServer.addLayer(player.application.window, player.application.pid());
        ++tally_.handedOver;
    }
}

void Contest::act(Player& player) {
    SimulatedApplication& application = player.application;
    if (!application.isAlive()) {
        startProcess(player);
        return;
    }
    const std::uint64_t what = random_.below(16);
    const bool asksOfItsMovie = what <= 10 && what != 5 && what != 6;
    if (asksOfItsMovie) {
        player.lastStop.reset();
        player.lastDiscard.reset();
    }
    switch (what) {
        case 0:
        case 1:
        case 2:
        case 3:
            player.starts.push_back(isPrivileged(player) && random_.below(2) == 0
                                        ? application.start({}, {.microphone = true, .system = true})
                                        : application.start());
            noteForbidden(player, nullptr);
            break;
        case 4: startOfAnotherKind(player); break;
        case 5:
            application.tell(DaemonMessage::PauseRecording);
            if (random_.below(3) != 0) break;
            [[fallthrough]];
        case 6: {
            const bool ofAnother = random_.below(4) == 0;
            if (ofAnother) player.lastStop.reset();
            application.tell(DaemonMessage::ResumeRecording,
                             {number(ofAnother ? players_[random_.below(players_.size())].application.window
                                               : application.window)});
            break;
        }
        case 7:
        case 8:
            stop(player, DaemonMessage::StopRecording);
            if (!aStartIsOpen(player)) player.lastStop = player.stops.back();
            break;
        case 9: stop(player, DaemonMessage::StopRecordingWithClipDurations, {1.0, 1.0}); break;
        case 10: {
            const auto discard = application.ask(DaemonMessage::DiscardRecording);
            if (!aStartIsOpen(player)) player.lastDiscard = discard;
            break;
        }
        case 11: application.tell(DaemonMessage::ClientDidResignActive); break;
        case 12: application.tell(DaemonMessage::ClientDidBecomeActive); break;
        case 13: application.ask(DaemonMessage::SynchronousGetCurrentState); break;
        case 14: application.connect(); break;  // again, over the old connection
        default:
            application.die();
            player.lastStop.reset();
            player.toldWhenItDied = application.told().size();
            ++tally_.deaths;
    }
}

void Contest::startOfAnotherKind(Player& player) {
    SimulatedApplication& application = player.application;
    const std::vector<ContextID> own{application.window};
    const auto begin = [&](const std::vector<ContextID>& windows, const SimulatedApplication::Wishes& wishes,
                           const char* why = nullptr) {
        player.starts.push_back(application.start(windows, wishes));
        noteForbidden(player, why);
        // These never become right.
        if (why) player.forbidden.back().changes = ContestPlayer::kNever;
    };
    switch (random_.below(8)) {
        case 0: return begin({ContextID{99}}, {}, "it is nobody's window");
        case 1: return begin({}, {});
        case 2: return begin({own[0], own[0]}, {.microphone = true});
        case 3: return begin(own, {.camera = true});
        case 4: return begin(own, {.broadcast = true}, "nothing has been set up");
        case 5: return begin(own, {.system = true}, isPrivileged(player) ? nullptr : "it lacks the entitlement");
        case 6: return begin(own, {.width = std::numeric_limits<double>::quiet_NaN()}, "the size is none");
        default: return begin(own, {.width = 1e9}, "no picture has this size");
    }
}

void Contest::resetMediaServices(FakeDisplayCaptureSource& source) {
    for (Player& player : players_) {
        std::shared_ptr<LCRecordingSession> session;
        daemon_.world.scheduler.mainQueue().sync(
            [&] { session = daemon_.process->manager().registeredSession(player.application.identifier); });
        if (session && session->screenCaptureController().get() == &source) player.deadSession = session;
    }
    source.mediaServicesWereReset();
}

void Contest::purge(std::int32_t urgency) {
    fakes().storagePurge.requestPurge(urgency, [this, urgency](const std::optional<PurgeRecord>&) {
        // Whatever was handed out until now may be gone.
        if (urgency == 3)
            for (Player& player : players_) player.lastStop.reset();
    });
    ++tally_.purges;
}

void Contest::recordInThePurge() {
    purge(3);
    goOnUpTo(8);
    Player& player = players_[random_.below(players_.size())];
    if (!player.application.isAlive()) return;
    player.lastStop.reset();
    player.lastDiscard.reset();
    player.starts.push_back(player.application.start());
    noteForbidden(player, nullptr);
}

void Contest::disturb() {
    switch (random_.below(10)) {
        case 9: recordInThePurge(); break;
        case 8: handWindowOver(); break;
        case 6: {
            // Late answers, and alerts whose program dies.
            const auto response = answerOf(random_.below(8));
            if (response) fakes().userAlerts.answer(*response);
            break;
        }
        case 7: {
            // Somebody comes to the front, leaves it, or ends.
            const Player& other = players_[random_.below(players_.size())];
            const std::uint64_t what = random_.below(3);
            fakes().appStateMonitor.update(what == 0 ? 1 : what == 1 ? 8 : 4, what == 1, other.application.pid());
            break;
        }
        case 0: purge(1 + static_cast<std::int32_t>(random_.below(3))); break;
        case 1: fakes().storagePurge.passDay(); break;
        case 2:
            setForeground(players_[random_.below(players_.size())], random_.below(2) == 0 ? 8 : 4);
            break;
        case 3: {
            const bool full = random_.below(3) == 0;
            setFreeSize(full ? 0 : kPlenty);
            break;
        }
        case 4: fakes().preferences.set(kPreferenceDomain, "LCSuppressAlert", random_.below(2) != 0); break;
        default:
            for (const auto& source : fakes().displayCapture.sources()) {
                if (!source->isRunning()) continue;
                switch (random_.below(5)) {
                    case 0: resetMediaServices(*source); break;
                    case 1:
                    case 2: source->preempt(); break;
                    default: source->fail(-3);
                }
            }
    }
}

void Contest::goOnUpTo(std::uint64_t steps) {
    for (std::uint64_t i = random_.below(steps); i > 0; --i)
        if (!daemon_.world.scheduler.step()) break;
}

void Contest::goOn() {
    goOnUpTo(60);
    if (random_.below(2) == 0) daemon_.world.scheduler.advance(milliseconds(random_.below(1500)));
}

}  // namespace lumacast
