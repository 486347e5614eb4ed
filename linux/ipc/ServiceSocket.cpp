#include "linux/ipc/ServiceSocket.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <cerrno>
#include <charconv>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <optional>
#include <string_view>
#include <system_error>
#include <utility>

namespace lumacast {

namespace {

constexpr int kFirstActivated = 3;
constexpr int kBacklog = 4096;

std::optional<int> integerFrom(const char* text) {
    if (!text) return std::nullopt;
    int value = 0;
    const std::string_view all(text);
    const auto [end, error] = std::from_chars(all.data(), all.data() + all.size(), value);
    if (error != std::errc() || end != all.data() + all.size()) return std::nullopt;
    return value;
}

bool isListeningStream(int socket) {
    const auto option = [&](int name) {
        int value = -1;
        socklen_t size = sizeof value;
        return getsockopt(socket, SOL_SOCKET, name, &value, &size) == 0 ? value : -1;
    };
    return option(SO_DOMAIN) == AF_UNIX && option(SO_TYPE) == SOCK_STREAM && option(SO_ACCEPTCONN) == 1;
}

/// The last part of the path that a socket is bound to.
std::string boundName(int socket) {
    sockaddr_un address{};
    socklen_t size = sizeof address;
    if (getsockname(socket, reinterpret_cast<sockaddr*>(&address), &size) != 0) return {};
    if (size <= offsetof(sockaddr_un, sun_path) || address.sun_path[0] == '\0') return {};
    return std::filesystem::path(address.sun_path).filename();
}

bool isPlainName(const std::string& service) {
    return !service.empty() && service.front() != '.' && service.find('/') == std::string::npos &&
           service.find('\0') == std::string::npos;
}

/// Absent when the path does not fit an address.
std::optional<sockaddr_un> addressOf(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof address.sun_path) return std::nullopt;
    std::memcpy(address.sun_path, path.data(), path.size());
    return address;
}

Fd streamSocket() { return Fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)); }

bool connectTo(const Fd& socket, const sockaddr_un& address) {
    return connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
}

std::string socketPath(const std::string& runtimeDirectory, const std::string& service) {
    return runtimeDirectory + "/" + service + ".sock";
}

/// Makes the directory, or answers why it can't be used: others who could write to it could take our place.
const char* prepareDirectory(const std::string& path) {
    std::error_code ignored;
    std::filesystem::create_directories(std::filesystem::path(path).parent_path(), ignored);
    if (mkdir(path.c_str(), 0700) != 0 && errno != EEXIST) return "the runtime directory can't be made";
    struct stat status {};
    if (lstat(path.c_str(), &status) != 0 || !S_ISDIR(status.st_mode)) return "the runtime directory is none";
    if (status.st_uid != geteuid() || (status.st_mode & 022) != 0) return "others can write to the runtime directory";
    return nullptr;
}

}  // namespace

ActivatedSockets ActivatedSockets::fromEnvironment() {
    ActivatedSockets result;
    const auto pid = integerFrom(std::getenv("LISTEN_PID"));
    const auto count = integerFrom(std::getenv("LISTEN_FDS"));
    const char* variable = std::getenv("LISTEN_FDNAMES");
    std::string names = variable ? variable : "";
    for (const char* name : {"LISTEN_PID", "LISTEN_FDS", "LISTEN_FDNAMES"}) unsetenv(name);
    if (!pid || *pid != getpid() || !count) return result;
    for (int i = 0; i < *count && i < 64; ++i) {
        const std::string name = names.substr(0, names.find(':'));
        names.erase(0, name.size() + 1);
        Fd socket(kFirstActivated + i);
        fcntl(socket.get(), F_SETFD, FD_CLOEXEC);
        if (isListeningStream(socket.get())) result.add(name, std::move(socket));
    }
    return result;
}

Fd ActivatedSockets::take(const std::string& service) {
    auto chosen = sockets_.find(service);
    if (chosen == sockets_.end()) chosen = sockets_.find(service + ".socket");
    for (auto at = sockets_.begin(); chosen == sockets_.end() && at != sockets_.end(); ++at)
        if (boundName(at->second.get()) == service + ".sock") chosen = at;
    if (chosen == sockets_.end() && sockets_.size() == 1) chosen = sockets_.begin();
    if (chosen == sockets_.end()) return Fd();
    Fd socket = std::move(chosen->second);
    sockets_.erase(chosen);
    // Accepting must not block, whoever else accepts from it.
    fcntl(socket.get(), F_SETFL, fcntl(socket.get(), F_GETFL) | O_NONBLOCK);
    return socket;
}

ServiceSocket ServiceSocket::open(const std::string& runtimeDirectory, const std::string& service,
                                  ActivatedSockets& activated, Log& log) {
    ServiceSocket result;
    result.socket_ = activated.take(service);
    if (result.socket_) return result;
    if (const char* reason = result.bindIn(runtimeDirectory, service)) {
        log.error("IPC: service %s is not available: %s", service, reason);
        result.socket_.reset();
    }
    return result;
}

const char* ServiceSocket::bindIn(const std::string& runtimeDirectory, const std::string& service) {
    if (!isPlainName(service)) return "its name can't be a file's";
    const std::string path = socketPath(runtimeDirectory, service);
    const auto address = addressOf(path);
    if (!address) return "its path is too long";
    if (const char* reason = prepareDirectory(runtimeDirectory)) return reason;
    const std::string lockPath = runtimeDirectory + "/" + service + ".lock";
    lock_ = Fd(::open(lockPath.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
    if (!lock_) return "its lock file can't be opened";
    if (flock(lock_.get(), LOCK_EX | LOCK_NB) != 0) return "another process serves it";

    struct stat status {};
    if (lstat(path.c_str(), &status) == 0) {
        if (!S_ISSOCK(status.st_mode)) return "something else lies at its path";
        // A socket without our lock: a process that does not know the lock may be listening there.
        if (connectTo(streamSocket(), *address) || errno == EAGAIN) return "another process serves it";
        unlink(path.c_str());
    }
    socket_ = streamSocket();
    if (bind(socket_.get(), reinterpret_cast<const sockaddr*>(&*address), sizeof *address) != 0)
        return "its socket can't be bound";
    path_ = path;
    if (listen(socket_.get(), kBacklog) != 0) return "its socket can't listen";
    return nullptr;
}

ServiceSocket::~ServiceSocket() {
    if (!path_.empty() && lock_) unlink(path_.c_str());
}

ServiceCall callServiceSocket(const std::string& runtimeDirectory, const std::string& service) {
    ServiceCall call;
    const auto address = addressOf(socketPath(runtimeDirectory, service));
    if (!isPlainName(service) || !address) return call;
    Fd socket = streamSocket();
    if (!socket) return call;
    if (connectTo(socket, *address)) call.socket = std::move(socket);
    else call.isBusy = errno == EAGAIN;
    return call;
}

Fd connectToServiceSocket(const std::string& runtimeDirectory, const std::string& service) {
    return callServiceSocket(runtimeDirectory, service).socket;
}

}  // namespace lumacast
