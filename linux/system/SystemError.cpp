#include "linux/system/SystemError.h"

#include <system_error>

namespace lumacast {

Error systemError(int errorNumber) {
    return Error(std::string(kSystemErrorDomain), errorNumber,
                 {{std::string(kLocalizedDescriptionKey), std::generic_category().message(errorNumber)}});
}

}  // namespace lumacast
