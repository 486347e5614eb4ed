#include "headless/sound/SyntheticMicrophone.h"

#include <chrono>
#include <cmath>
#include <condition_variable>
#include <mutex>
#include <numbers>
#include <utility>
#include <vector>

#include "linux/audio/DeviceSamples.h"
#include "linux/system/LinuxClock.h"
#include "linux/system/Threads.h"

namespace lumacast::headless {

namespace {

constexpr std::chrono::milliseconds kPiece{20};
/// What a late thread makes up for; the rest was not heard.
constexpr std::int64_t kMostFrames = 44100;

/// One opening: what it shares with its thread.
class Opening final {
public:
    Opening(sound::MicrophoneListener listener, std::shared_ptr<std::atomic<bool>> isTaken)
        : listener_(std::move(listener)),
          isTaken_(std::move(isTaken)),
          timeline_{LinuxClock::currentHostTime(), sound::microphoneFormat().sampleRate} {}

    void close() {
        const std::lock_guard lock(mutex_);
        isClosed_ = true;
        changed_.notify_all();
    }
    /// The thread's body.
    void run() {
        while (!isClosedAfter(kPiece)) hear();
    }

private:
    bool isClosedAfter(std::chrono::milliseconds time) {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, time, [this] { return isClosed_; });
    }
    void hear() {
        const std::int64_t end = timeline_.frameAt(LinuxClock::currentHostTime());
        const std::int64_t first = std::max(next_, end - kMostFrames);
        next_ = end;
        const bool isTaken = *isTaken_;
        if (std::exchange(wasTaken_, isTaken) != isTaken) listener_.interrupted(isTaken);
        if (isTaken || first >= end) return;
        std::vector<float> samples(static_cast<std::size_t>(end - first));
        for (std::size_t frame = 0; frame < samples.size(); ++frame) {
            const double seconds =
                std::fmod(static_cast<double>(first) + static_cast<double>(frame), timeline_.rate) / timeline_.rate;
            samples[frame] = static_cast<float>(SyntheticMicrophone::kAmplitude *
                                                std::sin(2 * std::numbers::pi * SyntheticMicrophone::kTone * seconds));
        }
        listener_.heard(timeline_, first, samples);
    }

    const sound::MicrophoneListener listener_;
    const std::shared_ptr<std::atomic<bool>> isTaken_;
    const sound::SoundTimeline timeline_;
    std::mutex mutex_;
    std::condition_variable changed_;
    bool isClosed_ = false;
    // Of the thread alone.
    std::int64_t next_ = 0;
    bool wasTaken_ = false;
};

class OpenUntilLetGo final : public sound::Listening {
public:
    explicit OpenUntilLetGo(std::shared_ptr<Opening> opening) : opening_(std::move(opening)) {}
    ~OpenUntilLetGo() override { opening_->close(); }

private:
    const std::shared_ptr<Opening> opening_;
};

}  // namespace

std::unique_ptr<sound::Listening> SyntheticMicrophone::open(sound::MicrophoneListener listener) const {
    auto opening = std::make_shared<Opening>(std::move(listener), isTaken_);
    if (!startDetachedThread([opening] { opening->run(); })) return nullptr;
    return std::make_unique<OpenUntilLetGo>(std::move(opening));
}

}  // namespace lumacast::headless
