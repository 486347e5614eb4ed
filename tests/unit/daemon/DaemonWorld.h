#pragma once
// The whole core in a simulation, and clients that talk to it over connections in memory.

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "daemon/Process.h"
#include "tests/fakes/FakePlatform.h"

namespace lumacast {

/// A client process with one window. Everything it is told and answered goes into one journal, in the order of arrival.
class TestClient {
public:
    /// One request that has a reply: how often it was answered and with what.
    struct Asked {
        int answers = 0;
        int failures = 0;  ///< the connection said that there will be no answer
        Array values;
        const Error* error(std::size_t index) const { return answers ? values.at(index).asError() : nullptr; }
        const URL* url(std::size_t index) const { return answers ? values.at(index).as<URL>() : nullptr; }
        std::int64_t code() const { return error(0) ? error(0)->code() : 0; }  ///< of a start
    };
    using AskedRef = std::shared_ptr<Asked>;
    /// A message from the daemon.
    struct Told {
        ClientMessage message;
        Array arguments;
    };

    TestClient(FakePlatform& machine, const std::string& identifier, const std::string& name, ProcessID thePid,
               ContextID theWindow)
        : id(identifier), pid(thePid), window(theWindow), machine_(machine) {
        machine.bundles.installApplication(id, name);
        machine.appStateMonitor.setState(id, 8);  // running in the foreground
        machine.bundles.run(pid, id);
        machine.renderServer.addLayer(window, pid);
        process_ = machine.makeProcess(pid);
    }
    ~TestClient() { die(); }

    void connect() {
        inbox_ = std::make_shared<Inbox>(*this);
        connection = process_->connectToService("com.orvane.lumacastd");
        connection->setExportedInterface(clientProtocol());
        connection->setExportedObject(inbox_);
        connection->setRemoteInterface(daemonProtocol());
        connection->setInvalidationHandler([this] { ++losses; });
        connection->resume();
    }
    void die() {
        if (!process_) return;
        machine_.endProcess(*process_);
        connection.reset();
        process_.reset();
    }
    AskedRef ask(DaemonMessage message, Array arguments = {}) {
        auto asked = std::make_shared<Asked>();
        connection->remoteProxy([asked](const Error&) { ++asked->failures; })
            ->send(static_cast<std::uint16_t>(message), std::move(arguments), [this, asked, message](Array values) {
                journal.push_back("answered " + std::to_string(static_cast<int>(message)));
                ++asked->answers;
                asked->values = std::move(values);
            });
        return asked;
    }
    void tell(DaemonMessage message, Array arguments = {}) {
        connection->remoteProxy([](const Error&) {})->send(static_cast<std::uint16_t>(message), std::move(arguments));
    }

    struct Flags {
        bool microphone = false, camera = false, broadcast = false, system = false, capture = false;
    };
    /// `endpoint`: where the broadcast's extension listens by itself.
    AskedRef start(const std::vector<ContextID>& windows, Flags flags,
                   const std::shared_ptr<IpcEndpoint>& endpoint = nullptr) {
        Array ids;
        for (const ContextID layer : windows) ids.emplace_back(number(layer));
        return ask(DaemonMessage::StartRecording,
                   {std::move(ids), Array{640.0, 360.0}, flags.microphone, flags.camera, flags.broadcast, flags.system,
                    flags.capture, endpoint ? Value(endpoint) : Value()});
    }
    AskedRef start(const std::vector<ContextID>& windows) { return start(windows, {}); }
    AskedRef start() { return start({window}, {}); }

    /// How often the daemon said that the recording has stopped with this error.
    int toldOfStop(std::int64_t code) const {
        return static_cast<int>(std::count_if(told.begin(), told.end(), [&](const Told& t) {
            return t.message == ClientMessage::StopRecordingWithError && t.arguments[0].asError() &&
                   t.arguments[0].asError()->code() == code;
        }));
    }

