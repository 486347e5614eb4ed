#include "headless/sound/ToneTaps.h"

#include "linux/system/HeldProcess.h"

namespace lumacast::headless {

namespace {

using sound::SoundLane;
using sound::TapMix;

/// One stream of a mix, until it is let go of.
class Stream final : public sound::Listening {
public:
    Stream(std::shared_ptr<TapMix> mix, SoundLane::Computed played)
        : mix_(std::move(mix)), lane_(mix_->addComputedLane(std::move(played))) {}
    ~Stream() override { mix_->discardLane(lane_); }

private:
    const std::shared_ptr<TapMix> mix_;
    const std::shared_ptr<SoundLane> lane_;
};

/// Nothing to listen to.
class Silence final : public sound::Listening {};

class ToneProcess final : public sound::TappedProcess {
public:
    ToneProcess(const Show& show, bool plays) : show_(show), plays_(plays) {}

    std::unique_ptr<sound::Listening> listen(std::shared_ptr<TapMix> mix) override {
        if (!plays_) return std::make_unique<Silence>();
        auto tones = [show = show_, rate = mix->rate(), channels = mix->channels()](
                         HostTime moment, std::span<float> samples) { show.addTones(moment, rate, channels, samples); };
        return std::make_unique<Stream>(std::move(mix), std::move(tones));
    }

private:
    const Show show_;
    const bool plays_;
};

}  // namespace

std::shared_ptr<sound::TappedProcess> ToneTaps::hold(ProcessID pid) {
    if (!HeldProcess::hold(pid)) return nullptr;
    return std::make_shared<ToneProcess>(show_, applicationOf_(pid).has_value());
}

}  // namespace lumacast::headless
