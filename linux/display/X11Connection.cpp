#include "linux/display/X11Connection.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>
#include <xcb/composite.h>
#include <xcb/damage.h>
#include <xcb/res.h>
#include <xcb/shm.h>
#include <xcb/xfixes.h>

#include <cstddef>
#include <cstring>
#include <optional>
#include <string_view>

#include "linux/display/AuthorityFile.h"

namespace lumacast::x11 {
namespace {

struct DisplayName {
    std::string socketPath;
    std::string number;
    int screen = 0;
};

std::optional<DisplayName> parse(const std::string& display) {
    char* host = nullptr;
    int number = 0, screen = 0;
    if (xcb_parse_display(display.c_str(), &host, &number, &screen) == 0) return std::nullopt;
    const Owned<char> ownedHost(host);
    const std::string_view where = host;
    if (!where.empty() && where != "unix") return std::nullopt;
    return DisplayName{"/tmp/.X11-unix/X" + std::to_string(number), std::to_string(number), screen};
}

// The socket in the file system, or the one in the abstract name space: containers often see only one of them.
Fd connectTo(const std::string& path) {
    for (const std::size_t leadingZeros : {0u, 1u}) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        if (path.size() + leadingZeros >= sizeof address.sun_path) return {};
        std::memcpy(address.sun_path + leadingZeros, path.data(), path.size());
        // Both come out one longer than the path: with the zero at its end, or the one before it.
        const auto length = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + path.size() + 1);
        // Not blocking, so that a server that hangs with its backlog full gives an error.
        Fd socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
        if (!socket) return {};
        if (::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), length) == 0) return socket;
    }
    return {};
}

const xcb_screen_t* screenNumber(xcb_connection_t* connection, int number) {
    auto screens = xcb_setup_roots_iterator(xcb_get_setup(connection));
    for (; screens.rem > 1 && number > 0; --number) xcb_screen_next(&screens);
    return screens.data;
}

bool pixelsAreBgrx(xcb_connection_t* connection, const xcb_screen_t& screen) {
    const xcb_setup_t* setup = xcb_get_setup(connection);
    if (setup->image_byte_order != XCB_IMAGE_ORDER_LSB_FIRST) return false;
    for (auto depth = xcb_screen_allowed_depths_iterator(&screen); depth.rem > 0; xcb_depth_next(&depth))
        for (auto visual = xcb_depth_visuals_iterator(depth.data); visual.rem > 0; xcb_visualtype_next(&visual))
            if (visual.data->visual_id == screen.root_visual)
                return visual.data->red_mask == 0xFF0000 && visual.data->blue_mask == 0xFF;
    return false;
}

bool present(xcb_connection_t* connection, xcb_extension_t* extension) {
    const auto* data = xcb_get_extension_data(connection, extension);
    return data != nullptr && data->present != 0;
}

}  // namespace

void Interrupt::arm(int socket) {
    const std::lock_guard lock(mutex_);
    socket_.reset(::fcntl(socket, F_DUPFD_CLOEXEC, 0));
    if (fired_) ::shutdown(socket_.get(), SHUT_RDWR);
}

void Interrupt::disarm() {
    const std::lock_guard lock(mutex_);
    socket_.reset();
}

void Interrupt::fire() {
    const std::lock_guard lock(mutex_);
    fired_ = true;
    if (socket_) ::shutdown(socket_.get(), SHUT_RDWR);
}

std::unique_ptr<X11Connection> X11Connection::open(const std::string& display, Interrupt& interrupt) {
    const auto name = parse(display);
    if (!name) return nullptr;
    Fd socket = connectTo(name->socketPath);
    if (!socket) return nullptr;
    interrupt.arm(socket.get());
    auto key = userKey(name->number);
    xcb_auth_info_t info{};
    if (key)
        info = {static_cast<int>(key->method.size()), key->method.data(), static_cast<int>(key->secret.size()),
                reinterpret_cast<char*>(key->secret.data())};
    xcb_connection_t* const connection = xcb_connect_to_fd(socket.release(), key ? &info : nullptr);
    if (xcb_connection_has_error(connection) != 0) {
        xcb_disconnect(connection);
        interrupt.disarm();
        return nullptr;
    }
    return std::unique_ptr<X11Connection>(new X11Connection(connection, name->screen, interrupt));
}

