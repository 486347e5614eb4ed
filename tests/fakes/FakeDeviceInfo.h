#pragma once
#include "base/Guarded.h"
#include "platform/DeviceInfo.h"

namespace lumacast {

/// A device that answers what the test says; nothing at first. Thread-safe.
class FakeDeviceInfo final : public DeviceInfo {
public:
    std::optional<std::int64_t> userInterfaceIdiom() const override { return idiom_.get(); }
    std::optional<std::int64_t> chipID() const override { return chip_.get(); }
    std::optional<std::int64_t> reducedCaptureChipID() const override { return reducedChip_.get(); }

    void setUserInterfaceIdiom(std::optional<std::int64_t> idiom) { idiom_.set(idiom); }
    void setChipID(std::optional<std::int64_t> chip) { chip_.set(chip); }
    void setReducedCaptureChipID(std::optional<std::int64_t> chip) { reducedChip_.set(chip); }

private:
    Guarded<std::optional<std::int64_t>> idiom_, chip_, reducedChip_;
};

}  // namespace lumacast
