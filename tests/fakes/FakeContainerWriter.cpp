#include "tests/fakes/FakeContainerWriter.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <utility>

#include "tests/fakes/FakeError.h"

namespace lumacast {

namespace {

constexpr std::uint64_t kBytesOfPicture = 1000;
constexpr std::uint64_t kBytesOfIndex = 500;

/// What an encoder could take: even sides, a known codec, at most two channels.
bool canEncode(MediaType type, const Dictionary& settings) {
    const auto numberIn = [&](std::string_view key, double otherwise) {
        const Value* value = settings.find(key);
        if (!value) return otherwise;
        if (const auto* real = value->as<double>()) return *real;
        if (const auto* integer = value->as<std::int64_t>()) return static_cast<double>(*integer);
        if (const auto* natural = value->as<std::uint64_t>()) return static_cast<double>(*natural);
        return -1.0;
    };
    const auto isSide = [](double side) { return side >= 2 && side <= 8192 && std::fmod(side, 2.0) == 0; };
    if (type == MediaType::Audio) {
        const double channels = numberIn(AudioSettings::kNumberOfChannels, 1);
        return numberIn(AudioSettings::kFormatID, -1) == kAudioFormatAAC && (channels == 1 || channels == 2);
    }
    const Value* codec = settings.find(VideoSettings::kCodec);
    const auto* text = codec ? codec->as<std::string>() : nullptr;
    return text && *text == VideoSettings::kCodecH264 && isSide(numberIn(VideoSettings::kWidth, -1)) &&
           isSide(numberIn(VideoSettings::kHeight, -1));
}

class FakeTrackInput final : public TrackInput {
public:
    FakeTrackInput(std::shared_ptr<FakeRecording> recording, std::size_t track)
        : recording_(std::move(recording)), track_(track) {}
    void setExpectsMediaInRealTime(bool) override {}
    void setTransform(const AffineTransform& transform) override { recording_->setTransform(track_, transform); }
    bool isReadyForMoreMediaData() const override { return recording_->isReady(track_); }
    bool append(const SampleRef& sample) override { return recording_->append(track_, sample); }

private:
    const std::shared_ptr<FakeRecording> recording_;
    const std::size_t track_;
};

class FakeContainerWriter final : public ContainerWriter {
public:
    explicit FakeContainerWriter(std::shared_ptr<FakeRecording> recording) : recording_(std::move(recording)) {}
    ~FakeContainerWriter() override { recording_->abandon(); }

