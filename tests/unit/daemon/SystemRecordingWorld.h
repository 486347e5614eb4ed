#pragma once
// Recordings of the whole display.

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {

/// Clients that may record the whole display, and what they hear.
class SystemRecordingWorld : public DaemonWorld {
protected:
    static constexpr TestClient::Flags kSystem{.system = true};

    std::unique_ptr<TestClient> makeEntitled(const std::string& name = "Control", std::int32_t pid = 600,
                                             std::uint32_t window = 60) {
        auto client = makeConnected(name, pid, window);
        fakes_.ipc.grant(client->pid, "com.orvane.private.luma-cast", true);
        return client;
    }
    TestClient::AskedRef started(TestClient& client, TestClient::Flags flags = kSystem) {
        fakes_.logSink.clear();
        auto asked = client.start({}, flags);
        settle();
        return asked;
    }
    std::unique_ptr<TestClient> makeSystemRecording(const std::string& name = "Control", std::int32_t pid = 600,
                                                    std::uint32_t window = 60) {
        auto client = makeEntitled(name, pid, window);
        EXPECT_EQ(started(*client)->code(), 0);
        fakes_.logSink.clear();
        return client;
    }
    TestClient::AskedRef stopped(TestClient& client) {
        auto asked = client.ask(DaemonMessage::StopRecording);
        settle();
        return asked;
    }
    void onRequestLane(const std::function<void(LCRecordingManager&)>& task) {
        world_.scheduler.mainQueue().sync([&] { task(process_->manager()); });
        settle();
    }
    void update(std::int64_t state, bool frontmost, ProcessID pid) {
        fakes_.appStateMonitor.update(state, frontmost, pid);
        settle();
    }
    std::int32_t heard(const TestClient& client) { return number(session(client)->frontmostPIDForAudioTap()); }
    using Sounds = std::vector<std::uint32_t>;
};

}  // namespace lumacast
