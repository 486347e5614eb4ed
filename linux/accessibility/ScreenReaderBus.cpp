#include "linux/accessibility/ScreenReaderBus.h"

#include <poll.h>

#include <algorithm>
#include <array>
#include <climits>
#include <cstdint>
#include <ctime>

namespace lumacast {

namespace {

constexpr const char* kService = "org.a11y.Bus";
constexpr const char* kObject = "/org/a11y/bus";
constexpr const char* kInterface = "org.a11y.Status";
constexpr const char* kProperty = "ScreenReaderEnabled";
constexpr const char* kProperties = "org.freedesktop.DBus.Properties";

BusSlot owned(sd_bus_slot* slot) {
    return BusSlot(slot);
}

}  // namespace

bool ScreenReaderBus::open(const std::string& address) {
    sd_bus* bus = nullptr;
    if (sd_bus_new(&bus) < 0) return false;
    bus_.reset(bus);
    return sd_bus_set_address(bus, address.c_str()) >= 0 && sd_bus_set_bus_client(bus, 1) >= 0 &&
           sd_bus_start(bus) >= 0 && follow() && ask();
}

bool ScreenReaderBus::follow() {
    // What a signal says is not believed, only that it is time to ask again: anybody on the bus may send one.
    constexpr sd_bus_message_handler_t askAgain = [](sd_bus_message*, void* self, sd_bus_error*) {
        static_cast<ScreenReaderBus*>(self)->ask();
        return 0;
    };
    sd_bus_slot* slot = nullptr;
    const std::string owner = std::string(
                                  "type='signal',sender='org.freedesktop.DBus',path='/org/freedesktop/DBus',"
                                  "interface='org.freedesktop.DBus',member='NameOwnerChanged',arg0='") +
                              kService + "'";
    if (sd_bus_add_match_async(bus_.get(), &slot, owner.c_str(), askAgain, nullptr, this) < 0) return false;
    ownerMatch_ = owned(slot);
    const std::string properties = std::string("type='signal',sender='") + kService + "',path='" + kObject +
                                   "',interface='" + kProperties + "',member='PropertiesChanged',arg0='" + kInterface +
                                   "'";
    if (sd_bus_add_match_async(bus_.get(), &slot, properties.c_str(), askAgain, nullptr, this) < 0) return false;
    propertyMatch_ = owned(slot);
    return true;
}

bool ScreenReaderBus::ask() {
    // One question at a time, however many signals come.
    changedMeanwhile_ = true;
    if (question_) return true;
    changedMeanwhile_ = false;
    sd_bus_message* made = nullptr;
    if (sd_bus_message_new_method_call(bus_.get(), &made, kService, kObject, kProperties, "Get") < 0) return false;
    const BusMessage message(made);
    sd_bus_slot* slot = nullptr;
    const bool asked = sd_bus_message_set_auto_start(made, 0) >= 0 &&
                       sd_bus_message_append(made, "ss", kInterface, kProperty) >= 0 &&
                       sd_bus_call_async(
                           bus_.get(), &slot, made,
                           [](sd_bus_message* reply, void* self, sd_bus_error*) {
                               static_cast<ScreenReaderBus*>(self)->answered(*reply);
                               return 0;
                           },
                           this, 0) >= 0;
    question_ = owned(slot);
    return asked;
}

void ScreenReaderBus::answered(sd_bus_message& reply) {
    int running = 0;
    const bool known = !sd_bus_message_is_method_error(&reply, nullptr) &&
                       sd_bus_message_enter_container(&reply, SD_BUS_TYPE_VARIANT, "b") > 0 &&
                       sd_bus_message_read_basic(&reply, SD_BUS_TYPE_BOOLEAN, &running) > 0;
    changed_(known && running != 0);
    question_.reset();
    if (changedMeanwhile_) ask();
}

bool ScreenReaderBus::dispatch() {
    int result = 1;
    while (result > 0) result = sd_bus_process(bus_.get(), nullptr);
    return result == 0;
}

void ScreenReaderBus::wait(int wake) const {
    const int events = sd_bus_get_events(bus_.get());
    std::uint64_t deadline = UINT64_MAX;  // on the monotonic clock
    sd_bus_get_timeout(bus_.get(), &deadline);
    int timeout = -1;
    if (deadline != UINT64_MAX) {
        timespec now{};
        ::clock_gettime(CLOCK_MONOTONIC, &now);
        const std::uint64_t microseconds = static_cast<std::uint64_t>(now.tv_sec) * 1'000'000 + now.tv_nsec / 1000;
        const std::uint64_t left = deadline > microseconds ? (deadline - microseconds + 999) / 1000 : 0;
        timeout = static_cast<int>(std::min<std::uint64_t>(left, INT_MAX));
    }
    std::array<pollfd, 2> polled{pollfd{sd_bus_get_fd(bus_.get()), static_cast<short>(std::max(events, 0)), 0},
                                 pollfd{wake, POLLIN, 0}};
    ::poll(polled.data(), polled.size(), timeout);
}

}  // namespace lumacast
