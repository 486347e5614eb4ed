// The Linux port: a desktop of an X11 display server and a sound server.

#include <unistd.h>

#include <cstdlib>
#include <memory>
#include <string>
#include <utility>

#include "linux/audio/LinuxAudioInputQueues.h"
#include "linux/audio/LinuxDeviceCapture.h"
#include "linux/audio/PulseTaps.h"
#include "linux/desktop/LinuxUserAlerts.h"
#include "linux/display/X11AppStateMonitor.h"
#include "linux/display/X11DisplayCapture.h"
#include "linux/display/X11RenderServer.h"
#include "linux/platform/LinuxPlatform.h"
#include "linux/sounds/LinuxSystemSounds.h"

namespace lumacast {

namespace {

std::string displayName() {
    const char* value = std::getenv("DISPLAY");
    return value ? value : "";
}

LinuxUserAlerts::Options alertOptions(const DesktopServices& services) {
    LinuxUserAlerts::Options options;
    options.display = displayName();
    options.searchPath = services.environment.searchPath;
    options.styleDirectory = services.environment.runtimeDirectory + "/dialog";
    options.environment = dialogEnvironment(environ, options.display);
    options.icon = [&bundles = services.bundles](const BundleIdentifier& application) {
        const auto bundle = bundles.withIdentifier(application);
        return bundle ? bundle->info(kInfoIcon) : std::nullopt;
    };
    options.explain = [&log = services.log](std::string_view reason) {
        log.error("the user can't be asked: %s", reason);
    };
    options.note = [&log = services.log](std::string_view what) { log.error("%s", what); };
    return options;
}

sound::PulseConnection::Options soundOptions(Log& log) {
    sound::PulseConnection::Options options;
    options.tell = [&log](bool isThere) {
        if (isThere)
            log.line("the sound server is there again");
        else
            log.error("no sound server can be reached: until one can, recordings have silence in place of sound");
    };
    return options;
}

class LinuxDesktop final : public DesktopRoles {
public:
    explicit LinuxDesktop(const DesktopServices& services) : services_(services) {
        // A user's manager may start a daemon before the session has told it its display.
        if (displayName().empty())
            services_.log.error("DISPLAY is not set: no window can be recorded until the daemon is started anew with it");
    }

    SoundRoles makeSound() override {
        auto taps = std::make_shared<sound::PulseTaps>(soundServer_, services_.applicationOf);
        return {std::make_unique<LinuxAudioInputQueues>(std::move(taps), services_.clock),
                std::make_unique<LinuxDeviceCapture>(sound::pulseMicrophone(soundServer_), services_.clock,
                                                     services_.scheduler)};
    }
    DisplayRoles makeDisplay() override {
        auto capture = std::make_shared<X11DisplayCapture>(displayName(), services_.clock, services_.scheduler);
        return {capture, capture, std::make_unique<X11RenderServer>(displayName()),
                std::make_unique<X11AppStateMonitor>(displayName(), services_.scheduler, services_.applicationOf)};
    }
    AttentionRoles makeAttention() override {
        const LinuxEnvironment& environment = services_.environment;
        return {std::make_unique<LinuxUserAlerts>(alertOptions(services_)),
                std::make_unique<LinuxSystemSounds>(
                    soundServer_, sound::SoundThemes{environment.dataDirectories, environment.configDirectories})};
    }

private:
    const DesktopServices services_;
    const std::shared_ptr<sound::PulseConnection> soundServer_ =
        std::make_shared<sound::PulseConnection>(soundOptions(services_.log));
};

}  // namespace

std::unique_ptr<PlatformOwner> makePlatform() {
    return makePlatformOn([](const DesktopServices& services) { return std::make_unique<LinuxDesktop>(services); });
}

}  // namespace lumacast
