#include "linux/system/LinuxTelemetry.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <condition_variable>
#include <deque>
#include <filesystem>
#include <mutex>
#include <sstream>
#include <system_error>
#include <thread>

#include "linux/calls/FileCalls.h"
#include "linux/ipc/Fd.h"
#include "linux/system/Json.h"
#include "linux/system/LinuxClock.h"
#include "linux/system/LinuxEnvironment.h"
#include "linux/system/SmallFile.h"
#include "linux/system/SystemError.h"
#include "linux/system/Threads.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumWaiting = 64;
constexpr std::size_t kMaximumReads = 8;
constexpr std::size_t kMaximumDepth = 8;  // far below what whoever reads an answer with all lines takes
constexpr std::chrono::seconds kFarewell{2};

/// Whether the file's last line has no end: the power went while it was written.
bool endsWithinLine(const Fd& file, const struct stat& status) {
    char last = '\n';
    return status.st_size > 0 && ::pread(file.get(), &last, 1, status.st_size - 1) == 1 && last != '\n';
}

/// Appends a line with one write, after making room. Whether all of it is in the file.
bool append(const std::string& path, std::uint64_t maximumBytes, std::string line) {
    const auto open = [&] {
        return Fd(
            calls::openAt(AT_FDCWD, path, O_RDWR | O_APPEND | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK, 0600));
    };
    Fd file = open();
    if (!file && errno == ENOENT) {
        if (makeDirectories(path.substr(0, path.rfind('/')))) return false;
        file = open();
    }
    struct stat status = {};
    if (!file || ::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) return false;
    if (status.st_size > 0 && static_cast<std::uint64_t>(status.st_size) + line.size() + 1 > maximumBytes) {
        if (calls::rename(AT_FDCWD, path, AT_FDCWD, path + ".1") != 0) return false;
        file = open();
        if (!file || ::fstat(file.get(), &status) != 0) return false;
    }
    if (endsWithinLine(file, status)) line.insert(line.begin(), '\n');
    if (calls::write(file.get(), line.data(), line.size()) == static_cast<ssize_t>(line.size())) return true;
    // Half a line would spoil the next one too. Only this thread appends, so the old end is still the end.
    (void)calls::truncate(file.get(), status.st_size);
    return false;
}

void readLines(const std::string& path, std::uint64_t maximumBytes, TelemetryHistory& history) {
    std::error_code unknown;
    if (!std::filesystem::exists(path, unknown)) return;
    const auto file = readSmallFile(path, maximumBytes);
    if (!file) {
        ++history.unreadableFiles;
        return;
    }
    std::istringstream lines(file->text);
    for (std::string line; std::getline(lines, line);) {
        auto event = valueFromJson(line, kMaximumDepth);
        if (event && event->as<Dictionary>())
            history.events.push_back(std::move(*event));
        else
            ++history.damagedLines;
    }
}

}  // namespace

struct LinuxTelemetry::State {
    /// A line to write, or where no line is, who wants to know what was written.
    struct Work {
        std::string line;
        HistoryHandler reader;
    };

    std::string path;
    std::uint64_t maximumBytes = 0;
    std::function<void()> beforeEachWrite;
    std::mutex mutex;
    std::condition_variable workCame;
    std::condition_variable workDone;
    std::deque<Work> waiting;
    std::size_t unwritten = 0;  ///< those waiting and the one being written
    std::size_t reads = 0;      ///< the same of those who want to know
    std::uint64_t lost = 0;
    bool stopping = false;
    bool running = false;  ///< the thread is made with the first work

    TelemetryHistory history(std::uint64_t lostEvents) const {
        TelemetryHistory result;
        result.lostEvents = lostEvents;
        readLines(path + ".1", maximumBytes, result);
        readLines(path, maximumBytes, result);
        return result;
    }
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
    if (!startLocked()) return systemError(EAGAIN);
    state_->waiting.push_back({std::move(line), {}});
    ++state_->unwritten;
    state_->workCame.notify_one();
    return std::nullopt;
}

bool LinuxTelemetry::readHistory(HistoryHandler handler) {
    const std::lock_guard lock(state_->mutex);
    if (state_->reads >= kMaximumReads || !startLocked()) return false;
    state_->waiting.push_back({{}, std::move(handler)});
    ++state_->reads;
    state_->workCame.notify_one();
    return true;
}

bool LinuxTelemetry::startLocked() {
    if (!state_->running) state_->running = startDetachedThread([state = state_] { work(state); });
    return state_->running;
}

bool LinuxTelemetry::flush(std::chrono::milliseconds limit) {
    std::unique_lock lock(state_->mutex);
    return state_->workDone.wait_for(lock, limit, [&] { return state_->unwritten == 0; });
}

std::uint64_t LinuxTelemetry::lostEvents() const {
    const std::lock_guard lock(state_->mutex);
    return state_->lost;
}

void LinuxTelemetry::work(const std::shared_ptr<State>& state) {
    std::unique_lock lock(state->mutex);
    while (true) {
        state->workCame.wait(lock, [&] { return state->stopping || !state->waiting.empty(); });
        if (state->waiting.empty()) break;
        State::Work work = std::move(state->waiting.front());
        state->waiting.pop_front();
        const std::uint64_t lost = state->lost;
        lock.unlock();
        if (state->beforeEachWrite) state->beforeEachWrite();
        const bool writes = !work.reader;
        bool done = true;
        if (writes)
            done = append(state->path, state->maximumBytes, std::move(work.line));
        else
            work.reader(state->history(lost));
        work = {};  // without the lock: it may hold the last reference to whoever asked
        lock.lock();
        if (!done) ++state->lost;
        --(writes ? state->unwritten : state->reads);
        state->workDone.notify_all();
    }
    state->running = false;
    state->workDone.notify_all();
}

}  // namespace lumacast
