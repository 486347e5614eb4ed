#include <sys/mman.h>
#include <unistd.h>
#include <xcb/composite.h>
#include <xcb/damage.h>
#include <xcb/res.h>
#include <xcb/shm.h>
#include <xcb/xfixes.h>

#include <cstdlib>
#include <future>
#include <memory>
#include <string_view>
#include <thread>

#include "client/lumacastctl/doctor/Display.h"
#include "linux/ipc/Fd.h"

namespace lumacast::ctl {

namespace {

using Version = DisplayFacts::Version;

struct Free {
    void operator()(void* memory) const { std::free(memory); }
};
template <class T>
using Owned = std::unique_ptr<T, Free>;

struct Disconnect {
    void operator()(xcb_connection_t* connection) const { xcb_disconnect(connection); }
};
using Connection = std::unique_ptr<xcb_connection_t, Disconnect>;

constexpr std::size_t kMemoryBytes = 4096;

/// The same server, named so that no way but the local socket is tried: the daemon, too, uses no other. None for a
/// server of another machine.
std::optional<std::string> localName(const std::string& display) {
    char* host = nullptr;
    int number = 0, screen = 0;
    if (xcb_parse_display(display.c_str(), &host, &number, &screen) == 0) return std::nullopt;
    const Owned<char> owned(host);
    if (const std::string_view where(host); !where.empty() && where != "unix") return std::nullopt;
    return "unix:" + std::to_string(number) + "." + std::to_string(screen);
}

bool has(xcb_connection_t* connection, xcb_extension_t& extension) {
    const auto* data = xcb_get_extension_data(connection, &extension);
    return data && data->present != 0;
}

void readVersions(xcb_connection_t* connection, DisplayFacts& facts) {
    if (has(connection, xcb_composite_id))
        if (const Owned<xcb_composite_query_version_reply_t> reply{
                xcb_composite_query_version_reply(connection, xcb_composite_query_version(connection, 0, 4), nullptr)})
            facts.composite = Version{reply->major_version, reply->minor_version};
    if (has(connection, xcb_damage_id))
        if (const Owned<xcb_damage_query_version_reply_t> reply{
                xcb_damage_query_version_reply(connection, xcb_damage_query_version(connection, 1, 1), nullptr)})
            facts.damage = Version{reply->major_version, reply->minor_version};
    if (has(connection, xcb_xfixes_id))
        if (const Owned<xcb_xfixes_query_version_reply_t> reply{
                xcb_xfixes_query_version_reply(connection, xcb_xfixes_query_version(connection, 5, 0), nullptr)})
            facts.fixes = Version{reply->major_version, reply->minor_version};
    if (has(connection, xcb_shm_id))
        if (const Owned<xcb_shm_query_version_reply_t> reply{
                xcb_shm_query_version_reply(connection, xcb_shm_query_version(connection), nullptr)})
            facts.sharedMemory = Version{reply->major_version, reply->minor_version};
    if (has(connection, xcb_res_id))
        if (const Owned<xcb_res_query_version_reply_t> reply{
                xcb_res_query_version_reply(connection, xcb_res_query_version(connection, 1, 2), nullptr)})
            facts.resources = Version{reply->server_major, reply->server_minor};
}

bool takesMemoryByDescriptor(xcb_connection_t* connection) {
    Fd memory(::memfd_create("lumacastctl", MFD_CLOEXEC));
    if (!memory || ::ftruncate(memory.get(), kMemoryBytes) != 0) return false;
    const xcb_shm_seg_t segment = xcb_generate_id(connection);
    // The library takes the descriptor, and closes it when it is sent.
    const auto attached = xcb_shm_attach_fd_checked(connection, segment, memory.release(), 0);
    if (const Owned<xcb_generic_error_t> error{xcb_request_check(connection, attached)}) return false;
    if (xcb_connection_has_error(connection) != 0) return false;
    xcb_shm_detach(connection, segment);
    return true;
}

const xcb_screen_t* screenOf(xcb_connection_t* connection, int screenNumber) {
    auto screens = xcb_setup_roots_iterator(xcb_get_setup(connection));
    for (; screens.rem > 1 && screenNumber > 0; --screenNumber) xcb_screen_next(&screens);
    return screens.rem == 0 ? nullptr : screens.data;
}

bool pixelsAreBgrx(xcb_connection_t* connection, const xcb_screen_t& screen) {
    if (xcb_get_setup(connection)->image_byte_order != XCB_IMAGE_ORDER_LSB_FIRST) return false;
    for (auto depth = xcb_screen_allowed_depths_iterator(&screen); depth.rem > 0; xcb_depth_next(&depth))
        for (auto visual = xcb_depth_visuals_iterator(depth.data); visual.rem > 0; xcb_visualtype_next(&visual))
            if (visual.data->visual_id == screen.root_visual)
                return visual.data->red_mask == 0xFF0000 && visual.data->blue_mask == 0xFF;
    return false;
}

/// Waits as long as the server likes.
DisplayFacts askServer(DisplayFacts facts, const std::string& localName) {
    int screenNumber = 0;
    const Connection connection(xcb_connect(localName.c_str(), &screenNumber));
    facts.reach = DisplayFacts::Reach::NoServer;
    if (xcb_connection_has_error(connection.get()) != 0) return facts;
    facts.reach = DisplayFacts::Reach::Connected;
    readVersions(connection.get(), facts);
    if (facts.sharedMemory >= Version{1, 2}) facts.takesMemoryByDescriptor = takesMemoryByDescriptor(connection.get());
    if (const xcb_screen_t* const screen = screenOf(connection.get(), screenNumber)) {
        facts.pixelsAreBgrx = pixelsAreBgrx(connection.get(), *screen);
        if (const Owned<xcb_get_geometry_reply_t> geometry{xcb_get_geometry_reply(
                connection.get(), xcb_get_geometry(connection.get(), screen->root), nullptr)}) {
            facts.width = geometry->width;
            facts.height = geometry->height;
        }
    }
    return facts;
}

}  // namespace

DisplayFacts probeDisplay(const LinuxEnvironment::Variables& variables, std::chrono::milliseconds patience) {
    DisplayFacts facts;
    facts.isWaylandSession =
        !variables("WAYLAND_DISPLAY").value_or("").empty() || variables("XDG_SESSION_TYPE") == "wayland";
    facts.name = variables("DISPLAY").value_or("");
    if (facts.name.empty()) return facts;
    const auto name = localName(facts.name);
    if (!name) {
        facts.reach = DisplayFacts::Reach::NotLocal;
        return facts;
    }
    std::promise<DisplayFacts> promise;
    auto answer = promise.get_future();
    // A server that hangs keeps this thread until the process ends, which is soon.
    std::thread([facts, name = *name, promise = std::move(promise)]() mutable {
        promise.set_value(askServer(std::move(facts), name));
    }).detach();
    if (answer.wait_for(patience) == std::future_status::ready) return answer.get();
    facts.reach = DisplayFacts::Reach::NoAnswer;
    return facts;
}

}  // namespace lumacast::ctl
