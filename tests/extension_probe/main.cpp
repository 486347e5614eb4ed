// An extension that does what its requests say. See README.md.

#include <fcntl.h>
#include <sys/file.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "base/Log.h"
#include "linux/ipc/ExtensionRequests.h"
#include "linux/ipc/FileTokens.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"
#include "tests/extension_probe/Attacks.h"
#include "tests/fakes/FakePlane.h"

extern char** environ;

namespace lumacast::probe {

namespace {

ExtensionItem textItem(std::string title, std::string text) {
    return {std::move(title), {{std::string(kGenericDataType), Value(std::move(text)), std::nullopt}}};
}

std::string textOf(const ExtensionItem& item) {
    const auto* text = item.attachments.empty() ? nullptr : item.attachments.front().item.as<std::string>();
    return text ? *text : std::string();
}

Data dataOf(const ExtensionItem& item) {
    const auto* data = item.attachments.empty() ? nullptr : item.attachments.front().item.as<Data>();
    return data ? *data : Data();
}

/// As many processes as it gets, up to 2000; they stay.
int forkMany() {
    int made = 0;
    while (made < 2000) {
        const pid_t child = ::fork();
        if (child == 0)
            for (;;) ::pause();
        if (child < 0) break;
        ++made;
    }
    return made;
}

class Probe final : public IpcExportedObject, public std::enable_shared_from_this<Probe> {
public:
    Probe(int descriptorsAtStart, Reactor& reactor, LinuxIpc& ipc, Log& log)
        : descriptorsAtStart_(descriptorsAtStart), reactor_(reactor), ipc_(ipc), log_(log) {}

    void start() {
        requests_ = ipc_.adopt(Fd(kExtensionRequestsDescriptor), Peer::of(kExtensionRequestsDescriptor));
        auxiliary_ = ipc_.adopt(Fd(kExtensionAuxiliaryDescriptor), Peer::of(kExtensionAuxiliaryDescriptor));
        requests_->setExportedInterface(extensionRequestProtocol());
        requests_->setRemoteInterface(extensionRequestHostProtocol());
        requests_->setExportedObject(weak_from_this());
        requests_->setInvalidationHandler([this] { reactor_.requestStop(); });
        auxiliary_->setExportedInterface(extensionVendorProtocol());
        auxiliary_->setRemoteInterface(extensionHostProtocol());
        auxiliary_->setExportedObject(weak_from_this());
        requests_->resume();
        auxiliary_->resume();
    }

    void receiveMessage(const std::shared_ptr<IpcConnection>& connection, std::uint16_t, Array arguments,
                        IpcReply reply) override {
        if (connection == auxiliary_) return takeEndpoint(std::move(arguments), reply);
        const std::int64_t request = *arguments[0].as<std::int64_t>();
        auto items = decodeItems(*arguments[1].as<Array>()).value_or(std::vector<ExtensionItem>());
        std::string command = "hold";
        if (!items.empty() && items.front().attributedTitle == "command") {
            command = textOf(items.front());
            items.erase(items.begin());
        }
        if (command != "at-once") reply({});
        perform(command, request, items);
        if (command == "at-once") reply({});
    }

private:
    void takeEndpoint(Array arguments, const IpcReply& reply) {
        const auto* endpoint = arguments[0].as<Value::EndpointRef>();
        if (endpoint && *endpoint) {
            broadcast_ = ipc_.connectToEndpoint(*endpoint);
            broadcast_->setRemoteInterface(broadcastDaemonProtocol());
            broadcast_->setExportedInterface(broadcastExtensionProtocol());
            broadcast_->resume();
            broadcast_->remoteProxy({})->send(static_cast<std::uint16_t>(BroadcastDaemonMessage::Ping), {});
        }
        reply({});
    }

    void completeWith(std::int64_t request, Array items) {
        requests_->remoteProxy({})->send(static_cast<std::uint16_t>(ExtensionRequestHostMessage::CompleteRequest),
                                         {Value(request), Value(std::move(items))});
    }
    void complete(std::int64_t request, const std::vector<ExtensionItem>& items) {
        completeWith(request, encodeItems(items));
    }

