#include "linux/display/ReadRows.h"

#include <xcb/shm.h>

#include <algorithm>
#include <array>

namespace lumacast::x11 {

RowsRead readRows(X11Connection& connection, xcb_drawable_t drawable, const PixelRect& part, const SharedMemory& memory,
                  std::span<const Strip> strips) {
    xcb_connection_t* const x = connection.get();
    const std::size_t rowBytes = static_cast<std::size_t>(part.width) * 4;
    std::array<xcb_shm_get_image_cookie_t, DamageRegion::kMaximumRects> cookies;
    const std::size_t count = std::min(strips.size(), cookies.size());
    RowsRead rows;
    // Unchecked requests take less memory: an error comes with the events, where nobody minds it, and no reply.
    for (std::size_t i = 0; i < count; ++i) {
        const Strip& strip = strips[i];
        cookies[i] = xcb_shm_get_image_unchecked(x, drawable, static_cast<std::int16_t>(part.x),
                                       static_cast<std::int16_t>(part.y + strip.y),
                                       static_cast<std::uint16_t>(part.width), static_cast<std::uint16_t>(strip.height),
                                       ~0u, XCB_IMAGE_FORMAT_Z_PIXMAP, memory.segment(),
                                       static_cast<std::uint32_t>(static_cast<std::size_t>(strip.y) * rowBytes));
        rows.lastRequest = cookies[i].sequence;
    }
    rows.complete = count == strips.size();
    for (std::size_t i = 0; i < count; ++i)
        rows.complete &= Owned<xcb_shm_get_image_reply_t>(xcb_shm_get_image_reply(x, cookies[i], nullptr)) != nullptr;
    return rows;
}

}  // namespace lumacast::x11
