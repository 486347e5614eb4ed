#include "tests/fakes/FakeAppExtensions.h"

#include <algorithm>
#include <utility>

#include "base/Limits.h"
#include "tests/fakes/FakeError.h"

namespace lumacast {

namespace {
constexpr int kNoSuchThing = 2;  // ENOENT
constexpr int kTryAgain = 11;    // EAGAIN
}

struct FakeAppExtensions::Shared {
    Scheduler& scheduler;
    FakeIpc& daemon;
    MakeProcess makeProcess;
    FaultPlan& faults;

    std::mutex mutex;
    ExtensionContextClass contextClass;
    std::vector<FakeInstalledExtension> installed;
    std::function<bool(const std::string&)> isFile;
    std::vector<std::string> lookups;
    std::vector<std::weak_ptr<FakeAppExtension>> extensions;
    std::int32_t nextPid = 5000;

    // No lock is held over a call of another role: the simulation may go on elsewhere there.
    ExtensionContextClass contextOf() {
        const std::lock_guard lock(mutex);
        return contextClass;
    }
    ProcessID takePid() {
        const std::lock_guard lock(mutex);
        return ProcessID{nextPid++};
    }
};

/// The extension's end of the auxiliary connection.
struct FakeAppExtension::Vendor final : IpcExportedObject, IpcListenerDelegate {
    Vendor(FakeIpc& ipc, std::shared_ptr<FakeExtensionProgram> program) : ipc(ipc), program(std::move(program)) {}
    bool listenerShouldAcceptNewConnection(IpcListener&, const std::shared_ptr<IpcConnection>& connection) override {
        connection->setExportedInterface(extensionVendorProtocol());
        connection->setExportedObject(self);
        connection->setRemoteInterface(extensionHostProtocol());
        connection->resume();
        return true;
    }
    void receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t, Array arguments, IpcReply reply) override {
        const auto* endpoint = arguments[0].as<Value::EndpointRef>();
        program->setEndpoint(ipc, endpoint ? *endpoint : nullptr, [reply] { reply({}); });
    }
    FakeIpc& ipc;
    const std::shared_ptr<FakeExtensionProgram> program;
    std::weak_ptr<Vendor> self;
};

struct FakeAppExtension::Process {
    ~Process() { ipc->kill(); }
    std::unique_ptr<FakeIpc> ipc;
    std::shared_ptr<SerialQueue> queue;  ///< where its program runs
    std::shared_ptr<FakeExtensionProgram> program;
    std::shared_ptr<Vendor> vendor;
    std::shared_ptr<IpcListener> listener;
    std::shared_ptr<IpcConnection> auxiliary;  ///< the daemon's end
};

FakeAppExtensions::FakeAppExtensions(Scheduler& scheduler, FakeIpc& daemon, MakeProcess makeProcess, FaultPlan& faults)
    : shared_(new Shared{scheduler, daemon, std::move(makeProcess), faults, {}, {}, {}, {}, {}, {}}),
      lookupQueue_(scheduler.serialQueue("extension lookups")) {}

FakeAppExtensions::~FakeAppExtensions() = default;

void FakeAppExtensions::setContextClass(ExtensionContextClass contextClass) {
    const std::lock_guard lock(shared_->mutex);
    shared_->contextClass = std::move(contextClass);
}

void FakeAppExtensions::extensionsWithMatchingPoint(const std::string& point, Matched handler) {
    std::vector<std::shared_ptr<AppExtension>> found;
    const auto error = shared_->faults.fails("AppExtensions.match") ? std::optional(fakeSystemError(kNoSuchThing)) : std::nullopt;
    {
        const std::lock_guard lock(shared_->mutex);
        shared_->lookups.push_back(point);
        for (const FakeInstalledExtension& installed : shared_->installed) {
            if (error || installed.point != point) continue;
            const auto extension = std::make_shared<FakeAppExtension>(shared_, installed);
            shared_->extensions.push_back(extension);
            found.push_back(extension);
        }
    }
    lookupQueue_->async([handler = std::move(handler), found = std::move(found), error] { handler(found, error); });
}

void FakeAppExtensions::install(FakeInstalledExtension extension) {
    const std::lock_guard lock(shared_->mutex);
    shared_->installed.push_back(std::move(extension));
}

void FakeAppExtensions::uninstall(const BundleIdentifier& identifier) {
    const std::lock_guard lock(shared_->mutex);
    std::erase_if(shared_->installed, [&](const auto& installed) { return installed.identifier == identifier; });
}

void FakeAppExtensions::setFiles(std::function<bool(const std::string& path)> isFile) {
    const std::lock_guard lock(shared_->mutex);
    shared_->isFile.swap(isFile);
}

std::vector<std::string> FakeAppExtensions::lookups() const {
    const std::lock_guard lock(shared_->mutex);
    return shared_->lookups;
}

std::vector<std::shared_ptr<FakeAppExtension>> FakeAppExtensions::extensions() const {
    const std::lock_guard lock(shared_->mutex);
    std::vector<std::shared_ptr<FakeAppExtension>> held;
    for (const auto& weak : shared_->extensions)
        if (auto extension = weak.lock()) held.push_back(std::move(extension));
    return held;
}

FakeAppExtension::FakeAppExtension(std::shared_ptr<FakeAppExtensions::Shared> shared, FakeInstalledExtension installed)
    : shared_(std::move(shared)),
      installed_(std::move(installed)),
      queue_(shared_->scheduler.serialQueue("extension " + installed_.identifier.text())) {}

FakeAppExtension::~FakeAppExtension() = default;

