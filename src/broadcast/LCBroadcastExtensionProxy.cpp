#include "broadcast/LCBroadcastExtensionProxy.h"

#include <utility>

#include "base/Limits.h"
#include "broadcast/PayloadKeys.h"

namespace lumacast {

namespace {

constexpr int kKillSignal = 9;
/// An extension that has processed nothing of what it was given for so long can't be reached any more.
constexpr std::chrono::seconds kPatience{10};
constexpr std::chrono::seconds kPatienceIsLookedAtEvery{2};

bool carriesFrame(const Dictionary& payload) {
    const Value* plane = payload.find(kPayloadSharedPlane);
    return plane && plane->as<Value::PlaneRef>();
}

}  // namespace

/// One payload that is under way: processed or lost, it ends with this.
class LCBroadcastExtensionProxy::PendingPayload {
public:
    PendingPayload(std::shared_ptr<Pending> pending, bool hasFrame, const Clock& clock)
        : pending_(std::move(pending)), hasFrame_(hasFrame), clock_(clock) {}
    PendingPayload(const PendingPayload&) = delete;
    PendingPayload& operator=(const PendingPayload&) = delete;
    ~PendingPayload() {
        const std::lock_guard lock(pending_->mutex);
        --pending_->payloads;
        if (hasFrame_) --pending_->frames;
    }
    void wasProcessed() {
        const std::chrono::nanoseconds now{clock_.hostTime().nanoseconds};
        const std::lock_guard lock(pending_->mutex);
        pending_->lastProgress = now;
    }

private:
    const std::shared_ptr<Pending> pending_;
    const bool hasFrame_;
    const Clock& clock_;
};

LCBroadcastExtensionProxy::LCBroadcastExtensionProxy(const Platform& platform, const RecordingErrors& errors)
    : platform_(platform), errors_(errors), log_(platform.log) {}

LCBroadcastExtensionProxy::~LCBroadcastExtensionProxy() { tearDown(); }

std::shared_ptr<LCBroadcastExtensionProxy> LCBroadcastExtensionProxy::initWithBroadcastUploadExtension(
    const Platform& platform, const RecordingErrors& errors, std::shared_ptr<AppExtension> extension) {
    const std::shared_ptr<LCBroadcastExtensionProxy> proxy(new LCBroadcastExtensionProxy(platform, errors));
    const auto listener = platform.ipc.anonymousListener();
    proxy->listener_.set(listener);
    // Deliberately before the delegate is there: nobody has the endpoint yet.
    listener->resume();
    listener->setDelegate(proxy);
    proxy->listenerEndpoint_.set(listener->endpoint());
    proxy->extension_.set(std::move(extension));
    return proxy;
}

std::shared_ptr<LCBroadcastExtensionProxy> LCBroadcastExtensionProxy::initWithBroadcastUploadListenerEndpoint(
    const Platform& platform, const RecordingErrors& errors, const std::shared_ptr<IpcEndpoint>& endpoint) {
    const std::shared_ptr<LCBroadcastExtensionProxy> proxy(new LCBroadcastExtensionProxy(platform, errors));
    if (!proxy->connection()) proxy->accept(platform.ipc.connectToEndpoint(endpoint));
    return proxy;
}

void LCBroadcastExtensionProxy::establishConnectionWithHandler(ReadyHandler handler) {
    log_.line("establishing connection to extension");
    connectionReadyHandler_.set(handler);
    const auto extension = extension_.get();
    if (!extension) return;
    extension->beginExtensionRequestWithInputItems(
        {ExtensionItem{}},
        [weak = weak_from_this(), launched = std::weak_ptr(extension), handler = std::move(handler)](
            std::optional<ExtensionRequestID> request, const std::optional<Error>& error) {
            auto self = weak.lock();
            if (!self || !self->broadcastUploadExtension()) {
                // Torn down before the extension was there to be killed.
                if (const auto late = launched.lock()) late->kill(kKillSignal);
                return;
            }
            if (error || !request) {
                self->log_.line("Error beginning extension request: %i", error ? error->code() : std::int64_t{0});
                handler(error);
                return;
            }
            self->log_.line("beginExtensionRequestWithInputItems returned");
            const auto isSet = self->setEndpoint(*request, handler);
            // The wait keeps nobody alive: whoever lets the proxy go ends it.
            self.reset();
            if (isSet) isSet->wait();
        });
}

std::shared_ptr<Semaphore> LCBroadcastExtensionProxy::setEndpoint(ExtensionRequestID request,
                                                                  const ReadyHandler& handler) {
    const auto extension = extension_.get();
    const auto context = extension ? extension->extensionContextForRequest(request) : nullptr;
    const auto auxiliary = context ? context->auxiliaryConnection() : nullptr;
    // The wait outlives this call where the answer comes twice, and the other way round.
    std::shared_ptr<Semaphore> isSet = platform_.scheduler.semaphore(0);
    auto remote = auxiliary ? auxiliary->remoteProxy([weak = weak_from_this(), isSet](const Error&) {
        // It has gone before it had the endpoint: it can't come.
        if (const auto self = weak.lock()) self->reportUnreachable();
        isSet->signal();
    })
                            : nullptr;
    if (!remote) {
        log_.line("Error setting listenerEndpoint");
        handler(std::nullopt);  // deliberately no error: a ping may still come
        return nullptr;
    }
    remote->send(static_cast<std::uint16_t>(ExtensionVendorMessage::SetEndpoint), {Value(listenerEndpoint_.get())},
                 [&log = log_, isSet](Array) {
                     log.line("Remote endpoint set.");
                     isSet->signal();
                 });
    return isSet;
}

bool LCBroadcastExtensionProxy::listenerShouldAcceptNewConnection(IpcListener&,
                                                                  const std::shared_ptr<IpcConnection>& connection) {
    accept(connection);
    return true;
}

void LCBroadcastExtensionProxy::accept(const std::shared_ptr<IpcConnection>& connection) {
    // One that came before is deliberately not retired: its end is still reported.
    connection_.set(connection);
    connection->setExportedObject(weak_from_this());
    connection->setExportedInterface(broadcastDaemonProtocol());
    connection->setRemoteInterface(broadcastExtensionProtocol());
    connection->setInvalidationHandler([weak = weak_from_this()] {
        const auto self = weak.lock();
        if (!self) return;
        self->log_.line("connection to broadcast extension invalidated");
        self->reportUnreachable();
    });
    connection->setInterruptionHandler([&log = log_] { log.line("connection to broadcast extension interrupted"); });
    connection->resume();
    startPatienceTimer();
}

void LCBroadcastExtensionProxy::receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t message,
                                               Array arguments, IpcReply) {
    switch (static_cast<BroadcastDaemonMessage>(message)) {
        case BroadcastDaemonMessage::Ping: {
            log_.line("received ping from extension, notifying handler that connection is ready");
            if (const auto ready = connectionReadyHandler_.get()) ready(std::nullopt);
            break;
        }
        case BroadcastDaemonMessage::UpdateServiceInfo:
            log_.line("received serviceInfo");
            if (const auto handler = serviceInfoHandler_.get()) handler(arguments[0]);
            break;
        case BroadcastDaemonMessage::UpdateBroadcastURL: {
            log_.line("received broadcastURL");
            const auto handler = broadcastURLHandler_.get();
            if (const URL* url = arguments[0].as<URL>(); url && handler) handler(*url);
            break;
        }
        case BroadcastDaemonMessage::FinishBroadcastWithError: {
            log_.line("received finish request from service due to error");
            const auto handler = errorHandler_.get();
            const Error* error = arguments[0].asError();
            if (handler)
                handler(error ? *error
                              : errors_._lcUserErrorForCode(RecordingErrorCode::InvalidBroadcastSession, Dictionary()));
            break;
        }
    }
}

