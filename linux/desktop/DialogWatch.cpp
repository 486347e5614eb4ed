#include "linux/desktop/DialogWatch.h"

#include <poll.h>
#include <xcb/res.h>

#include <array>
#include <vector>

#include "linux/system/Threads.h"

namespace lumacast {

using x11::Owned;
using x11::X11Connection;

namespace {

constexpr int kLookEvery = 20;  // milliseconds, until the window is there
constexpr int kDeepest = 4;     // how many frames of a window manager a window may be in
constexpr std::size_t kMostWindows = 20000;

/// The first resource identifiers of the connections that the process has to the server, by the X-Resource extension:
/// every window of a connection has the same bits outside the mask.
std::vector<std::uint32_t> clientsOf(xcb_connection_t* x, pid_t pid) {
    const xcb_res_client_id_spec_t all{0, XCB_RES_CLIENT_ID_MASK_LOCAL_CLIENT_PID};
    const Owned<xcb_res_query_client_ids_reply_t> reply(
        xcb_res_query_client_ids_reply(x, xcb_res_query_client_ids(x, 1, &all), nullptr));
    std::vector<std::uint32_t> clients;
    if (!reply) return clients;
    for (auto id = xcb_res_query_client_ids_ids_iterator(reply.get()); id.rem > 0; xcb_res_client_id_value_next(&id))
        if ((id.data->spec.mask & XCB_RES_CLIENT_ID_MASK_LOCAL_CLIENT_PID) != 0 &&
            xcb_res_client_id_value_value_length(id.data) == 1 &&
            *xcb_res_client_id_value_value(id.data) == static_cast<std::uint32_t>(pid))
            clients.push_back(id.data->spec.client);
    return clients;
}

bool isOnTheScreen(xcb_connection_t* x, xcb_window_t window) {
    const Owned<xcb_get_window_attributes_reply_t> attributes(
        xcb_get_window_attributes_reply(x, xcb_get_window_attributes(x, window), nullptr));
    return attributes && attributes->map_state == XCB_MAP_STATE_VIEWABLE &&
           attributes->_class == XCB_WINDOW_CLASS_INPUT_OUTPUT;
}

}  // namespace

std::shared_ptr<DialogWatch> DialogWatch::start(const std::string& display, std::function<void()> changed) {
    std::shared_ptr<DialogWatch> watch(new DialogWatch(std::move(changed)));
    return startDetachedThread([watch, display] { watch->run(display); }) ? watch : nullptr;
}

void DialogWatch::stop() {
    {
        const std::lock_guard lock(mutex_);
        stopped_ = true;
    }
    interrupt_.fire();
    wake_.signal();
}

bool DialogWatch::waitForDisplay(std::chrono::milliseconds patience) {
    std::unique_lock lock(mutex_);
    opened_.wait_for(lock, patience, [this] { return display_ != Display::Opening; });
    return display_ == Display::Open;
}

void DialogWatch::follow(pid_t pid) {
    {
        const std::lock_guard lock(mutex_);
        pid_ = pid;
        seen_.reset();
        destroyed_ = false;
    }
    wake_.signal();
}

std::optional<DialogWatch::Time> DialogWatch::seen() const {
    const std::lock_guard lock(mutex_);
    return seen_;
}

bool DialogWatch::lost() const {
    const std::lock_guard lock(mutex_);
    return destroyed_ || display_ == Display::Gone;
}

void DialogWatch::set(Display display) {
    {
        const std::lock_guard lock(mutex_);
        display_ = display;
    }
    opened_.notify_all();
    changed_();
}

void DialogWatch::sawWindow(pid_t pid) {
    {
        const std::lock_guard lock(mutex_);
        if (pid_ == pid) seen_ = std::chrono::steady_clock::now();
    }
    changed_();
}

void DialogWatch::lostWindow(pid_t pid) {
    {
        const std::lock_guard lock(mutex_);
        if (pid_ == pid) destroyed_ = true;
    }
    changed_();
}

void DialogWatch::run(const std::string& display) {
    if (const auto connection = X11Connection::open(display, interrupt_); connection && connection->canNameOwners()) {
        set(Display::Open);
        watch(*connection);
    }
    set(Display::Gone);
}

void DialogWatch::watch(X11Connection& connection) {
    pid_t followed = 0;
    xcb_window_t window = XCB_NONE;
    while (!connection.broken()) {
        pid_t pid = 0;
        {
            const std::lock_guard lock(mutex_);
            if (stopped_) return;
            pid = pid_;
        }
        if (pid != followed) {
            followed = pid;
            window = XCB_NONE;
        }
        bool gone = false;
        while (const Owned<xcb_generic_event_t> event{xcb_poll_for_event(connection.get())})
            if ((event->response_type & 0x7F) == XCB_DESTROY_NOTIFY)
                gone |= window != XCB_NONE &&
                        reinterpret_cast<const xcb_destroy_notify_event_t*>(event.get())->window == window;
        if (gone) {
            lostWindow(followed);
            window = XCB_NONE;
            followed = 0;
            const std::lock_guard lock(mutex_);
            if (pid_ == pid) pid_ = 0;  // nothing to look for until the next one
            continue;
        }
        if (window == XCB_NONE && followed != 0 && (window = find(connection, followed)) != XCB_NONE) {
            // From here on its end is told; it may have come in between.
            const std::uint32_t events = XCB_EVENT_MASK_STRUCTURE_NOTIFY;
            const bool there = connection.succeeded(
                xcb_change_window_attributes_checked(connection.get(), window, XCB_CW_EVENT_MASK, &events));
            sawWindow(followed);
            if (!there) lostWindow(followed);
            continue;
        }
        sleep(&connection, followed != 0 && window == XCB_NONE ? kLookEvery : -1);
    }
}

void DialogWatch::sleep(X11Connection* connection, int milliseconds) const {
    std::array<pollfd, 2> polled{{{wake_.descriptor(), POLLIN, 0}, {connection->descriptor(), POLLIN, 0}}};
    ::poll(polled.data(), polled.size(), milliseconds);
    wake_.clear();
}

// A level of the tree at a time: all questions of a level go out before the first answer is waited for.
xcb_window_t DialogWatch::find(X11Connection& connection, pid_t pid) const {
    xcb_connection_t* const x = connection.get();
    const std::uint32_t mask = xcb_get_setup(x)->resource_id_mask;
    const std::vector<std::uint32_t> clients = clientsOf(x, pid);
    if (clients.empty()) return XCB_NONE;
    std::vector<xcb_window_t> level{connection.screen().root};
    for (int depth = 0; depth < kDeepest && !level.empty(); ++depth) {
        std::vector<xcb_query_tree_cookie_t> cookies;
        for (const xcb_window_t parent : level) cookies.push_back(xcb_query_tree(x, parent));
        std::vector<xcb_window_t> children;
        for (const auto cookie : cookies) {
            const Owned<xcb_query_tree_reply_t> tree(xcb_query_tree_reply(x, cookie, nullptr));
            if (!tree || children.size() > kMostWindows) continue;
            const xcb_window_t* const first = xcb_query_tree_children(tree.get());
            children.insert(children.end(), first, first + xcb_query_tree_children_length(tree.get()));
        }
        for (const xcb_window_t child : children)
            for (const std::uint32_t client : clients)
                if ((child & ~mask) == (client & ~mask) && isOnTheScreen(x, child)) return child;
        level = std::move(children);
    }
    return XCB_NONE;
}

}  // namespace lumacast
