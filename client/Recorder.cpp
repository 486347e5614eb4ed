#include "client/Recorder.h"

#include <unistd.h>

#include <cstdlib>
#include <future>
#include <utility>

#include "base/MessageTables.h"
#include "broadcast/ConfigurationArchive.h"
#include "client/Link.h"
#include "linux/ipc/LinuxKeyedArchive.h"

namespace lumacast::client {

namespace {

std::optional<Error> errorIn(const Value& value) {
    const Error* error = value.asError();
    return error ? std::optional(*error) : std::nullopt;
}

/// Each answer as the application sees it. The values match the message's declaration: the transport has checked them.
StartAnswer startAnswer(const Error* error, const Array& values) {
    if (error) return {*error, false, false};
    return {errorIn(values[0]), *values[1].as<bool>(), *values[2].as<bool>()};
}

StopAnswer stopAnswer(const Error* error, const Array& values) {
    if (error) return {std::nullopt, *error};
    const URL* movie = values[0].as<URL>();
    return {movie ? std::optional(*movie) : std::nullopt, errorIn(values[1])};
}

std::optional<Error> discardAnswer(const Error* error, const Array&) {
    return error ? std::optional(*error) : std::nullopt;
}

std::optional<Error> saveAnswer(const Error* error, const Array& values) {
    return error ? std::optional(*error) : errorIn(values[0]);
}

StateAnswer stateAnswer(const Error* error, const Array& values) {
    if (error) return {std::nullopt, *error};
    const Dictionary* state = values[0].as<Dictionary>();
    return {state ? std::optional(*state) : std::nullopt, std::nullopt};
}

std::optional<Error> setupAnswer(const Error* error, const Array& values) { return saveAnswer(error, values); }

Data bytesIn(const Value* value) {
    const Data* bytes = value ? value->as<Data>() : nullptr;
    return bytes ? *bytes : Data();
}

std::string textIn(const Value* value) {
    const std::string* text = value ? value->as<std::string>() : nullptr;
    return text ? *text : std::string();
}

BroadcastExtensionsAnswer extensionsAnswer(const Error* error, const Array& values) {
    if (error) return {{}, *error};
    BroadcastExtensionsAnswer answer{{}, errorIn(values[1])};
    for (const Value& value : *values[0].as<Array>()) {
        const Dictionary* entry = value.as<Dictionary>();
        if (!entry) continue;
        answer.extensions.push_back({textIn(entry->find("displayName")),
                                     BundleIdentifier(textIn(entry->find("extBundleID"))),
                                     bytesIn(entry->find("extAppImgData"))});
    }
    return answer;
}

BroadcastImagesAnswer imagesAnswer(const Error* error, const Array& values) {
    if (error) return {{}, {}, *error};
    return {bytesIn(&values[0]), bytesIn(&values[1]), std::nullopt};
}

template <class Answer>
Link::Answered read(Answer (*answer)(const Error*, const Array&), std::function<void(Answer)> answered) {
    return [answer, answered = std::move(answered)](const Error* error, const Array& values) {
        if (answered) answered(answer(error, values));
    };
}

/// Asks by `operation` and waits for the answer; `answer` makes one of an error.
template <class Answer, class Operation>
Answer waitFor(const Link& link, std::chrono::milliseconds limit, Answer (*answer)(const Error*, const Array&),
               Operation operation) {
    const auto failed = [&](ConnectionError code) {
        const Error error = connectionError(code);
        return answer(&error, {});
    };
    if (link.isOwnThread()) return failed(ConnectionError::WouldBlock);
    auto promise = std::make_shared<std::promise<Answer>>();
    auto future = promise->get_future();
    operation([promise](Answer value) { promise->set_value(std::move(value)); });
    if (limit != kNoLimit && future.wait_for(limit) != std::future_status::ready)
        return failed(ConnectionError::NoAnswer);
    return future.get();
}

}  // namespace

Recorder::Recorder(Events events, std::string runtimeDirectory)
    : link_(std::make_shared<Link>(std::move(events), runtimeDirectory)) {
    link_->open();
}

Recorder::~Recorder() { link_->close(); }

void Recorder::start(const StartOptions& options, std::function<void(StartAnswer)> answered) {
    Array windows;
    for (const ContextID window : options.windows) windows.emplace_back(number(window));
    link_->ask(DaemonMessage::StartRecording,
               {std::move(windows), Array{options.size.width, options.size.height}, options.microphone, options.camera,
                options.broadcast, options.systemRecording, options.capture, Value()},
               read(startAnswer, std::move(answered)));
}

void Recorder::stop(std::function<void(StopAnswer)> answered) {
    link_->ask(DaemonMessage::StopRecording, {}, read(stopAnswer, std::move(answered)));
}

void Recorder::stopWithClip(double fromStart, double fromEnd, std::function<void(StopAnswer)> answered) {
    link_->ask(DaemonMessage::StopRecordingWithClipDurations, {fromStart, fromEnd},
               read(stopAnswer, std::move(answered)));
}

void Recorder::discard(std::function<void(std::optional<Error>)> answered) {
    link_->ask(DaemonMessage::DiscardRecording, {}, read(discardAnswer, std::move(answered)));
}

void Recorder::save(const URL& movie, std::function<void(std::optional<Error>)> answered) {
    link_->ask(DaemonMessage::SaveVideoToCameraRoll, {movie}, read(saveAnswer, std::move(answered)));
}

void Recorder::state(std::function<void(StateAnswer)> answered) {
    link_->ask(DaemonMessage::SynchronousGetCurrentState, {}, read(stateAnswer, std::move(answered)));
}

void Recorder::setUpBroadcast(const BroadcastSetup& setup, std::function<void(std::optional<Error>)> answered) {
    LinuxKeyedArchive archives;
    // A configuration that no archive can hold is none.
    Data configuration =
        archiveOf(archives, setup.configuration.value_or(LCBroadcastConfiguration())).value_or(Data());
    link_->ask(DaemonMessage::SetupBroadcast,
               {setup.host.text(), setup.extension, std::move(configuration), setup.userInfo},
               read(setupAnswer, std::move(answered)));
}

void Recorder::broadcastExtensions(std::function<void(BroadcastExtensionsAnswer)> answered) {
    link_->ask(DaemonMessage::GetSystemBroadcastExtensionInfo, {}, read(extensionsAnswer, std::move(answered)));
}

void Recorder::broadcastImages(std::function<void(BroadcastImagesAnswer)> answered) {
    link_->ask(DaemonMessage::GetCurrentBroadcastImages, {}, read(imagesAnswer, std::move(answered)));
}

void Recorder::pause() { link_->send(DaemonMessage::PauseRecording, {}); }

void Recorder::resume(ContextID window) { link_->send(DaemonMessage::ResumeRecording, {number(window)}); }

void Recorder::setMicrophoneEnabled(bool enabled) { link_->send(DaemonMessage::SetMicrophoneEnabled, {enabled}); }

void Recorder::setMicrophoneEnabledPersistent(bool enabled) {
    link_->send(DaemonMessage::SetMicrophoneEnabledPersistent, {enabled});
}

void Recorder::setHasUserConsentForMicrophone(bool consent) {
    link_->send(DaemonMessage::SetHasUserConsentForMicrophone, {consent});
}

void Recorder::setHasUserConsentForCamera(bool consent) {
    link_->send(DaemonMessage::SetHasUserConsentForCamera, {consent});
}

void Recorder::setBroadcastURL(const std::optional<URL>& url) {
    link_->send(DaemonMessage::SetBroadcastURL, {Value(url)});
}

void Recorder::setProcessForAudioCapture(ProcessID pid) {
    link_->send(DaemonMessage::UpdateProcessIDForAudioCapture, {number(pid)});
}

void Recorder::didBecomeActive() { link_->send(DaemonMessage::ClientDidBecomeActive, {}); }

void Recorder::didResignActive() { link_->send(DaemonMessage::ClientDidResignActive, {}); }

void Recorder::reportCameraUsage(std::int32_t usage) { link_->send(DaemonMessage::ReportCameraUsage, {usage}); }

StartAnswer Recorder::startAndWait(const StartOptions& options, std::chrono::milliseconds limit) {
    return waitFor(*link_, limit, startAnswer, [&](auto answered) { start(options, std::move(answered)); });
}

StopAnswer Recorder::stopAndWait(std::chrono::milliseconds limit) {
    return waitFor(*link_, limit, stopAnswer, [&](auto answered) { stop(std::move(answered)); });
}

StopAnswer Recorder::stopWithClipAndWait(double fromStart, double fromEnd, std::chrono::milliseconds limit) {
    return waitFor(*link_, limit, stopAnswer,
                   [&](auto answered) { stopWithClip(fromStart, fromEnd, std::move(answered)); });
}

std::optional<Error> Recorder::discardAndWait(std::chrono::milliseconds limit) {
    return waitFor(*link_, limit, discardAnswer, [&](auto answered) { discard(std::move(answered)); });
}

std::optional<Error> Recorder::saveAndWait(const URL& movie, std::chrono::milliseconds limit) {
    return waitFor(*link_, limit, saveAnswer, [&](auto answered) { save(movie, std::move(answered)); });
}

StateAnswer Recorder::stateAndWait(std::chrono::milliseconds limit) {
    return waitFor(*link_, limit, stateAnswer, [&](auto answered) { state(std::move(answered)); });
}

std::optional<Error> Recorder::setUpBroadcastAndWait(const BroadcastSetup& setup, std::chrono::milliseconds limit) {
    return waitFor(*link_, limit, setupAnswer, [&](auto answered) { setUpBroadcast(setup, std::move(answered)); });
}

BroadcastExtensionsAnswer Recorder::broadcastExtensionsAndWait(std::chrono::milliseconds limit) {
    return waitFor(*link_, limit, extensionsAnswer, [&](auto answered) { broadcastExtensions(std::move(answered)); });
}

BroadcastImagesAnswer Recorder::broadcastImagesAndWait(std::chrono::milliseconds limit) {
    return waitFor(*link_, limit, imagesAnswer, [&](auto answered) { broadcastImages(std::move(answered)); });
}

std::string Recorder::defaultRuntimeDirectory() {
    const char* directory = std::getenv("XDG_RUNTIME_DIR");
    return (directory && *directory ? std::string(directory) : "/run/user/" + std::to_string(::getuid())) + "/lumacast";
}

}  // namespace lumacast::client
