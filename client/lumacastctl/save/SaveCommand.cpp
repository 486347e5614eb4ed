#include "client/lumacastctl/save/SaveCommand.h"

#include <filesystem>
#include <optional>

#include "client/lumacastctl/AskDaemon.h"
#include "client/lumacastctl/ExitStatus.h"
#include "client/lumacastctl/Text.h"
#include "client/lumacastctl/save/Save.h"
#include "linux/system/Json.h"

namespace lumacast::ctl {

namespace {

/// Back to the line's beginning, and clear to its end (ECMA-48 EL).

/// Shows how far a save is, and never the same twice. On a terminal the cursor stays at the beginning of its line: a
/// complaint takes its place.
class ProgressLine final {
public:
    ProgressLine(Form form, Screen screen, std::FILE* out, std::FILE* progress)
        : form_(form), screen_(screen), out_(out), progress_(progress) {}

    /// False when the output can't be written.
    bool show(const SaveProgress& progress) {
        if (form_ == Form::Json) {
            std::string line = jsonText(progress.entry) + "\n";
            if (line == last_) return true;
            last_ = std::move(line);
            return std::fputs(last_.c_str(), out_) >= 0 && std::fflush(out_) == 0;
        }
        const bool isOver = progress.state == SaveState::Saved || progress.state == SaveState::Failed;
        if (isOver) {
            clear();
            return true;
        }
        std::string line = screen_ == Screen::Terminal ? kClearLine + progressBar(progress) + "\r"
                                                         : plainLine(progress);
        if (line == last_) return true;
        last_ = std::move(line);
        std::fputs(last_.c_str(), progress_);  // who doesn't see the progress still gets the movie
        std::fflush(progress_);
        return true;
    }
    /// Before anything else is written.
    void clear() {
        if (form_ == Form::Json || screen_ != Screen::Terminal || last_.empty()) return;
        std::fputs(kClearLine, progress_);
        last_.clear();
    }

private:
    static std::string plainLine(const SaveProgress& progress) {
        if (progress.state == SaveState::Adding) return "copying to the library\n";
        return "mixing: " + std::to_string(static_cast<int>(progress.part * 10) * 10) + " %\n";
    }

    const Form form_;
    const Screen screen_;
    std::FILE* const out_;
    std::FILE* const progress_;
    std::string last_;
};

int notSaved(std::FILE* complaints, const std::string& path, const std::string& reason) {
    complain(complaints, printable(path) + " is not saved: " + printable(reason));
    return kNotSaved;
}

}  // namespace

std::string moviePath(const std::string& named) {
    std::error_code failure;
    const std::filesystem::path path = std::filesystem::absolute(named, failure);
    if (failure) return named;
    const std::filesystem::path folder = std::filesystem::canonical(path.parent_path(), failure);
    return failure ? path.string() : (folder / path.filename()).string();
}

int saveMovie(const std::string& runtimeDirectory, const std::string& path, Form form, Screen screen, std::FILE* out,
              std::FILE* complaints, const std::function<void()>& begun, const std::function<bool()>& nextRound,
              std::chrono::milliseconds limit) {
    std::error_code failure;
    if (!std::filesystem::exists(std::filesystem::symlink_status(path, failure)))
        return notSaved(complaints, path, failure ? failure.message() : "there is no such file.");
    const auto taken = askDaemon(runtimeDirectory, "save " + fileURL(path), complaints, limit);
    if (!taken) return kNoAnswer;
    const auto number = readSaveNumber(*taken);
    if (const auto* reason = std::get_if<std::string>(&number)) return notSaved(complaints, path, *reason);
    begun();

    ProgressLine line(form, screen, out, complaints);
    while (true) {
        const auto answer = askDaemon(runtimeDirectory, "saves", complaints, limit);
        if (!answer) return kNoAnswer;
        const auto read = readSaveProgress(*answer, std::get<std::uint64_t>(number));
        if (const auto* reason = std::get_if<std::string>(&read)) {
            line.clear();
            return complain(complaints, "the daemon can't say how far the save is: " + printable(*reason));
        }
        if (const auto* progress = std::get_if<SaveProgress>(&read)) {
            if (!line.show(*progress)) return kNoAnswer;  // who called says so
            if (progress->state == SaveState::Failed)
                return notSaved(complaints, path,
                                progress->error.empty() ? "the daemon doesn't say why." : progress->error);
            if (progress->state == SaveState::Saved) {
                if (form == Form::Text) std::fprintf(out, "%s\n", progress->savedAs.c_str());
                return kGood;
            }
        }
        if (!nextRound()) return kLeftToTheDaemon;
    }
}

}  // namespace lumacast::ctl