    void perform(const std::string& command, std::int64_t request, const std::vector<ExtensionItem>& items) {
        if (command == "echo" || command == "at-once") return complete(request, items);
        if (command == "leave") ::_exit(3);
        if (command == "twice") {
            complete(request, {textItem("first", "1")});
            return complete(request, {textItem("second", "2")});
        }
        if (command == "cancel") {
            requests_->remoteProxy({})->send(static_cast<std::uint16_t>(ExtensionRequestHostMessage::CancelRequest),
                                             {Value(request), Value(Error("probe", 7))});
            return;
        }
        if (command == "release") return release();
        if (command == "many") return returnMany(request, std::atoi(textOf(items.front()).c_str()));
        if (command == "ill-formed") return returnIllFormed(request);
        if (command == "open") return tryPaths(request, items);
        if (command == "attack") return attack(request, std::atoi(textOf(items.front()).c_str()));
        if (command == "exchange") return exchange(request, items, 0, std::make_shared<std::vector<ExtensionItem>>());
        if (command == "environment") return tellEnvironment(request);
        if (command == "print") {
            for (const ExtensionItem& item : items) std::fprintf(stdout, "%s\n", textOf(item).c_str());
            std::fflush(stdout);
            return complete(request, {});
        }
        if (command == "leave-child") return leaveChild(request, textOf(items.front()));
        if (command == "connect") {
            const int socket = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
            const std::string answer = socket >= 0 ? "0" : ::strerrorname_np(errno);
            if (socket >= 0) ::close(socket);
            return complete(request, {textItem("socket", answer)});
        }
        if (command == "forks") return complete(request, {textItem("forks", std::to_string(forkMany()))});
        if (command == "descriptors") return tellDescriptors(request);
        if (command == "limits") return tellLimits(request);
        if (command == "memory") return takeMemory(request);
        if (command == "garbage") {
            const std::array<char, 64> garbage{};
            [[maybe_unused]] const auto written = ::write(kExtensionRequestsDescriptor, garbage.data(), garbage.size());
            return;
        }
        held_.push_back(request);
    }

    /// Completes what was held.
    void release() {
        for (const std::int64_t request : std::exchange(held_, {})) complete(request, {textItem("released", "")});
    }

    void returnMany(std::int64_t request, int count) {
        std::vector<ExtensionItem> items;
        for (int i = 0; i < count; ++i) items.push_back(textItem("item", std::to_string(i)));
        complete(request, items);
    }

    void returnIllFormed(std::int64_t request) {
        Array items = encodeItems({textItem("good", "1")});
        items.emplace_back(7);
        items.emplace_back(Dictionary{{"title", "no attachments"}});
        items.emplace_back(Dictionary{{"title", 5}, {"attachments", Value(Array{})}});
        items.emplace_back(Dictionary{{"title", "x"}, {"attachments", Value(Array{Value(1)})}});
        const Value memory(Value::PlaneRef(std::make_shared<FakePlane>(1, 1, 1, std::vector<PixelRect>())));
        items.push_back(encodeItems({ExtensionItem{"memory", {{"x", memory, std::nullopt}}}}).front());
        items.push_back(encodeItems({textItem("also good", "2")}).front());
        completeWith(request, std::move(items));
    }

    void tryPaths(std::int64_t request, const std::vector<ExtensionItem>& paths) {
        std::vector<ExtensionItem> answers;
        for (const ExtensionItem& path : paths) answers.push_back(textItem(textOf(path), openedAs(textOf(path))));
        complete(request, answers);
    }

    void attack(std::int64_t request, int victim) {
        std::string all;
        for (const auto& [what, outcome] : attackEverything(victim)) all += what + "=" + outcome + "\n";
        complete(request, {textItem("attacks", all)});
    }

