#include "tests/fakes/FakeIpc.h"

#include <algorithm>
#include <utility>

#include "base/Limits.h"
#include "tests/fakes/FakeIpcConnection.h"

namespace lumacast {

namespace {

class FakeEndpoint final : public IpcEndpoint {
public:
    explicit FakeEndpoint(std::weak_ptr<FakeListenerState> listener) : listener_(std::move(listener)) {}
    std::shared_ptr<FakeListenerState> listener() const { return listener_.lock(); }

private:
    const std::weak_ptr<FakeListenerState> listener_;
};

/// Asks the delegate about one connection. On the main queue of the listener's process.
void decide(const std::shared_ptr<FakeListenerState>& state, const std::shared_ptr<FakeIpcConnection>& connection) {
    std::shared_ptr<IpcListener> listener;
    std::shared_ptr<IpcListenerDelegate> delegate;
    {
        const std::lock_guard lock(state->mutex);
        if (!state->closed) {
            listener = state->listener.lock();
            delegate = state->delegate.lock();
        }
    }
    bool hasRoom = false;
    {
        const std::lock_guard lock(state->process->machine->mutex);
        hasRoom = state->process->machine->acceptedConnections <= limitOf(Limit::ConnectionsPerUser);
    }
    if (!state->process->isAlive()) return connection->processDied();
    {
        // Owned before the delegate is asked: it may be lost from within.
        const std::lock_guard lock(state->process->mutex);
        state->process->accepted.insert(connection);
    }
    if (!listener || !delegate || !hasRoom || !delegate->listenerShouldAcceptNewConnection(*listener, connection))
        connection->invalidate();
}

void offer(const std::shared_ptr<FakeListenerState>& state, std::shared_ptr<FakeIpcConnection> connection) {
    {
        const std::lock_guard lock(state->mutex);
        if (!state->resumed) {
            state->waiting.push_back(std::move(connection));
            return;
        }
    }
    state->process->queue->async([state, connection = std::move(connection)] { decide(state, connection); });
}

void close(const std::shared_ptr<FakeListenerState>& state) {
    std::deque<std::shared_ptr<FakeIpcConnection>> waiting;
    {
        const std::lock_guard lock(state->mutex);
        state->closed = true;
        waiting.swap(state->waiting);
    }
    for (const auto& connection : waiting) connection->invalidate();
}

class FakeListener final : public IpcListener {
public:
    explicit FakeListener(std::shared_ptr<FakeListenerState> state) : state_(std::move(state)) {}
    ~FakeListener() override { close(state_); }

