#include "linux/system/UsageCommand.h"

#include <utility>

namespace lumacast {

AdminCommand usageCommand(LinuxTelemetry& telemetry) {
    return [&telemetry](const std::vector<std::string>& arguments, const AdminAnswer& answer) {
        if (!arguments.empty()) return answer({{"error", "usage takes no arguments"}});
        const bool asked = telemetry.readHistory([answer](TelemetryHistory history) {
            answer({{"events", std::move(history.events)},
                    {"damagedLines", history.damagedLines},
                    {"unreadableFiles", history.unreadableFiles},
                    {"lostEvents", history.lostEvents}});
        });
        if (!asked) answer({{"error", "the disk of the state directory does not answer"}});
    };
}

}  // namespace lumacast
