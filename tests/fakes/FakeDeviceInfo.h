#pragma once
#include <atomic>

#include "base/Guarded.h"
#include "platform/DeviceInfo.h"

namespace lumacast {

/// A device that answers what the test says; nothing at first. Thread-safe.
class FakeDeviceInfo final : public DeviceInfo {
public:
    std::optional<std::int64_t> userInterfaceIdiom() const override { return ++questions_, idiom_.get(); }
    std::optional<std::int64_t> chipID() const override { return ++questions_, chip_.get(); }
    std::optional<std::int64_t> reducedCaptureChipID() const override { return reducedChip_.get(); }

    void setUserInterfaceIdiom(std::optional<std::int64_t> idiom) { idiom_.set(idiom); }
    void setChipID(std::optional<std::int64_t> chip) { chip_.set(chip); }
    void setReducedCaptureChipID(std::optional<std::int64_t> chip) { reducedChip_.set(chip); }

    /// How often it was asked for its idiom or its chip.
    int questions() const { return questions_; }

private:
    mutable std::atomic<int> questions_{0};
    Guarded<std::optional<std::int64_t>> idiom_, chip_, reducedChip_;
};

}  // namespace lumacast