void LCBroadcastExtensionProxy::processPayload(Dictionary payload, std::function<void()> completion) {
    const auto connection = connection_.get();
    if (!connection) return;  // nobody to send it to, and deliberately nobody told
    const bool hasFrame = carriesFrame(payload);
    {
        const std::chrono::nanoseconds now{platform_.clock.hostTime().nanoseconds};
        const std::lock_guard lock(pending_->mutex);
        if (hasFrame && pending_->frames >= limitOf(Limit::FramesAtExtension)) {
            ++pending_->framesLeftOut;
            return;
        }
        if (pending_->payloads++ == 0) pending_->lastProgress = now;
        if (hasFrame) ++pending_->frames;
    }
    const auto pending = std::make_shared<PendingPayload>(pending_, hasFrame, platform_.clock);
    const auto remote = connection->remoteProxy([weak = weak_from_this()](const Error& error) {
        const auto self = weak.lock();
        if (!self) return;
        self->log_.line("error getting remote proxy to extension: %i", error.code());
        self->reportUnreachable();
    });
    Array arguments;
    arguments.emplace_back(std::move(payload));
    remote->send(static_cast<std::uint16_t>(BroadcastExtensionMessage::ProcessPayload), std::move(arguments),
                 [pending, completion = std::move(completion)](Array) {
                     pending->wasProcessed();
                     if (completion) completion();
                 });
}

void LCBroadcastExtensionProxy::reportUnreachable() {
    if (const auto handler = errorHandler_.get())
        handler(errors_._lcUserErrorForCode(RecordingErrorCode::InvalidBroadcastSession, Dictionary()));
}

void LCBroadcastExtensionProxy::startPatienceTimer() {
    // The main queue lives as long as the platform does.
    const std::shared_ptr<SerialQueue> lane(std::shared_ptr<void>(), &platform_.scheduler.mainQueue());
    patienceTimer_.set(platform_.scheduler.timer(lane, kPatienceIsLookedAtEvery, [weak = weak_from_this()] {
        if (const auto self = weak.lock()) self->checkPatience();
    }));
}

void LCBroadcastExtensionProxy::checkPatience() {
    const std::chrono::nanoseconds now{platform_.clock.hostTime().nanoseconds};
    {
        const std::lock_guard lock(pending_->mutex);
        if (pending_->payloads == 0 || now - pending_->lastProgress < kPatience) return;
    }
    patienceTimer_.set(nullptr);
    log_.error("the broadcast extension has processed nothing for %d seconds", static_cast<int>(kPatience.count()));
    reportUnreachable();
}

void LCBroadcastExtensionProxy::invalidateConnection() {
    log_.line("invalidating connection with extension");
    tearDown();
}

void LCBroadcastExtensionProxy::tearDown() {
    connectionReadyHandler_.set({});
    patienceTimer_.set(nullptr);
    if (const auto connection = connection_.get()) {
        // So that a deliberate end is not reported.
        connection->setInvalidationHandler({});
        connection->setInterruptionHandler({});
        connection->invalidate();
    }
    if (const auto listener = listener_.get()) listener->invalidate();
    connection_.set(nullptr);
    listener_.set(nullptr);
    if (const auto extension = extension_.get()) extension->kill(kKillSignal);
    extension_.set(nullptr);
}

std::uint64_t LCBroadcastExtensionProxy::framesLeftOut() const {
    const std::lock_guard lock(pending_->mutex);
    return pending_->framesLeftOut;
}

}  // namespace lumacast