X11Connection::X11Connection(xcb_connection_t* connection, int screen, Interrupt& interrupt)
    : connection_(connection), interrupt_(interrupt), screen_(screenNumber(connection, screen)) {
    readExtensions();
}

X11Connection::~X11Connection() {
    interrupt_.disarm();
    xcb_disconnect(connection_);
}

// All questions go out before the first answer is waited for. Asking for the versions also tells the server ours.
void X11Connection::readExtensions() {
    for (xcb_extension_t* extension : {&xcb_composite_id, &xcb_damage_id, &xcb_xfixes_id, &xcb_shm_id, &xcb_res_id})
        xcb_prefetch_extension_data(connection_, extension);
    if (present(connection_, &xcb_res_id)) {
        const Owned<xcb_res_query_version_reply_t> res(
            xcb_res_query_version_reply(connection_, xcb_res_query_version(connection_, 1, 2), nullptr));
        canNameOwners_ = res && (res->server_major > 1 || (res->server_major == 1 && res->server_minor >= 2));
    }
    if (!present(connection_, &xcb_composite_id) || !present(connection_, &xcb_damage_id) ||
        !present(connection_, &xcb_xfixes_id) || !present(connection_, &xcb_shm_id))
        return;
    const auto compositeCookie = xcb_composite_query_version(connection_, 0, 4);
    const auto damageCookie = xcb_damage_query_version(connection_, 1, 1);
    const auto regionsCookie = xcb_xfixes_query_version(connection_, 5, 0);
    const auto sharedCookie = xcb_shm_query_version(connection_);
    const Owned<xcb_composite_query_version_reply_t> composite(
        xcb_composite_query_version_reply(connection_, compositeCookie, nullptr));
    const Owned<xcb_damage_query_version_reply_t> damage(
        xcb_damage_query_version_reply(connection_, damageCookie, nullptr));
    const Owned<xcb_xfixes_query_version_reply_t> regions(
        xcb_xfixes_query_version_reply(connection_, regionsCookie, nullptr));
    const Owned<xcb_shm_query_version_reply_t> shared(xcb_shm_query_version_reply(connection_, sharedCookie, nullptr));
    canCapture_ = composite && composite->minor_version + 10 * composite->major_version >= 2 && damage && regions &&
                  regions->major_version >= 2 && shared && shared->major_version * 100 + shared->minor_version >= 102 &&
                  pixelsAreBgrx(connection_, *screen_);
    firstDamageEvent_ = xcb_get_extension_data(connection_, &xcb_damage_id)->first_event;
}

bool X11Connection::isRoot(xcb_window_t window) const {
    for (auto screens = xcb_setup_roots_iterator(xcb_get_setup(connection_)); screens.rem > 0;
         xcb_screen_next(&screens))
        if (screens.data->root == window) return true;
    return false;
}

xcb_atom_t X11Connection::atom(const char* name) {
    const auto cookie = xcb_intern_atom(connection_, 0, static_cast<std::uint16_t>(std::strlen(name)), name);
    const Owned<xcb_intern_atom_reply_t> reply(xcb_intern_atom_reply(connection_, cookie, nullptr));
    return reply ? reply->atom : static_cast<xcb_atom_t>(XCB_ATOM_NONE);
}

bool X11Connection::succeeded(xcb_void_cookie_t cookie) {
    return Owned<xcb_generic_error_t>(xcb_request_check(connection_, cookie)) == nullptr && !broken();
}

}  // namespace lumacast::x11
