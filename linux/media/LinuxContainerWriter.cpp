#include "linux/media/LinuxContainerWriter.h"

namespace lumacast {

namespace {

class LinuxTrackInput final : public TrackInput {
public:
    LinuxTrackInput(std::shared_ptr<media::MovieRecording> recording, std::size_t track)
        : recording_(std::move(recording)), track_(track) {}

    /// Nothing to choose: the encoders never hold a sample back.
    void setExpectsMediaInRealTime(bool) override {}
    void setTransform(const AffineTransform& transform) override { recording_->setTransform(track_, transform); }
    bool isReadyForMoreMediaData() const override { return recording_->hasRoom(track_); }
    bool append(const SampleRef& sample) override { return recording_->append(track_, sample); }

private:
    const std::shared_ptr<media::MovieRecording> recording_;
    const std::size_t track_;
};

}  // namespace

std::shared_ptr<TrackInput> LinuxContainerWriter::addVideoInput(const Dictionary& settings) {
    const auto parsed = media::VideoTrackSettings::parse(settings);
    return parsed ? addTrack({*parsed, {}}) : nullptr;
}

std::shared_ptr<TrackInput> LinuxContainerWriter::addAudioInput(const Dictionary& settings) {
    const auto parsed = media::AudioTrackSettings::parse(settings);
    return parsed ? addTrack({*parsed, {}}) : nullptr;
}

std::shared_ptr<TrackInput> LinuxContainerWriter::addTrack(media::TrackPlan plan) {
    const auto track = recording_->addTrack(std::move(plan));
    return track ? std::make_shared<LinuxTrackInput>(recording_, *track) : nullptr;
}

}  // namespace lumacast
