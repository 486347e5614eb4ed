#pragma once
// A handler that writes down what it is told.

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "client/extension/Extension.h"
#include "tests/extension/StandInHost.h"

namespace lumacast::test {

class ListeningHandler final : public extension::Handler {
public:
    struct Event {
        std::string what;
        std::optional<Dictionary> userInfo = std::nullopt;
        extension::Completion completion = nullptr;
    };

    void connected(extension::Broadcast& broadcast) override {
        broadcast_ = &broadcast;
        events.add({"connected"});
    }
    void clip(extension::Clip clip) override { clips.add(std::make_unique<extension::Clip>(std::move(clip))); }
    void clipMissed(bool isLast) override { events.add({isLast ? "last clip missed" : "clip missed"}); }
    void started(std::optional<Dictionary> userInfo, extension::Completion completion) override {
        events.add({"started", std::move(userInfo), std::move(completion)});
    }
    void paused(extension::Completion completion) override { events.add({"paused", {}, std::move(completion)}); }
    void resumed(extension::Completion completion) override { events.add({"resumed", {}, std::move(completion)}); }
    void finished(extension::Completion completion) override { events.add({"finished", {}, std::move(completion)}); }
    void frame(extension::Frame frame) override { frames.add(std::move(frame)); }
    void sound(extension::Sound sound) override { sounds.add(std::move(sound)); }
    void frontmostApplication(BundleIdentifier application) override { events.add({"front: " + application.text()}); }
    void ended() override { events.add({"ended"}); }

    /// After "connected".
    extension::Broadcast& broadcast() { return *broadcast_; }
    /// The next event's name; empty when none comes.
    std::string next() {
        const auto event = events.next();
        return event ? event->what : std::string();
    }

    Told<Event> events;
    Told<std::unique_ptr<extension::Clip>> clips;
    Told<extension::Frame> frames;
    Told<extension::Sound> sounds;

private:
    extension::Broadcast* broadcast_ = nullptr;
};

}  // namespace lumacast::test
