#include "client/lumacastctl/record/RecordCommand.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <memory>
#include <mutex>
#include <thread>
#include <utility>

#include "client/Recorder.h"
#include "client/lumacastctl/AskDaemon.h"
#include "client/lumacastctl/ExitStatus.h"
#include "client/lumacastctl/Form.h"
#include "client/lumacastctl/Text.h"
#include "linux/admin/LinuxAdminService.h"
#include "linux/calls/FolderSync.h"
#include "linux/ipc/Fd.h"

namespace lumacast::ctl {

namespace {

using std::chrono::milliseconds;
using Clock = std::chrono::steady_clock;

constexpr milliseconds kLook{100};
constexpr milliseconds kLine{500};
constexpr milliseconds kStopPatience{60'000};
constexpr milliseconds kFarewell{300};
constexpr milliseconds kInsistence{3000};

/// What the daemon answers and tells, from the recorder's thread.
class Answers {
public:
    struct Known {
        std::optional<client::StartAnswer> start;
        std::optional<client::StopAnswer> stop;
        bool hasStopped = false;  ///< by itself
        std::optional<Error> stopError;
        std::optional<URL> stopMovie;
        bool isDisconnected = false;
        std::string viewURL;  ///< of a broadcast
    };
    Known known() const {
        const std::lock_guard lock(mutex_);
        return known_;
    }
    void change(const std::function<void(Known&)>& change) {
        const std::lock_guard lock(mutex_);
        change(known_);
    }

private:
    mutable std::mutex mutex_;
    Known known_;
};

int notRecorded(std::FILE* complaints, const std::string& reason) {
    complain(complaints, "the display is not recorded: " + printable(reason));
    return kNotRecorded;
}

std::string whereItIs(const std::string& path) {
    if (path.empty()) return "What was recorded is in the daemon's folder; see `lumacastctl storage`.";
    return "What was recorded was written to " + printable(path) + ", or is in the Videos folder.";
}

/// Ends a start that has not been answered. It may begin at this moment, and would go on without anybody: then it is
/// stopped. A question that stands dies with the connection.
void takeBack(client::Recorder& recorder, const std::shared_ptr<Answers>& answers) {
    const auto wished = Clock::now();
    bool isStopped = false;
    while (true) {
        const auto known = answers->known();
        const bool hasBegun = known.start && !known.start->error;
        if (known.stop || (known.start && known.start->error)) return;
        if (hasBegun && !std::exchange(isStopped, true))
            recorder.stop([answers](client::StopAnswer answer) {
                answers->change([&](Answers::Known& changed) { changed.stop = std::move(answer); });
            });
        if (Clock::now() - wished >= (hasBegun ? kStopPatience : kFarewell)) return;
        std::this_thread::sleep_for(kLook / 10);
    }
}

/// The line that changes. Elsewhere than on a terminal it is not shown.
class LiveLine final {
public:
    LiveLine(Screen screen, std::FILE* to) : screen_(screen), to_(to) {}
    ~LiveLine() { clear(); }
    void show(const std::string& text) {
        if (screen_ != Screen::Terminal) return;
        std::fprintf(to_, "%s%s\r", kClearLine, text.c_str());
        std::fflush(to_);
        isShown_ = true;
    }
    void clear() {
        if (std::exchange(isShown_, false)) std::fputs(kClearLine, to_);
    }

private:
    const Screen screen_;
    std::FILE* const to_;
    bool isShown_ = false;
};

}  // namespace

std::string viewURLIn(const Value& serviceInfo) {
    const Dictionary* info = serviceInfo.as<Dictionary>();
    const Value* url = info ? info->find("viewURL") : nullptr;
    if (const URL* address = url ? url->as<URL>() : nullptr) return address->text();
    const std::string* text = url ? url->as<std::string>() : nullptr;
    return text ? *text : std::string();
}

std::optional<RunningRecording> displayRecording(const DaemonStatus& status) {
    for (const ApplicationSession& session : status.sessions)
        if (session.wholeDisplay && session.recording) return session.recording;
    return std::nullopt;
}

std::string recordLine(const RunningRecording& recording) {
    std::string line = durationText(recording.elapsedSeconds);
    if (recording.bytes) line += "   " + bytesText(*recording.bytes);
    if (const auto frames = recording.recorded ? recording.recorded : recording.frames)
        line += "   " + std::to_string(*frames) + " frames";
    if (recording.dropped.value_or(0) > 0) line += " (" + std::to_string(*recording.dropped) + " dropped)";
    return line;
}

namespace {

/// Brings the copy onto the disk, its bytes and its name: the other one may go then. 0 or the error number.
int syncCopy(const std::string& path) {
    const Fd copy(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    if (!copy || ::fsync(copy.get()) != 0) return errno;
    const std::string around = std::filesystem::path(path).parent_path().string();
    const Fd folder(::open(around.empty() ? "." : around.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    return folder ? syncFolder(folder.get()) : errno;
}

}  // namespace

std::optional<std::string> moveMovie(const std::string& from, const std::string& to) {
    if (::renameat2(AT_FDCWD, from.c_str(), AT_FDCWD, to.c_str(), RENAME_NOREPLACE) == 0) return std::nullopt;
    if (errno != EXDEV && errno != EINVAL) return std::string(std::strerror(errno));
    std::error_code failure;
    // Without an option it copies over nothing.
    if (!std::filesystem::copy_file(from, to, failure)) {
        const std::string reason = failure ? failure.message() : "there is a file already";
        if (failure != std::errc::file_exists) std::filesystem::remove(to, failure);
        return reason;
    }
    if (const int error = syncCopy(to); error != 0) {
        std::filesystem::remove(to, failure);
        return std::string(std::strerror(error));
    }
    std::filesystem::remove(from, failure);
    return std::nullopt;
}

namespace {

/// None when a movie can go there; else why it can't, for people.
std::optional<std::string> whyNoPlace(const std::string& output) {
    if (output.empty()) return std::nullopt;
    std::error_code failure;
    if (std::filesystem::exists(std::filesystem::symlink_status(output, failure))) return output + " is there already.";
    const auto folder = std::filesystem::path(output).parent_path();
    if (!std::filesystem::is_directory(folder, failure)) return folder.string() + " is no folder.";
    return std::nullopt;
}

/// What the daemon tells by itself, put down in `answers`.
client::Events eventsTo(const std::shared_ptr<Answers>& answers) {
    client::Events events;
    events.stopped = [answers](std::optional<Error> error, std::optional<URL> movie) {
        answers->change([&](Answers::Known& known) {
            known.hasStopped = true;
            known.stopError = std::move(error);
            known.stopMovie = std::move(movie);
        });
    };
    events.disconnected = [answers] { answers->change([](Answers::Known& known) { known.isDisconnected = true; }); };
    const auto tellView = [answers](const std::string& url) {
        if (!url.empty()) answers->change([&](Answers::Known& known) { known.viewURL = url; });
    };
    events.broadcastURL = [tellView](std::optional<URL> url) { tellView(url ? url->text() : std::string()); };
    events.broadcastServiceInfo = [tellView](const Value& info) { tellView(viewURLIn(info)); };
    return events;
}

/// One recording of the display: begin, then follow, then end. Each of the first two answers none when it goes on, else
/// the process's exit status, and has said why.
class DisplayRecording final {
public:
    DisplayRecording(const std::string& runtimeDirectory, const RecordRequest& request, Screen progress, std::FILE* out,
                     std::FILE* complaints, const std::function<bool(milliseconds)>& stopWished)
        : runtimeDirectory_(runtimeDirectory),
          request_(request),
          out_(out),
          complaints_(complaints),
          stopWished_(stopWished),
          recorder_(eventsTo(answers_), runtimeDirectory),
          line_(progress, complaints) {}
    /// However it ends, the tool is in front no longer then, and some time later the user is asked again.
    ~DisplayRecording() {
        if (hasBegun_) recorder_.didResignActive();
    }
    DisplayRecording(const DisplayRecording&) = delete;
    DisplayRecording& operator=(const DisplayRecording&) = delete;

    /// Has the daemon record; waits for its answer, or for the wish to stop.
    std::optional<int> begin();
    /// Shows how far it is until it is to end, or has ended.
    std::optional<int> follow();
    /// Stops it and brings the movie where it is to be.
    int end(const std::function<int(const std::string&)>& save);

private:
    void askToStart();
    void askToStop();
    bool isToBeAskedAgain(const client::StartAnswer& answer, Clock::time_point asked) const;
    int refused(const Error& error) const;
    void showProgress();
    void printView(const std::string& url);
    int endedByDaemon(const Answers::Known& known) const;
    int deliver(const std::string& movie, const std::function<int(const std::string&)>& save) const;

    const std::string& runtimeDirectory_;
    const RecordRequest& request_;
    std::FILE* const out_;
    std::FILE* const complaints_;
    const std::function<bool(milliseconds)>& stopWished_;
    const std::shared_ptr<Answers> answers_ = std::make_shared<Answers>();
    client::Recorder recorder_;
    LiveLine line_;
    bool hasBegun_ = false;
    std::string path_;     ///< where the daemon writes it
    std::string viewURL_;  ///< the one printed last
};

std::optional<int> DisplayRecording::begin() {
    if (request_.broadcast)
        if (const auto error = recorder_.setUpBroadcastAndWait(*request_.broadcast))
            return notRecorded(complaints_, client::textOf(*error) +
                                                "\n`lumacastctl extensions` shows the upload extensions.");
    askToStart();
    line_.show("The user may be asked first…");
    const auto asked = Clock::now();
    while (true) {
        const auto answer = answers_->known().start;
        if (answer && !isToBeAskedAgain(*answer, asked)) break;
        if (stopWished_(kLook)) {
            takeBack(recorder_, answers_);
            return notRecorded(complaints_, "it was stopped before it began.");
        }
        if (answer) askToStart();
    }
    line_.clear();
    if (const auto error = answers_->known().start.value_or(client::StartAnswer{}).error) return refused(*error);
    hasBegun_ = true;
    return std::nullopt;
}

void DisplayRecording::askToStart() {
    client::StartOptions options;
    options.broadcast = request_.broadcast.has_value();
    options.size = request_.size;
    options.microphone = request_.microphone;
    options.systemRecording = true;
    answers_->change([](Answers::Known& known) { known.start.reset(); });
    recorder_.start(options, [answers = answers_](client::StartAnswer answer) {
        answers->change([&](Answers::Known& known) { known.start = std::move(answer); });
    });
}

/// A busy display does not say in time who is in front: then one asks again.
bool DisplayRecording::isToBeAskedAgain(const client::StartAnswer& answer, Clock::time_point asked) const {
    return answer.error && client::recordingCodeOf(*answer.error) == RecordingErrorCode::FailedToStart &&
           Clock::now() - asked < kInsistence;
}

int DisplayRecording::refused(const Error& error) const {
    const bool mayNot = client::recordingCodeOf(error) == RecordingErrorCode::Entitlements;
    return notRecorded(complaints_, client::textOf(error) +
                                        (mayNot ? "\n`lumacastctl doctor` says who is, and how to change that." : ""));
}

std::optional<int> DisplayRecording::follow() {
    const auto begun = Clock::now();
    auto nextLine = begun;
    bool isWished = false;
    while (!isWished) {
        const auto known = answers_->known();
        printView(known.viewURL);
        if (known.hasStopped || known.isDisconnected) break;
        const auto now = Clock::now();
        if (request_.duration.count() > 0 && now - begun >= request_.duration) break;
        if (now >= nextLine) {
            nextLine = now + kLine;
            showProgress();
        }
        auto wait = kLook;
        if (request_.duration.count() > 0)
            wait = std::min(wait, std::chrono::ceil<milliseconds>(request_.duration - (now - begun)));
        isWished = stopWished_(std::max(wait, milliseconds(0)));
    }
    line_.clear();
    const auto known = answers_->known();
    if (known.isDisconnected)
        return complain(complaints_,
                        "the connection to the daemon was lost; the recording may go on. " + whereItIs(path_));
    if (known.hasStopped) return endedByDaemon(known);
    return std::nullopt;
}

void DisplayRecording::showProgress() {
    const auto answer = askAdminService(runtimeDirectory_ + "/admin.sock", "status", kLine);
    const auto status = answer ? readStatus(*answer) : std::variant<DaemonStatus, std::string>("");
    const auto* daemon = std::get_if<DaemonStatus>(&status);
    const auto recording = daemon ? displayRecording(*daemon) : std::nullopt;
    if (!recording) return;
    path_ = recording->path.value_or(path_);
    line_.show(recordLine(*recording) + "   (q or Ctrl-C stops)");
}

void DisplayRecording::printView(const std::string& url) {
    if (url.empty() || std::exchange(viewURL_, url) == url) return;
    line_.clear();
    std::fprintf(out_, "%s\n", printable(url).c_str());
    std::fflush(out_);
}

int DisplayRecording::endedByDaemon(const Answers::Known& known) const {
    complain(complaints_, "the recording was ended by the daemon: " +
                              printable(known.stopError ? client::textOf(*known.stopError) : "no reason given") + "\n" +
                              whereItIs(path_));
    if (known.stopMovie) std::fprintf(out_, "%s\n", known.stopMovie->path().c_str());
    return kNotRecorded;
}

void DisplayRecording::askToStop() {
    recorder_.stop([answers = answers_](client::StopAnswer answer) {
        answers->change([&](Answers::Known& changed) { changed.stop = std::move(answer); });
    });
}

int DisplayRecording::end(const std::function<int(const std::string&)>& save) {
    askToStop();
    const auto asked = Clock::now();
    Answers::Known known;
    while (!(known = answers_->known()).stop && !known.hasStopped && !known.isDisconnected &&
           Clock::now() - asked < kStopPatience)
        stopWished_(milliseconds(10));
    printView(known.viewURL);
    if (request_.broadcast && known.stop && !known.stop->error) return kGood;
    if (known.stop && known.stop->movie) return deliver(known.stop->movie->path(), save);
    const std::string reason = known.stop && known.stop->error ? client::textOf(*known.stop->error)
                               : known.stopError               ? client::textOf(*known.stopError)
                                                               : "the daemon does not answer.";
    return notRecorded(complaints_, reason);
}

int DisplayRecording::deliver(const std::string& movie, const std::function<int(const std::string&)>& save) const {
    if (request_.output.empty()) return save(movie);
    if (const auto reason = moveMovie(movie, request_.output)) {
        complain(complaints_, "the movie can't be moved to " + printable(request_.output) + ": " + *reason +
                                  "\nIt is " + printable(movie));
        return kNotSaved;
    }
    std::fprintf(out_, "%s\n", request_.output.c_str());
    return kGood;
}

}  // namespace

int recordDisplay(const std::string& runtimeDirectory, const RecordRequest& request, Screen progress, std::FILE* out,
                  std::FILE* complaints, const std::function<bool(milliseconds)>& stopWished,
                  const std::function<int(const std::string&)>& save) {
    if (const auto reason = whyNoPlace(request.output)) return notRecorded(complaints, *reason);
    DisplayRecording recording(runtimeDirectory, request, progress, out, complaints, stopWished);
    if (const auto status = recording.begin()) return *status;
    if (const auto status = recording.follow()) return *status;
    return recording.end(save);
}

}  // namespace lumacast::ctl
