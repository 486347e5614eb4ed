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

namespace lumacast::test {

/// Asks again and again until `condition` holds; false when it did not within a minute.
inline bool waitUntil(const std::function<bool()>& condition) {
    const auto until = std::chrono::steady_clock::now() + std::chrono::seconds(60);
    while (!condition()) {
        if (std::chrono::steady_clock::now() > until) return false;
        ::poll(nullptr, 0, 2);
    }
    return true;
}

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

    /// Listens, but accepts nobody before run.
    static std::shared_ptr<StandInService> make(LinuxIpcOptions options, Answer answer = {}) {
        const auto service = std::make_shared<StandInService>(std::move(options), std::move(answer));
        service->listener_ = service->ipc_.listenerForService("com.orvane.lumacastd");
        service->listener_->setDelegate(service);
        service->listener_->resume();
        return service;
    }
    StandInService(LinuxIpcOptions options, Answer answer)
        : answer_(std::move(answer)), ipc_(reactor_, log_, std::move(options)) {}
    ~StandInService() override {
        if (!thread_.joinable()) return;
        reactor_.requestStop();
        thread_.join();
    }

    void run() {
        thread_ = std::thread([this] { reactor_.run(); });
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
    void tell(ClientMessage message, Array arguments) {
        connection()->remoteProxy([](const Error&) {})->send(static_cast<std::uint16_t>(message), std::move(arguments));
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

/// Counts the answers to one question each, and keeps the last.
template <class Answer>
class Answers {
public:
    /// A handler for question `number`.
    std::function<void(Answer)> handler(std::size_t number = 0) {
        const std::lock_guard lock(held_->mutex);
        if (held_->counts.size() <= number) held_->counts.resize(number + 1);
        return [held = held_, number](Answer answer) {
            const std::lock_guard lock2(held->mutex);
            ++held->counts[number];
            held->last = std::move(answer);
        };
    }
    std::vector<int> counts() const {
        const std::lock_guard lock(held_->mutex);
        return held_->counts;
    }
    int total() const {
        int sum = 0;
        for (const int count : counts()) sum += count;
        return sum;
    }
    bool eachOnce() const {
        for (const int count : counts())
            if (count != 1) return false;
        return true;
    }
    Answer last() const {
        const std::lock_guard lock(held_->mutex);
        return held_->last;
    }

private:
    struct Held {
        mutable std::mutex mutex;
        std::vector<int> counts;
        Answer last;
    };
    std::shared_ptr<Held> held_ = std::make_shared<Held>();
};

/// "connected" and "disconnected", in the order they came.
class Comings {
public:
    client::Events events() {
        client::Events events;
        events.connected = [held = held_] { held->add("connected"); };
        events.disconnected = [held = held_] { held->add("disconnected"); };
        return events;
    }
    std::vector<std::string> all() const {
        const std::lock_guard lock(held_->mutex);
        return held_->words;
    }

private:
    struct Held {
        void add(const char* word) {
            const std::lock_guard lock(mutex);
            words.emplace_back(word);
        }
        std::mutex mutex;
        std::vector<std::string> words;
    };
    std::shared_ptr<Held> held_ = std::make_shared<Held>();
};

inline std::string keyIn(const std::optional<Error>& error) {
    return error ? std::string(client::keyOf(*error)) : std::string("no error");
}

}  // namespace lumacast::test
