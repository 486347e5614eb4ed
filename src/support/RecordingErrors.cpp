#include "support/RecordingErrors.h"

#include "support/Localization.h"

namespace lumacast {

Error RecordingErrors::_lcUserErrorForCode(std::int64_t code, Dictionary userInfo) const {
    if (const auto text = localization_._lcLocalizedStringFromFrameworkBundleWithKey(recordingErrorKey(code)))
        userInfo.set(std::string(kLocalizedDescriptionKey), *text);
    return Error(std::string(kRecordingErrorDomain), code, std::move(userInfo));
}

}  // namespace lumacast
