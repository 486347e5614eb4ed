#pragma once
#include <memory>
#include <utility>

#include "linux/media/MovieRecording.h"
#include "platform/ContainerWriter.h"

namespace lumacast {

/// The role's face of a recording. The recording outlives it: what was asked for is still finished.
class LinuxContainerWriter final : public ContainerWriter {
public:
    LinuxContainerWriter(std::shared_ptr<media::MovieRecording> recording, URL outputURL)
        : recording_(std::move(recording)), outputURL_(std::move(outputURL)) {}
    ~LinuxContainerWriter() override { recording_->abandon(); }

    std::shared_ptr<TrackInput> addVideoInput(const Dictionary& settings) override;
    std::shared_ptr<TrackInput> addAudioInput(const Dictionary& settings) override;
    ContainerStatus status() const override { return recording_->status(); }
    std::optional<Error> error() const override { return recording_->error(); }
    URL outputURL() const override { return outputURL_; }
    bool startWriting() override { return recording_->startWriting(); }
    void startSession(MediaTime time) override { recording_->startSession(time); }
    void endSession(MediaTime time) override { recording_->endSession(time); }
    void finishWriting(std::function<void()> completion) override { recording_->finish(std::move(completion)); }
    std::uint64_t bytesWritten() const override { return recording_->bytesWritten(); }
    std::uint64_t picturesTaken() const override { return recording_->picturesTaken(); }

private:
    std::shared_ptr<TrackInput> addTrack(media::TrackPlan plan);

    const std::shared_ptr<media::MovieRecording> recording_;
    const URL outputURL_;
};

}  // namespace lumacast