    void setDelegate(std::weak_ptr<IpcListenerDelegate> delegate) override {
        const std::lock_guard lock(state_->mutex);
        state_->delegate.swap(delegate);
    }
    void resume() override {
        std::deque<std::shared_ptr<FakeIpcConnection>> waiting;
        {
            const std::lock_guard lock(state_->mutex);
            state_->resumed = true;
            waiting.swap(state_->waiting);
        }
        for (auto& connection : waiting) offer(state_, std::move(connection));
    }
    std::shared_ptr<IpcEndpoint> endpoint() override { return std::make_shared<FakeEndpoint>(state_); }
    void invalidate() override { close(state_); }

private:
    const std::shared_ptr<FakeListenerState> state_;
};

std::shared_ptr<FakeListener> makeListener(const std::shared_ptr<FakeIpc::Process>& process,
                                           const std::shared_ptr<FakeListenerState>& state) {
    state->process = process;
    auto listener = std::make_shared<FakeListener>(state);
    state->listener = listener;
    const std::lock_guard lock(process->mutex);
    process->listeners.push_back(state);
    return listener;
}

bool isOpen(const std::shared_ptr<FakeListenerState>& state) {
    if (!state) return false;
    const std::lock_guard lock(state->mutex);
    return !state->closed;
}

}  // namespace

FakeIpc::FakeIpc(std::shared_ptr<FakeIpcMachine> machine, std::shared_ptr<SerialQueue> mainQueue, ProcessID pid,
                 FaultPlan& faults, Log& log)
    : process_(std::make_shared<Process>(std::move(machine), std::move(mainQueue), pid, faults, log)) {}

FakeIpc::~FakeIpc() { kill(); }

ProcessID FakeIpc::pid() const { return process_->pid; }

std::shared_ptr<IpcListener> FakeIpc::listenerForService(const std::string& name) {
    const auto state = std::make_shared<FakeListenerState>();
    auto listener = makeListener(process_, state);
    bool taken = false;
    {
        const std::lock_guard lock(process_->machine->mutex);
        std::weak_ptr<FakeListenerState>& service = process_->machine->services[name];
        taken = isOpen(service.lock());
        if (!taken) service = state;
    }
    if (taken) process_->log.error("IPC: the name %s is taken", name);
    return listener;
}

std::shared_ptr<IpcListener> FakeIpc::anonymousListener() {
    return makeListener(process_, std::make_shared<FakeListenerState>());
}

std::shared_ptr<IpcConnection> FakeIpc::connectToService(const std::string& name) {
    std::shared_ptr<FakeListenerState> state;
    {
        const std::lock_guard lock(process_->machine->mutex);
        const auto found = process_->machine->services.find(name);
        if (found != process_->machine->services.end()) state = found->second.lock();
    }
    return connectTo(state);
}

std::shared_ptr<IpcConnection> FakeIpc::connectToEndpoint(const std::shared_ptr<IpcEndpoint>& endpoint) {
    const auto* fake = dynamic_cast<const FakeEndpoint*>(endpoint.get());
    return connectTo(fake ? fake->listener() : nullptr);
}

std::shared_ptr<IpcConnection> FakeIpc::connectTo(const std::shared_ptr<FakeListenerState>& listener) {
    const bool works = isOpen(listener) && process_->isAlive() && !process_->faults.fails("Ipc.connect");
    const auto near =
        std::make_shared<FakeIpcConnection>(process_, works ? listener->process->pid : ProcessID{0}, false);
    {
        const std::lock_guard lock(process_->mutex);
        std::erase_if(process_->ends, [](const auto& end) { return end.expired(); });
        process_->ends.push_back(near);
    }
    if (!works) return near;
    const auto far = std::make_shared<FakeIpcConnection>(listener->process, process_->pid, true);
    {
        const std::lock_guard lock(listener->process->mutex);
        std::erase_if(listener->process->ends, [](const auto& end) { return end.expired(); });
        listener->process->ends.push_back(far);
    }
    FakeIpcConnection::join(near, far);
    offer(listener, far);
    return near;
}

void FakeIpc::grant(ProcessID peer, const std::string& name, Value value) {
    const std::lock_guard lock(process_->mutex);
    process_->grants.insert_or_assign({peer, name}, std::move(value));
}

void FakeIpc::setUser(ProcessID peer, UserID user) {
    const std::lock_guard lock(process_->mutex);
    process_->users[peer] = user;
}

void FakeIpc::kill() {
    std::vector<std::weak_ptr<FakeIpcConnection>> ends;
    std::vector<std::weak_ptr<FakeListenerState>> listeners;
    std::set<std::shared_ptr<FakeIpcConnection>> accepted;
    {
        const std::lock_guard lock(process_->mutex);
        if (!process_->alive) return;
        process_->alive = false;
        ends.swap(process_->ends);
        listeners.swap(process_->listeners);
        accepted.swap(process_->accepted);
    }
    for (const auto& weak : listeners)
        if (const auto listener = weak.lock()) close(listener);
    for (const auto& weak : ends)
        if (const auto end = weak.lock()) end->processDied();
}

void FakeIpc::setReading(bool reading) {
    std::vector<std::weak_ptr<FakeIpcConnection>> ends;
    {
        const std::lock_guard lock(process_->mutex);
        process_->reading = reading;
        ends = process_->ends;
    }
    if (!reading) return;
    for (const auto& weak : ends)
        if (const auto end = weak.lock()) end->readOn();
}

}  // namespace lumacast
