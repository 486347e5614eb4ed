// Presses a button of the daemon's dialog, as a user would, or says which window it is.

#include <cstdio>
#include <cstdlib>
#include <optional>
#include <string>
#include <string_view>

#include "tests/dialog/DialogUser.h"

namespace {

using lumacast::test::DialogUser;

int usage() {
    std::fprintf(stderr,
                 "usage: click_button default|alternate|other [--display :7] [--pid PID] [--wait SECONDS]\n"
                 "       click_button window [the same]\n");
    return 2;
}

std::optional<DialogUser::Button> buttonNamed(std::string_view name) {
    if (name == "default") return DialogUser::Button::Default;
    if (name == "alternate") return DialogUser::Button::Alternate;
    if (name == "other") return DialogUser::Button::Other;
    return std::nullopt;
}

}  // namespace

int main(int count, char** words) {
    const auto button = count > 1 ? buttonNamed(words[1]) : std::nullopt;
    const bool onlyLook = count > 1 && std::string_view(words[1]) == "window";
    if ((!button && !onlyLook) || count % 2 != 0) return usage();
    const char* const variable = std::getenv("DISPLAY");
    std::string display = variable != nullptr ? variable : "";
    std::optional<pid_t> pid;
    int seconds = 30;
    for (int i = 2; i < count; i += 2) {
        const std::string_view option = words[i];
        if (option == "--display")
            display = words[i + 1];
        else if (option == "--pid")
            pid = std::atoi(words[i + 1]);
        else if (option == "--wait")
            seconds = std::atoi(words[i + 1]);
        else
            return usage();
    }
    DialogUser user(display);
    if (!user.works()) {
        std::fprintf(stderr, "click_button: there is no display %s\n", display.c_str());
        return 1;
    }
    if (onlyLook) {
        const auto dialog = user.waitForDialog(pid, std::chrono::seconds(seconds));
        if (dialog) std::printf("0x%x\n", dialog->window);
        return dialog ? 0 : 1;
    }
    if (user.answer(*button, pid, std::chrono::seconds(seconds))) return 0;
    std::fprintf(stderr, "click_button: no dialog with such a button, or it stayed\n");
    return 1;
}
