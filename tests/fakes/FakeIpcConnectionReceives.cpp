// The way into an end: what comes, and the answers to it.

#include <atomic>
#include <cerrno>
#include <utility>

#include "base/Limits.h"
#include "tests/fakes/FakeIpcConnection.h"

namespace lumacast {

/// A request's one answer, or the word that there is none.
class FakeIpcConnection::Answer {
public:
    Answer(std::weak_ptr<FakeIpcConnection> connection, std::uint64_t sequence, const MessageDeclaration& declaration)
        : connection_(std::move(connection)), sequence_(sequence), declaration_(declaration) {}
    Answer(const Answer&) = delete;
    Answer& operator=(const Answer&) = delete;
    ~Answer() {
        if (given_) return;
        const auto live = connection_.lock();
        if (live && live->finishRequest()) live->giveNoReply(sequence_, 0);
    }
    void give(Array values) {
        const auto live = connection_.lock();
        if (given_.exchange(true)) {
            if (live) live->noteSecondAnswer();
            return;
        }
        if (live && live->finishRequest()) live->reply(sequence_, declaration_, std::move(values));
    }

private:
    const std::weak_ptr<FakeIpcConnection> connection_;
    const std::uint64_t sequence_;
    const MessageDeclaration& declaration_;
    std::atomic<bool> given_{false};
};

void FakeIpcConnection::noteSecondAnswer() {
    const std::lock_guard lock(process_->machine->mutex);
    ++process_->machine->secondAnswers[process_->pid];
}

/// One of the peer's requests is in flight no more. False when nobody is there any more to be told.
bool FakeIpcConnection::finishRequest() {
    const std::lock_guard lock(mutex_);
    if (lost_) return false;
    --requestsToAnswer_;
    return true;
}

bool FakeIpcConnection::receive(FakeFrame frame) {
    {
        const std::lock_guard lock(mutex_);
        if (lost_) return true;
        if (frame.kind != FakeFrame::Kind::End &&
            incomingBytes_ + frame.body.bytes.size() > limitOf(Limit::QueuedBytesPerReader))
            return false;
        incomingBytes_ += frame.body.bytes.size();
        incoming_.push_back(std::move(frame));
        if (!resumed_) return true;
    }
    process_->queue->async([weak = weak_from_this()] { if (auto self = weak.lock()) self->deliverOne(); });
    return true;
}

void FakeIpcConnection::deliverOne() {
    if (!process_->isReading()) return;  // readOn asks again
    FakeFrame frame;
    {
        const std::lock_guard lock(mutex_);
        if (lost_ || !resumed_ || incoming_.empty()) return;
        frame = std::move(incoming_.front());
        incoming_.pop_front();
        incomingBytes_ -= frame.body.bytes.size();
    }
    dispatch(std::move(frame));
}

void FakeIpcConnection::dispatch(FakeFrame frame) {
    const char* reason = nullptr;
    switch (frame.kind) {
        case FakeFrame::Kind::Message:
        case FakeFrame::Kind::Request: reason = dispatchMessage(frame); break;
        case FakeFrame::Kind::Reply:
        case FakeFrame::Kind::NoReply: reason = dispatchReply(frame); break;
        case FakeFrame::Kind::End: lose(false); break;
    }
    if (reason) drop(reason);
}

const char* FakeIpcConnection::dispatchMessage(FakeFrame& frame) {
    const Protocol* interface = nullptr;
    std::shared_ptr<IpcExportedObject> object;
    const bool isRequest = frame.kind == FakeFrame::Kind::Request;
    {
        const std::lock_guard lock(mutex_);
        interface = exportedInterface_;
        object = exportedObject_.lock();
        if (isRequest && ++requestsToAnswer_ > limitOf(Limit::MessagesInFlight)) return "too many requests in flight";
    }
    if (!interface || frame.message >= interface->messages.size()) return "an unknown message";
    const MessageDeclaration& declaration = interface->messages[frame.message];
    if (isRequest != (declaration.reply == Reply::Expected)) return "a message whose reply is declared otherwise";
    std::optional<Value> decoded = decode(frame.body.bytes, frame.body.handles);
    const Array* arguments = decoded ? decoded->as<Array>() : nullptr;
    if (!arguments) return "a malformed message";
    if (!matches(*arguments, declaration.arguments)) return "a message with arguments of other types";
    IpcReply answer;
    if (isRequest)
        answer = [shared = std::make_shared<Answer>(weak_from_this(), frame.sequence, declaration)](Array values) {
            shared->give(std::move(values));
        };
    if (!object) return nullptr;
    Array taken = *arguments;
    frame.body = {};
    decoded.reset();
    object->receiveMessage(shared_from_this(), frame.message, std::move(taken), std::move(answer));
    return nullptr;
}

const char* FakeIpcConnection::dispatchReply(FakeFrame& frame) {
    Pending pending;
    {
        const std::lock_guard lock(mutex_);
        const auto found = pending_.find(frame.sequence);
        if (found == pending_.end()) return "a reply to nothing";
        pending = std::move(found->second);
        pending_.erase(found);
    }
    if (frame.kind == FakeFrame::Kind::NoReply) {
        if (frame.error != 0) fail(pending.errorHandler, frame.error);
        else leaveUnanswered(std::move(pending.errorHandler));
        return nullptr;
    }
    const std::optional<Value> decoded = decode(frame.body.bytes, frame.body.handles);
    const Array* values = decoded ? decoded->as<Array>() : nullptr;
    if (!values || !matches(*values, pending.declaration->replyValues)) {
        fail(pending.errorHandler, EBADMSG);
        return "a reply with values of other types";
    }
    if (pending.reply) pending.reply(*values);
    return nullptr;
}

void FakeIpcConnection::leaveUnanswered(ErrorHandler errorHandler) {
    if (!errorHandler) return;
    ErrorHandler oldest;
    {
        const std::lock_guard lock(mutex_);
        unanswered_.push_back(std::move(errorHandler));
        if (unanswered_.size() <= limitOf(Limit::RequestsWithoutReply)) return;
        oldest = std::move(unanswered_.front());
        unanswered_.pop_front();
    }
    fail(oldest, ENODATA);
}

}  // namespace lumacast
