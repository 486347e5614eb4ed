#pragma once
#include "platform/AppExtension.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// The installed extensions of this device.
class LinuxAppExtensions final : public AppExtensions {
public:
    explicit LinuxAppExtensions(Scheduler& scheduler) : queue_(scheduler.serialQueue("extensions")) {}
    void setContextClass(ExtensionContextClass contextClass) override { contextClass_ = std::move(contextClass); }
    void extensionsWithMatchingPoint(const std::string&, Matched handler) override {
        queue_->async([handler = std::move(handler)] { handler({}, std::nullopt); });
    }

private:
    const std::shared_ptr<SerialQueue> queue_;
    ExtensionContextClass contextClass_;
};

}  // namespace lumacast
