#include "linux/audio/DeviceAudioSession.h"

#include <utility>

namespace lumacast::sound {

namespace {

struct Kept final : AudioSession::Registration {
    explicit Kept(std::shared_ptr<AudioSession::InterruptionHandler> handler) : handler(std::move(handler)) {}
    const std::shared_ptr<AudioSession::InterruptionHandler> handler;
};

}  // namespace

class DeviceAudioSession::State final : public std::enable_shared_from_this<State> {
public:
    explicit State(Scheduler& scheduler) : lane_(scheduler.serialQueue("audio session")) {}

    void observe(const std::shared_ptr<InterruptionHandler>& handler) {
        const std::lock_guard lock(mutex_);
        std::erase_if(handlers_, [](const auto& kept) { return kept.expired(); });
        handlers_.push_back(handler);
    }

    void change(Part& part, bool isInterrupted, bool closes) {
        {
            const std::lock_guard lock(mutex_);
            if (part.isClosed_) return;
            part.isClosed_ = closes;
            if (std::exchange(part.isInterrupted_, isInterrupted) == isInterrupted) return;
            interrupted_ += isInterrupted ? 1 : -1;
            // Only the first one's beginning and the last one's end.
            if (interrupted_ != (isInterrupted ? 1 : 0)) return;
            untold_.push_back(isInterrupted ? kInterruptionBegan : kInterruptionEnded);
        }
        lane_->async([self = shared_from_this()] { self->tell(); });
    }

private:
    void tell() {
        std::uint64_t type = 0;
        std::vector<std::shared_ptr<InterruptionHandler>> told;
        {
            const std::lock_guard lock(mutex_);
            type = untold_.front();
            untold_.pop_front();
            for (const auto& weak : handlers_)
                if (auto handler = weak.lock()) told.push_back(std::move(handler));
        }
        for (const auto& handler : told)
            if (*handler) (*handler)(type);
    }

    const std::shared_ptr<SerialQueue> lane_;
    std::mutex mutex_;
    std::vector<std::weak_ptr<InterruptionHandler>> handlers_;
    std::deque<std::uint64_t> untold_;  ///< in the order in which it came about, one for each task
    int interrupted_ = 0;               ///< parts
};

void DeviceAudioSession::Part::setInterrupted(bool isInterrupted) { state_->change(*this, isInterrupted, false); }
void DeviceAudioSession::Part::close() { state_->change(*this, false, true); }

DeviceAudioSession::DeviceAudioSession(Scheduler& scheduler) : state_(std::make_shared<State>(scheduler)) {}

bool DeviceAudioSession::setCategory(std::string_view category, std::uint32_t options) {
    return category == kPlayAndRecord && (options & ~(kMixWithOthers | kAllowBluetoothHandsFree)) == 0;
}

std::unique_ptr<AudioSession::Registration> DeviceAudioSession::observeInterruptions(InterruptionHandler handler) {
    auto kept = std::make_shared<InterruptionHandler>(std::move(handler));
    state_->observe(kept);
    return std::make_unique<Kept>(std::move(kept));
}

}  // namespace lumacast::sound
