// What clients ask: from message to operation.

#include "daemon/LCRecordingManager.h"

namespace lumacast {

namespace {

// The arguments were checked against the message's declaration before they came here.
template <class T>
const T& argument(const Array& arguments, std::size_t index) {
    return *arguments[index].as<T>();
}

StartRequest startRequest(const Array& arguments) {
    StartRequest request;
    for (const Value& id : argument<Array>(arguments, 0))
        request.windowLayerContextIDs.push_back(ContextID{static_cast<std::uint32_t>(*id.as<std::uint64_t>())});
    const Array& size = argument<Array>(arguments, 1);
    request.windowSize = {*size[0].as<double>(), *size[1].as<double>()};
    request.microphoneEnabled = argument<bool>(arguments, 2);
    request.cameraEnabled = argument<bool>(arguments, 3);
    request.broadcast = argument<bool>(arguments, 4);
    request.systemRecording = argument<bool>(arguments, 5);
    request.captureEnabled = argument<bool>(arguments, 6);
    if (const auto* endpoint = arguments[7].as<Value::EndpointRef>()) request.listenerEndpoint = *endpoint;
    return request;
}

}  // namespace

void LCRecordingManager::receiveMessage(const std::shared_ptr<IpcConnection>& connection, std::uint16_t message,
                                        Array arguments, IpcReply reply) {
    struct Calling {
        std::shared_ptr<IpcConnection>& slot;
        ~Calling() { slot = nullptr; }
    } calling{callingConnection_};
    callingConnection_ = connection;

    const auto withSession = [this](auto change) {
        if (const auto session = getCallingConnectionRecordingSession()) change(*session);
    };
    const StopHandler stopped = [reply](std::optional<URL> url, std::optional<Error> error) {
        reply({Value(std::move(url)), Value(std::move(error))});
    };
    switch (static_cast<DaemonMessage>(message)) {
        case DaemonMessage::StartRecording:
            startRecording(startRequest(arguments),
                           [reply](std::optional<Error> error, bool microphoneRecording, bool cameraRecording) {
                               reply({Value(std::move(error)), microphoneRecording, cameraRecording});
                           });
            break;
        case DaemonMessage::SetupBroadcast:
            setupBroadcastWithHostBundleID(
                BundleIdentifier(argument<std::string>(arguments, 0)), argument<std::string>(arguments, 1),
                argument<Data>(arguments, 2),
                arguments[3].isNull() ? std::nullopt : std::optional(argument<Dictionary>(arguments, 3)),
                [reply](std::optional<Error> error) { reply({Value(std::move(error))}); });
            break;
        case DaemonMessage::GetCurrentBroadcastImages:
            getCurrentBroadcastImages([reply](std::optional<Data> host, std::optional<Data> extension) {
                reply({Value(std::move(host)), Value(std::move(extension))});
            });
            break;
        case DaemonMessage::GetSystemBroadcastExtensionInfo:
            getSystemBroadcastExtensionInfo([reply](Array entries, std::optional<Error> error) {
                reply({Value(std::move(entries)), Value(std::move(error))});
            });
            break;
        case DaemonMessage::StopRecording: stopRecordingWithHandler(stopped); break;
        case DaemonMessage::StopRecordingWithClipDurations:
            stopRecordingWithStartClipDuration(argument<double>(arguments, 0), argument<double>(arguments, 1), stopped);
            break;
        case DaemonMessage::SaveVideoToCameraRoll:
            saveVideoToCameraRoll(
                arguments[0].isNull() ? std::nullopt : std::optional(argument<URL>(arguments, 0)),
                connection->userIdentifier(),
                [reply](std::optional<Error> error) { reply({Value(std::move(error))}); });
            break;
        case DaemonMessage::PauseRecording: pauseRecording(); break;
        case DaemonMessage::ResumeRecording:
            resumeRecordingWithWindowLayerContextID(
                ContextID{static_cast<std::uint32_t>(argument<std::uint64_t>(arguments, 0))});
            break;
        case DaemonMessage::DiscardRecording: discardRecordingWithHandler([reply] { reply({}); }); break;
        case DaemonMessage::SynchronousGetCurrentState: reply({Value(synchronousGetCurrentState())}); break;
        case DaemonMessage::SetHasUserConsentForCamera:
            withSession([&](LCRecordingSession& s) { s.setHasUserConsentForCamera(argument<bool>(arguments, 0)); });
            break;
        case DaemonMessage::SetHasUserConsentForMicrophone:
            withSession([&](LCRecordingSession& s) { s.setHasUserConsentForMicrophone(argument<bool>(arguments, 0)); });
            break;
        case DaemonMessage::SetBroadcastURL:
            withSession([&](LCRecordingSession& s) {
                s.setBroadcastURL(arguments[0].isNull() ? std::nullopt : std::optional(argument<URL>(arguments, 0)));
            });
            break;
        case DaemonMessage::SetMicrophoneEnabledPersistent:
            withSession([&](LCRecordingSession& s) { s.setMicrophoneEnabledPersistent(argument<bool>(arguments, 0)); });
            break;
        case DaemonMessage::SetMicrophoneEnabled: setMicrophoneEnabled(argument<bool>(arguments, 0)); break;
        case DaemonMessage::UpdateProcessIDForAudioCapture:
            updateProcessIDForAudioCaptureWithPID(
                ProcessID{static_cast<std::int32_t>(argument<std::int64_t>(arguments, 0))});
            break;
        case DaemonMessage::ClientDidBecomeActive: clientDidBecomeActive(); break;
        case DaemonMessage::ClientDidResignActive: clientDidResignActive(); break;
        case DaemonMessage::ReportCameraUsage: break;  // deliberately accepted and ignored
    }
}

void LCRecordingManager::pauseRecording() {
    log_.line("LCRecordingManager:pauseRecording");
    const auto session = getCallingConnectionRecordingSession();
    if (session && !session->isSystemRecording() && session->isRecording() && !session->isPaused())
        session->pauseSession();
}

void LCRecordingManager::resumeRecordingWithWindowLayerContextID(ContextID contextID) {
    const auto session = getCallingConnectionRecordingSession();
    if (!session) return;
    // Nothing ever accepts the resume of a broadcast: it deliberately ends here, paused or not.
    if (session->isBroadcasting() && session->isRecording() && !session->isSystemRecording() && !didAcceptResume_) {
        showResumeBroadcastAlertWithSession(*session, contextID);
        return;
    }
    didAcceptResume_ = false;
    const auto isResumable = [&] {
        return !session->isSystemRecording() && session->isRecording() && session->isPaused();
    };
    if (checkContextIDsMatch({contextID})) {
        log_.line("LCRecordingManager: resumeRecording");
        if (isResumable()) session->resumeSessionWithContextID(contextID);
    } else if (isResumable()) {
        stopRecordingSession(
            session, 0, 0, [self = shared_from_this(), session](std::optional<URL> url, std::optional<Error>) {
                self->recordingSessionStoppedWithError(
                    session, self->services_.errors._lcUserErrorForCode(RecordingErrorCode::NoContextIDMatch), url);
            });
    }
}

void LCRecordingManager::setMicrophoneEnabled(bool enabled) {
    log_.line("LCRecordingManager: setMicrophoneEnabled:%i", enabled);
    const auto session = getCallingConnectionRecordingSession();
    if (session && session->isRecording()) session->setMicrophoneEnabled(enabled);
}

void LCRecordingManager::updateProcessIDForAudioCaptureWithPID(ProcessID pid) {
    log_.line("LCRecordingManager: updateProcessIDForAudioCaptureWithPID:%i", pid);
    const auto session = getCallingConnectionRecordingSession();
    if (session && session->isRecording()) session->updateProcessIDForAudioCaptureWithPID(pid);
}

std::optional<Dictionary> LCRecordingManager::synchronousGetCurrentState() {
    const auto session = getCallingConnectionRecordingSession();
    if (!session) return std::nullopt;
    Dictionary state{
        {"isRecording", session->isRecording()},
        {"isBroadcasting", session->isBroadcasting()},
        {"microphoneEnabled", session->microphoneEnabled()},
        {"isSystemRecording", session->isSystemRecording()},
        {"hasUserConsentForMicrophone", session->hasUserConsentForMicrophone()},
        {"hasUserConsentForCamera", session->hasUserConsentForCamera()},
        {"microphoneEnabledPersistent", session->microphoneEnabledPersistent()},
    };
    // Deliberately left out when there is none.
    if (const auto url = session->broadcastURL()) state.set("broadcastURL", *url);
    return state;
}

}  // namespace lumacast
