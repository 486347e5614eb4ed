#include <algorithm>
#include <mutex>
#include <set>

#include "broadcast/LCExtensionHostContext.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/ExtensionsWorld.h"
#include "tests/fakes/FakeAppExtensions.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {

namespace {

ExtensionItem textItem(std::string title, std::string text) {
    return {std::move(title), {{std::string(kGenericDataType), Value(std::move(text)), std::nullopt}}};
}

/// What the probe is for the port.
class ObedientProgram final : public FakeExtensionProgram {
public:
    void beginRequest(FakeAppExtension& extension, ExtensionRequestID request,
                      const std::vector<ExtensionItem>& given) override {
        std::vector<ExtensionItem> items = given;
        std::string command = "hold";
        if (!items.empty() && items.front().attributedTitle == "command") {
            command = *items.front().attachments.front().item.as<std::string>();
            items.erase(items.begin());
        }
        if (command == "echo") return extension.complete(request, items);
        if (command == "leave") return extension.crash();
        if (command == "cancel") return extension.cancel(request);
        if (command == "twice") {
            extension.complete(request, {textItem("first", "1")});
            return extension.complete(request, {textItem("second", "2")});
        }
        if (command == "many") {
            const int count = std::stoi(*items.front().attachments.front().item.as<std::string>());
            items.clear();
            for (int i = 0; i < count; ++i) items.push_back(textItem("item", std::to_string(i)));
            return extension.complete(request, items);
        }
        if (command == "release") {
            for (const ExtensionRequestID held : std::exchange(held_, {}))
                extension.complete(held, {textItem("released", "")});
            return;
        }
        held_.push_back(request);
    }
    void setEndpoint(FakeIpc& ipc, const std::shared_ptr<IpcEndpoint>& endpoint,
                     const std::function<void()>& completion) override {
        broadcast_ = ipc.connectToEndpoint(endpoint);
        broadcast_->setRemoteInterface(broadcastDaemonProtocol());
        broadcast_->setExportedInterface(broadcastExtensionProtocol());
        broadcast_->resume();
        broadcast_->remoteProxy({})->send(static_cast<std::uint16_t>(BroadcastDaemonMessage::Ping), {});
        completion();
    }

private:
    std::vector<ExtensionRequestID> held_;
    std::shared_ptr<IpcConnection> broadcast_;
};

class FakeExtensionsWorld final : public ExtensionsWorld {
public:
    FakeExtensionsWorld() {
        extensions_.setContextClass(LCExtensionHostContext::contextClass(log_));
        extensions_.setFiles([this](const std::string& path) {
            const std::lock_guard lock(mutex_);
            return files_.contains(path);
        });
    }

    AppExtensions& extensions() override { return extensions_; }
    Scheduler& scheduler() override { return scheduler_; }
    void install(const ExtensionToInstall& extension) override {
        FakeInstalledExtension installed;
        installed.identifier = BundleIdentifier(extension.identifier);
        installed.point = extension.point;
        if (extension.activationRule)
            installed.attributes.set(std::string(kExtensionActivationRule), *extension.activationRule);
        Dictionary own;
        if (!extension.processMode.empty()) own.set("LCBroadcastProcessMode", extension.processMode);
        installed.info.set(std::string(kExtensionDictionary), Value(own));
        installed.info.set(std::string(kExtensionDisplayName),
                           extension.germanName.empty() ? extension.name : extension.germanName);
        installed.icons = extension.icons;
        installed.program = [] { return std::make_shared<ObedientProgram>(); };
        if (!extension.canBeLaunched) faults_.failNext("AppExtension.begin");
        extensions_.install(std::move(installed));
    }
    void uninstall(const std::string& identifier) override { extensions_.uninstall(BundleIdentifier(identifier)); }
    void breakLookups() override { faults_.failNext("AppExtensions.match"); }
    std::string makeFile(const std::string& name, const std::string&) override {
        const std::lock_guard lock(mutex_);
        return *files_.insert(directory() + "/" + name).first;
    }
    std::string directory() override { return "/files"; }
    std::shared_ptr<IpcEndpoint> listenForPing() override {
        listener_ = daemon_.anonymousListener();
        listener_->setDelegate(ping_);
        listener_->resume();
        return listener_->endpoint();
    }
    bool wasPinged() override { return ping_->was; }
    bool isOnRequestLane() override { return daemonQueue_->isCurrent(); }
    std::size_t processCount() override {
        const auto held = extensions_.extensions();
        return static_cast<std::size_t>(
            std::count_if(held.begin(), held.end(), [](const auto& extension) { return extension->isRunning(); }));
    }

private:
    FaultPlan faults_;
    Log log_;
    std::mutex mutex_;
    std::set<std::string> files_;
    const std::shared_ptr<ThreadLoop> loop_ = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler_{loop_};
    const std::shared_ptr<FakeIpcMachine> machine_ = std::make_shared<FakeIpcMachine>();
    const std::shared_ptr<SerialQueue> daemonQueue_ = scheduler_.serialQueue("daemon");
    FakeIpc daemon_{machine_, daemonQueue_, ProcessID{100}, faults_, log_};
    const std::shared_ptr<PingListener> ping_ = std::make_shared<PingListener>();
    std::shared_ptr<IpcListener> listener_;
    FakeAppExtensions extensions_{scheduler_, daemon_,
                                  [this](ProcessID pid) {
                                      return std::make_unique<FakeIpc>(
                                          machine_, scheduler_.serialQueue("extension process"), pid, faults_, log_);
                                  },
                                  faults_};
};

}  // namespace

std::unique_ptr<ExtensionsWorld> fakeExtensionsWorld() {
    return std::make_unique<FakeExtensionsWorld>();
}

}  // namespace lumacast
