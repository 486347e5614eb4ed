#pragma once
// Real dialogs on a display of the test's own.

#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "linux/desktop/LinuxUserAlerts.h"
#include "tests/contract/Eventually.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/dialog/DialogUser.h"

namespace lumacast::test {

/// Takes an alert's answer. Thread-safe; may end before the alert does.
class Answer final {
public:
    using Response = UserAlert::Response;

    std::function<void(Response)> handler() const {
        return [state = state_](Response response) {
            const std::lock_guard lock(state->mutex);
            state->responses.push_back(response);
            state->lane = std::this_thread::get_id();
            state->changed.notify_all();
        };
    }
    /// The answer, waiting for it; none when it doesn't come.
    std::optional<Response> wait(std::chrono::seconds limit = std::chrono::seconds(30)) const {
        std::unique_lock lock(state_->mutex);
        state_->changed.wait_for(lock, limit, [this] { return !state_->responses.empty(); });
        return state_->responses.empty() ? std::nullopt : std::optional(state_->responses.front());
    }
    std::size_t count() const {
        const std::lock_guard lock(state_->mutex);
        return state_->responses.size();
    }
    std::thread::id lane() const {
        const std::lock_guard lock(state_->mutex);
        return state_->lane;
    }
    /// Whether nobody holds the handler any more.
    bool handlerIsGone() const { return state_.use_count() == 1; }

private:
    struct State {
        std::mutex mutex;
        std::condition_variable changed;
        std::vector<Response> responses;
        std::thread::id lane;
    };
    std::shared_ptr<State> state_ = std::make_shared<State>();
};

inline AlertContent twoButtons() {
    return {.application = BundleIdentifier("org.example.Player"),
            .header = "Allow “Player” to record the screen?",
            .message = "The recording shows everything this application displays.",
            .defaultButton = "Record Screen",
            .alternateButton = std::nullopt,
            .otherButton = "Don’t Allow",
            .localizationURL = std::nullopt};
}

inline AlertContent threeButtons() {
    AlertContent content = twoButtons();
    content.defaultButton = "Don’t Allow";
    content.alternateButton = "Record Screen and Microphone";
    content.otherButton = "Record Screen Only";
    return content;
}

/// A display, a program for dialogs, and a user who is quick: what is pressed at once counts.
class DialogWorld final {
public:
    /// `program` is "yad" or "zenity"; none for neither.
    explicit DialogWorld(const std::string& program = "yad", const std::vector<std::string>& displayOptions = {})
        : display_("1280x800x24", {}, displayOptions) {
        options_.display = display_.name();
        options_.searchPath = {scratch_.makeDirectory("bin")};
        options_.styleDirectory = scratch_.path("style");
        options_.tooSoon = std::chrono::milliseconds(0);
        const std::string home = "HOME=" + scratch_.makeDirectory("home");
        const std::string runtime = "XDG_RUNTIME_DIR=" + scratch_.makeDirectory("run");
        const char* const variables[] = {home.c_str(), runtime.c_str(), "PATH=/usr/bin:/bin", "LANG=xx_XX", "LC_ALL=C",
                                         "SECRET=1",   nullptr};
        options_.environment = dialogEnvironment(variables, display_.name());
        if (!program.empty()) std::filesystem::create_symlink("/usr/bin/" + program, scratch_.path("bin/" + program));
    }

    PrivateDisplay& display() { return display_; }
    const ScratchDirectory& scratch() const { return scratch_; }
    /// To be changed before the first alert.
    LinuxUserAlerts::Options& options() { return options_; }
    /// A program of the test's own in the place of yad.
    void usePlayedProgram(const std::string& script) {
        std::filesystem::remove(scratch_.path("bin/yad"));
        const std::string path = scratch_.write("bin/yad", "#!/bin/sh\n" + script + "\n");
        std::filesystem::permissions(path, std::filesystem::perms::owner_all);
        options_.programOwner = ProgramOwner::Anybody;
    }
    LinuxUserAlerts& alerts() {
        if (!alerts_) alerts_ = std::make_unique<LinuxUserAlerts>(options_);
        return *alerts_;
    }
    DialogUser& user() {
        if (!user_) user_ = std::make_unique<DialogUser>(display_.name());
        return *user_;
    }

private:
    const ScratchDirectory scratch_;
    PrivateDisplay display_;
    LinuxUserAlerts::Options options_;
    std::unique_ptr<LinuxUserAlerts> alerts_;
    std::unique_ptr<DialogUser> user_;
};

}  // namespace lumacast::test
