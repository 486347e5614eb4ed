#pragma once
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "base/Guarded.h"
#include "base/RecordingErrorCodes.h"
#include "base/Value.h"

namespace lumacast {

class Localization;

/// The one place that builds recording errors. Callable from any lane; a text that was found once is kept, so that lanes
/// which must not wait for the disk don't.
class RecordingErrors {
public:
    explicit RecordingErrors(Localization& localization) : localization_(localization) {}

    /// `_lcUserErrorForCode:userInfo:` — an error with this code, exactly as given, whose user info is `userInfo` with
    /// the code's localised description set over it. Without a localised text the user info stays as it is. Cannot
    /// fail.
    Error _lcUserErrorForCode(std::int64_t code, Dictionary userInfo = {}) const;
    Error _lcUserErrorForCode(RecordingErrorCode code, Dictionary userInfo = {}) const {
        return _lcUserErrorForCode(static_cast<std::int64_t>(code), std::move(userInfo));
    }

    /// Looks every text up that the daemon may need, waiting for the disk.
    void readTexts() const;

private:
    std::optional<std::string> text(std::string_view key) const;

    mutable Guarded<std::map<std::string, std::string, std::less<>>> texts_;
    Localization& localization_;
};

}  // namespace lumacast
