#pragma once
#include <atomic>
#include <map>
#include <mutex>
#include <string>

#include "base/Guarded.h"
#include "platform/DeviceInfo.h"

namespace lumacast {

/// A device that answers what the test says; nothing at first. Thread-safe.
class FakeDeviceInfo final : public DeviceInfo {
public:
    std::optional<std::int64_t> userInterfaceIdiom() const override { return ++questions_, idiom_.get(); }
    std::optional<std::int64_t> chipID() const override { return ++questions_, chip_.get(); }
    std::optional<std::int64_t> reducedCaptureChipID() const override { return reducedChip_.get(); }

    std::optional<bool> regionalRule(std::string_view name) const override {
        const std::lock_guard lock(rulesMutex_);
        const auto found = rules_.find(std::string(name));
        return found == rules_.end() ? std::nullopt : std::optional(found->second);
    }

    void setUserInterfaceIdiom(std::optional<std::int64_t> idiom) { idiom_.set(idiom); }
    void setChipID(std::optional<std::int64_t> chip) { chip_.set(chip); }
    void setReducedCaptureChipID(std::optional<std::int64_t> chip) { reducedChip_.set(chip); }
    void setRegionalRule(std::string_view name, std::optional<bool> value) {
        const std::lock_guard lock(rulesMutex_);
        rules_.erase(std::string(name));
        if (value) rules_.emplace(name, *value);
    }

    /// How often it was asked for its idiom or its chip.
    int questions() const { return questions_; }

private:
    mutable std::atomic<int> questions_{0};
    Guarded<std::optional<std::int64_t>> idiom_, chip_, reducedChip_;
    mutable std::mutex rulesMutex_;
    std::map<std::string, bool> rules_;
};

}  // namespace lumacast
