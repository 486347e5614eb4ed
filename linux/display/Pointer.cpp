#include "linux/display/Pointer.h"

#include <xcb/xfixes.h>

#include <algorithm>

namespace lumacast::x11 {

Pointer::Pointer(X11Connection& connection)
    : connection_(connection), firstEvent_(xcb_get_extension_data(connection.get(), &xcb_xfixes_id)->first_event) {
    xcb_xfixes_select_cursor_input(connection_.get(), connection_.screen().root,
                                   XCB_XFIXES_CURSOR_NOTIFY_MASK_DISPLAY_CURSOR);
}

Pointer::~Pointer() {
    xcb_xfixes_select_cursor_input(connection_.get(), connection_.screen().root, 0);
}

void Pointer::handle(const xcb_generic_event_t& event) {
    shapeIsStale_ |= (event.response_type & 0x7F) == firstEvent_ + XCB_XFIXES_CURSOR_NOTIFY;
}

void Pointer::look() {
    if (shapeIsStale_) return readShape();
    xcb_connection_t* const x = connection_.get();
    const Owned<xcb_query_pointer_reply_t> place(
        xcb_query_pointer_reply(x, xcb_query_pointer_unchecked(x, connection_.screen().root), nullptr));
    onScreen_ = place && place->same_screen != 0;
    if (!onScreen_) return;
    x_ = place->root_x;
    y_ = place->root_y;
}

void Pointer::readShape() {
    xcb_connection_t* const x = connection_.get();
    shapeIsStale_ = false;
    shapeIsNew_ = true;
    shape_ = {};
    const auto placeCookie = xcb_query_pointer(x, connection_.screen().root);
    const Owned<xcb_xfixes_get_cursor_image_reply_t> image(
        xcb_xfixes_get_cursor_image_reply(x, xcb_xfixes_get_cursor_image(x), nullptr));
    const Owned<xcb_query_pointer_reply_t> place(xcb_query_pointer_reply(x, placeCookie, nullptr));
    onScreen_ = image && place && place->same_screen != 0;
    if (!onScreen_) return;
    x_ = image->x;
    y_ = image->y;
    const std::uint32_t* const pixels = xcb_xfixes_get_cursor_image_cursor_image(image.get());
    const int count = xcb_xfixes_get_cursor_image_cursor_image_length(image.get());
    if (count != image->width * image->height) return;
    if (std::all_of(pixels, pixels + count, [](std::uint32_t pixel) { return pixel == 0; })) return;
    shape_ = {image->width, image->height, image->xhot, image->yhot, {pixels, pixels + count}};
}

PixelRect Pointer::place() const {
    if (!onScreen_ || shape_.pixels.empty()) return {};
    return {x_ - shape_.hotX, y_ - shape_.hotY, shape_.width, shape_.height};
}

bool Pointer::changed() const {
    return shapeIsStale_ || shapeIsNew_ || place() != drawn_;
}

void Pointer::take(DamageRegion& into) {
    if (!changed()) return;
    into.add(drawn_);
    drawn_ = place();
    into.add(drawn_);
    shapeIsNew_ = false;
}

Overlay Pointer::drawn() const {
    if (isEmpty(drawn_)) return {};
    return {drawn_, shape_.pixels};
}

}  // namespace lumacast::x11
