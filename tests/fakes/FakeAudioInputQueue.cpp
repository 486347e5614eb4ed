#include "tests/fakes/FakeAudioInputQueue.h"

#include <algorithm>
#include <chrono>
#include <string>
#include <utility>

#include "platform/RefusedAudioInputQueue.h"

namespace lumacast {

namespace {

/// How many buffers are handed over only when full, until one has come back.
constexpr std::size_t kKeptForLater = 5;

/// The format with what follows from its other fields, or none for one that no queue delivers.
std::optional<AudioFormat> completed(AudioFormat format) {
    const std::uint32_t bits = format.bitsPerChannel;
    const bool isFloat = (format.formatFlags & AudioFormat::kFlagFloat) != 0;
    if (format.formatID != kAudioFormatLinearPCM || !(format.sampleRate >= 8'000 && format.sampleRate <= 192'000) ||
        format.channelsPerFrame < 1 || format.channelsPerFrame > 2 ||
        (isFloat ? bits != 32 : bits != 16 && bits != 24 && bits != 32))
        return std::nullopt;
    constexpr std::uint32_t kKnownFlags = AudioFormat::kFlagFloat | AudioFormat::kFlagBigEndian |
                                          AudioFormat::kFlagSignedInteger | AudioFormat::kFlagPacked;
    const bool isInteger = (format.formatFlags & AudioFormat::kFlagSignedInteger) != 0;
    if ((format.formatFlags & ~kKnownFlags) != 0 || isFloat == isInteger) return std::nullopt;
    const std::uint32_t frame = bits / 8 * format.channelsPerFrame;
    if (format.framesPerPacket == 0) format.framesPerPacket = 1;
    if (format.bytesPerFrame == 0) format.bytesPerFrame = frame;
    if (format.bytesPerPacket == 0) format.bytesPerPacket = frame;
    if (format.bytesPerFrame != frame || format.bytesPerPacket != frame || format.framesPerPacket != 1)
        return std::nullopt;
    return format;
}

}  // namespace

FakeAudioInputQueue::FakeAudioInputQueue(std::shared_ptr<FakeSoundSettings> settings, const AudioFormat& format,
                                         InputCallback callback)
    : settings_(std::move(settings)),
      format_(format),
      lane_(settings_->scheduler.serialQueue("tap")),
      callback_(std::move(callback)) {}

std::int32_t FakeAudioInputQueue::checkLocked(const char* call) const {
    if (settings_->faults.fails(std::string("AudioInputQueue.") + call)) return kFailed;
    return disposed_ ? AudioStatus::kDisposed : AudioStatus::kSuccess;
}

std::int32_t FakeAudioInputQueue::setProcessTap(ProcessID pid) {
    const std::lock_guard lock(mutex_);
    if (const std::int32_t status = checkLocked("setProcessTap")) return status;
    if (running_) return AudioStatus::kBadState;
    if (number(pid) < 1) return AudioStatus::kNoSuchProcess;
    pid_ = pid;
    return AudioStatus::kSuccess;
}

std::int32_t FakeAudioInputQueue::streamFormat(AudioFormat& format) const {
    const std::lock_guard lock(mutex_);
    if (const std::int32_t status = checkLocked("streamFormat")) return status;
    format = format_;
    if (settings_->maximumPacketSize != 0) format.bytesPerPacket = 0;
    return AudioStatus::kSuccess;
}

std::int32_t FakeAudioInputQueue::maximumOutputPacketSize(std::uint32_t& bytes) const {
    const std::lock_guard lock(mutex_);
    if (const std::int32_t status = checkLocked("maximumOutputPacketSize")) return status;
    bytes = settings_->maximumPacketSize != 0 ? settings_->maximumPacketSize.load() : format_.bytesPerPacket;
    return AudioStatus::kSuccess;
}

std::int32_t FakeAudioInputQueue::allocateBuffer(std::uint32_t bytes, AudioQueueBufferRef& buffer) {
    const std::lock_guard lock(mutex_);
    if (const std::int32_t status = checkLocked("allocateBuffer")) return status;
    if (bytes < 1 || bytes > kMostBufferBytes) return AudioStatus::kBadSize;
    if (allocated_.size() >= kMostBuffers) return AudioStatus::kTooManyBuffers;
    buffer = std::make_shared<AudioQueueBuffer>();
    buffer->bytes.resize(bytes);
    if (bufferBytes_ == 0) bufferBytes_ = bytes;
    allocated_.push_back(buffer);
    return AudioStatus::kSuccess;
}

std::int32_t FakeAudioInputQueue::enqueueBuffer(const AudioQueueBufferRef& buffer) {
    const std::lock_guard lock(mutex_);
    if (const std::int32_t status = checkLocked("enqueueBuffer")) return status;
    if (!buffer || std::find(allocated_.begin(), allocated_.end(), buffer) == allocated_.end() ||
        std::find(enqueued_.begin(), enqueued_.end(), buffer) != enqueued_.end() ||
        std::find(filled_.begin(), filled_.end(), buffer) != filled_.end())
        return AudioStatus::kBadBuffer;
    if (std::find(handedOver_.begin(), handedOver_.end(), buffer.get()) != handedOver_.end()) cameBack_ = true;
    buffer->byteSize = 0;
    enqueued_.push_back(buffer);
    return AudioStatus::kSuccess;
}

std::int32_t FakeAudioInputQueue::freeBuffer(const AudioQueueBufferRef& buffer) {
    const std::lock_guard lock(mutex_);
    if (const std::int32_t status = checkLocked("freeBuffer")) return status;
    const auto found = std::find(allocated_.begin(), allocated_.end(), buffer);
    if (!buffer || found == allocated_.end()) return AudioStatus::kBadBuffer;
    std::erase(enqueued_, buffer);
    std::erase(filled_, buffer);
    allocated_.erase(found);
    return AudioStatus::kSuccess;
}

std::int32_t FakeAudioInputQueue::addIsRunningListener(IsRunningListener listener) {
    const std::lock_guard lock(mutex_);
    if (const std::int32_t status = checkLocked("addIsRunningListener")) return status;
    std::swap(listener_, listener);
    return AudioStatus::kSuccess;
}

std::int32_t FakeAudioInputQueue::removeIsRunningListener() {
    IsRunningListener old;
    const std::lock_guard lock(mutex_);
    if (const std::int32_t status = checkLocked("removeIsRunningListener")) return status;
    std::swap(listener_, old);
    return AudioStatus::kSuccess;
}

void FakeAudioInputQueue::tellRunning() {
    lane_->async([weak = weak_from_this()] {
        const auto self = weak.lock();
        if (!self) return;
        IsRunningListener listener;
        {
            const std::lock_guard lock(self->mutex_);
            listener = self->listener_;
        }
        if (listener) listener();
    });
}

std::int32_t FakeAudioInputQueue::start() {
    {
        const std::lock_guard lock(mutex_);
        if (const std::int32_t status = checkLocked("start")) return status;
        if (running_) return AudioStatus::kSuccess;
        running_ = true;
        ++run_;
        clock_ = settings_->clock.captureClock();
    }
    tellRunning();
    return AudioStatus::kSuccess;
}

std::int32_t FakeAudioInputQueue::stop() {
    {
        const std::lock_guard lock(mutex_);
        if (const std::int32_t status = checkLocked("stop")) return status;
        if (!running_) return AudioStatus::kSuccess;
        running_ = false;
        ++run_;
        enqueued_.insert(enqueued_.begin(), filled_.begin(), filled_.end());
        filled_.clear();
        for (const AudioQueueBufferRef& buffer : enqueued_) buffer->byteSize = 0;
    }
    tellRunning();
    return AudioStatus::kSuccess;
}

std::int32_t FakeAudioInputQueue::dispose() {
    InputCallback callback;
    IsRunningListener listener;
    std::vector<AudioQueueBufferRef> buffers;
    const std::lock_guard lock(mutex_);
    if (const std::int32_t status = checkLocked("dispose")) return status;
    running_ = false;
    disposed_ = true;
    ++run_;
    std::swap(callback_, callback);
    std::swap(listener_, listener);
    std::swap(allocated_, buffers);
    enqueued_.clear();
    filled_.clear();
    return AudioStatus::kSuccess;
}

Task FakeAudioInputQueue::handOverLocked(AudioQueueBufferRef buffer, const AudioTimeStamp& start, std::uint32_t packets,
                                         std::vector<AudioPacketDescription> descriptions) {
    filled_.push_back(buffer);
    return [weak = weak_from_this(), run = run_, buffer = std::move(buffer), start, packets,
                  descriptions = std::move(descriptions)] {
        const auto self = weak.lock();
        if (!self) return;
        InputCallback callback;
        {
            const std::lock_guard lock(self->mutex_);
            // Stopped or freed meanwhile.
            if (self->run_ != run || std::erase(self->filled_, buffer) == 0) return;
            self->handedOver_.push_back(buffer.get());
            callback = self->callback_;
        }
        if (callback) callback(buffer, start, packets, descriptions);
    };
}

void FakeAudioInputQueue::hear(std::uint32_t frames) {
    std::vector<Task> tasks;
    fill(frames, tasks);
    for (Task& task : tasks) lane_->async(std::move(task));
}

void FakeAudioInputQueue::fill(std::uint32_t frames, std::vector<Task>& tasks) {
    const std::lock_guard lock(mutex_);
    if (!running_ || !clock_ || !clock_->isRunning()) return;
    std::uint8_t byte = 0;
    {
        const std::lock_guard settingsLock(settings_->mutex);
        const auto playing = settings_->playing.find(pid_);
        if (playing != settings_->playing.end()) byte = playing->second;
    }
    const std::int64_t now = clock_->now().value;
    while (frames > 0) {
        if (enqueued_.empty()) {
            samples_ += frames;
            return;
        }
        AudioQueueBuffer& buffer = *enqueued_.front();
        const auto room = static_cast<std::uint32_t>(buffer.bytes.size() - buffer.byteSize) / format_.bytesPerFrame;
        const std::uint32_t part = std::min(frames, room);
        std::fill_n(buffer.bytes.begin() + buffer.byteSize, part * format_.bytesPerFrame, byte);
        buffer.byteSize += part * format_.bytesPerFrame;
        frames -= part;
        samples_ += part;
        const bool isFull = part == room;
        if (!isFull && !cameBack_ && enqueued_.size() <= kKeptForLater) return;
        AudioTimeStamp start;
        const std::uint32_t inBuffer = buffer.byteSize / format_.bytesPerFrame;
        const double after = static_cast<double>(inBuffer + frames) / format_.sampleRate;
        start.sampleTime = static_cast<double>(samples_ - inBuffer);
        start.hostTime = static_cast<std::uint64_t>(std::max<std::int64_t>(0, now - static_cast<std::int64_t>(after * 1e9)));
        start.flags = AudioTimeStamp::kSampleTimeValid | AudioTimeStamp::kHostTimeValid | AudioTimeStamp::kRateScalarValid;
        AudioQueueBufferRef filled = std::move(enqueued_.front());
        enqueued_.pop_front();
        tasks.push_back(handOverLocked(std::move(filled), start, inBuffer, {}));
    }
}

bool FakeAudioInputQueue::deliver(const Data& bytes, std::uint64_t hostTime, std::optional<std::uint32_t> packets,
                                  std::vector<AudioPacketDescription> descriptions) {
    Task task;
    {
        const std::lock_guard lock(mutex_);
        if (!running_ || enqueued_.empty()) return false;
        AudioQueueBufferRef buffer = std::move(enqueued_.front());
        enqueued_.pop_front();
        buffer->byteSize = static_cast<std::uint32_t>(std::min(bytes.size(), buffer->bytes.size()));
        std::copy_n(bytes.begin(), buffer->byteSize, buffer->bytes.begin());
        AudioTimeStamp start;
        start.hostTime = hostTime;
        start.flags = AudioTimeStamp::kHostTimeValid;
        const std::uint32_t count = packets.value_or(buffer->byteSize / format_.bytesPerFrame);
        task = handOverLocked(std::move(buffer), start, count, std::move(descriptions));
    }
    lane_->async(std::move(task));
    return true;
}

ProcessID FakeAudioInputQueue::process() const {
    const std::lock_guard lock(mutex_);
    return pid_;
}
bool FakeAudioInputQueue::isRunning() const {
    const std::lock_guard lock(mutex_);
    return running_;
}
bool FakeAudioInputQueue::isDisposed() const {
    const std::lock_guard lock(mutex_);
    return disposed_;
}
std::size_t FakeAudioInputQueue::allocatedBuffers() const {
    const std::lock_guard lock(mutex_);
    return allocated_.size();
}
std::size_t FakeAudioInputQueue::enqueuedBuffers() const {
    const std::lock_guard lock(mutex_);
    return enqueued_.size();
}
std::uint32_t FakeAudioInputQueue::bufferBytes() const {
    const std::lock_guard lock(mutex_);
    return bufferBytes_;
}
bool FakeAudioInputQueue::hasListener() const {
    const std::lock_guard lock(mutex_);
    return listener_ != nullptr;
}

AudioInputQueues::Made FakeAudioInputQueues::makeInputQueue(const AudioFormat& format,
                                                            AudioInputQueue::InputCallback callback,
                                                            std::uint32_t flags) {
    const auto refused = [](std::int32_t status) {
        return Made{status, std::make_shared<RefusedAudioInputQueue>(status)};
    };
    const std::lock_guard lock(mutex_);
    ++made_;
    lastFlags_ = flags;
    if (settings_->faults.fails("AudioInputQueues.makeInputQueue")) return refused(AudioStatus::kNoResources);
    if (flags != kCaptureProcessOutput) return refused(AudioStatus::kBadFlags);
    const auto whole = completed(format);
    if (!whole) return refused(AudioStatus::kBadFormat);
    auto queue = std::make_shared<FakeAudioInputQueue>(settings_, *whole, std::move(callback));
    std::erase_if(queues_, [](const auto& weak) { return weak.expired(); });
    queues_.push_back(queue);
    return {AudioStatus::kSuccess, std::move(queue)};
}

void FakeAudioInputQueues::play(ProcessID pid, std::uint8_t byte) {
    const std::lock_guard lock(settings_->mutex);
    settings_->playing[pid] = byte;
}

void FakeAudioInputQueues::hear(std::uint32_t frames) {
    for (const auto& queue : queues()) queue->hear(frames);
}

void FakeAudioInputQueues::hearAllTheTime(int milliseconds) {
    auto timer = settings_->scheduler.timer(settings_->scheduler.serialQueue("sound server"),
                                            std::chrono::milliseconds(milliseconds),
                                            [this, frames = static_cast<std::uint32_t>(44100 * milliseconds / 1000)] {
                                                hear(frames);
                                            });
    const std::lock_guard lock(mutex_);
    timer_.swap(timer);
}

std::vector<std::shared_ptr<FakeAudioInputQueue>> FakeAudioInputQueues::queues() const {
    const std::lock_guard lock(mutex_);
    std::vector<std::shared_ptr<FakeAudioInputQueue>> living;
    for (const auto& weak : queues_)
        if (auto queue = weak.lock()) living.push_back(std::move(queue));
    return living;
}

std::shared_ptr<FakeAudioInputQueue> FakeAudioInputQueues::lastQueue() const {
    const auto living = queues();
    return living.empty() ? nullptr : living.back();
}

std::uint64_t FakeAudioInputQueues::made() const {
    const std::lock_guard lock(mutex_);
    return made_;
}

std::uint32_t FakeAudioInputQueues::lastFlags() const {
    const std::lock_guard lock(mutex_);
    return lastFlags_;
}

}  // namespace lumacast
