#pragma once
#include <xcb/xcb.h>

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace lumacast::test {

/// Somebody who looks at a display and uses the dialogs of the daemon on it. Of one thread. Everything waits for the
/// display server.
class DialogUser final {
public:
    static constexpr xcb_keysym_t kReturn = 0xFF0D, kKeypadEnter = 0xFF8D, kEscape = 0xFF1B, kTab = 0xFF09,
                                  kSpace = 0x20;

    /// From the left, as they stand in the dialog.
    enum class Button { Other, Alternate, Default };
    struct Dialog {
        xcb_window_t window = XCB_NONE;
        pid_t pid = -1;
        int x = 0, y = 0, width = 0, height = 0;  ///< on the screen
    };
    struct Place {
        int x = 0, y = 0;  ///< of a button's middle, in the dialog
    };

    explicit DialogUser(const std::string& display);
    bool works() const { return connection_ && xcb_connection_has_error(connection_.get()) == 0; }

    /// The dialogs on the screen.
    std::vector<Dialog> dialogs();
    /// The first dialog (of that process, if one is named), waiting for it and for its buttons to be painted; none when
    /// it doesn't come.
    std::optional<Dialog> waitForDialog(std::optional<pid_t> pid = std::nullopt,
                                        std::chrono::seconds limit = std::chrono::seconds(30));
    /// Where its buttons are, from the left; empty when they can't be told from the picture.
    std::vector<Place> buttons(const Dialog& dialog);

    /// Presses and releases. False when the dialog has no such button.
    bool click(const Dialog& dialog, Button button);
    /// Gives the dialog the keyboard and presses a key there.
    void press(const Dialog& dialog, xcb_keysym_t key);
    /// What a window manager's close button does.
    void close(const Dialog& dialog);
    void destroy(const Dialog& dialog);
    void killClient(const Dialog& dialog);
    /// Ends the dialog's program with SIGKILL; false when nobody knows which it is.
    static bool killProgram(const Dialog& dialog);

    /// Waits for a dialog, looks at it for `look` (the daemon does not believe a press that comes at once), presses the
    /// button and waits until the dialog has gone.
    bool answer(Button button, std::optional<pid_t> pid = std::nullopt,
                std::chrono::seconds limit = std::chrono::seconds(30),
                std::chrono::milliseconds look = std::chrono::milliseconds(1500));

private:
    struct Disconnect {
        void operator()(xcb_connection_t* connection) const { xcb_disconnect(connection); }
    };
    void fake(std::uint8_t type, std::uint8_t detail, int x = 0, int y = 0);
    void sync();
    bool isDialog(xcb_window_t window);
    pid_t ownerOf(xcb_window_t window);
    bool gone(xcb_window_t window);
    xcb_atom_t atom(const char* name);

    std::unique_ptr<xcb_connection_t, Disconnect> connection_;
    xcb_window_t root_ = XCB_NONE;
};

}  // namespace lumacast::test
