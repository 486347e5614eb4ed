#pragma once
// A session bus of a test's own, and the accessibility service on it.

#include <systemd/sd-bus.h>

#include <atomic>
#include <filesystem>
#include <memory>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "linux/accessibility/ScreenReaderBus.h"
#include "tests/contract/HeardSound.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/sound/SoundProcess.h"

namespace lumacast::test {

/// A message bus at a socket of its own. Whoever wants the accessibility service started by it leaves a mark instead.
class PrivateBus final {
public:
    std::string address() const { return "unix:path=" + scratch_.path("bus"); }

    /// Also again, at the same address; whether it is there.
    bool start() {
        std::filesystem::remove(scratch_.path("bus"));
        scratch_.write("services/org.a11y.Bus.service",
                       "[D-BUS Service]\nName=org.a11y.Bus\nExec=/usr/bin/touch " + scratch_.path("started") + "\n");
        scratch_.write("bus.conf", "<busconfig><type>session</type><listen>" + address() + "</listen><servicedir>" +
                                       scratch_.path("services") +
                                       "</servicedir><policy context=\"default\"><allow send_destination=\"*\"/>"
                                       "<allow receive_sender=\"*\"/><allow own=\"*\"/></policy></busconfig>");
        daemon_ = std::make_unique<SoundProcess>(std::vector<std::string>{
            "dbus-daemon", "--config-file=" + scratch_.path("bus.conf"), "--nofork", "--nopidfile", "--print-address"});
        return daemon_->readLine().starts_with("unix:path=");
    }
    void kill() { daemon_.reset(); }
    void hang() { daemon_->send(SIGSTOP); }
    void goOn() { daemon_->send(SIGCONT); }
    /// Whether somebody had the service started.
    bool hasStartedService() const { return std::filesystem::exists(scratch_.path("started")); }

private:
    ScratchDirectory scratch_;
    std::unique_ptr<SoundProcess> daemon_;
};

/// The accessibility service: says whether a screen reader runs. A thread of its own.
class AccessibilityService final {
public:
    explicit AccessibilityService(const std::string& address) {
        sd_bus* bus = nullptr;
        sd_bus_new(&bus);
        bus_.reset(bus);
        sd_bus_set_address(bus, address.c_str());
        sd_bus_set_bus_client(bus, 1);
        there_ = sd_bus_start(bus) >= 0 && sd_bus_add_object(bus, nullptr, "/org/a11y/bus", answer, this) >= 0 &&
                 sd_bus_request_name(bus, "org.a11y.Bus", 0) >= 0;
        thread_ = std::thread([this] { serve(); });
    }
    ~AccessibilityService() {
        ending_ = true;
        thread_.join();
    }
    bool isThere() const { return there_; }
    /// How often it has been asked.
    int questions() const { return questions_; }
    /// Announced, with the value or without.
    enum class Announce { Value, Invalidated };
    void setRunning(bool running, Announce how = Announce::Value) {
        how_ = how;
        running_ = running;
        // Told by its own thread.
        static_cast<void>(eventually([&] { return told_ == running || ending_; }));
    }
    /// Answers are kept back, each with what was true when it was asked for; false sends them.
    void holdAnswers(bool holding) { holding_ = holding; }
    int heldAnswers() const { return heldAnswers_; }
    /// Signals that say something else than the service does when it is asked.
    void lie(int times) { lies_ = times; }

private:
    static int answer(sd_bus_message* message, void* self, sd_bus_error*) {
        auto& service = *static_cast<AccessibilityService*>(self);
        const char *interface = nullptr, *property = nullptr;
        if (!sd_bus_message_is_method_call(message, "org.freedesktop.DBus.Properties", "Get")) return 0;
        if (sd_bus_message_read(message, "ss", &interface, &property) < 0) return 0;
        ++service.questions_;
        const bool value = std::string(property) == "ScreenReaderEnabled" ? service.running_.load() : true;
        if (!service.holding_) return sd_bus_reply_method_return(message, "v", "b", value ? 1 : 0);
        service.held_.emplace_back(BusMessage(sd_bus_message_ref(message)), value);
        ++service.heldAnswers_;
        return 1;
    }

    void announce(bool value) {
        sd_bus_message* made = nullptr;
        sd_bus_message_new_signal(bus_.get(), &made, "/org/a11y/bus", "org.freedesktop.DBus.Properties",
                                  "PropertiesChanged");
        const BusMessage signal(made);
        if (how_ == Announce::Value)
            sd_bus_message_append(made, "sa{sv}as", "org.a11y.Status", 1, "ScreenReaderEnabled", "b", value ? 1 : 0, 0);
        else
            sd_bus_message_append(made, "sa{sv}as", "org.a11y.Status", 0, 1, "ScreenReaderEnabled");
        sd_bus_send(bus_.get(), made, nullptr);
    }

    void serve() {
        while (!ending_) {
            if (told_ != running_) {
                announce(running_);
                told_ = running_.load();
            }
            for (; lies_ > 0; --lies_) announce(!running_);
            if (!holding_)
                for (const auto& [question, value] : std::exchange(held_, {}))
                    sd_bus_reply_method_return(question.get(), "v", "b", value ? 1 : 0);
            int result = 1;
            while (result > 0) result = sd_bus_process(bus_.get(), nullptr);
            if (result < 0) return;
            sd_bus_wait(bus_.get(), 5'000);
        }
    }

    BusHandle bus_;
    bool there_ = false;
    std::vector<std::pair<BusMessage, bool>> held_;
    std::atomic<bool> running_{false}, told_{false}, ending_{false}, holding_{false};
    std::atomic<int> questions_{0}, lies_{0}, heldAnswers_{0};
    std::atomic<Announce> how_{Announce::Value};
    std::thread thread_;
};

}  // namespace lumacast::test
