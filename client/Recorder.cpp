#include "client/Recorder.h"

#include <unistd.h>

#include <cstdlib>
#include <mutex>
#include <thread>
#include <utility>

#include "base/Log.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"

namespace lumacast::client {

namespace {

constexpr char kServiceName[] = "com.orvane.lumacastd";

Error notReached() {
    return Error(kConnectionErrorDomain, static_cast<std::int64_t>(ConnectionError::NotReached),
                 {{std::string(kLocalizedDescriptionKey), "The recording service can't be reached."}});
}

std::optional<Error> errorIn(const Value& value) {
    const Error* error = value.asError();
    return error ? std::optional(*error) : std::nullopt;
}

std::optional<URL> urlIn(const Value& value) {
    const URL* url = value.as<URL>();
    return url ? std::optional(*url) : std::nullopt;
}

StartAnswer startAnswer(const Array& values) {
    return {errorIn(values[0]), *values[1].as<bool>(), *values[2].as<bool>()};
}

StopAnswer stopAnswer(const Array& values) { return {urlIn(values[0]), errorIn(values[1])}; }

StateAnswer stateAnswer(const Array& values) {
    const Dictionary* state = values[0].as<Dictionary>();
    return {state ? std::optional(*state) : std::nullopt, std::nullopt};
}

/// Calls an asynchronous operation and waits for its answer.
template <class Answer, class Operation>
Answer waitFor(Operation operation) {
    auto promise = std::make_shared<std::promise<Answer>>();
    auto future = promise->get_future();
    operation([promise](Answer answer) { promise->set_value(std::move(answer)); });
    return future.get();
}

}  // namespace

/// The connection and the thread that serves it. What the daemon tells the application arrives here.
class Recorder::Connection final : public IpcExportedObject, public std::enable_shared_from_this<Connection> {
public:
    Connection(Events events, const std::string& runtimeDirectory)
        : events_(std::move(events)),
          reactor_("lumacast client"),
          ipc_(reactor_, log_, {.runtimeDirectory = runtimeDirectory}) {}

    void open() {
        connection_ = ipc_.connectToService(kServiceName);
        connection_->setExportedInterface(clientProtocol());
        connection_->setExportedObject(weak_from_this());
        connection_->setRemoteInterface(daemonProtocol());
        connection_->setInvalidationHandler([weak = weak_from_this()] {
            if (const auto self = weak.lock(); self && self->events_.disconnected) self->events_.disconnected();
        });
        connection_->resume();
        thread_ = std::thread([this] { reactor_.run(); });
    }

    void close() {
        reactor_.async([this] {
            connection_->setInvalidationHandler({});
            connection_->invalidate();
            // The answers of what was pending are queued before this and run first.
            reactor_.async([this] { reactor_.requestStop(); });
        });
        thread_.join();
    }

    void send(DaemonMessage message, Array arguments) {
        connection_->remoteProxy([](const Error&) {})->send(static_cast<std::uint16_t>(message), std::move(arguments));
    }

    /// Sends a message that has a reply; `answered` is called once, with what `read` makes of the reply or with
    /// `failed`.
    template <class Answer, class Read>
    void ask(DaemonMessage message, Array arguments, Answer failed, Read read, std::function<void(Answer)> answered) {
        const auto shared = std::make_shared<std::function<void(Answer)>>(std::move(answered));
        const auto answer = [shared](Answer value) {
            if (auto call = std::exchange(*shared, nullptr)) call(std::move(value));
        };
        connection_->remoteProxy([answer, failed](const Error&) { answer(failed); })
            ->send(static_cast<std::uint16_t>(message), std::move(arguments),
                   [answer, read](const Array& values) { answer(read(values)); });
    }

    void receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t message, Array arguments,
                        IpcReply) override {
        if (static_cast<ClientMessage>(message) == ClientMessage::StopRecordingWithError && events_.stopped)
            events_.stopped(errorIn(arguments[0]), urlIn(arguments[1]));
    }

private:
    const Events events_;
    Log log_;
    Reactor reactor_;
    LinuxIpc ipc_;
    std::shared_ptr<IpcConnection> connection_;
    std::thread thread_;
};

Recorder::Recorder(Events events, std::string runtimeDirectory)
    : connection_(std::make_shared<Connection>(std::move(events), runtimeDirectory)) {
    connection_->open();
}

Recorder::~Recorder() { connection_->close(); }

void Recorder::start(const StartOptions& options, std::function<void(StartAnswer)> answered) {
    Array windows;
    for (const ContextID window : options.windows) windows.emplace_back(number(window));
    connection_->ask<StartAnswer>(
        DaemonMessage::StartRecording,
        {std::move(windows), Array{options.size.width, options.size.height}, options.microphone, options.camera,
         options.broadcast, options.systemRecording, options.capture, Value()},
        StartAnswer{notReached(), false, false}, startAnswer, std::move(answered));
}

void Recorder::stop(std::function<void(StopAnswer)> answered) {
    connection_->ask<StopAnswer>(DaemonMessage::StopRecording, {}, StopAnswer{std::nullopt, notReached()}, stopAnswer,
                                 std::move(answered));
}

void Recorder::stopWithClip(double fromStart, double fromEnd, std::function<void(StopAnswer)> answered) {
    connection_->ask<StopAnswer>(DaemonMessage::StopRecordingWithClipDurations, {fromStart, fromEnd},
                                 StopAnswer{std::nullopt, notReached()}, stopAnswer, std::move(answered));
}

void Recorder::pause() { connection_->send(DaemonMessage::PauseRecording, {}); }

void Recorder::resume(ContextID window) { connection_->send(DaemonMessage::ResumeRecording, {number(window)}); }

void Recorder::discard(std::function<void(std::optional<Error>)> answered) {
    connection_->ask<std::optional<Error>>(DaemonMessage::DiscardRecording, {}, notReached(),
                                           [](const Array&) { return std::optional<Error>(); }, std::move(answered));
}

void Recorder::state(std::function<void(StateAnswer)> answered) {
    connection_->ask<StateAnswer>(DaemonMessage::SynchronousGetCurrentState, {},
                                  StateAnswer{std::nullopt, notReached()}, stateAnswer, std::move(answered));
}

StartAnswer Recorder::startAndWait(const StartOptions& options) {
    return waitFor<StartAnswer>([&](auto answered) { start(options, std::move(answered)); });
}

StopAnswer Recorder::stopAndWait() {
    return waitFor<StopAnswer>([&](auto answered) { stop(std::move(answered)); });
}

StopAnswer Recorder::stopWithClipAndWait(double fromStart, double fromEnd) {
    return waitFor<StopAnswer>([&](auto answered) { stopWithClip(fromStart, fromEnd, std::move(answered)); });
}

StateAnswer Recorder::stateAndWait() {
    return waitFor<StateAnswer>([&](auto answered) { state(std::move(answered)); });
}

std::string Recorder::defaultRuntimeDirectory() {
    const char* directory = std::getenv("XDG_RUNTIME_DIR");
    return (directory && *directory ? std::string(directory) : "/run/user/" + std::to_string(::getuid())) + "/lumacast";
}

}  // namespace lumacast::client
