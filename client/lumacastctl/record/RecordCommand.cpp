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
#include "client/lumacastctl/Text.h"
#include "linux/admin/LinuxAdminService.h"
#include "linux/calls/FolderSync.h"
#include "linux/system/FileDescriptor.h"

namespace lumacast::ctl {

namespace {

using std::chrono::milliseconds;
using Clock = std::chrono::steady_clock;

constexpr milliseconds kLook{100};
constexpr milliseconds kLine{500};
constexpr milliseconds kStopPatience{60'000};
constexpr milliseconds kFarewell{300};
constexpr milliseconds kInsistence{3000};
constexpr char kClearLine[] = "\r\033[K";

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
    const FileDescriptor copy(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    if (!copy || ::fsync(copy.get()) != 0) return errno;
    const std::string around = std::filesystem::path(path).parent_path().string();
    const FileDescriptor folder(::open(around.empty() ? "." : around.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
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

int recordDisplay(const std::string& runtimeDirectory, const RecordRequest& request, Screen progress, std::FILE* out,
                  std::FILE* complaints, const std::function<bool(milliseconds)>& stopWished,
                  const std::function<int(const std::string&)>& save) {
    std::error_code failure;
    if (!request.output.empty() && std::filesystem::exists(std::filesystem::symlink_status(request.output, failure)))
        return notRecorded(complaints, request.output + " is there already.");
    const auto folder = std::filesystem::path(request.output).parent_path();
    if (!request.output.empty() && !std::filesystem::is_directory(folder, failure))
        return notRecorded(complaints, folder.string() + " is no folder.");
    const auto answers = std::make_shared<Answers>();
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
    client::Recorder recorder(std::move(events), runtimeDirectory);

    if (request.broadcast)
        if (const auto error = recorder.setUpBroadcastAndWait(*request.broadcast))
            return notRecorded(complaints, client::textOf(*error) +
                                               "\n`lumacastctl extensions` shows the upload extensions.");
    client::StartOptions options;
    options.broadcast = request.broadcast.has_value();
    options.size = request.size;
    options.microphone = request.microphone;
    options.systemRecording = true;
    const auto ask = [&] {
        answers->change([](Answers::Known& known) { known.start.reset(); });
        recorder.start(options, [answers](client::StartAnswer answer) {
            answers->change([&](Answers::Known& known) { known.start = std::move(answer); });
        });
    };
    ask();
    LiveLine line(progress, complaints);
    line.show("The user may be asked first…");
    const auto asked = Clock::now();
    // A busy display does not say in time who is in front: then one asks again.
    const auto isToBeAskedAgain = [&](const client::StartAnswer& answer) {
        return answer.error && client::recordingCodeOf(*answer.error) == RecordingErrorCode::FailedToStart &&
               Clock::now() - asked < kInsistence;
    };
    while (true) {
        const auto answer = answers->known().start;
        if (answer && !isToBeAskedAgain(*answer)) break;
        if (stopWished(kLook)) {
            takeBack(recorder, answers);
            return notRecorded(complaints, "it was stopped before it began.");
        }
        if (answer) ask();
    }
    line.clear();
    if (const auto error = answers->known().start.value_or(client::StartAnswer{}).error) {
        const auto code = client::recordingCodeOf(*error);
        return notRecorded(complaints, client::textOf(*error) +
                                           (code == RecordingErrorCode::Entitlements
                                                ? "\n`lumacastctl doctor` says who is, and how to change that."
                                                : ""));
    }

    // However it ends, the tool is in front no longer then, and some time later the user is asked again.
    struct InFront {
        client::Recorder& recorder;
        ~InFront() { recorder.didResignActive(); }
    };
    const InFront inFront{recorder};
    const auto begun = Clock::now();
    auto nextLine = begun;
    bool isWished = false;
    std::string path;  ///< where the daemon writes it
    std::string viewURL;
    const auto printView = [&](const std::string& url) {
        if (url.empty() || std::exchange(viewURL, url) == url) return;
        line.clear();
        std::fprintf(out, "%s\n", printable(url).c_str());
        std::fflush(out);
    };
    while (!isWished) {
        const auto known = answers->known();
        printView(known.viewURL);
        if (known.hasStopped || known.isDisconnected) break;
        const auto now = Clock::now();
        if (request.duration.count() > 0 && now - begun >= request.duration) break;
        if (now >= nextLine) {
            nextLine = now + kLine;
            const auto answer = askAdminService(runtimeDirectory + "/admin.sock", "status", kLine);
            const auto status = answer ? readStatus(*answer) : std::variant<DaemonStatus, std::string>("");
            if (const auto* daemon = std::get_if<DaemonStatus>(&status))
                if (const auto recording = displayRecording(*daemon)) {
                    path = recording->path.value_or(path);
                    line.show(recordLine(*recording) + "   (q or Ctrl-C stops)");
                }
        }
        auto wait = kLook;
        if (request.duration.count() > 0)
            wait = std::min(wait, std::chrono::ceil<milliseconds>(request.duration - (now - begun)));
        isWished = stopWished(std::max(wait, milliseconds(0)));
    }
    line.clear();

    auto known = answers->known();
    if (known.isDisconnected)
        return complain(complaints, "the connection to the daemon was lost; the recording may go on. " + whereItIs(path));
    if (known.hasStopped) {
        complain(complaints, "the recording was ended by the daemon: " +
                                 printable(known.stopError ? client::textOf(*known.stopError) : "no reason given") +
                                 "\n" + whereItIs(path));
        if (known.stopMovie) std::fprintf(out, "%s\n", known.stopMovie->path().c_str());
        return kNotRecorded;
    }
    recorder.stop([answers](client::StopAnswer answer) {
        answers->change([&](Answers::Known& changed) { changed.stop = std::move(answer); });
    });
    const auto stopped = Clock::now();
    while (!(known = answers->known()).stop && !known.hasStopped && !known.isDisconnected &&
           Clock::now() - stopped < kStopPatience)
        stopWished(milliseconds(10));
    printView(known.viewURL);
    if (request.broadcast && known.stop && !known.stop->error) return kGood;
    if (!known.stop || !known.stop->movie) {
        const std::string reason = known.stop && known.stop->error ? client::textOf(*known.stop->error)
                                   : known.stopError               ? client::textOf(*known.stopError)
                                                                   : "the daemon does not answer.";
        return notRecorded(complaints, reason);
    }
    const std::string movie = known.stop->movie->path();
    if (request.output.empty()) return save(movie);
    if (const auto reason = moveMovie(movie, request.output)) {
        complain(complaints, "the movie can't be moved to " + printable(request.output) + ": " + *reason + "\nIt is " +
                                 printable(movie));
        return kNotSaved;
    }
    std::fprintf(out, "%s\n", request.output.c_str());
    return kGood;
}

}  // namespace lumacast::ctl
