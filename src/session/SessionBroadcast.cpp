// A session's link to the upload extension of a broadcast. Enabling runs on the session's start queue and may wait there;
// samples come on the frame lane and the audio queues, the rest on the request lane.

#include "broadcast/ConfigurationArchive.h"
#include "broadcast/ExtensionDiscovery.h"
#include "broadcast/PayloadKeys.h"
#include "session/LCRecordingSession.h"
#include "session/SamplePayloads.h"

namespace lumacast {

namespace {

bool isSampleBuffers(std::int64_t mode) { return mode == static_cast<std::int64_t>(BroadcastProcessMode::SampleBuffers); }

}  // namespace

/// The wait for an extension. Shared with handlers that may be called when it is long over.
struct LCRecordingSession::ExtensionWait {
    explicit ExtensionWait(Scheduler& scheduler) : semaphore(scheduler.semaphore(0)) {}
    std::atomic<bool> isForsaken{false};  ///< nobody wants what would come of it any more
    const std::unique_ptr<Semaphore> semaphore;
    /// The extension's failure that ended it, or came later.
    const std::shared_ptr<Guarded<std::optional<Error>>> error = std::make_shared<Guarded<std::optional<Error>>>();
};

std::optional<BundleIdentifier> LCRecordingSession::broadcastExtensionID() const {
    const auto extension = broadcastExtension();
    return extension ? std::optional(extension->identifier()) : std::nullopt;
}

std::int64_t LCRecordingSession::enableBroadcastWithExtension(std::shared_ptr<AppExtension> extension, std::int64_t mode,
                                                              std::optional<Dictionary> userInfo,
                                                              const std::shared_ptr<IpcEndpoint>& listenerEndpoint) {
    const auto wait = prepareBroadcast(std::move(extension), mode, std::move(userInfo));
    connectBroadcast(wait, broadcastExtension(), mode, listenerEndpoint);
    return 0;  // deliberately always: a failure shows in disableBroadcast alone
}

LCRecordingSession::ExtensionWaitRef LCRecordingSession::prepareBroadcast(std::shared_ptr<AppExtension> extension,
                                                                          std::int64_t mode,
                                                                          std::optional<Dictionary> userInfo) {
    log_.line("LCRecordingSession: enableBroadcastWithExtension");
    setBroadcastExtension(std::move(extension));
    broadcastUserInfo_.set(std::move(userInfo));
    broadcastFragmentStartTime_.set(kInvalidMediaTime);
    broadcastFragmentIndex_ = 1;
    broadcastProcessMode_ = mode;
    bundleIDOfFirstForegroundApp_.set(std::nullopt);
    auto wait = std::make_shared<ExtensionWait>(services_.platform.scheduler);
    extensionWait_.set(wait);
    return wait;
}

LCRecordingSession::BroadcastLink LCRecordingSession::connectBroadcast(
    const ExtensionWaitRef& wait, std::shared_ptr<AppExtension> extension, std::int64_t mode,
    const std::shared_ptr<IpcEndpoint>& listenerEndpoint) {
    BroadcastLink link;
    if (isSampleBuffers(mode) && !wait->isForsaken) {
        log_.line("setting up extension proxy");
        link = listenerEndpoint ? connectToListeningExtension(wait, listenerEndpoint)
                                : connectToExtension(wait, std::move(extension));
    }
    extensionWait_.update([&](ExtensionWaitRef& current) {
        if (current == wait) current = nullptr;
    });
    return link;
}

LCRecordingSession::BroadcastLink LCRecordingSession::connectToListeningExtension(
    const ExtensionWaitRef& wait, const std::shared_ptr<IpcEndpoint>& listenerEndpoint) {
    const auto proxy = LCBroadcastExtensionProxy::initWithBroadcastUploadListenerEndpoint(
        services_.platform, services_.errors, listenerEndpoint);
    installHandlers(*proxy, wait);
    setBroadcastUploadExtensionProxy(proxy);
    return {proxy, wait->error};
}

LCRecordingSession::BroadcastLink LCRecordingSession::connectToExtension(const ExtensionWaitRef& wait,
                                                                         std::shared_ptr<AppExtension> extension) {
    const auto proxy = LCBroadcastExtensionProxy::initWithBroadcastUploadExtension(services_.platform, services_.errors,
                                                                                   std::move(extension));
    installHandlers(*proxy, wait);
    setBroadcastUploadExtensionProxy(proxy);
    proxy->establishConnectionWithHandler([weak = weak_from_this(), wait](const std::optional<Error>& error) {
        if (const auto self = weak.lock()) {
            // A newer start has its own broadcast by then.
            if (error && self->extensionWait_.get() == wait)
                self->disableBroadcast();
            else if (!error)
                self->log_.line("connection to extensions ready");
        }
        wait->semaphore->signal();
    });
    wait->semaphore->wait();  // deliberately without a limit; endWaitForExtension ends it
    return {proxy, wait->error};
}

void LCRecordingSession::installHandlers(LCBroadcastExtensionProxy& proxy, const ExtensionWaitRef& wait) {
    proxy.setServiceInfoHandler([weak = weak_from_this()](const Value& info) {
        const auto self = weak.lock();
        if (const auto client = self ? self->clientProxy() : nullptr) client->updateBroadcastServiceInfo(info);
    });
    proxy.setBroadcastURLHandler([weak = weak_from_this()](const URL& url) {
        const auto self = weak.lock();
        if (const auto client = self ? self->clientProxy() : nullptr) client->updateBroadcastURL(url);
    });
    proxy.setErrorHandler([weak = weak_from_this(), weakProxy = proxy.weak_from_this(), wait](const Error& error) {
        const auto self = weak.lock();
        const auto failed = weakProxy.lock();
        if (self && failed) self->extensionFailed(failed, error);
        wait->error->set(error);
        wait->semaphore->signal();
    });
}

void LCRecordingSession::extensionFailed(const std::shared_ptr<LCBroadcastExtensionProxy>& proxy, const Error& error) {
    const bool isCurrent = broadcastUploadExtensionProxy() == proxy;
    // What an older broadcast's extension reports ends nothing that came after it.
    if (isCurrent && isSampleBuffers(broadcastProcessMode_)) stopRecordingWithNotification(true, error);
    if (const auto delegate = delegate_.get().lock())
        delegate->broadcastExtensionFailed(shared_from_this(), proxy, error);
    proxy->invalidateConnection();
    if (isCurrent) setBroadcastUploadExtensionProxy(nullptr);
}

void LCRecordingSession::endWaitForExtension() {
    const auto wait = extensionWait_.get();
    if (!wait) return;
    wait->isForsaken = true;
    wait->semaphore->signal();
}

void LCRecordingSession::disableBroadcast() {
    log_.line("LCRecordingSession: disableBroadcast");
    setBroadcastExtension(nullptr);
    broadcastUserInfo_.set(std::nullopt);
    broadcastConfiguration_.set(std::nullopt);
    broadcastProcessMode_ = static_cast<std::int64_t>(BroadcastProcessMode::MovieClips);
}

void LCRecordingSession::_notifyExtensionOfAction(ExtensionAction action, Handler completion) {
    if (!isSampleBuffers(broadcastProcessMode_)) {
        completion();
        return;
    }
    const auto proxy = readyExtensionProxy();
    if (!proxy) {
        completion();
        return;
    }
    Dictionary payload{{std::string(kPayloadActionType), static_cast<std::int64_t>(action)}};
    if (const auto info = broadcastUserInfo_.get()) payload.set(std::string(kPayloadUserInfo), *info);
    proxy->processPayload(std::move(payload), std::move(completion));
}

std::shared_ptr<LCBroadcastExtensionProxy> LCRecordingSession::readyExtensionProxy() {
    if (!broadcastExtension()) {
        log_.line("no broadcast extension found!");
        return nullptr;
    }
    auto proxy = broadcastUploadExtensionProxy();
    if (!proxy) log_.line("broadcast extension not ready");
    return proxy;
}

void LCRecordingSession::_notifyExtensionOfVideoSampleBuffer(const SampleRef& sample, SampleType type,
                                                             std::uint32_t orientation) {
    if (const auto proxy = readyExtensionProxy())
        proxy->processPayload(videoPayload(*sample, static_cast<std::int64_t>(type), orientation), [&log = log_] {
            log.sample("lumacastd sending video payload to broadcast extension...");
        });
}

void LCRecordingSession::_notifyExtensionOfAudioSampleBuffer(const SampleRef& sample, SampleType type) {
    // The sample is kept until the extension has processed it.
    if (const auto proxy = readyExtensionProxy())
        proxy->processPayload(audioPayload(*sample, static_cast<std::int64_t>(type)), [&log = log_, sample] {
            log.sample("lumacastd sending audio payload to broadcast extension...");
        });
}

void LCRecordingSession::_notifyExtensionOfFrontmostProcessBundleID(const BundleIdentifier& identifier) {
    if (const auto proxy = readyExtensionProxy())
        proxy->processPayload({{std::string(kPayloadFrontmostApp), identifier.text()}}, [&log = log_] {
            log.line("lumacastd sending frontmost app bundleID to broadcast extension...");
        });
}

void LCRecordingSession::packageVideoSampleBufferForCapture(const SampleRef& sample) {
    const auto client = clientProxy();
    if (!client) return;
    const auto& image = sample->image();
    client->captureHandlerWithSample(image ? image->plane() : nullptr, timingInfoBlock(*sample));
}

void LCRecordingSession::packageAudioSampleBufferForCapture(const SampleRef& sample, SampleType type) {
    const auto client = clientProxy();
    if (!client) return;
    client->captureHandlerWithAudioSample(audioDataBlock(*sample), audioFormatBlock(*sample), sample->sampleCount(),
                                          static_cast<std::int64_t>(type), timingInfoBlock(*sample));
}

}  // namespace lumacast
