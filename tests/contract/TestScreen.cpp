#include "tests/contract/TestScreen.h"

#include <xcb/randr.h>
#include <xcb/render.h>

#include <algorithm>
#include <cmath>
#include <cstring>

#include "linux/display/X11Connection.h"
#include "platform/DisplayCapture.h"

namespace lumacast::test {

using x11::Owned;

Pixels uprightPixels(const SharedPlane& plane, std::uint32_t transformFlags) {
    const bool turned = (transformFlags & kRotateClockwise) != 0;
    const std::int32_t width = plane.width(), height = plane.height();
    Pixels upright{turned ? height : width, turned ? width : height, {}};
    upright.colours.resize(static_cast<std::size_t>(width) * static_cast<std::size_t>(height));
    for (std::int32_t y = 0; y < height; ++y)
        for (std::int32_t x = 0; x < width; ++x) {
            std::uint32_t pixel = 0;
            std::memcpy(
                &pixel,
                plane.pixels().data() + static_cast<std::size_t>(y) * plane.stride() + static_cast<std::size_t>(x) * 4,
                4);
            // Clockwise: the first row becomes the last column.
            const std::int32_t toX = turned ? height - 1 - y : x, toY = turned ? x : y;
            upright.colours[static_cast<std::size_t>(toY) * static_cast<std::size_t>(upright.width) +
                            static_cast<std::size_t>(toX)] = pixel & 0xFFFFFF;
        }
    return upright;
}

TestScreen::TestScreen(const std::string& display)
    : connection_(xcb_connect(display.c_str(), nullptr)),
      screen_(xcb_setup_roots_iterator(xcb_get_setup(connection_.get())).data) {
    xcb_connection_t* const x = connection_.get();
    const Owned<xcb_render_query_version_reply_t> version(
        xcb_render_query_version_reply(x, xcb_render_query_version(x, 0, 11), nullptr));
    const Owned<xcb_render_query_pict_formats_reply_t> formats(
        xcb_render_query_pict_formats_reply(x, xcb_render_query_pict_formats(x), nullptr));
    for (auto format = xcb_render_query_pict_formats_formats_iterator(formats.get()); format.rem > 0;
         xcb_render_pictforminfo_next(&format))
        if (format.data->depth == 32 && format.data->direct.alpha_mask == 0xFF &&
            format.data->direct.alpha_shift == 24 && format.data->direct.red_shift == 16)
            argb_ = format.data->id;
    const Owned<xcb_randr_query_version_reply_t> randr(
        xcb_randr_query_version_reply(x, xcb_randr_query_version(x, 1, 4), nullptr));
}

TestScreen::~TestScreen() = default;

void TestScreen::sync() const {
    xcb_connection_t* const x = connection_.get();
    const Owned<xcb_get_input_focus_reply_t> done(xcb_get_input_focus_reply(x, xcb_get_input_focus(x), nullptr));
}

void TestScreen::movePointer(int toX, int toY) {
    xcb_warp_pointer(connection_.get(), XCB_NONE, screen_->root, 0, 0, 0, 0, static_cast<std::int16_t>(toX),
                     static_cast<std::int16_t>(toY));
    sync();
}

void TestScreen::setPointer(const PointerLook& look) {
    xcb_connection_t* const x = connection_.get();
    const xcb_pixmap_t pixmap = xcb_generate_id(x);
    const xcb_gcontext_t context = xcb_generate_id(x);
    const xcb_render_picture_t picture = xcb_generate_id(x);
    const xcb_cursor_t cursor = xcb_generate_id(x);
    xcb_create_pixmap(x, 32, pixmap, screen_->root, look.width, look.height);
    xcb_create_gc(x, context, pixmap, 0, nullptr);
    xcb_put_image(x, XCB_IMAGE_FORMAT_Z_PIXMAP, pixmap, context, look.width, look.height, 0, 0, 0, 32,
                  static_cast<std::uint32_t>(look.pixels.size() * 4),
                  reinterpret_cast<const std::uint8_t*>(look.pixels.data()));
    xcb_render_create_picture(x, picture, pixmap, argb_, 0, nullptr);
    xcb_render_create_cursor(x, cursor, picture, look.hotX, look.hotY);
    xcb_change_window_attributes(x, screen_->root, XCB_CW_CURSOR, &cursor);
    xcb_render_free_picture(x, picture);
    xcb_free_gc(x, context);
    xcb_free_pixmap(x, pixmap);
    xcb_free_cursor(x, cursor);
    sync();
}

// The monitor has one mode, the first size: it is taken off the screen before the size changes.
void TestScreen::resize(int width, int height) {
    xcb_connection_t* const x = connection_.get();
    const Owned<xcb_randr_get_screen_resources_reply_t> resources(
        xcb_randr_get_screen_resources_reply(x, xcb_randr_get_screen_resources(x, screen_->root), nullptr));
    const xcb_randr_crtc_t* const crtcs = xcb_randr_get_screen_resources_crtcs(resources.get());
    for (int i = 0; i < resources->num_crtcs; ++i) {
        const auto cookie = xcb_randr_set_crtc_config(x, crtcs[i], XCB_CURRENT_TIME, resources->config_timestamp, 0, 0,
                                                      XCB_NONE, XCB_RANDR_ROTATION_ROTATE_0, 0, nullptr);
        const Owned<xcb_randr_set_crtc_config_reply_t> off(xcb_randr_set_crtc_config_reply(x, cookie, nullptr));
    }
    xcb_randr_set_screen_size(x, screen_->root, static_cast<std::uint16_t>(width), static_cast<std::uint16_t>(height),
                              static_cast<std::uint32_t>(width / 4 + 1), static_cast<std::uint32_t>(height / 4 + 1));
    sync();
}

void TestScreen::saveScreen(bool on) {
    xcb_force_screen_saver(connection_.get(), on ? XCB_SCREEN_SAVER_ACTIVE : XCB_SCREEN_SAVER_RESET);
    sync();
}

Pixels TestScreen::withoutPointer() const {
    xcb_connection_t* const x = connection_.get();
    const Owned<xcb_get_geometry_reply_t> size(xcb_get_geometry_reply(x, xcb_get_geometry(x, screen_->root), nullptr));
    const Owned<xcb_get_image_reply_t> image(xcb_get_image_reply(
        x, xcb_get_image(x, XCB_IMAGE_FORMAT_Z_PIXMAP, screen_->root, 0, 0, size->width, size->height, ~0u), nullptr));
    Pixels pixels{size->width, size->height, {}};
    pixels.colours.resize(static_cast<std::size_t>(size->width) * size->height);
    std::memcpy(pixels.colours.data(), xcb_get_image_data(image.get()), pixels.colours.size() * 4);
    for (std::uint32_t& colour : pixels.colours) colour &= 0xFFFFFF;
    return pixels;
}

Pixels TestScreen::withPointer(const PointerLook& look, int atX, int atY) const {
    Pixels pixels = withoutPointer();
    for (int y = 0; y < look.height; ++y)
        for (int x = 0; x < look.width; ++x) {
            const int toX = atX - look.hotX + x, toY = atY - look.hotY + y;
            if (toX < 0 || toY < 0 || toX >= pixels.width || toY >= pixels.height) continue;
            const std::uint32_t over =
                look.pixels[static_cast<std::size_t>(y) * look.width + static_cast<std::size_t>(x)];
            std::uint32_t& under =
                pixels.colours[static_cast<std::size_t>(toY) * static_cast<std::size_t>(pixels.width) +
                               static_cast<std::size_t>(toX)];
            const double through = 1 - static_cast<double>(over >> 24) / 255;
            std::uint32_t mixed = 0;
            for (const int shift : {16, 8, 0})
                mixed = mixed << 8 | static_cast<std::uint32_t>(
                                         std::lround((over >> shift & 0xFF) + (under >> shift & 0xFF) * through));
            under = mixed;
        }
    return pixels;
}

}  // namespace lumacast::test
