#include "linux/accessibility/BusAnswers.h"

#include <poll.h>

#include "linux/accessibility/ScreenReaderBus.h"

namespace lumacast {

namespace {

/// Sends a question that is answered also when nobody has the name: a service that isn't there yet is not waited for.
bool askService(sd_bus* bus, sd_bus_slot** slot, bool& answered) {
    sd_bus_message* made = nullptr;
    if (sd_bus_message_new_method_call(bus, &made, "org.a11y.Bus", "/org/a11y/bus", "org.freedesktop.DBus.Peer",
                                       "Ping") < 0)
        return false;
    const BusMessage message(made);
    constexpr sd_bus_message_handler_t note = [](sd_bus_message*, void* noted, sd_bus_error*) {
        *static_cast<bool*>(noted) = true;
        return 0;
    };
    return sd_bus_message_set_auto_start(made, 0) >= 0 && sd_bus_call_async(bus, slot, made, note, &answered, 0) >= 0;
}

}  // namespace

bool busAnswers(const std::string& address, std::chrono::milliseconds patience) {
    using std::chrono::milliseconds;
    using std::chrono::steady_clock;
    const auto deadline = steady_clock::now() + patience;
    sd_bus* made = nullptr;
    if (sd_bus_new(&made) < 0) return false;
    const BusHandle bus(made);
    bool answered = false;
    sd_bus_slot* question = nullptr;
    if (sd_bus_set_address(made, address.c_str()) < 0 || sd_bus_set_bus_client(made, 1) < 0 ||
        sd_bus_start(made) < 0 || !askService(made, &question, answered))
        return false;
    const BusSlot slot(question);
    while (!answered) {
        int result = 1;
        while (result > 0 && !answered) result = sd_bus_process(made, nullptr);
        if (answered) break;
        const auto left = std::chrono::ceil<milliseconds>(deadline - steady_clock::now());
        const int events = sd_bus_get_events(made);
        if (result < 0 || events < 0 || left <= milliseconds::zero()) return false;
        pollfd polled{sd_bus_get_fd(made), static_cast<short>(events), 0};
        ::poll(&polled, 1, static_cast<int>(left.count()));
    }
    // A refused connection ends the question too.
    return sd_bus_is_ready(made) > 0;
}

}  // namespace lumacast
