#pragma once
#include <memory>

namespace lumacast {

/// Something that is shown in the status bar; destroying it takes it away. This platform has no status bar: nothing makes
/// one.
class StatusBarOverride {
public:
    virtual ~StatusBarOverride() = default;
};

/// Grants overrides, and reports taps on them and their end.
class StatusBarStyleCoordinator {
public:
    virtual ~StatusBarStyleCoordinator() = default;
};

}  // namespace lumacast
