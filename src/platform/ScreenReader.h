#pragma once

namespace lumacast {

/// The program that reads the screen to users who do not see it.
class ScreenReader {
public:
    virtual ~ScreenReader() = default;
    /// Whether it is running; false when nobody knows. Callable from any lane; never blocks.
    virtual bool isRunning() const = 0;
};

}  // namespace lumacast
