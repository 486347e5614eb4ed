#include "linux/display/BlankWatch.h"

#include <xcb/dpms.h>
#include <xcb/screensaver.h>

#include <limits>

namespace lumacast::x11 {
namespace {

bool present(X11Connection& connection, xcb_extension_t* extension) {
    const auto* data = xcb_get_extension_data(connection.get(), extension);
    return data != nullptr && data->present != 0;
}

bool isOn(std::uint8_t saver) {
    return saver == XCB_SCREENSAVER_STATE_ON || saver == XCB_SCREENSAVER_STATE_CYCLE;
}

}  // namespace

BlankWatch::BlankWatch(X11Connection& connection)
    : connection_(connection),
      hasSaver_(present(connection, &xcb_screensaver_id)),
      hasPower_(present(connection, &xcb_dpms_id)) {
    if (!hasSaver_) return;
    xcb_connection_t* const x = connection_.get();
    firstEvent_ = xcb_get_extension_data(x, &xcb_screensaver_id)->first_event;
    xcb_discard_reply(x, xcb_screensaver_query_version(x, 1, 1).sequence);
    xcb_screensaver_select_input(x, connection_.screen().root,
                                 XCB_SCREENSAVER_EVENT_NOTIFY_MASK | XCB_SCREENSAVER_EVENT_CYCLE_MASK);
}

BlankWatch::~BlankWatch() {
    if (hasSaver_) xcb_screensaver_select_input(connection_.get(), connection_.screen().root, 0);
}

void BlankWatch::handle(const xcb_generic_event_t& event) {
    if (!hasSaver_ || (event.response_type & 0x7F) != firstEvent_ + XCB_SCREENSAVER_NOTIFY) return;
    saverIsOn_ = isOn(reinterpret_cast<const xcb_screensaver_notify_event_t&>(event).state);
}

void BlankWatch::look(std::int64_t now) {
    xcb_connection_t* const x = connection_.get();
    nextLook_ = hasPower_ ? now + kLookAgain : std::numeric_limits<std::int64_t>::max();
    xcb_screensaver_query_info_cookie_t saverCookie{};
    xcb_dpms_info_cookie_t powerCookie{};
    if (hasSaver_) saverCookie = xcb_screensaver_query_info(x, connection_.screen().root);
    if (hasPower_) powerCookie = xcb_dpms_info(x);
    if (hasSaver_) {
        const Owned<xcb_screensaver_query_info_reply_t> saver(
            xcb_screensaver_query_info_reply(x, saverCookie, nullptr));
        if (saver) saverIsOn_ = isOn(saver->state);
    }
    if (hasPower_) {
        const Owned<xcb_dpms_info_reply_t> power(xcb_dpms_info_reply(x, powerCookie, nullptr));
        if (power) monitorsAreOff_ = power->power_level != XCB_DPMS_DPMS_MODE_ON;
    }
}

}  // namespace lumacast::x11
