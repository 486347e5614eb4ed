#pragma once
// The daemon's side of an extension's process, in the test: both ends in one process, each with a loop of its own.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <condition_variable>
#include <cstdio>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <utility>
#include <vector>

#include "base/Log.h"
#include "broadcast/PayloadKeys.h"
#include "client/extension/Extension.h"
#include "linux/ipc/ExtensionRequests.h"
#include "linux/ipc/FileTokens.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"

namespace lumacast::test {

/// What one side was told, as it came; read by the test.
template <class T>
class Told final {
public:
    void add(T value) {
        const std::lock_guard lock(mutex_);
        values_.push_back(std::move(value));
        changed_.notify_all();
    }
    /// The next one that was not taken yet; none when none comes within half a minute.
    std::optional<T> next() {
        std::unique_lock lock(mutex_);
        if (!changed_.wait_for(lock, std::chrono::seconds(30), [this] { return !values_.empty(); }))
            return std::nullopt;
        T value = std::move(values_.front());
        values_.pop_front();
        return value;
    }
    bool isEmpty() const {
        const std::lock_guard lock(mutex_);
        return values_.empty();
    }

private:
    mutable std::mutex mutex_;
    std::condition_variable changed_;
    std::deque<T> values_;
};

/// Runs an extension's handler on a thread, and is the daemon to it.
class StandInHost final : public IpcListenerDelegate {
public:
    /// What came over one of the connections.
    struct Message {
        std::uint16_t number;
        Array arguments;
    };

    explicit StandInHost(extension::Handler& handler, extension::TokenExchange exchange = {}) {
        const Ends ends = open();
        extension::Options options;
        options.requestsDescriptor = ends.requests;
        options.auxiliaryDescriptor = ends.auxiliary;
        if (exchange) options.exchange = std::move(exchange);
        process_ =
            std::thread([this, &handler, options = std::move(options)] { status_ = extension::run(handler, options); });
    }
    /// Launches a program, as a daemon does but for the confinement.
    explicit StandInHost(const std::string& program) {
        Ends ends = open();
        const pid_t pid = ::fork();
        EXPECT_GE(pid, 0);
        if (pid == 0) {
            // Away from where they go, so that neither is closed by the other's coming.
            const int requests = ::fcntl(ends.requests, F_DUPFD, 10), auxiliary = ::fcntl(ends.auxiliary, F_DUPFD, 10);
            ::dup2(requests, kExtensionRequestsDescriptor);
            ::dup2(auxiliary, kExtensionAuxiliaryDescriptor);
            ::close(requests);
            ::close(auxiliary);
            ::execl(program.c_str(), program.c_str(), nullptr);
            ::_exit(127);
        }
        ::close(ends.requests);
        ::close(ends.auxiliary);
        process_ = std::thread([this, pid] {
            int status = -1;
            ::waitpid(pid, &status, 0);
            status_ = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
        });
    }
    ~StandInHost() override {
        hangUp();
        if (process_.joinable()) process_.join();
        reactor_.requestStop();
        loop_.join();
    }

    /// Ends all connections.
    void hangUp() {
        onLoop([this] {
            requests_->invalidate();
            auxiliary_->invalidate();
            if (daemon_) daemon_->invalidate();
            if (listener_) listener_->invalidate();
        });
    }
    /// What run() answered; waits for it.
    int status() {
        process_.join();
        return status_;
    }

    /// Answers tokens as a daemon does.
    void keepTokens(TokenKeeper keeper) {
        onLoop([&] { keepFileTokens(requests_, std::move(keeper)); });
    }
    /// Begins a request; its reply is told as `taken`.
    void begin(std::int64_t request, const std::vector<ExtensionItem>& items) { begin(request, encodeItems(items)); }
    void begin(std::int64_t request, Array items) {
        onLoop([&] {
            requests_->remoteProxy([](const Error&) {})
                ->send(0, {Value(request), Value(std::move(items))}, [this, request](Array) { taken.add(request); });
        });
    }
    void beginClip(std::int64_t request, const std::string& token, bool isLast, Value userInfo = {}) {
        begin(request, clipItems(token, isLast, std::move(userInfo)));
    }
    static std::vector<ExtensionItem> clipItems(const std::string& token, bool isLast, Value userInfo = {}) {
        const auto item = [](std::string_view title, Value value) {
            return ExtensionItem{std::string(title), {{std::string(kGenericDataType), std::move(value), std::nullopt}}};
        };
        return {item(kItemRequestedFinish, isLast ? "1" : "0"),
                item(kItemSandboxToken, Data(token.begin(), token.end())), item(kItemUserInfo, std::move(userInfo)),
                item(kItemMovieClipURL, "file:///clips/" + token + ".mp4")};
    }

