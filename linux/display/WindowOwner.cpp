#include "linux/display/WindowOwner.h"

#include <xcb/res.h>

#include <algorithm>

namespace lumacast::x11 {

std::vector<ProcessID> ownersOf(X11Connection& connection, std::span<const xcb_window_t> windows) {
    std::vector<ProcessID> owners;
    if (!connection.canNameOwners() || windows.empty()) return owners;
    std::vector<xcb_res_client_id_spec_t> asked;
    for (const xcb_window_t window : windows)
        if (window != XCB_NONE) asked.push_back({window, XCB_RES_CLIENT_ID_MASK_LOCAL_CLIENT_PID});
    if (asked.empty()) return owners;  // no window at all would ask for every client
    xcb_connection_t* const x = connection.get();
    const auto cookie = xcb_res_query_client_ids(x, static_cast<std::uint32_t>(asked.size()), asked.data());
    const Owned<xcb_res_query_client_ids_reply_t> reply(xcb_res_query_client_ids_reply(x, cookie, nullptr));
    if (!reply) return owners;
    auto id = xcb_res_query_client_ids_ids_iterator(reply.get());
    for (; id.rem > 0; xcb_res_client_id_value_next(&id)) {
        if ((id.data->spec.mask & XCB_RES_CLIENT_ID_MASK_LOCAL_CLIENT_PID) == 0) continue;
        if (xcb_res_client_id_value_value_length(id.data) != 1) continue;
        const ProcessID pid{static_cast<std::int32_t>(*xcb_res_client_id_value_value(id.data))};
        if (number(pid) > 0 && std::find(owners.begin(), owners.end(), pid) == owners.end()) owners.push_back(pid);
    }
    return owners;
}

std::optional<ProcessID> ownerOf(X11Connection& connection, xcb_window_t window) {
    const auto owners = ownersOf(connection, {&window, 1});
    if (owners.size() != 1) return std::nullopt;
    return owners.front();
}

}  // namespace lumacast::x11
