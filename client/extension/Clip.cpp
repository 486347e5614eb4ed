#include "client/extension/Clip.h"

#include <string>
#include <utility>

#include "broadcast/ConfigurationArchive.h"
#include "broadcast/PayloadKeys.h"
#include "client/extension/HostLink.h"
#include "linux/ipc/LinuxKeyedArchive.h"

namespace lumacast::extension {

ClipAnswer::ClipAnswer(std::shared_ptr<World> world, std::weak_ptr<HostLink> host, std::int64_t request)
    : world_(std::move(world)), host_(std::move(host)), request_(request) {}

ClipAnswer::ClipAnswer(ClipAnswer&& other) noexcept
    : world_(std::exchange(other.world_, nullptr)),
      host_(std::move(other.host_)),
      request_(other.request_),
      items_(std::move(other.items_)),
      error_(std::move(other.error_)) {}

ClipAnswer& ClipAnswer::operator=(ClipAnswer&& other) noexcept {
    if (this == &other) return *this;
    give();
    world_ = std::exchange(other.world_, nullptr);
    host_ = std::move(other.host_);
    request_ = other.request_;
    items_ = std::move(other.items_);
    error_ = std::move(other.error_);
    return *this;
}

ClipAnswer::~ClipAnswer() { give(); }

bool ClipAnswer::setConfiguration(const BroadcastConfiguration& configuration) {
    LinuxKeyedArchive archives;
    const auto archive = archiveOf(archives, configuration);
    if (!archive) return false;
    items_.push_back({std::string(kItemBroadcastConfiguration), {{std::string(kGenericDataType), *archive, std::nullopt}}});
    return true;
}

void ClipAnswer::setServiceInfo(Dictionary info) {
    items_.push_back({std::string(kItemServiceInfo), {{std::string(kGenericDataType), std::move(info), std::nullopt}}});
}

void ClipAnswer::fail(Error error) { error_ = std::move(error); }

void ClipAnswer::give() {
    const auto world = std::exchange(world_, nullptr);
    const auto host = world ? host_.lock() : nullptr;
    if (!host) return;
    if (error_)
        host->cancel(request_, error_);
    else
        host->complete(request_, items_);
}

}  // namespace lumacast::extension
