#include "client/Link.h"

#include <algorithm>
#include <cerrno>

#include "base/Limits.h"
#include "linux/ipc/QuietThread.h"

namespace lumacast::client {

// From -> to, and what leads there:
//   Away, Busy, Dismissed -> Reached    connected
//   Away, Dismissed -> Busy             the listener's backlog is full
//   Busy -> Busy                        still
//   Busy -> Away                        for kBusyLimit, or nobody listens any more
//   Reached -> Open                     the daemon has answered
//   Reached, Open -> Away               the connection was lost
//   Away -> Dismissed                   it had been open, and the daemon that ended it still lives: mostly another
//                                       connection of the application has taken its place. Connecting again by itself
//                                       would take it back, and the two would go on so for ever.
//   Dismissed -> Away                   the application asks for something, and nobody listens
//   any -> Closed                       the recorder is destroyed

namespace {

using namespace std::chrono_literals;

constexpr char kServiceName[] = "com.orvane.lumacastd";

/// Between two attempts: doubled from the first to the last. Begins anew only after a connection that lasted, so that a
/// daemon that dies at once each time is not asked without end.
constexpr auto kFirstDelay = 50ms;
constexpr auto kLastDelay = 5000ms;
/// A process that was killed may still be seen for a moment: how often, and how far apart, it must be seen alive after
/// it has ended a connection until that counts as its will.
constexpr int kLooks = 3;
constexpr auto kLookDelay = 250ms;
/// Between two attempts at a full backlog, and for how long they are made before the daemon counts as not there.
constexpr auto kBusyDelay = 20ms;
constexpr auto kBusyLimit = 10s;
/// As many as can be under way together with the connection's own first question.
constexpr std::size_t kMostHeld = limitOf(Limit::MessagesInFlight) - 1;

}  // namespace

Link::Link(Events events, const std::string& runtimeDirectory)
    : events_(std::move(events)),
      reactor_("lumacast client"),
      ipc_(reactor_, log_, {.runtimeDirectory = runtimeDirectory}),
      delay_(kFirstDelay) {}

void Link::open() {
    reactor_.async([this] { connect(); });
    // Signals are the application's: its handlers don't run here.
    thread_ = quietThread([self = shared_from_this()] { self->reactor_.run(); });
}

void Link::close() {
    if (isOwnThread()) {
        shutDown();
        thread_.detach();  // it holds the link until its loop has ended
        return;
    }
    reactor_.async([this] { shutDown(); });
    thread_.join();
}

void Link::shutDown() {
    state_ = LinkState::Closed;
    timer_.reset();
    held_.clear();
    if (connection_) {
        connection_->setInvalidationHandler({});
        connection_->invalidate();
        connection_ = nullptr;
    }
    // Until none is left: a handler may ask once more.
    while (!pending_.empty()) pending_.failAll(connectionError(ConnectionError::Closed));
    // Behind the loss of the connection, which is on its way through the loop.
    reactor_.async([this] { reactor_.requestStop(); });
}

void Link::onOwnThread(Task task) {
    if (isOwnThread()) task();
    else reactor_.async(std::move(task));
}

void Link::send(DaemonMessage message, Array arguments) {
    onOwnThread([this, request = Request{message, std::move(arguments), std::nullopt}]() mutable {
        this->request(std::move(request));
    });
}

void Link::ask(DaemonMessage message, Array arguments, Answered answered) {
    onOwnThread([this, message, arguments = std::move(arguments), answered = std::move(answered)]() mutable {
        const std::uint64_t question = pending_.add(std::move(answered));
        request({message, std::move(arguments), question});
    });
}

void Link::request(Request request) {
    // Whom the daemon has dismissed comes back by its own will only.
    if (state_ == LinkState::Dismissed || (state_ == LinkState::Away && wasOpen_ && daemon_.isAlive())) connect();
    switch (state_) {
        case LinkState::Reached:
        case LinkState::Open: return transmit(std::move(request));
        case LinkState::Busy:
            if (held_.size() < kMostHeld) return held_.push_back(std::move(request));
            if (request.question) failLater(*request.question, ConnectionError::Busy);
            return;
        case LinkState::Away:
        case LinkState::Dismissed:
            if (request.question) failLater(*request.question, ConnectionError::NotReached);
            return;
        case LinkState::Closed: return;  // what is pending is being answered
    }
}

void Link::transmit(Request request) {
    const auto number = static_cast<std::uint16_t>(request.message);
    if (!request.question) {
        connection_->remoteProxy([](const Error&) {})->send(number, std::move(request.arguments));
        return;
    }
    const auto failed = [weak = weak_from_this(), question = *request.question](const Error& error) {
        if (const auto self = weak.lock()) self->pending_.fail(question, connectionError(self->errorFor(error)));
    };
    connection_->remoteProxy(failed)->send(
        number, std::move(request.arguments),
        [weak = weak_from_this(), question = *request.question, message = request.message](const Array& values) {
            const auto self = weak.lock();
            if (!self) return;
            if (message == DaemonMessage::StartRecording) self->messages_.forgetStamps();
            self->pending_.answer(question, values);
        });
}

/// What a failure of the transport means to the application.
ConnectionError Link::errorFor(const Error& error) const {
    switch (error.code()) {
        case EAGAIN:
        case ENOBUFS: return ConnectionError::Busy;
        case EMSGSIZE:
        case EINVAL: return ConnectionError::Unsendable;
        case ENODATA: return ConnectionError::NoAnswer;
        case EPIPE: return state_ == LinkState::Reached ? ConnectionError::NotReached : ConnectionError::Lost;
        default: return ConnectionError::BadAnswer;
    }
}

void Link::failLater(std::uint64_t question, ConnectionError error) {
    reactor_.async([this, question, error] { pending_.fail(question, connectionError(error)); });
}

void Link::connect() {
    if (state_ == LinkState::Closed) return;
    timer_.reset();
    LinuxIpc::Attempt attempt = ipc_.tryService(kServiceName);
    if (attempt.connection) return reached(std::move(attempt));
    if (!attempt.isBusy) return goAway();
    if (state_ != LinkState::Busy) busySince_ = Clock::now();
    state_ = LinkState::Busy;
    if (Clock::now() - busySince_ >= kBusyLimit) return goAway();
    tryAgainAfter(kBusyDelay);
}

void Link::reached(LinuxIpc::Attempt attempt) {
    state_ = LinkState::Reached;
    const std::uint64_t number = ++connectionNumber_;
    daemon_ = std::move(attempt.peer);
    connection_ = std::move(attempt.connection);
    connection_->setExportedInterface(clientProtocol());
    connection_->setExportedObject(weak_from_this());
    connection_->setRemoteInterface(daemonProtocol());
    connection_->setInvalidationHandler([weak = weak_from_this(), number] {
        if (const auto self = weak.lock()) self->lost(number);
    });
    connection_->resume();
    // Being accepted says nothing yet: whom the daemon does not serve it drops. Any answer does.
    connection_->remoteProxy([](const Error&) {})
        ->send(static_cast<std::uint16_t>(DaemonMessage::SynchronousGetCurrentState), {},
               [weak = weak_from_this(), number](const Array&) {
                   if (const auto self = weak.lock()) self->proved(number);
               });
    for (Request& request : std::exchange(held_, {})) transmit(std::move(request));
}

void Link::proved(std::uint64_t connection) {
    if (state_ != LinkState::Reached || connection != connectionNumber_) return;
    state_ = LinkState::Open;
    openSince_ = Clock::now();
    if (toldConnected_ == true) return;
    toldConnected_ = true;
    if (events_.connected) events_.connected();
}

void Link::lost(std::uint64_t connection) {
    if (state_ == LinkState::Closed || connection != connectionNumber_) return;
    wasOpen_ = state_ == LinkState::Open;
    looks_ = 0;
    const auto error = wasOpen_ ? ConnectionError::Lost : ConnectionError::NotReached;
    connection_ = nullptr;
    state_ = LinkState::Away;
    if (wasOpen_ && Clock::now() - openSince_ >= kLastDelay) delay_ = kFirstDelay;
    tryAgainAfter(delay_);
    delay_ = std::min(delay_ * 2, kLastDelay);
    // The transport has answered all of them; a peer that breaks its rules must not leave one behind.
    pending_.failAll(connectionError(error));
    if (state_ == LinkState::Away) tellDisconnected();
}

void Link::goAway() {
    state_ = LinkState::Away;
    wasOpen_ = false;
    tryAgainAfter(delay_);
    delay_ = std::min(delay_ * 2, kLastDelay);
    for (const Request& request : std::exchange(held_, {}))
        if (request.question) failLater(*request.question, ConnectionError::NotReached);
    tellDisconnected();
}

void Link::tryAgainAfter(std::chrono::milliseconds delay) {
    timer_ = reactor_.after(delay, [weak = weak_from_this()] {
        if (const auto self = weak.lock()) self->tryAgain();
    });
}

void Link::tryAgain() {
    if (state_ != LinkState::Away || !wasOpen_ || !daemon_.isAlive()) return connect();
    if (++looks_ < kLooks) return tryAgainAfter(kLookDelay);
    state_ = LinkState::Dismissed;
}

void Link::tellDisconnected() {
    if (state_ == LinkState::Closed || toldConnected_ == false) return;
    toldConnected_ = false;
    if (events_.disconnected) events_.disconnected();
}

void Link::receiveMessage(const std::shared_ptr<IpcConnection>& connection, std::uint16_t message, Array arguments,
                          IpcReply) {
    if (state_ != LinkState::Closed && connection == connection_) messages_.deliver(message, arguments);
}

}  // namespace lumacast::client
