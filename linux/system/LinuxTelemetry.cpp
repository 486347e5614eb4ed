#include "linux/system/LinuxTelemetry.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <condition_variable>
#include <deque>
#include <mutex>
#include <system_error>
#include <thread>

#include "linux/system/FileDescriptor.h"
#include "linux/system/Json.h"
#include "linux/system/LinuxClock.h"
#include "linux/system/LinuxEnvironment.h"
#include "linux/system/SystemError.h"
#include "linux/system/Threads.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumWaiting = 64;
constexpr std::chrono::seconds kFarewell{2};

/// Appends a line with one write, after making room. Whether all of it is in the file.
bool append(const std::string& path, std::uint64_t maximumBytes, const std::string& line) {
    const auto open = [&] {
        return FileDescriptor(
            ::open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK, 0600));
    };
    FileDescriptor file = open();
    if (!file && errno == ENOENT) {
        if (makeDirectories(path.substr(0, path.rfind('/')))) return false;
        file = open();
    }
    struct stat status = {};
    if (!file || ::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) return false;
    if (status.st_size > 0 && static_cast<std::uint64_t>(status.st_size) + line.size() > maximumBytes) {
        if (::rename(path.c_str(), (path + ".1").c_str()) != 0) return false;
        file = open();
        if (!file || ::fstat(file.get(), &status) != 0) return false;
    }
    if (::write(file.get(), line.data(), line.size()) == static_cast<ssize_t>(line.size())) return true;
    // Half a line would spoil the next one too. Only this thread appends, so the old end is still the end.
    if (::ftruncate(file.get(), status.st_size) != 0) return false;
    return false;
}

}  // namespace

struct LinuxTelemetry::State {
    std::string path;
    std::uint64_t maximumBytes = 0;
    std::function<void()> beforeEachWrite;
    std::mutex mutex;
    std::condition_variable workCame;
    std::condition_variable workDone;
    std::deque<std::string> waiting;
    std::size_t unwritten = 0;  ///< those waiting and the one being written
    std::uint64_t lost = 0;
    bool stopping = false;
    bool running = false;  ///< the thread is made with the first event
};

LinuxTelemetry::LinuxTelemetry(std::string path, std::uint64_t maximumBytes, std::function<void()> beforeEachWrite)
    : state_(std::make_shared<State>()) {
    state_->path = std::move(path);
    state_->maximumBytes = maximumBytes;
    state_->beforeEachWrite = std::move(beforeEachWrite);
}

LinuxTelemetry::~LinuxTelemetry() {
    std::unique_lock lock(state_->mutex);
    state_->stopping = true;
    state_->workCame.notify_all();
    state_->workDone.wait_for(lock, kFarewell, [&] { return !state_->running; });
}

std::optional<Error> LinuxTelemetry::send(const TelemetrySession& session, const TelemetryUser& user,
                                          std::int64_t category, std::int64_t type, const Dictionary& payload) {
    const Dictionary event{{"time", LinuxClock().now()},
                           {"clientType", session.clientType},
                           {"clientVersion", session.clientVersion},
                           {"sessionIdentifier", session.sessionIdentifier},
                           {"batchEvent", session.batchEvent},
                           {"requireUserInfo", session.requireUserInfo},
                           {"clientName", user.clientName},
                           {"serviceName", user.serviceName},
                           {"category", category},
                           {"type", type},
                           {"payload", payload}};
    std::string line = jsonText(event) + "\n";
    if (line.size() > state_->maximumBytes) return systemError(EMSGSIZE);

    const std::lock_guard lock(state_->mutex);
    if (state_->unwritten >= kMaximumWaiting) return systemError(ENOBUFS);
    if (!state_->running) {
        if (!startDetachedThread([state = state_] { write(state); })) return systemError(EAGAIN);
        state_->running = true;
    }
    state_->waiting.push_back(std::move(line));
    ++state_->unwritten;
    state_->workCame.notify_one();
    return std::nullopt;
}

bool LinuxTelemetry::flush(std::chrono::milliseconds limit) {
    std::unique_lock lock(state_->mutex);
    return state_->workDone.wait_for(lock, limit, [&] { return state_->unwritten == 0; });
}

std::uint64_t LinuxTelemetry::lostEvents() const {
    const std::lock_guard lock(state_->mutex);
    return state_->lost;
}

void LinuxTelemetry::write(const std::shared_ptr<State>& state) {
    std::unique_lock lock(state->mutex);
    while (true) {
        state->workCame.wait(lock, [&] { return state->stopping || !state->waiting.empty(); });
        if (state->waiting.empty()) break;
        const std::string line = std::move(state->waiting.front());
        state->waiting.pop_front();
        lock.unlock();
        if (state->beforeEachWrite) state->beforeEachWrite();
        const bool written = append(state->path, state->maximumBytes, line);
        lock.lock();
        if (!written) ++state->lost;
        --state->unwritten;
        state->workDone.notify_all();
    }
    state->running = false;
    state->workDone.notify_all();
}

}  // namespace lumacast