    std::shared_ptr<TrackInput> addVideoInput(const Dictionary& settings) override {
        return add(MediaType::Video, settings);
    }
    std::shared_ptr<TrackInput> addAudioInput(const Dictionary& settings) override {
        return add(MediaType::Audio, settings);
    }
    ContainerStatus status() const override { return recording_->status(); }
    std::optional<Error> error() const override { return recording_->error(); }
    URL outputURL() const override { return recording_->outputURL(); }
    bool startWriting() override { return recording_->startWriting(); }
    void startSession(MediaTime time) override { recording_->startSession(time); }
    void endSession(MediaTime time) override { recording_->endSession(time); }
    void finishWriting(std::function<void()> completion) override { recording_->finish(std::move(completion)); }
    std::uint64_t bytesWritten() const override { return recording_->bytesWritten(); }
    std::uint64_t picturesTaken() const override { return recording_->picturesTaken(); }

private:
    std::shared_ptr<TrackInput> add(MediaType type, const Dictionary& settings) {
        const auto track = recording_->addTrack(type, settings);
        return track ? std::make_shared<FakeTrackInput>(recording_, *track) : nullptr;
    }
    const std::shared_ptr<FakeRecording> recording_;
};

}  // namespace

FakeRecording::FakeRecording(FakeFileSystem& files, FaultPlan& faults, std::shared_ptr<SerialQueue> queue,
                             std::shared_ptr<CaptureClock> clock, URL outputURL, std::shared_ptr<FakeFile> file)
    : files_(files), faults_(faults), queue_(std::move(queue)), clock_(std::move(clock)),
      outputURL_(std::move(outputURL)), file_(std::move(file)) {}

std::optional<std::size_t> FakeRecording::addTrack(MediaType type, const Dictionary& settings) {
    const std::lock_guard lock(mutex_);
    const bool hasVideo = std::any_of(movie_.tracks.begin(), movie_.tracks.end(),
                                      [](const FakeTrack& track) { return track.type == MediaType::Video; });
    if (status_ != ContainerStatus::Unknown || !canEncode(type, settings)) return std::nullopt;
    if (type == MediaType::Video && hasVideo) return std::nullopt;
    movie_.tracks.push_back({type, settings, {}});
    inputs_.emplace_back();
    return inputs_.size() - 1;
}

void FakeRecording::setTransform(std::size_t track, const AffineTransform& transform) {
    const std::lock_guard lock(mutex_);
    if (status_ == ContainerStatus::Unknown) inputs_[track].transform = transform;
}

bool FakeRecording::isReady(std::size_t track) const {
    const std::lock_guard lock(mutex_);
    return inputs_[track].ready || movie_.tracks[track].samples.empty();
}

bool FakeRecording::append(std::size_t track, const SampleRef& sample) {
    if (!sample) return false;
    const MediaTime stamp = sample->presentationTime();
    const bool isVideo = sample->format().type == MediaType::Video;
    std::uint64_t bytes = isVideo ? kBytesOfPicture : sample->data()->size();
    {
        const std::lock_guard lock(mutex_);
        if (status_ != ContainerStatus::Writing || finishing_ || !movie_.start.isValid()) return false;
        if ((stamp.flags & ~MediaTime::kRounded) != MediaTime::kValid) return false;
        FakeTrack& into = movie_.tracks[track];
        if (into.type != sample->format().type) return false;
        if (!inputs_[track].ready && !into.samples.empty()) return false;
        const bool isRepeat = !into.samples.empty() && compare(stamp, into.samples.back()->presentationTime()) <= 0;
        const bool isEarly = isVideo && compare(stamp, movie_.start) < 0;
        const bool isLate = sessionEnd_ && compare(stamp, *sessionEnd_) > 0;
        if (isVideo && isRepeat && into.samples.size() > 1) ++repeats_;
        if (isRepeat || isEarly || isLate) return true;
        into.samples.push_back(sample);
        bytes_ += bytes;
        if (isVideo) ++pictures_;
    }
    if (faults_.fails("ContainerWriter.append") || !files_.append(*file_, bytes)) fail(fakeSystemError(ENOSPC));
    return true;
}

bool FakeRecording::startWriting() {
    const bool fails = faults_.fails("ContainerWriter.startWriting");
    const std::lock_guard lock(mutex_);
    if (status_ != ContainerStatus::Unknown || movie_.tracks.empty()) return false;
    if (fails) {
        failLocked(fakeSystemError(EIO));
        return false;
    }
    status_ = ContainerStatus::Writing;
    return true;
}

void FakeRecording::startSession(MediaTime time) {
    const std::lock_guard lock(mutex_);
    if (status_ == ContainerStatus::Writing && !movie_.start.isValid()) movie_.start = time;
}

void FakeRecording::endSession(MediaTime time) {
    const std::lock_guard lock(mutex_);
    if (status_ == ContainerStatus::Writing && movie_.start.isValid() && !finishing_) sessionEnd_ = time;
}

void FakeRecording::finish(std::function<void()> completion) {
    {
        const std::lock_guard lock(mutex_);
        completions_.push_back(std::move(completion));
        if (!finishing_ && clock_) clockAtFinish_ = clock_->now();
        finishing_ = true;
        if (status_ == ContainerStatus::Unknown) failLocked(fakeSystemError(ENODATA));
        if (held_) return;
    }
    queue_->async([self = shared_from_this()] { self->finishOnQueue(); });
}

void FakeRecording::finishOnQueue() {
    const bool fails = faults_.fails("ContainerWriter.finish");
    std::vector<std::function<void()>> completions;
    std::shared_ptr<const FakeMovie> finished;
    {
        const std::lock_guard lock(mutex_);
        if (held_) return;
        if (status_ == ContainerStatus::Writing) {
            if (fails)
                failLocked(fakeSystemError(EIO));
            else
                completeLocked();
            if (movie_.finished) finished = std::make_shared<const FakeMovie>(movie_);
        }
        completions.swap(completions_);
    }
    if (finished) {
        (void)files_.append(*file_, kBytesOfIndex);
        files_.setMovie(*file_, std::move(finished));
    }
    for (const auto& completion : completions)
        if (completion) completion();
}

void FakeRecording::completeLocked() {
    const std::optional<MediaTime> end = sessionEnd_ ? sessionEnd_ : clockAtFinish_;
    for (FakeTrack& track : movie_.tracks)
        std::erase_if(track.samples, [&](const SampleRef& sample) {
            return sessionEnd_ && compare(sample->presentationTime(), *sessionEnd_) > 0;
        });
    std::erase_if(movie_.tracks, [](const FakeTrack& track) { return track.samples.empty(); });
    if (movie_.tracks.empty()) return failLocked(fakeSystemError(ENODATA));
    const MediaTime last = subtract(add(movie_.start, movie_.duration()), kZeroMediaTime);
    movie_.end = end && compare(*end, last) > 0 ? *end : last;
    movie_.finished = true;
    bytes_ += kBytesOfIndex;
    status_ = ContainerStatus::Completed;
}

void FakeRecording::abandon() {
    const std::lock_guard lock(mutex_);
    abandoned_ = true;
    if (status_ == ContainerStatus::Writing && !finishing_) status_ = ContainerStatus::Cancelled;
    if (status_ == ContainerStatus::Unknown) status_ = ContainerStatus::Cancelled;
}

ContainerStatus FakeRecording::status() const {
    const std::lock_guard lock(mutex_);
    return status_;
}

std::optional<Error> FakeRecording::error() const {
    const std::lock_guard lock(mutex_);
    return error_;
}

std::uint64_t FakeRecording::picturesTaken() const {
    const std::lock_guard lock(mutex_);
    return pictures_;
}

std::uint64_t FakeRecording::bytesWritten() const {
    const std::lock_guard lock(mutex_);
    return bytes_;
}

FakeMovie FakeRecording::movie() const {
    const std::lock_guard lock(mutex_);
    return movie_;
}

std::optional<AffineTransform> FakeRecording::transform(std::size_t track) const {
    const std::lock_guard lock(mutex_);
    return track < inputs_.size() ? inputs_[track].transform : std::nullopt;
}

void FakeRecording::setReady(std::size_t track, bool ready) {
    const std::lock_guard lock(mutex_);
    inputs_[track].ready = ready;
}

void FakeRecording::failLocked(Error error) {
    if (status_ != ContainerStatus::Unknown && status_ != ContainerStatus::Writing) return;
    status_ = ContainerStatus::Failed;
    error_ = std::move(error);
}

void FakeRecording::fail(Error error) {
    const std::lock_guard lock(mutex_);
    failLocked(std::move(error));
}

void FakeRecording::holdFinish(bool hold) {
    {
        const std::lock_guard lock(mutex_);
        held_ = hold;
        if (hold || completions_.empty()) return;
    }
    queue_->async([self = shared_from_this()] { self->finishOnQueue(); });
}

// The maker

std::variant<std::unique_ptr<ContainerWriter>, Error> FakeContainerWriters::make(const URL& outputURL, ContainerType) {
    if (faults_.fails("ContainerWriters.make")) return fakeSystemError(EIO);
    auto file = files_.create(outputURL.path());
    if (Error* error = std::get_if<Error>(&file)) return std::move(*error);
    auto recording = std::make_shared<FakeRecording>(files_, faults_, scheduler_.serialQueue("container writer"),
                                                     clock_.captureClock(), outputURL, std::get<0>(std::move(file)));
    std::function<void()> whenMade;
    {
        const std::lock_guard lock(mutex_);
        recordings_.push_back(recording);
        whenMade = whenMade_;
    }
    if (whenMade) whenMade();
    return std::make_unique<FakeContainerWriter>(std::move(recording));
}

std::vector<std::shared_ptr<FakeRecording>> FakeContainerWriters::recordings() const {
    const std::lock_guard lock(mutex_);
    return recordings_;
}

std::shared_ptr<FakeRecording> FakeContainerWriters::lastRecording() const {
    const std::lock_guard lock(mutex_);
    return recordings_.empty() ? nullptr : recordings_.back();
}

void FakeContainerWriters::setWhenMade(std::function<void()> whenMade) {
    const std::lock_guard lock(mutex_);
    whenMade_.swap(whenMade);
}

}  // namespace lumacast
