#include "headless/HeadlessDesktop.h"

#include <utility>

#include "headless/display/SyntheticAppStateMonitor.h"
#include "headless/display/SyntheticDisplay.h"
#include "headless/display/SyntheticRenderServer.h"
#include "headless/sound/NotedSystemSounds.h"
#include "headless/sound/ToneTaps.h"
#include "linux/audio/LinuxAudioInputQueues.h"
#include "linux/audio/LinuxDeviceCapture.h"

namespace lumacast::headless {

HeadlessDesktop::HeadlessDesktop(const DesktopServices& services, Consent consent)
    : services_(services), consent_(consent), show_(services.clock.hostTime()) {}

SoundRoles HeadlessDesktop::makeSound() {
    auto taps = std::make_shared<ToneTaps>(show_, services_.applicationOf);
    auto openMicrophone = [microphone = microphone_](sound::MicrophoneListener listener) {
        return microphone.open(std::move(listener));
    };
    return {std::make_unique<LinuxAudioInputQueues>(std::move(taps), services_.clock),
            std::make_unique<LinuxDeviceCapture>(std::move(openMicrophone), services_.clock, services_.scheduler)};
}

DisplayRoles HeadlessDesktop::makeDisplay() {
    auto display = std::make_shared<SyntheticDisplay>(show_, services_.clock, services_.scheduler);
    auto isKnown = [&bundles = services_.bundles](const BundleIdentifier& identifier) {
        return bundles.withIdentifier(identifier) != nullptr;
    };
    return {display, display, std::make_unique<SyntheticRenderServer>(),
            std::make_unique<SyntheticAppStateMonitor>(std::move(isKnown), services_.applicationOf)};
}

AttentionRoles HeadlessDesktop::makeAttention() {
    Log& log = services_.log;
    auto noteAlert = [&log](const AlertContent& content, std::optional<UserAlert::Response> response) {
        log.line("nobody is here to be asked “%s”: %s", content.header,
                 !response                                       ? "it stays unanswered"
                 : *response == UserAlert::Response::OtherButton ? "refused by configuration"
                                                                 : "allowed by configuration");
    };
    auto noteSound = [&log](std::uint32_t sound) { log.line("the sound %u would be heard now", sound); };
    return {std::make_unique<SyntheticUserAlerts>(consent_, services_.scheduler, std::move(noteAlert)),
            std::make_unique<NotedSystemSounds>(std::move(noteSound))};
}

}  // namespace lumacast::headless
