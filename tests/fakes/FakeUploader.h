#pragma once
#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "tests/fakes/FakeAppExtensions.h"
#include "tests/fakes/FakePlatform.h"

namespace lumacast {

/// What an upload extension does, said by the test before it is launched or while it runs, and what it was given. Shared by
/// all processes of one installed extension.
struct UploaderPlan {
    // Behaviour.
    bool answersEndpoint = true;
    bool connects = true;  ///< to the endpoint it is given
    int pings = 1;
    bool diesBeforePing = false;
    bool completesPayloads = true;
    bool keepsPlanes = false;
    bool completesRequests = true;
    std::vector<ExtensionItem> returned;  ///< with each request's completion

    // What came.
    std::vector<Dictionary> payloads;
    std::vector<std::function<void()>> uncompleted;
    std::vector<std::vector<ExtensionItem>> requests;
    std::vector<std::pair<std::weak_ptr<FakeAppExtension>, ExtensionRequestID>> uncompletedRequests;
    int launches = 0;
    std::weak_ptr<IpcConnection> connection;  ///< the newest process's link to the daemon

    /// Sends over that link; nothing without one.
    void tell(BroadcastDaemonMessage message, Array arguments = {}) const {
        if (const auto link = connection.lock())
            link->remoteProxy([](const Error&) {})->send(static_cast<std::uint16_t>(message), std::move(arguments));
    }
    /// What the payloads' action keys say, in order.
    std::vector<std::int64_t> actions() const {
        std::vector<std::int64_t> all;
        for (const Dictionary& payload : payloads)
            if (const Value* action = payload.find("LCBroadcastProcessExtensionPayloadKeyActionType"))
                all.push_back(*action->as<std::int64_t>());
        return all;
    }
    std::size_t samples(std::int64_t type) const {
        std::size_t count = 0;
        for (const Dictionary& payload : payloads) {
            const Value* value = payload.find("LCBroadcastProcessExtensionPayloadKeySampleType");
            if (value && *value->as<std::int64_t>() == type) ++count;
        }
        return count;
    }
};

/// The program of an upload extension: takes clips, or connects to the endpoint it is given and takes payloads.
class FakeUploader final : public FakeExtensionProgram, public std::enable_shared_from_this<FakeUploader> {
public:
    explicit FakeUploader(std::shared_ptr<UploaderPlan> plan) : plan_(std::move(plan)) { ++plan_->launches; }

    void beginRequest(FakeAppExtension& extension, ExtensionRequestID request,
                      const std::vector<ExtensionItem>& items) override {
        plan_->requests.push_back(items);
        if (plan_->completesRequests)
            extension.complete(request, plan_->returned);
        else
            plan_->uncompletedRequests.emplace_back(extension.weak_from_this(), request);
    }
    void setEndpoint(FakeIpc& ipc, const std::shared_ptr<IpcEndpoint>& endpoint,
                     const std::function<void()>& completion) override {
        if (plan_->connects) connect(ipc, endpoint);
        if (plan_->answersEndpoint) completion();
    }
    /// Makes the link; also for a process that listens by itself.
    void connect(FakeIpc& ipc, const std::shared_ptr<IpcEndpoint>& endpoint) {
        link_ = ipc.connectToEndpoint(endpoint);
        serve(link_);
        if (plan_->diesBeforePing) return ipc.kill();
        for (int i = 0; i < plan_->pings; ++i) plan_->tell(BroadcastDaemonMessage::Ping);
    }
    void serve(const std::shared_ptr<IpcConnection>& link) {
        inbox_ = std::make_shared<Inbox>(plan_);
        link->setExportedInterface(broadcastExtensionProtocol());
        link->setExportedObject(inbox_);
        link->setRemoteInterface(broadcastDaemonProtocol());
        link->resume();
        plan_->connection = link;
    }

private:
    struct Inbox final : IpcExportedObject {
        explicit Inbox(std::shared_ptr<UploaderPlan> plan) : plan(std::move(plan)) {}
        void receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t, Array arguments,
                            IpcReply reply) override {
            Dictionary payload = *arguments[0].as<Dictionary>();
            if (!plan->keepsPlanes && payload.find("LCBroadcastProcessExtensionPayloadKeySharedPlane"))
                payload.set("LCBroadcastProcessExtensionPayloadKeySharedPlane", Value());
            plan->payloads.push_back(std::move(payload));
            if (plan->completesPayloads)
                reply({});
            else
                plan->uncompleted.emplace_back([reply] { reply({}); });
        }
        const std::shared_ptr<UploaderPlan> plan;
    };

    const std::shared_ptr<UploaderPlan> plan_;
    std::shared_ptr<IpcConnection> link_;
    std::shared_ptr<Inbox> inbox_;
};

/// A process of an upload extension that listens by itself.
class ListeningUploader final {
public:
    ListeningUploader(FakePlatform& machine, const std::shared_ptr<UploaderPlan>& plan, ProcessID pid)
        : process_(machine.makeProcess(pid)), door_(std::make_shared<Door>(std::make_shared<FakeUploader>(plan))) {
        listener_ = process_->anonymousListener();
        listener_->setDelegate(door_);
        listener_->resume();
    }
    std::shared_ptr<IpcEndpoint> endpoint() const { return listener_->endpoint(); }

private:
    struct Door final : IpcListenerDelegate {
        explicit Door(std::shared_ptr<FakeUploader> program) : uploader(std::move(program)) {}
        bool listenerShouldAcceptNewConnection(IpcListener&, const std::shared_ptr<IpcConnection>& connection) override {
            uploader->serve(connection);
            return true;
        }
        const std::shared_ptr<FakeUploader> uploader;
    };

    const std::unique_ptr<FakeIpc> process_;
    const std::shared_ptr<Door> door_;
    std::shared_ptr<IpcListener> listener_;
};

/// An installed upload extension that follows the plan.
inline FakeInstalledExtension uploadExtension(const std::shared_ptr<UploaderPlan>& plan, bool takesSamples,
                                              const std::string& identifier = "org.example.Uploader.upload") {
    Dictionary own;
    if (takesSamples) own.set("LCBroadcastProcessMode", "LCBroadcastProcessModeSampleBuffer");
    return {BundleIdentifier(identifier),
            "com.orvane.broadcast-services-upload",
            {},
            Dictionary{{std::string(kExtensionDisplayName), "Uploader"}, {std::string(kExtensionDictionary), own}},
            {Data{0x89, 'P', 'N', 'G', 1}, Data{0x89, 'P', 'N', 'G', 2}},
            [plan] { return std::make_shared<FakeUploader>(plan); }};
}

}  // namespace lumacast
