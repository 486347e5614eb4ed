#include "linux/extensions/ExtensionRun.h"

#include <signal.h>

#include <cerrno>
#include <utility>

#include "base/Limits.h"

namespace lumacast {

namespace {

Error systemError(int number) {
    return Error(std::string(kSystemErrorDomain), number);
}

}  // namespace

ExtensionRun::ExtensionRun(std::shared_ptr<ExtensionServices> services,
                           std::shared_ptr<const InstalledExtension> installed)
    : services_(std::move(services)),
      installed_(std::move(installed)),
      queue_(services_->scheduler.serialQueue("extension " + installed_->manifest.identifier)),
      tokens_(services_->options.readableFiles, services_->disk) {}

void ExtensionRun::setCompletionHandler(AppExtension::RequestCompletionHandler handler) {
    auto shared = std::make_shared<AppExtension::RequestCompletionHandler>(std::move(handler));
    const std::lock_guard lock(mutex_);
    completionHandler_.swap(shared);
}

void ExtensionRun::begin(std::vector<ExtensionItem> items, AppExtension::BeginHandler handler) {
    {
        const std::lock_guard lock(mutex_);
        if (requests_.size() < limitOf(Limit::ExtensionRequestsInFlight)) {
            const ExtensionRequestID id{++lastRequest_};
            tokens_.handOver(id, items);
            requests_.emplace(id, Request{Stage::Waiting, std::move(items), std::move(handler), nullptr});
            services_->reactor.async([self = shared_from_this()] { self->proceed(); });
            return;
        }
    }
    tokens_.handOver(std::nullopt, items);
    services_->log.error("%s has too many requests that it has not completed", name());
    queue_->async([handler = std::move(handler)] { handler(std::nullopt, systemError(EAGAIN)); });
}

std::shared_ptr<ExtensionContext> ExtensionRun::context(ExtensionRequestID request) {
    const std::lock_guard lock(mutex_);
    const auto found = requests_.find(request);
    return found == requests_.end() ? nullptr : found->second.context;
}

std::optional<std::string> ExtensionRun::issueToken(const std::string& path) {
    return tokens_.issue(path);
}

void ExtensionRun::kill(int signal) {
    if (signal <= 0) return;
    std::shared_ptr<Session> session;
    {
        const std::lock_guard lock(mutex_);
        session = session_;
        if (session && session->process) session->process->signal(signal);
    }
    // It won't serve another request.
    if (session && signal == SIGKILL) over(session, ECANCELED);
}

void ExtensionRun::proceed() {
    if (services_->isOver) return;
    std::vector<ExtensionRequestID> waiting;
    bool hasSession = false, isGreeted = false;
    {
        const std::lock_guard lock(mutex_);
        hasSession = session_ != nullptr;
        isGreeted = hasSession && session_->requests;
        for (const auto& [id, request] : requests_)
            if (request.stage == Stage::Waiting) waiting.push_back(id);
    }
    if (waiting.empty()) return;
    if (!hasSession) return launch();
    if (!isGreeted) return;
    for (const ExtensionRequestID id : waiting) handOver(id);
}

void ExtensionRun::launch() {
    auto session = std::make_shared<Session>();
    {
        const std::lock_guard lock(mutex_);
        session_ = session;
    }
    // Making its directory may have to wait for the disk.
    services_->scheduler.serialQueue("launch of " + name())->async([self = shared_from_this(), session] {
        auto command = std::make_shared<std::optional<ConfinedCommand>>();
        if (!self->services_->isOver) *command = self->services_->sandbox->commandFor(*self->installed_);
        self->services_->reactor.async([self, session, command] { self->launched(session, std::move(*command)); });
    });
}

void ExtensionRun::launched(const std::shared_ptr<Session>& session, std::optional<ConfinedCommand> command) {
    if (services_->isOver) return;
    if (!command) return over(session, EACCES);
    ExtensionProcess::Events events;
    events.greeted = [self = shared_from_this(), session](ExtensionProcess::Greeting requests,
                                                          ExtensionProcess::Greeting auxiliary) {
        self->greeted(session, std::move(requests), std::move(auxiliary));
    };
    events.ended = [self = shared_from_this(), session](const std::string& how, int error) {
        if (!self->services_->isOver) self->services_->log.line("%s %s", self->name(), how);
        self->over(session, error);
    };
    const auto process =
        std::make_shared<ExtensionProcess>(services_->reactor, services_->log, name(), std::move(events));
    {
        // It may have been killed while its command was made.
        const std::lock_guard lock(mutex_);
        if (session_ != session) return;
        session->process = process;
    }
    const std::lock_guard lock(services_->mutex);
    std::erase_if(services_->processes, [](const auto& weak) { return weak.expired(); });
    services_->processes.push_back(process);
    if (services_->launches) process->start(*services_->launches, *command);
}

void ExtensionRun::greeted(const std::shared_ptr<Session>& session, ExtensionProcess::Greeting requests,
                           ExtensionProcess::Greeting auxiliary) {
    if (services_->isOver) return;
    ExtensionContextClass contextClass;
    {
        const std::lock_guard lock(services_->mutex);
        contextClass = services_->contextClass;
    }
    const auto requestsConnection = services_->ipc.adopt(std::move(requests.socket), std::move(requests.peer));
    const auto auxiliaryConnection = services_->ipc.adopt(std::move(auxiliary.socket), std::move(auxiliary.peer));
    {
        const std::lock_guard lock(mutex_);
        if (session_ != session) return;  // killed meanwhile
        session->requests = requestsConnection;
        session->auxiliary = auxiliaryConnection;
    }
    if (contextClass.auxiliaryHostProtocol)
        auxiliaryConnection->setExportedInterface(*contextClass.auxiliaryHostProtocol);
    if (contextClass.auxiliaryVendorProtocol)
        auxiliaryConnection->setRemoteInterface(*contextClass.auxiliaryVendorProtocol);
    const std::weak_ptr weakSession = session;
    auxiliaryConnection->setInvalidationHandler([weak = weak_from_this(), weakSession] {
        const auto self = weak.lock();
        const auto live = weakSession.lock();
        if (!self || !live) return;
        const std::lock_guard lock(self->mutex_);
        live->auxiliary = nullptr;
    });
    requestsConnection->setExportedInterface(extensionRequestHostProtocol());
    requestsConnection->setRemoteInterface(extensionRequestProtocol());
    requestsConnection->setExportedObject(weak_from_this());
    requestsConnection->setInvalidationHandler([weak = weak_from_this(), weakSession] {
        const auto self = weak.lock();
        const auto lost = weakSession.lock();
        if (self && lost) self->over(lost, EPIPE);
    });
    keepFileTokens(requestsConnection, [weak = weak_from_this()](Bytes token) {
        const auto self = weak.lock();
        return self ? self->tokens_.exchange(token) : TokenAnswer{Fd(), EACCES, false};
    });
    auxiliaryConnection->resume();
    requestsConnection->resume();
    proceed();
}

void ExtensionRun::handOver(ExtensionRequestID id) {
    ExtensionContextClass contextClass;
    {
        const std::lock_guard lock(services_->mutex);
        contextClass = services_->contextClass;
    }
    std::shared_ptr<IpcConnection> requests, auxiliary;
    Array items;
    {
        const std::lock_guard lock(mutex_);
        const auto found = requests_.find(id);
        if (found == requests_.end() || found->second.stage != Stage::Waiting || !session_) return;
        found->second.stage = Stage::HandedOver;
        items = encodeItems(std::exchange(found->second.items, {}));
        requests = session_->requests;
        auxiliary = session_->auxiliary;
    }
    const auto context = contextClass.make ? contextClass.make(auxiliary) : nullptr;
    {
        const std::lock_guard lock(mutex_);
        if (const auto found = requests_.find(id); found != requests_.end()) found->second.context = context;
    }
    if (context && auxiliary) context->didConnectToVendor();
    const auto weak = weak_from_this();
    requests
        ->remoteProxy([weak, id](const Error& error) {
            const auto self = weak.lock();
            if (!self) return;
            std::optional<Request> failed;
            {
                const std::lock_guard lock(self->mutex_);
                const auto found = self->requests_.find(id);
                if (found == self->requests_.end() || found->second.stage == Stage::Taken) return;
                failed.emplace(std::move(found->second));
                self->requests_.erase(found);
            }
            self->tokens_.end(id);
            self->fail(*failed, static_cast<int>(error.code()));
            self->endIfAbandoned();
        })
        ->send(static_cast<std::uint16_t>(ExtensionRequestMessage::BeginRequest),
               {Value(static_cast<std::int64_t>(id)), Value(std::move(items))}, [weak, id](Array) {
                   if (const auto self = weak.lock()) self->taken(id);
               });
}

void ExtensionRun::taken(ExtensionRequestID id) {
    AppExtension::BeginHandler handler;
    {
        const std::lock_guard lock(mutex_);
        const auto found = requests_.find(id);
        if (found == requests_.end() || found->second.stage != Stage::HandedOver) return;
        found->second.stage = Stage::Taken;
        handler.swap(found->second.handler);
    }
    if (handler) queue_->async([handler = std::move(handler), id] { handler(id, std::nullopt); });
}

void ExtensionRun::fail(Request& request, int error) {
    if (!request.handler) return;
    queue_->async([handler = std::move(request.handler), error] { handler(std::nullopt, systemError(error)); });
}

void ExtensionRun::over(const std::shared_ptr<Session>& session, int error) {
    std::map<ExtensionRequestID, Request> gone;
    Session last;
    {
        const std::lock_guard lock(mutex_);
        if (session_ != session) return;
        session_ = nullptr;
        last = *session;
        // Begun while a process was there: they were this one's.
        gone.swap(requests_);
    }
    tokens_.endAll();
    if (last.process) last.process->signal(SIGKILL);
    if (last.auxiliary) last.auxiliary->invalidate();
    if (last.requests) last.requests->invalidate();
    if (services_->isOver) return;
    for (auto& [id, request] : gone) {
        if (request.handler)
            fail(request, error);
        else
            services_->log.line("%s has left a request without completing it", name());
    }
}

}  // namespace lumacast
