#pragma once
#include "base/Identifiers.h"

namespace lumacast {

/// One installed broadcast upload extension: a program of its own that the platform can launch. Shared by whoever
/// broadcasts through it.
class AppExtension {
public:
    virtual ~AppExtension() = default;
    virtual BundleIdentifier identifier() const = 0;
};

}  // namespace lumacast
