// The headless port.

#include <cstdio>
#include <cstdlib>
#include <memory>

#include "headless/HeadlessDesktop.h"
#include "linux/platform/LinuxPlatform.h"

namespace lumacast {

std::unique_ptr<PlatformOwner> makePlatform() {
    const char* const variable = std::getenv("LUMACAST_HEADLESS_CONSENT");
    const auto consent = headless::consentFrom(variable ? variable : "refuse");
    if (!consent) {
        std::fprintf(stderr, "lumacastd: LUMACAST_HEADLESS_CONSENT is refuse, allow or wait, not \"%s\"\n", variable);
        return nullptr;
    }
    return makePlatformOn([consent](const DesktopServices& services) {
        return std::make_unique<headless::HeadlessDesktop>(services, *consent);
    });
}

}  // namespace lumacast
