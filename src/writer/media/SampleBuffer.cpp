#include "writer/media/SampleBuffer.h"

#include <algorithm>

namespace lumacast {

SampleBuffer::SampleBuffer(Key, PixelBuffer image, MediaTime presentation, MediaTime duration)
    : format_{MediaType::Video, {}},
      timing_{duration, presentation, kInvalidMediaTime},
      sampleCount_(1),
      image_(std::move(image)) {}

SampleBuffer::SampleBuffer(Key, const AudioFormat& format, std::shared_ptr<Data> data, std::int64_t sampleCount,
                           const SampleTiming& timing)
    : format_{MediaType::Audio, format}, timing_(timing), sampleCount_(sampleCount), data_(std::move(data)) {}

SampleRef SampleBuffer::makeVideo(PixelBuffer image, MediaTime presentation, MediaTime duration) {
    return std::make_shared<SampleBuffer>(Key(), std::move(image), presentation, duration);
}

SampleRef SampleBuffer::makeAudio(const AudioFormat& format, Data data, std::int64_t sampleCount, SampleTiming timing) {
    return std::make_shared<SampleBuffer>(Key(), format, std::make_shared<Data>(std::move(data)), sampleCount, timing);
}

SampleRef SampleBuffer::copyWithTiming(std::vector<SampleTiming> timing) const {
    const auto sample = std::make_shared<SampleBuffer>(*this);
    sample->timingCount_ = std::min<std::size_t>(timing.size(), 1);
    sample->timing_ = timing.empty() ? SampleTiming{} : timing.front();
    sample->several_ = timing.size() > 1 ? std::move(timing) : std::vector<SampleTiming>();
    return sample;
}

void SampleBuffer::overwriteDataWithZero() const {
    if (data_) std::fill(data_->begin(), data_->end(), std::uint8_t{0});
}

MediaTime SampleBuffer::presentationTime() const {
    return timing().empty() ? kInvalidMediaTime : timing().front().presentation;
}

MediaTime SampleBuffer::duration() const { return timing().empty() ? kInvalidMediaTime : timing().front().duration; }

}  // namespace lumacast
