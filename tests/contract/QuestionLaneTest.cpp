#include "linux/display/QuestionLane.h"

#include <gtest/gtest.h>
#include <xcb/xcb.h>

#include <atomic>
#include <vector>

#include "tests/client/WaitUntil.h"
#include "tests/contract/PrivateDisplay.h"

namespace lumacast::x11 {
namespace {

/// Answers each change of a property of the root window with the next one, and waits for an answer of the server: with that
/// the event is read.
class ChangesMeanwhile final : public QuestionLaneObserver {
public:
    static constexpr int kChanges = 6;

    void connected(X11Connection& connection) override {
        const std::uint32_t events = XCB_EVENT_MASK_PROPERTY_CHANGE;
        xcb_change_window_attributes(connection.get(), connection.screen().root, XCB_CW_EVENT_MASK, &events);
        change(connection);
    }
    bool takeEvents(X11Connection& connection) override {
        int came = 0;
        while (const Owned<xcb_generic_event_t> event{xcb_poll_for_event(connection.get())})
            came += (event->response_type & 0x7F) == XCB_PROPERTY_NOTIFY;
        if (came == 0) return false;
        if ((taken += came) < kChanges) change(connection);
        return true;
    }
    std::vector<int> descriptors() override { return {}; }
    void readable(int) override {}

    std::atomic<int> taken{0};

private:
    static void change(X11Connection& connection) {
        xcb_change_property(connection.get(), XCB_PROP_MODE_REPLACE, connection.screen().root, XCB_ATOM_WM_NAME,
                            XCB_ATOM_STRING, 8, 1, "x");
        const auto asked = xcb_get_input_focus(connection.get());
        EXPECT_TRUE(Owned<xcb_get_input_focus_reply_t>(xcb_get_input_focus_reply(connection.get(), asked, nullptr)));
    }
};

TEST(QuestionLane, AnEventThatComesWithAnAnswerIsTakenBeforeTheLaneSleeps) {
    const test::PrivateDisplay display;
    ChangesMeanwhile observer;
    QuestionLane lane(display.name(), "lc-test", &observer);
    EXPECT_TRUE(lane.ask<bool>([](X11Connection&) { return true; }, false));
    EXPECT_TRUE(test::waitUntil([&] { return observer.taken == ChangesMeanwhile::kChanges; })) << observer.taken;
}

}  // namespace
}  // namespace lumacast::x11
