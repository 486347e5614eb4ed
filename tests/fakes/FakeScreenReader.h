#pragma once
#include <atomic>

#include "platform/ScreenReader.h"

namespace lumacast {

/// Runs when the test says so. Thread-safe.
class FakeScreenReader final : public ScreenReader {
public:
    bool isRunning() const override { return running_; }
    void setRunning(bool running) { running_ = running; }

private:
    std::atomic<bool> running_{false};
};

}  // namespace lumacast
