#include "tests/contract/XClientProcess.h"

#include <sys/prctl.h>
#include <xcb/xcb.h>

#include <cstdio>
#include <cstdlib>

namespace lumacast::test {
namespace {

constexpr const char* kVariable = "LC_TEST_X_CLIENT";

// The other process: this same program, which does this before anything else when the variable is set.

// Ends when its parent ends, which it may have done already.
void dieWith(pid_t parent) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    if (::getppid() != parent) ::_exit(1);
}

[[noreturn]] void serve(const char* display, int report, pid_t test) {
    dieWith(test);
    const pid_t self = ::getpid();
    const pid_t tool = ::fork();
    if (tool == 0) {
        dieWith(self);
        while (true) ::pause();
    }
    xcb_connection_t* const x = xcb_connect(display, nullptr);
    if (xcb_connection_has_error(x) != 0) ::_exit(1);
    const xcb_screen_t* const screen = xcb_setup_roots_iterator(xcb_get_setup(x)).data;
    const xcb_window_t window = xcb_generate_id(x);
    xcb_create_window(x, XCB_COPY_FROM_PARENT, window, screen->root, 0, 0, 200, 150, 0, XCB_WINDOW_CLASS_INPUT_OUTPUT,
                      XCB_COPY_FROM_PARENT, 0, nullptr);
    xcb_map_window(x, window);
    std::free(xcb_get_input_focus_reply(x, xcb_get_input_focus(x), nullptr));
    char text[64];
    const int length = std::snprintf(text, sizeof text, "%u %d\n", window, tool);
    if (::write(report, text, static_cast<std::size_t>(length)) != length) ::_exit(1);
    while (xcb_generic_event_t* const event = xcb_wait_for_event(x)) std::free(event);
    ::_exit(0);
}

const struct Early {
    Early() {
        const char* const text = std::getenv(kVariable);
        if (text == nullptr) return;
        int report = -1, test = 0;
        char display[64] = "";
        // Never the tests themselves.
        if (std::sscanf(text, "%d %d %63s", &report, &test, display) != 3) ::_exit(1);
        serve(display, report, test);
    }
} early;

}  // namespace

XClientProcess::XClientProcess(const std::string& display) {
    int ends[2] = {-1, -1};
    if (::pipe2(ends, O_CLOEXEC) != 0) return;
    const Fd read(ends[0]);
    Fd write(ends[1]);
    process_ = std::make_unique<ChildProcess>(
        std::vector<std::string>{"/proc/self/exe"}, write.get(),
        std::vector<std::string>{std::string(kVariable) + "=" + std::to_string(write.get()) + " " +
                                 std::to_string(::getpid()) + " " + display});
    write.reset();
    std::string line;
    char letter = 0;
    while (::read(read.get(), &letter, 1) == 1 && letter != '\n') line += letter;
    unsigned window = 0;
    int tool = 0;
    if (std::sscanf(line.c_str(), "%u %d", &window, &tool) != 2) return;
    window_ = ContextID{window};
    tool_ = ProcessID{tool};
}

}  // namespace lumacast::test
