#pragma once
#include <chrono>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "linux/desktop/DialogProgram.h"
#include "platform/UserAlert.h"

namespace lumacast {

/// Alerts as windows of the desktop's dialog program, yad or zenity, in a process of their own. Only the press of a
/// granting button grants: whatever else ends the dialog, or keeps it from being seen, is the other button. Callable
/// from any lane; each alert has a thread of its own, on which its handler is called.
class LinuxUserAlerts final : public UserAlerts {
public:
    /// The icon of an application: a name of the icon theme or an absolute path; none when it has none. Called by
    /// `show`.
    using IconLookup = std::function<std::optional<std::string>(const BundleIdentifier&)>;

    struct Options {
        std::string display;                   ///< as in $DISPLAY
        std::vector<std::string> searchPath;   ///< where the programs are looked for, at each alert
        std::string styleDirectory;            ///< of this user alone; made when it isn't there
        std::vector<std::string> environment;  ///< what the program gets, see dialogEnvironment
        ProgramOwner programOwner = ProgramOwner::Administrator;
        /// A grant that comes sooner after the dialog's window than this was meant for something else: the user is
        /// asked again.
        std::chrono::milliseconds tooSoon{500};
        /// How long the display may take to answer, and the program to show its window.
        std::chrono::milliseconds displayPatience{5'000}, windowPatience{20'000};
        /// How long the session bus may take to let the dialog in; a dialog without one is none to screen readers.
        std::chrono::milliseconds busPatience{1'000};
        IconLookup icon;
        /// Told why an alert could not be shown, from any thread.
        std::function<void(std::string_view reason)> explain;
        /// Told what else is worth a line of the log.
        std::function<void(std::string_view what)> note;
    };

    explicit LinuxUserAlerts(Options options);
    /// Null when there is no dialog program, no display of this machine, or no buttons that can be told apart. Waits
    /// for the display and the session bus, not for the program.
    std::shared_ptr<UserAlert> show(const AlertContent& content) override;

private:
    const Options options_;
};

/// What a dialog needs of this process's environment: display, home, path and directories; the session bus for screen
/// readers where there is one, and nothing that would start one. Never the locale: the texts are the user's language
/// already, and in one that isn't installed, or isn't UTF-8, the program would refuse them.
std::vector<std::string> dialogEnvironment(const char* const* variables, const std::string& display);

}  // namespace lumacast
