// What an extension says of its requests, and the end of an extension nobody holds any more. On the reactor.

#include <signal.h>

#include <utility>

#include "linux/extensions/ExtensionRun.h"

namespace lumacast {

namespace {

/// How long a process that is done may take to end by itself.
constexpr std::chrono::seconds kTimeToLeave{2};

}  // namespace

void ExtensionRun::receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t message, Array arguments,
                                  IpcReply) {
    const auto number = arguments[0].as<std::int64_t>();
    const ExtensionRequestID id{number ? static_cast<std::uint64_t>(*number) : 0};
    bool isOpen = false;
    {
        const std::lock_guard lock(mutex_);
        const auto found = requests_.find(id);
        isOpen = found != requests_.end() && found->second.stage != Stage::Waiting;
    }
    if (!isOpen) {
        services_->log.error("%s has completed a request that is over, or never was: ignored", name());
        return;
    }
    // Completed before it was said to be taken: it was, then.
    taken(id);
    switch (static_cast<ExtensionRequestHostMessage>(message)) {
        case ExtensionRequestHostMessage::CompleteRequest: return complete(id, *arguments[1].as<Array>());
        case ExtensionRequestHostMessage::CancelRequest: return cancel(id, arguments[1]);
    }
}

std::vector<ExtensionItem> ExtensionRun::itemsFrom(const Array& items) {
    ReturnedItems returned = returnedItems(items);
    if (returned.isCut)
        services_->log.error("%s has returned more than %d items: the others are dropped", name(),
                             static_cast<std::int64_t>(returned.items.size()));
    if (returned.illFormed > 0)
        services_->log.error("%s has returned %d items that are none: dropped", name(),
                             static_cast<std::int64_t>(returned.illFormed));
    return std::move(returned.items);
}

void ExtensionRun::complete(ExtensionRequestID id, const Array& items) {
    {
        const std::lock_guard lock(mutex_);
        requests_.erase(id);
    }
    tokens_.end(id);
    queue_->async([self = shared_from_this(), id, returned = itemsFrom(items)] {
        std::shared_ptr<AppExtension::RequestCompletionHandler> handler;
        {
            // The one that is set by now.
            const std::lock_guard lock(self->mutex_);
            handler = self->completionHandler_;
        }
        if (handler && *handler) (*handler)(id, returned);
    });
    endIfAbandoned();
}

void ExtensionRun::cancel(ExtensionRequestID id, const Value& error) {
    {
        const std::lock_guard lock(mutex_);
        requests_.erase(id);
    }
    tokens_.end(id);
    services_->log.line("%s has given up a request: %s", name(),
                        error.asError() ? describe(*error.asError()) : std::string("it does not say why"));
    endIfAbandoned();
}

void ExtensionRun::abandon() {
    {
        const std::lock_guard lock(mutex_);
        isAbandoned_ = true;
        // A request that was begun just now is still to be launched for.
        if (!session_ && requests_.empty()) return;
    }
    services_->reactor.async([self = shared_from_this()] {
        if (self->services_->isOver) return;
        self->end_ =
            self->services_->reactor.after(self->services_->options.lastRequests, [weak = self->weak_from_this()] {
                if (const auto late = weak.lock()) late->letGo();
            });
        self->endIfAbandoned();
    });
}

void ExtensionRun::endIfAbandoned() {
    {
        const std::lock_guard lock(mutex_);
        if (!isAbandoned_ || !session_ || !requests_.empty()) return;
    }
    letGo();
}

/// The connections end, which tells the process to go; if it does not, it is ended.
void ExtensionRun::letGo() {
    std::shared_ptr<Session> session;
    std::shared_ptr<IpcConnection> requests;
    {
        const std::lock_guard lock(mutex_);
        session = session_;
        if (!session) return;
        requests = session->requests;
    }
    if (!requests) return over(session, ECANCELED);
    requests->setInvalidationHandler({});
    requests->invalidate();
    end_ = services_->reactor.after(kTimeToLeave, [weak = weak_from_this(), session] {
        if (const auto self = weak.lock()) self->over(session, ECANCELED);
    });
}

}  // namespace lumacast