    const BundleIdentifier id;
    const ProcessID pid;
    const ContextID window;
    std::vector<Told> told;
    std::vector<std::string> journal;
    int losses = 0;
    std::shared_ptr<IpcConnection> connection;

private:
    class Inbox final : public IpcExportedObject {
    public:
        explicit Inbox(TestClient& client) : client_(client) {}
        void receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t message, Array arguments,
                            IpcReply) override {
            client_.told.push_back({static_cast<ClientMessage>(message), std::move(arguments)});
            client_.journal.push_back("told " + std::to_string(message));
        }

    private:
        TestClient& client_;
    };

    FakePlatform& machine_;
    std::unique_ptr<FakeIpc> process_;
    std::shared_ptr<Inbox> inbox_;
};

/// A started daemon with the question to the user suppressed.
class DaemonWorld : public ::testing::Test {
protected:
    /// Movies in memory keep their pictures.
    static constexpr int kManyPlanes = 1 << 20;

    /// `prepare` installs what the daemon reads when it starts.
    explicit DaemonWorld(void (*prepare)(FakePlatform&) = nullptr) {
        if (prepare) prepare(fakes_);
        fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
        fakes_.displayCapture.setPlanes(kManyPlanes);
        process_ = std::make_unique<Process>(fakes_.platform());
        world_.scheduler.mainQueue().sync([this] { process_->start(); });
    }
    ~DaemonWorld() override { world_.scheduler.endWorld(); }

    std::unique_ptr<TestClient> makeClient(const std::string& name = "Player", std::int32_t pid = 500,
                                           std::uint32_t window = 7) {
        return std::make_unique<TestClient>(fakes_, "org.example." + name, name, ProcessID{pid}, ContextID{window});
    }
    /// A client that is connected.
    std::unique_ptr<TestClient> makeConnected(const std::string& name = "Player", std::int32_t pid = 500,
                                              std::uint32_t window = 7) {
        auto client = makeClient(name, pid, window);
        client->connect();
        settle();
        return client;
    }
    /// A client that records; the log is empty afterwards.
    std::unique_ptr<TestClient> makeRecording(const std::string& name = "Player", std::int32_t pid = 500,
                                              std::uint32_t window = 7) {
        auto client = makeConnected(name, pid, window);
        const auto start = client->start();
        settle();
        EXPECT_EQ(start->answers, 1);
        EXPECT_EQ(start->code(), 0);
        fakes_.logSink.clear();
        return client;
    }
    void settle() { world_.scheduler.runUntilIdle(); }
    void advance(std::chrono::nanoseconds duration) { world_.scheduler.advance(duration); }

    std::shared_ptr<LCRecordingSession> session(const TestClient& client) {
        std::shared_ptr<LCRecordingSession> result;
        world_.scheduler.mainQueue().sync([&] { result = process_->manager().registeredSession(client.id); });
        return result;
    }
    std::string pathOf(const std::string& name) { return process_->tempStore().pathFor(name + ".mp4"); }
    std::size_t logged(std::string_view text) { return fakes_.logSink.count(text); }
    using Lines = std::vector<std::string>;
    static Lines joined(Lines lines, const Lines& more) {
        lines.insert(lines.end(), more.begin(), more.end());
        return lines;
    }
    /// What stopping all capture says, with a tap and without.
    static Lines captureStops(bool tapped = true) {
        Lines lines{"LCRecordingSession: stopAllCapture",
                    "LCCaptureManager: stopDeviceCaptureSessionWithFinishHandler"};
        if (tapped) {
            lines.emplace_back("LCRecordingManager:stopAudioCapture: Audio Queue successfully stopped");
            lines = joined(std::move(lines), Lines(10, "LCRecordingManager: Audio Queue buffer released"));
            lines.emplace_back("LCRecordingManager: Audio Queue has been disposed");
        }
        lines.emplace_back("Stop mirroring");
        return lines;
    }

    SimWorld world_{1};
    FakePlatform& fakes_ = world_.fakes;
    std::unique_ptr<Process> process_;
};

}  // namespace lumacast
