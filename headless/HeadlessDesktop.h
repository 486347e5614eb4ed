#pragma once
#include <memory>

#include "headless/Show.h"
#include "headless/sound/SyntheticMicrophone.h"
#include "headless/user/SyntheticUserAlerts.h"
#include "linux/platform/DesktopRoles.h"

namespace lumacast::headless {

/// A desktop that needs neither a display nor a sound server: what is seen and heard is computed.
class HeadlessDesktop final : public DesktopRoles {
public:
    HeadlessDesktop(const DesktopServices& services, Consent consent);

    SoundRoles makeSound() override;
    DisplayRoles makeDisplay() override;
    AttentionRoles makeAttention() override;

private:
    const DesktopServices services_;
    const Consent consent_;
    const Show show_;
    SyntheticMicrophone microphone_;
};

}  // namespace lumacast::headless
