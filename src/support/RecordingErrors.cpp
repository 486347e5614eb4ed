#include "support/RecordingErrors.h"

#include "support/Localization.h"

namespace lumacast {

Error RecordingErrors::_lcUserErrorForCode(std::int64_t code, Dictionary userInfo) const {
    if (auto description = text(recordingErrorKey(code)))
        userInfo.set(std::string(kLocalizedDescriptionKey), std::move(*description));
    return Error(std::string(kRecordingErrorDomain), code, std::move(userInfo));
}

std::optional<std::string> RecordingErrors::text(std::string_view key) const {
    std::optional<std::string> found;
    texts_.update([&](const auto& texts) {
        if (const auto known = texts.find(key); known != texts.end()) found = known->second;
    });
    if (found) return found;
    found = localization_._lcLocalizedStringFromFrameworkBundleWithKey(key);
    if (found) texts_.update([&](auto& texts) { texts.insert_or_assign(std::string(key), *found); });
    return found;
}

void RecordingErrors::readTexts() const {
    for (auto code = static_cast<std::int64_t>(RecordingErrorCode::MixingFailure);
         code <= static_cast<std::int64_t>(RecordingErrorCode::UserDeclined) + 1; ++code)
        (void)text(recordingErrorKey(code));
}

}  // namespace lumacast
