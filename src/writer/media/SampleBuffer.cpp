#include "writer/media/SampleBuffer.h"

#include <algorithm>

namespace lumacast {

SampleRef SampleBuffer::makeVideo(PixelBuffer image, MediaTime presentation, MediaTime duration) {
    const auto sample = std::make_shared<SampleBuffer>(Key());
    sample->format_.type = MediaType::Video;
    sample->timing_ = {duration, presentation, kInvalidMediaTime};
    sample->sampleCount_ = 1;
    sample->image_ = std::move(image);
    return sample;
}

SampleRef SampleBuffer::makeAudio(const AudioFormat& format, Data data, std::int64_t sampleCount, SampleTiming timing) {
    const auto sample = std::make_shared<SampleBuffer>(Key());
    sample->format_ = {MediaType::Audio, format};
    sample->timing_ = timing;
    sample->sampleCount_ = sampleCount;
    sample->data_ = std::make_shared<Data>(std::move(data));
    return sample;
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
