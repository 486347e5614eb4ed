#pragma once
#include <functional>
#include <memory>
#include <optional>
#include <utility>

#include "headless/Show.h"
#include "linux/audio/TapSource.h"

namespace lumacast::headless {

/// What processes play where there is no sound server: every application the show's tones, everybody else nothing. The
/// tones are computed when they are read, so there is no thread, and nothing that could be late.
class ToneTaps final : public sound::TapSource {
public:
    using ApplicationOf = std::function<std::optional<BundleIdentifier>(ProcessID pid)>;

    ToneTaps(const Show& show, ApplicationOf applicationOf) : show_(show), applicationOf_(std::move(applicationOf)) {}

    std::shared_ptr<sound::TappedProcess> hold(ProcessID pid) override;

private:
    const Show show_;
    const ApplicationOf applicationOf_;
};

}  // namespace lumacast::headless
