// Asks the user what the daemon would ask, in the language of this process, and says which button was pressed: for the
// pictures of the manual, and for looking at it.

#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <future>
#include <string_view>

#include "daemon/AcknowledgementAlert.h"
#include "linux/apps/LinuxBundles.h"
#include "linux/desktop/LinuxUserAlerts.h"

namespace {

using namespace lumacast;

int usage() {
    std::fprintf(stderr, "usage: show_alert BUNDLE-IDENTIFIER DIRECTORY [microphone|camera] [capture]\n");
    return 2;
}

}  // namespace

int main(int count, char** words) {
    if (count < 3) return usage();
    AcknowledgementRequest request{.application = BundleIdentifier(words[1])};
    for (int i = 3; i < count; ++i) {
        const std::string_view word = words[i];
        if (word == "microphone")
            request.microphone = true;
        else if (word == "camera")
            request.camera = true;
        else if (word == "capture")
            request.isCapturing = true;
        else
            return usage();
    }
    const LinuxEnvironment environment = LinuxEnvironment::ofThisProcess();
    LinuxBundles bundles(LinuxBundles::optionsFrom(environment));
    Localization localization(bundles);
    LinuxUserAlerts::Options options;
    const char* const display = std::getenv("DISPLAY");
    options.display = display != nullptr ? display : "";
    options.searchPath = environment.searchPath;
    options.styleDirectory = words[2];
    options.environment = dialogEnvironment(environ, options.display);
    options.icon = [&](const BundleIdentifier& application) {
        const auto bundle = bundles.withIdentifier(application);
        return bundle ? bundle->info(kInfoIcon) : std::nullopt;
    };
    options.explain = [](std::string_view reason) {
        std::fprintf(stderr, "show_alert: %.*s\n", static_cast<int>(reason.size()), reason.data());
    };
    LinuxUserAlerts alerts(options);
    const auto alert = alerts.show(acknowledgementAlertContent(localization, request));
    if (!alert) return 1;
    std::promise<UserAlert::Response> response;
    alert->receiveResponse([&](UserAlert::Response pressed) { response.set_value(pressed); });
    constexpr const char* kNames[] = {"default", "alternate", "other"};
    std::printf("%s\n", kNames[static_cast<int>(response.get_future().get())]);
    return 0;
}