    /// Makes a broadcast of samples: listens, hands over the endpoint, waits for the ping.
    void connect() {
        onLoop([this] {
            if (listener_) listener_->invalidate();
            listener_ = ipc_.anonymousListener();
            listener_->setDelegate(delegate_);
            listener_->resume();
            auxiliary_->remoteProxy([](const Error&) {})->send(0, {Value(listener_->endpoint())}, [this](Array) {
                endpointSet.add(true);
            });
        });
        const auto ping = reports_->messages.next();
        ASSERT_TRUE(ping);
        EXPECT_EQ(ping->number, static_cast<std::uint16_t>(BroadcastDaemonMessage::Ping));
        EXPECT_TRUE(endpointSet.next());
    }
    /// Sends a payload; one of the two is called on the host's loop: when it was processed, or when it can't be.
    void send(
        Dictionary payload, std::function<void()> processed = [] {}, std::function<void()> failed = [] {}) {
        onLoop([&] {
            daemon_
                ->remoteProxy([failed = std::move(failed)](const Error& error) {
                    std::fprintf(stderr, "a payload can't be processed: error %lld\n",
                                 static_cast<long long>(error.code()));
                    failed();
                })
                ->send(0, {Value(std::move(payload))}, [processed = std::move(processed)](Array) { processed(); });
        });
    }
    /// Sends it and waits until it was processed; false when it can't be, or was not in time.
    bool sendAndWait(Dictionary payload) {
        const auto processed = std::make_shared<Told<bool>>();  // an answer may come too late
        send(
            std::move(payload), [processed] { processed->add(true); }, [processed] { processed->add(false); });
        return processed->next().value_or(false);
    }

    bool listenerShouldAcceptNewConnection(IpcListener&, const std::shared_ptr<IpcConnection>& connection) override {
        daemon_ = connection;
        connection->setExportedInterface(broadcastDaemonProtocol());
        connection->setExportedObject(reports_);
        connection->setRemoteInterface(broadcastExtensionProtocol());
        connection->resume();
        return true;
    }

    /// Completed and cancelled requests (numbers of ExtensionRequestHostMessage).
    Told<Message>& answers() { return answers_->messages; }
    /// What the extension reports (numbers of BroadcastDaemonMessage).
    Told<Message>& reports() { return reports_->messages; }
    Told<std::int64_t> taken;
    Told<bool> endpointSet;

private:
    class Inbox final : public IpcExportedObject {
    public:
        void receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t message, Array arguments,
                            IpcReply) override {
            messages.add({message, std::move(arguments)});
        }
        Told<Message> messages;
    };

    /// The other ends of the two sockets; whoever gets them owns them.
    struct Ends {
        int requests, auxiliary;
    };
    Ends open() {
        int requests[2], auxiliary[2];
        EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0, requests), 0);
        EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0, auxiliary), 0);
        requests_ = ipc_.adopt(Fd(requests[0]), Peer::of(requests[0]));
        requests_->setExportedInterface(extensionRequestHostProtocol());
        requests_->setExportedObject(answers_);
        requests_->setRemoteInterface(extensionRequestProtocol());
        requests_->resume();
        auxiliary_ = ipc_.adopt(Fd(auxiliary[0]), Peer::of(auxiliary[0]));
        auxiliary_->setExportedInterface(extensionHostProtocol());
        auxiliary_->setRemoteInterface(extensionVendorProtocol());
        auxiliary_->resume();
        loop_ = std::thread([this] { reactor_.run(); });
        return {requests[1], auxiliary[1]};
    }

    void onLoop(const std::function<void()>& task) { reactor_.sync(task); }

    Log log_{[](LogLevel level, std::string_view text) {
        if (level == LogLevel::Error) std::fprintf(stderr, "host: %.*s\n", static_cast<int>(text.size()), text.data());
    }};
    Reactor reactor_;
    LinuxIpc ipc_{reactor_, log_, {}};
    const std::shared_ptr<Inbox> answers_ = std::make_shared<Inbox>();
    const std::shared_ptr<Inbox> reports_ = std::make_shared<Inbox>();
    /// Itself, as somebody who is not to be deleted.
    const std::shared_ptr<IpcListenerDelegate> delegate_{this, [](IpcListenerDelegate*) {}};
    std::shared_ptr<IpcConnection> requests_, auxiliary_, daemon_;
    std::shared_ptr<IpcListener> listener_;
    std::thread loop_, process_;
    int status_ = -1;
};

}  // namespace lumacast::test
