#include "writer/media/SampleBuffer.h"

#include <algorithm>

namespace lumacast {

SampleRef SampleBuffer::makeVideo(PixelBuffer image, MediaTime presentation, MediaTime duration) {
    std::shared_ptr<SampleBuffer> sample(new SampleBuffer);
    sample->format_.type = MediaType::Video;
    sample->timing_.push_back({duration, presentation, kInvalidMediaTime});
    sample->sampleCount_ = 1;
    sample->image_ = std::move(image);
    return sample;
}

SampleRef SampleBuffer::makeAudio(const AudioFormat& format, Data data, std::int64_t sampleCount, SampleTiming timing) {
    std::shared_ptr<SampleBuffer> sample(new SampleBuffer);
    sample->format_ = {MediaType::Audio, format};
    sample->timing_.push_back(timing);
    sample->sampleCount_ = sampleCount;
    sample->data_ = std::make_shared<Data>(std::move(data));
    return sample;
}

SampleRef SampleBuffer::copyWithTiming(std::vector<SampleTiming> timing) const {
    std::shared_ptr<SampleBuffer> sample(new SampleBuffer(*this));
    sample->timing_ = std::move(timing);
    return sample;
}

void SampleBuffer::overwriteDataWithZero() const {
    if (data_) std::fill(data_->begin(), data_->end(), std::uint8_t{0});
}

MediaTime SampleBuffer::presentationTime() const {
    return timing_.empty() ? kInvalidMediaTime : timing_.front().presentation;
}

MediaTime SampleBuffer::duration() const { return timing_.empty() ? kInvalidMediaTime : timing_.front().duration; }

}  // namespace lumacast
