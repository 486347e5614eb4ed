#pragma once
// A daemon of the test's own, in this process, and what a recorder hears.

#include <poll.h>

#include <chrono>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "base/Log.h"
#include "client/Recorder.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"
#include "tests/client/Heard.h"

namespace lumacast::test {

/// Answers each message by `answer`, on a thread of its own; the newest connection is kept for messages to the client.
class StandInService final : public IpcListenerDelegate,
                             public IpcExportedObject,
                             public std::enable_shared_from_this<StandInService> {
public:
    using Answer = std::function<void(DaemonMessage message, const Array& arguments, const IpcReply& reply)>;

    struct Received {
        DaemonMessage message;
        Array arguments;
    };

    /// Listens, but accepts nobody before run. It ends with the pointer that this answers: what else holds the object,
    /// say a message that is being handled, doesn't count.
    static std::shared_ptr<StandInService> make(LinuxIpcOptions options, Answer answer = {}) {
        const auto service = std::make_shared<StandInService>(std::move(options), std::move(answer));
        service->listener_ = service->ipc_.listenerForService("com.orvane.lumacastd");
        service->listener_->setDelegate(service);
        service->listener_->resume();
        return {service.get(), [service](StandInService*) { service->stop(); }};
    }
    StandInService(LinuxIpcOptions options, Answer answer)
        : answer_(std::move(answer)), ipc_(reactor_, log_, std::move(options)) {}

    void run() {
        thread_ = std::thread([this] { reactor_.run(); });
    }
    void stop() {
        if (!thread_.joinable()) return;
        reactor_.requestStop();
        thread_.join();
    }

    /// What came, but for the questions for the state with which each connection begins.
    std::vector<Received> received() const {
        const std::lock_guard lock(mutex_);
        return received_;
    }
    bool hasReceived(DaemonMessage message) const {
        for (const Received& one : received())
            if (one.message == message) return true;
        return false;
    }
    std::size_t connections() const {
        const std::lock_guard lock(mutex_);
        return connections_;
    }
    std::shared_ptr<IpcConnection> connection() const {
        const std::lock_guard lock(mutex_);
        return newest_.lock();
    }
    /// Says something on the newest connection, if it is still there.
    void tell(ClientMessage message, Array arguments) {
        if (const auto reached = connection())
            reached->remoteProxy([](const Error&) {})->send(static_cast<std::uint16_t>(message), std::move(arguments));
    }

    bool listenerShouldAcceptNewConnection(IpcListener&, const std::shared_ptr<IpcConnection>& connection) override {
        connection->setExportedInterface(daemonProtocol());
        connection->setExportedObject(weak_from_this());
        connection->setRemoteInterface(clientProtocol());
        {
            const std::lock_guard lock(mutex_);
            newest_ = connection;
            ++connections_;
        }
        connection->resume();
        return true;
    }

    void receiveMessage(const std::shared_ptr<IpcConnection>& connection, std::uint16_t number, Array arguments,
                        IpcReply reply) override {
        const auto message = static_cast<DaemonMessage>(number);
        {
            const std::lock_guard lock(mutex_);
            if (message == DaemonMessage::SynchronousGetCurrentState && proved_.lock() != connection) {
                proved_ = connection;
                reply({Dictionary()});
                return;
            }
            received_.push_back({message, arguments});
        }
        if (answer_) answer_(message, arguments, reply);
    }

private:
    const Answer answer_;
    Log log_;
    Reactor reactor_{"stand-in"};
    LinuxIpc ipc_;
    std::shared_ptr<IpcListener> listener_;
    mutable std::mutex mutex_;
    std::vector<Received> received_;
    std::weak_ptr<IpcConnection> newest_, proved_;
    std::size_t connections_ = 0;
    std::thread thread_;
};

}  // namespace lumacast::test