    /// Exchanges each token in turn: what is in its file and what of it could be written, or the error.
    void exchange(std::int64_t request, const std::vector<ExtensionItem>& tokens, std::size_t at,
                  const std::shared_ptr<std::vector<ExtensionItem>>& answers) {
        if (at == tokens.size()) return complete(request, *answers);
        exchangeFileToken(
            requests_, dataOf(tokens[at]),
            [self = shared_from_this(), request, tokens, at, answers](Fd file, std::optional<Error> error) {
                std::string text = error ? "error " + std::to_string(error->code()) : std::string();
                if (file) {
                    std::array<char, 256> some{};
                    const ssize_t count = ::pread(file.get(), some.data(), some.size(), 0);
                    text = "read " + std::string(some.data(), static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
                    const std::string written = writtenThrough(file.get());
                    if (!written.empty()) text += " WRITTEN: " + written;
                }
                answers->push_back(textItem("file", text));
                self->exchange(request, tokens, at + 1, answers);
            });
    }

    void tellEnvironment(std::int64_t request) {
        std::string all;
        for (char** variable = environ; *variable; ++variable) all += std::string(*variable) + "\n";
        std::array<char, 4096> folder{};
        all += "in " + std::string(::getcwd(folder.data(), folder.size()) ? folder.data() : "");
        complete(request, {textItem("environment", all)});
    }

    /// Leaves a child behind that holds a lock, in a session of its own.
    void leaveChild(std::int64_t request, const std::string& path) {
        const int lock = ::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
        if (lock < 0 || ::flock(lock, LOCK_EX) != 0) return complete(request, {textItem("child", "no lock")});
        const pid_t child = ::fork();
        if (child == 0) {
            ::setsid();
            for (int descriptor = 0; descriptor < 256; ++descriptor)
                if (descriptor != lock) ::close(descriptor);
            for (;;) ::pause();
        }
        complete(request, {textItem("child", child > 0 ? "left" : "none")});
        ::close(lock);
    }

    /// The descriptors that it has been started with, apart from the standard three.
    void tellDescriptors(std::int64_t request) {
        complete(request, {textItem("descriptors", std::to_string(descriptorsAtStart_))});
    }

    void tellLimits(std::int64_t request) {
        std::vector<ExtensionItem> all;
        for (const auto& [name, which] : {std::pair("address-space", RLIMIT_AS),
                                          {"file-size", RLIMIT_FSIZE},
                                          {"open-files", RLIMIT_NOFILE},
                                          {"processes", RLIMIT_NPROC},
                                          {"core", RLIMIT_CORE}}) {
            rlimit now{};
            ::getrlimit(which, &now);
            // Neither may be raised: the hard limit is the same.
            const bool isFixed = now.rlim_cur == now.rlim_max;
            all.push_back(textItem(name, isFixed ? std::to_string(now.rlim_cur) : "can be raised"));
        }
        complete(request, all);
    }

    void takeMemory(std::int64_t request) {
        std::size_t megabytes = 0;
        constexpr std::size_t kStep = 64;
        // Only mapped, not used: it is the limit that is asked, not the machine.
        while (megabytes < 64 * 1024) {
            void* const some = std::malloc(kStep << 20);
            if (!some) break;
            megabytes += kStep;
        }
        complete(request, {textItem("megabytes", std::to_string(megabytes))});
        std::fflush(stdout);
    }

    const int descriptorsAtStart_;
    Reactor& reactor_;
    LinuxIpc& ipc_;
    Log& log_;
    std::shared_ptr<IpcConnection> requests_, auxiliary_, broadcast_;
    std::vector<std::int64_t> held_;
};

}  // namespace

}  // namespace lumacast::probe

int main(int count, char** arguments) {
    using namespace lumacast;
    if (count > 1 && std::strcmp(arguments[1], "--silent") == 0)
        for (;;) ::pause();
    if (count > 1 && std::strcmp(arguments[1], "--forks") == 0) {
        std::printf("%d\n", probe::forkMany());
        return 0;
    }
    int descriptors = 0;
    for (int descriptor = 3; descriptor < 1024; ++descriptor)
        if (::fcntl(descriptor, F_GETFD) >= 0) ++descriptors;
    Log log([](LogLevel, std::string_view line) {
        std::fprintf(stderr, "%.*s\n", static_cast<int>(line.size()), line.data());
    });
    Reactor reactor("probe");
    LinuxIpc ipc(reactor, log, {});
    const auto probe = std::make_shared<probe::Probe>(descriptors, reactor, ipc, log);
    probe->start();
    reactor.run();
}
