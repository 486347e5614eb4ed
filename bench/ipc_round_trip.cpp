// The round trip of a request of 100 bytes on the wire and its reply of 30 between two processes: over the transport,
// each end with its reactor, and over a bare socket with blocking calls, in alternation. Prints microseconds.
//
//   ipc_round_trip [round trips per run] [runs]

#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "base/Log.h"
#include "base/MessageTables.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"

namespace {

using namespace lumacast;
using Clock = std::chrono::steady_clock;
using Times = std::vector<double>;

constexpr std::size_t kRequestBytes = 100;
constexpr std::size_t kReplyBytes = 30;  // header, list, null
constexpr auto kService = "bench";

double microseconds(Clock::duration time) { return std::chrono::duration<double, std::micro>(time).count(); }

/// A child process that runs `body`; ended by its number.
class Child {
public:
    explicit Child(const std::function<void()>& body) : pid_(fork()) {
        if (pid_ != 0) return;
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        body();
        _exit(0);
    }
    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;
    ~Child() {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }

private:
    const pid_t pid_;
};

Times bareSocket(int count) {
    std::array<int, 2> ends{};
    if (socketpair(AF_UNIX, SOCK_STREAM, 0, ends.data()) != 0) std::abort();
    const Fd ours(ends[0]);
    Fd theirs(ends[1]);
    const Child echo([&] {
        std::array<char, kRequestBytes> bytes{};
        while (recv(theirs.get(), bytes.data(), bytes.size(), MSG_WAITALL) > 0)
            if (send(theirs.get(), bytes.data(), kReplyBytes, 0) < 0) return;
    });
    theirs.reset();
    std::array<char, kRequestBytes> bytes{};
    Times times;
    for (int i = 0; i < count; ++i) {
        const auto begin = Clock::now();
        if (send(ours.get(), bytes.data(), kRequestBytes, 0) < 0 ||
            recv(ours.get(), bytes.data(), kReplyBytes, MSG_WAITALL) < 0)
            std::abort();
        times.push_back(microseconds(Clock::now() - begin));
    }
    return times;
}

class Echo final : public IpcExportedObject {
public:
    void receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t, Array, IpcReply reply) override {
        reply({Value()});
    }
};

class AcceptAll final : public IpcListenerDelegate {
public:
    bool listenerShouldAcceptNewConnection(IpcListener&, const std::shared_ptr<IpcConnection>& connection) override {
        connection->setExportedInterface(daemonProtocol());
        connection->setExportedObject(echo_);
        connection->resume();
        return true;
    }

private:
    const std::shared_ptr<Echo> echo_ = std::make_shared<Echo>();
};

void serve(const std::string& directory, int ready) {
    Reactor reactor;
    Log log;
    LinuxIpc ipc(reactor, log, {directory});
    const auto delegate = std::make_shared<AcceptAll>();
    const auto listener = ipc.listenerForService(kService);
    listener->setDelegate(delegate);
    listener->resume();
    if (write(ready, "r", 1) != 1) return;
    reactor.run();
}

/// Asks the next question when the reply to the last has come.
class Asker {
public:
    Asker(Reactor& reactor, IpcConnection& connection, int count)
        : reactor_(reactor), connection_(connection), left_(count) {}

    void ask() {
        begin_ = Clock::now();
        connection_.remoteProxy([](const Error&) { std::abort(); })
            ->send(static_cast<std::uint16_t>(DaemonMessage::SaveVideoToCameraRoll), {url_}, [this](const Array&) {
                times.push_back(microseconds(Clock::now() - begin_));
                if (--left_ > 0) return ask();
                reactor_.requestStop();
            });
    }
    Times times;

private:
    Reactor& reactor_;
    IpcConnection& connection_;
    int left_;
    /// Header, list, tag and length take 34 bytes.
    const Value url_ = URL(std::string(kRequestBytes - 34, 'u'));
    Clock::time_point begin_;
};

Times transport(int count) {
    std::string directory = (std::filesystem::temp_directory_path() / "lc-bench-XXXXXX").string();
    if (!mkdtemp(directory.data())) std::abort();
    std::array<int, 2> ready{};
    if (pipe(ready.data()) != 0) std::abort();
    const Fd readEnd(ready[0]), writeEnd(ready[1]);
    Times times;
    {
        const Child service([&] { serve(directory, ready[1]); });
        char byte = 0;
        if (read(ready[0], &byte, 1) != 1) std::abort();
        Reactor reactor;
        Log log;
        LinuxIpc ipc(reactor, log, {directory});
        const auto connection = ipc.connectToService(kService);
        connection->setRemoteInterface(daemonProtocol());
        connection->resume();
        Asker asker(reactor, *connection, count);
        asker.ask();
        reactor.run();
        times = std::move(asker.times);
    }
    std::filesystem::remove_all(directory);
    return times;
}

void print(const char* name, Times times) {
    std::sort(times.begin(), times.end());
    const auto at = [&](double part) {
        return times[static_cast<std::size_t>(part * static_cast<double>(times.size() - 1))];
    };
    std::printf("%-12s p50 %6.1f  p90 %6.1f  p99 %6.1f  (%zu round trips)\n", name, at(0.5), at(0.9), at(0.99),
                times.size());
}

}  // namespace

int main(int argc, char** argv) {
    const int count = argc > 1 ? std::atoi(argv[1]) : 20'000;
    const int runs = argc > 2 ? std::atoi(argv[2]) : 5;
    if (count < 1 || runs < 1) return 2;
    Times bare, ours;
    for (int run = 0; run < runs; ++run) {
        const Times a = bareSocket(count);
        const Times b = transport(count);
        bare.insert(bare.end(), a.begin(), a.end());
        ours.insert(ours.end(), b.begin(), b.end());
    }
    print("bare socket", bare);
    print("transport", ours);
    return 0;
}
