#pragma once

#include <xcb/shm.h>
#include <xcb/xcb.h>

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "examples/scene/Picture.h"
#include "examples/self_recorder/SharedImage.h"

namespace lumacast::example {

/// A top-level X11 window that shows pictures from shared memory. Nothing here blocks once it is open: the owner calls
/// `pump` when the descriptor can be read. Lives on the loop.
class SceneWindow final {
public:
    struct Events {
        std::function<void()> shown;    ///< the picture given to `put` is on the window
        std::function<void()> exposed;  ///< part of the window lost its content, or the window appeared
        std::function<void()> resized;  ///< `picture()` is new and blank
        std::function<void()> closed;   ///< the user closed the window
        std::function<void()> lost;     ///< the display is gone or refused a request; the reason is on standard error
    };

    /// Connects to $DISPLAY and maps the window. On failure `error()` says why and nothing else may be called.
    SceneWindow(int width, int height, const std::string& name);
    ~SceneWindow();
    SceneWindow(const SceneWindow&) = delete;
    SceneWindow& operator=(const SceneWindow&) = delete;

    [[nodiscard]] const std::string& error() const { return error_; }
    [[nodiscard]] int descriptor() const { return xcb_get_file_descriptor(connection_.get()); }
    [[nodiscard]] std::uint32_t identifier() const { return window_; }
    [[nodiscard]] bool mapped() const { return mapped_; }

    /// The memory to draw into, of the window's size; valid until `resized`. Don't draw while `busy`.
    [[nodiscard]] scene::Picture picture() const { return image_->picture(); }
    /// The server hasn't finished with the last `put` yet.
    [[nodiscard]] bool busy() const { return puts_ > 0; }
    /// Shows these rectangles of the picture with one request, so that nobody sees half of it.
    void put(const std::vector<scene::Rect>& changed);

    void resize(int width, int height);
    void move(int x, int y);
    void hide();
    void show();
    /// Above all others.
    void raise();

    /// Handles what the server has sent and calls the events.
    void pump();
    Events events;

private:
    struct Disconnect {
        void operator()(xcb_connection_t* connection) const { xcb_disconnect(connection); }
    };

    bool openConnection();
    void createWindow(int width, int height, const std::string& name);
    void setTextProperty(const char* property, const char* type, const std::string& text);
    xcb_atom_t atom(const char* name);
    void handle(const xcb_generic_event_t& event);
    void configured(int width, int height);
    void lost(const std::string& why);

    std::unique_ptr<xcb_connection_t, Disconnect> connection_;
    const xcb_screen_t* screen_ = nullptr;
    std::uint32_t window_ = 0;
    std::uint32_t context_ = 0;
    xcb_atom_t deleteWindow_ = 0;
    std::uint8_t completionEvent_ = 0;
    bool mapped_ = false;
    int puts_ = 0;
    std::unique_ptr<SharedImage> image_;
    std::string error_;
};

}  // namespace lumacast::example