void FakeAppExtension::setRequestCompletionHandler(RequestCompletionHandler handler) {
    const std::lock_guard lock(mutex_);
    completionHandler_.swap(handler);
}

std::shared_ptr<FakeAppExtension::Process> FakeAppExtension::launch() {
    auto process = std::make_shared<Process>();
    process->ipc = shared_->makeProcess(shared_->takePid());
    process->queue = shared_->scheduler.serialQueue("program of " + installed_.identifier.text());
    process->program = installed_.program ? installed_.program() : std::make_shared<FakeExtensionProgram>();
    process->vendor = std::make_shared<Vendor>(*process->ipc, process->program);
    process->vendor->self = process->vendor;
    process->listener = process->ipc->anonymousListener();
    process->listener->setDelegate(process->vendor);
    process->listener->resume();
    process->auxiliary = shared_->daemon.connectToEndpoint(process->listener->endpoint());
    const ExtensionContextClass contextClass = shared_->contextOf();
    process->auxiliary->setExportedInterface(*contextClass.auxiliaryHostProtocol);
    process->auxiliary->setRemoteInterface(*contextClass.auxiliaryVendorProtocol);
    process->auxiliary->resume();
    return process;
}

void FakeAppExtension::beginExtensionRequestWithInputItems(std::vector<ExtensionItem> items, BeginHandler handler) {
    queue_->async([self = shared_from_this(), items = std::move(items), handler = std::move(handler)] {
        if (self->shared_->faults.fails("AppExtension.begin")) return handler(std::nullopt, fakeSystemError(kNoSuchThing));
        std::shared_ptr<Process> process;
        bool isTooMany = false;
        {
            const std::lock_guard lock(self->mutex_);
            process = self->process_;
            isTooMany = self->contexts_.size() >= limitOf(Limit::ExtensionRequestsInFlight);
        }
        if (isTooMany) return handler(std::nullopt, fakeSystemError(kTryAgain));
        if (!process) process = self->launch();
        const bool hasVendor = !self->shared_->faults.fails("AppExtension.vendor");
        auto context = self->shared_->contextOf().make(hasVendor ? process->auxiliary : nullptr);
        ExtensionRequestID request{};
        {
            const std::lock_guard lock(self->mutex_);
            self->process_ = process;
            request = ExtensionRequestID{++self->lastRequest_};
            self->contexts_[request] = context;
            self->begun_.push_back({request, items});
        }
        if (hasVendor) context->didConnectToVendor();
        // Held until then: what it was begun with goes on when its object has gone.
        process->queue->async([self, program = process->program, request, items] {
            if (self->isRunning()) program->beginRequest(*self, request, items);
        });
        handler(request, std::nullopt);
    });
}

std::shared_ptr<ExtensionContext> FakeAppExtension::extensionContextForRequest(ExtensionRequestID request) {
    const std::lock_guard lock(mutex_);
    const auto found = contexts_.find(request);
    return found == contexts_.end() ? nullptr : found->second;
}

std::optional<std::string> FakeAppExtension::issueReadOnlyFileToken(std::string_view tokenClass,
                                                                    const std::string& path) {
    if (path.empty() || shared_->faults.fails("AppExtension.token")) return std::nullopt;
    {
        const std::lock_guard lock(shared_->mutex);
        if (shared_->isFile && !shared_->isFile(path)) return std::nullopt;
    }
    const std::lock_guard lock(mutex_);
    tokens_.push_back({std::string(tokenClass), path, "token " + std::to_string(tokens_.size() + 1)});
    return tokens_.back().text;
}

void FakeAppExtension::kill(int signal) {
    {
        const std::lock_guard lock(mutex_);
        if (!process_) return;
        signals_.push_back(signal);
    }
    crash();
}

void FakeAppExtension::crash() {
    std::shared_ptr<Process> process;
    std::map<ExtensionRequestID, std::shared_ptr<ExtensionContext>> left;
    {
        const std::lock_guard lock(mutex_);
        process_.swap(process);
        contexts_.swap(left);  // what it leaves is never told
    }
    // Not on the lane of the handlers: one may be waiting there.
    if (process) process->queue->async([process] { process->ipc->kill(); });
}

void FakeAppExtension::complete(ExtensionRequestID request, std::vector<ExtensionItem> returned) {
    if (returned.size() > limitOf(Limit::ExtensionItemsReturned))
        returned.resize(limitOf(Limit::ExtensionItemsReturned));
    queue_->async([self = shared_from_this(), request, returned = std::move(returned)] {
        RequestCompletionHandler handler;
        {
            const std::lock_guard lock(self->mutex_);
            if (self->contexts_.erase(request) == 0) return;
            handler = self->completionHandler_;
        }
        if (handler) handler(request, returned);
    });
}

void FakeAppExtension::cancel(ExtensionRequestID request) {
    queue_->async([self = shared_from_this(), request] {
        std::shared_ptr<ExtensionContext> context;
        const std::lock_guard lock(self->mutex_);
        const auto found = self->contexts_.find(request);
        if (found == self->contexts_.end()) return;
        context = std::move(found->second);
        self->contexts_.erase(found);
    });
}

bool FakeAppExtension::isRunning() const {
    const std::lock_guard lock(mutex_);
    return process_ != nullptr;
}

std::vector<FakeAppExtension::Begun> FakeAppExtension::begun() const {
    const std::lock_guard lock(mutex_);
    return begun_;
}

std::vector<FakeAppExtension::Token> FakeAppExtension::tokens() const {
    const std::lock_guard lock(mutex_);
    return tokens_;
}

std::vector<int> FakeAppExtension::signals() const {
    const std::lock_guard lock(mutex_);
    return signals_;
}

}  // namespace lumacast
