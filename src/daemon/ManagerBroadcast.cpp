// Setting a broadcast up, and starting one. Request lane, but for what lookups answer (their lane, which asks the disk for
// icons) and the waits on a session's start queue.

#include <utility>

#include "broadcast/ConfigurationArchive.h"
#include "broadcast/ExtensionDiscovery.h"
#include "daemon/LCRecordingManager.h"

namespace lumacast {

void LCRecordingManager::setupBroadcastWithHostBundleID(const BundleIdentifier& host,
                                                        const std::string& broadcastExtensionBundleID,
                                                        const Data& broadcastConfigurationData,
                                                        const std::optional<Dictionary>& userInfo,
                                                        SaveHandler handler) {
    loadBroadcastUploadExtensionWithBaseIdentifier(
        Localization::baseIdentifier(broadcastExtensionBundleID),
        [self = shared_from_this(), host, broadcastConfigurationData, userInfo, handler = std::move(handler)](
            const std::shared_ptr<AppExtension>& extension, std::int64_t processMode, const std::optional<Error>& error) {
            if (!extension) {
                handler(error ? *error
                              : self->services_.errors._lcUserErrorForCode(RecordingErrorCode::InvalidBroadcastSession));
                return;
            }
            // A configuration that does not decode fails nothing: the broadcast goes without.
            auto configuration = configurationIn(self->platform_.keyedArchive, broadcastConfigurationData);
            // Here, off the request lane: the disk is asked.
            auto extensionImage = firstIcon(*extension);
            auto hostImage = self->platform_.bundles.applicationIcon(host, IconFormat::Large);
            self->onRequestLane([=, configuration = std::move(configuration), extensionImage = std::move(extensionImage),
                                 hostImage = std::move(hostImage)] {
                self->hostBundleIDtoExtensionInfoLookup_[host] = {host, userInfo, configuration, processMode, extension};
                self->currentExtensionAppImage_ = extensionImage;
                self->currentExtensionDisplayName_ = displayNameOf(*extension);
                self->currentHostAppImage_ = hostImage;
                handler(std::nullopt);
            });
        });
}

void LCRecordingManager::loadBroadcastUploadExtensionWithBaseIdentifier(const BaseIdentifier& baseIdentifier,
                                                                        ExtensionHandler handler) {
    log_.line("looking for upload extension");
    using Found = std::vector<std::shared_ptr<AppExtension>>;
    const auto answerFirst = [handler](const Found& found, const std::optional<Error>& error) {
        if (found.empty()) return handler(nullptr, 0, error);
        handler(found.front(), ExtensionDiscovery::processMode(*found.front()), std::nullopt);
    };
    ExtensionDiscovery(log_, platform_.appExtensions)
        .extensionsWithMatchingPointName(
            kBroadcastUploadPoint, baseIdentifier,
            [self = shared_from_this(), baseIdentifier, answerFirst](const Found& found,
                                                                     const std::optional<Error>& error) {
                if (!error && !found.empty()) return answerFirst(found, error);
                ExtensionDiscovery(self->log_, self->platform_.appExtensions)
                    .extensionsWithMatchingPointName(kBroadcastServicesPoint, baseIdentifier,
                                                     UnwantedActivationRule{std::string(kSupportsStreamingRule)},
                                                     answerFirst);
            });
}

std::optional<Data> LCRecordingManager::firstIcon(const AppExtension& extension) {
    auto icons = extension.icons();
    return icons.empty() ? std::nullopt : std::optional(std::move(icons.front()));
}

std::optional<std::string> LCRecordingManager::displayNameOf(const AppExtension& extension) {
    const Value* name = extension.infoDictionary().find(kExtensionDisplayName);
    const std::string* text = name ? name->as<std::string>() : nullptr;
    return text ? std::optional(*text) : std::nullopt;
}

void LCRecordingManager::getSystemBroadcastExtensionInfo(
    const std::function<void(Array, std::optional<Error>)>& handler) {
    ExtensionDiscovery(log_, platform_.appExtensions)
        .extensionsWithMatchingPointName(
            kBroadcastUploadPoint, [handler](const std::vector<std::shared_ptr<AppExtension>>& found,
                                             const std::optional<Error>& error) {
                Array entries;
                if (!error)
                    for (const auto& extension : found)
                        entries.emplace_back(Dictionary{{"displayName", Value(displayNameOf(*extension))},
                                                        {"extBundleID", extension->identifier().text()},
                                                        {"extAppImgData", Value(firstIcon(*extension))}});
                handler(std::move(entries), error);
            });
}

void LCRecordingManager::getCurrentBroadcastImages(
    const std::function<void(std::optional<Data>, std::optional<Data>)>& handler) const {
    handler(currentHostAppImage_, currentExtensionAppImage_);
}

void LCRecordingManager::clearCurrentBroadcastImages() {
    currentHostAppImage_.reset();
    currentExtensionAppImage_.reset();
    currentExtensionDisplayName_.reset();
}

void LCRecordingManager::enableBroadcast(const WaitingStartRef& start, std::uint64_t generation,
                                         const BroadcastInfo& info) {
    const auto& session = start->session;
    session->setBroadcastConfiguration(info.configuration);
    const auto wait = session->prepareBroadcast(info.extension, info.processMode, info.userInfo);
    session->managerRecord.startsWaiting.push_back(generation);
    session->startQueue().async([self = shared_from_this(), start, generation, info, wait,
                                 microphone = microphoneRecording_, camera = cameraRecording_] {
        // Nothing is connected when its client went, or a newer start took its place, while it waited its turn.
        auto link = start->session->connectBroadcast(wait, info.extension, info.processMode,
                                                     start->request.listenerEndpoint);
        // A newer start that came since may be of the same set-up, so the process of this one ends before that one's is
        // launched.
        if (!isNewest(*start, generation)) endLink(*start->session, std::exchange(link.proxy, nullptr));
        self->onRequestLane([self, start, generation, link, microphone, camera] {
            self->broadcastEnabled(start, generation, link, microphone, camera);
        });
    });
}

void LCRecordingManager::endLink(LCRecordingSession& session, const std::shared_ptr<LCBroadcastExtensionProxy>& link) {
    if (!link) return;
    link->invalidateConnection();
    if (session.broadcastUploadExtensionProxy() == link) session.setBroadcastUploadExtensionProxy(nullptr);
}

bool LCRecordingManager::isNewest(const WaitingStart& start, std::uint64_t generation) {
    return start.session->managerRecord.broadcastGeneration == generation;
}

void LCRecordingManager::broadcastEnabled(const WaitingStartRef& start, std::uint64_t generation,
                                          const LCRecordingSession::BroadcastLink& link, bool microphone, bool camera) {
    const auto& session = start->session;
    std::erase(session->managerRecord.startsWaiting, generation);
    const auto failure = link.failure();
    const bool isWanted = isStillWanted(*start) && session->managerRecord.startGeneration == generation;
    if (isWanted && !failure) {
        microphoneRecording_ = microphone;
        cameraRecording_ = camera;
        // Another start of the application has been faster.
        if (session->isRecording()) stopCurrentRecordingSessionWithHandler(*start, {});
        return startEnabledRecording(start, generation, link.proxy);
    }
    endLink(*session, link.proxy);
    resetStatesForSession(session, generation);
    if (failure && isWanted) {
        logRefusal(start->number, RecordingErrorCode::InvalidBroadcastSession, "the broadcast extension has failed");
        start->handler(*failure, false, false);
        return;
    }
    refuse(*start, RecordingErrorCode::FailedToStart, "the client has gone, or has started anew, meanwhile");
}

void LCRecordingManager::broadcastExtensionFailed(const std::shared_ptr<LCRecordingSession>& session,
                                                  const std::shared_ptr<LCBroadcastExtensionProxy>& link,
                                                  const Error& error) {
    onRequestLane([session, link = std::weak_ptr(link), error] {
        answerPendingStarts(*session, error, [&](const auto& start) {
            return !start.link.owner_before(link) && !link.owner_before(start.link);
        });
    });
}

void LCRecordingManager::answerPendingStarts(
    LCRecordingSession& session, const Error& error,
    const std::function<bool(const LCRecordingSession::ManagerRecord::PendingStart&)>& which) {
    auto& pending = session.managerRecord.pendingStarts;
    std::vector<StartHandler> handlers;
    std::erase_if(pending, [&](const auto& start) {
        if (!*start.answer) return true;
        if (!which(start)) return false;
        handlers.push_back(std::exchange(*start.answer, {}));
        return true;
    });
    for (const auto& handler : handlers) handler(error, false, false);
}

}  // namespace lumacast
