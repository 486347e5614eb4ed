#include "linux/audio/LinuxDeviceCaptureSession.h"

#include <algorithm>

#include "linux/audio/DeviceSamples.h"

namespace lumacast {

using sound::DeviceAudioOutput;

LinuxDeviceCaptureSession::LinuxDeviceCaptureSession(DeviceServices services, Scheduler& scheduler)
    : services_(std::move(services)), lane_(scheduler.serialQueue("capture session")) {}

void LinuxDeviceCaptureSession::setUsesApplicationAudioSession(bool uses) {
    const std::lock_guard lock(mutex_);
    usesAudioSession_ = uses;
}

bool LinuxDeviceCaptureSession::canAddInputLocked(const std::shared_ptr<CaptureInput>& input) const {
    return !input_ && dynamic_cast<const MicrophoneInput*>(input.get());
}

bool LinuxDeviceCaptureSession::canAddOutputLocked(const std::shared_ptr<CaptureOutput>& output) const {
    return !output_ && dynamic_cast<const DeviceAudioOutput*>(output.get());
}

bool LinuxDeviceCaptureSession::canAddInput(const std::shared_ptr<CaptureInput>& input) const {
    const std::lock_guard lock(mutex_);
    return canAddInputLocked(input);
}

bool LinuxDeviceCaptureSession::canAddOutput(const std::shared_ptr<CaptureOutput>& output) const {
    const std::lock_guard lock(mutex_);
    return canAddOutputLocked(output);
}

void LinuxDeviceCaptureSession::addInput(const std::shared_ptr<CaptureInput>& input) {
    Opening closed;
    const std::lock_guard lock(mutex_);
    if (!canAddInputLocked(input)) return;
    input_ = input;
    closed = updateLocked();
}

void LinuxDeviceCaptureSession::removeInput(const std::shared_ptr<CaptureInput>& input) {
    Opening closed;
    const std::lock_guard lock(mutex_);
    if (!input || input_ != input) return;
    input_ = nullptr;
    closed = updateLocked();
}

void LinuxDeviceCaptureSession::addOutput(const std::shared_ptr<CaptureOutput>& output) {
    Opening closed;
    const std::lock_guard lock(mutex_);
    if (!canAddOutputLocked(output)) return;
    output_ = std::static_pointer_cast<DeviceAudioOutput>(output);
    closed = updateLocked();
}

void LinuxDeviceCaptureSession::removeOutput(const std::shared_ptr<CaptureOutput>& output) {
    Opening closed;
    const std::lock_guard lock(mutex_);
    if (!output || output_ != output) return;
    output_ = nullptr;  // the caller still has it
    closed = updateLocked();
}

void LinuxDeviceCaptureSession::startRunning() {
    auto clock = services_.clock.captureClock();
    std::vector<std::weak_ptr<CaptureSessionObserver>> observers;
    {
        const std::lock_guard lock(mutex_);
        if (running_) return;
        running_ = true;
        clock_ = std::move(clock);
        (void)updateLocked();  // nothing was open
        observers = observersOfRunningLocked();
    }
    tellRunning(observers);
}

void LinuxDeviceCaptureSession::stopRunning() {
    Opening closed;
    std::vector<std::weak_ptr<CaptureSessionObserver>> observers;
    {
        const std::lock_guard lock(mutex_);
        if (!running_) return;
        running_ = false;
        closed = updateLocked();
        observers = observersOfRunningLocked();
    }
    tellRunning(observers);
}

bool LinuxDeviceCaptureSession::isRunning() const {
    const std::lock_guard lock(mutex_);
    return running_;
}

LinuxDeviceCaptureSession::Opening LinuxDeviceCaptureSession::updateLocked() {
    const bool isWanted = running_ && input_ && output_;
    if (isWanted == (opening_.microphone != nullptr)) return {};
    if (isWanted) {
        openLocked();
        return {};
    }
    ++openings_;
    // Before the microphone is told that its server has gone: a stop is no interruption.
    if (opening_.part) opening_.part->close();
    return std::exchange(opening_, {});
}

void LinuxDeviceCaptureSession::openLocked() {
    Opening opening;
    if (usesAudioSession_) opening.part = services_.audioSession.makePart();
    opening.microphone = services_.openMicrophone({
        [weak = weak_from_this(), number = ++openings_](const sound::SoundTimeline& timeline, std::int64_t first,
                                                        std::span<const float> samples) {
            if (const auto self = weak.lock()) self->heard(number, timeline, first, samples);
        },
        [weak = std::weak_ptr(opening.part)](bool isInterrupted) {
            if (const auto part = weak.lock()) part->setInterrupted(isInterrupted);
        }});
    // Without a thread for it there are no samples; the next change tries again.
    if (opening.microphone) opening_ = std::move(opening);
}

void LinuxDeviceCaptureSession::heard(std::uint64_t number, const sound::SoundTimeline& timeline, std::int64_t first,
                                      std::span<const float> samples) {
    std::shared_ptr<CaptureClock> clock;
    std::shared_ptr<DeviceAudioOutput> output;
    {
        const std::lock_guard lock(mutex_);
        if (number != openings_) return;
        clock = clock_;
        output = output_;
    }
    if (!clock || !output) return;
    for (SampleRef& sample : sound::stampedSamples(*clock, timeline, first, samples)) output->deliver(std::move(sample));
}

std::vector<std::weak_ptr<CaptureSessionObserver>> LinuxDeviceCaptureSession::observersOfRunningLocked() const {
    std::vector<std::weak_ptr<CaptureSessionObserver>> observers;
    for (const Observation& observation : observations_)
        if (observation.keyPath == kRunning) observers.push_back(observation.observer);
    return observers;
}

void LinuxDeviceCaptureSession::tellRunning(const std::vector<std::weak_ptr<CaptureSessionObserver>>& observers) {
    for (const auto& observer : observers) {
        lane_->async([observer] {
            if (const auto told = observer.lock()) told->observeValueForKeyPath(kRunning);
        });
    }
}

void LinuxDeviceCaptureSession::addObserver(std::weak_ptr<CaptureSessionObserver> observer, std::string_view keyPath) {
    const auto held = observer.lock();
    if (!held) return;
    const std::lock_guard lock(mutex_);
    std::erase_if(observations_, [](const Observation& one) { return one.observer.expired(); });
    observations_.push_back({std::string(keyPath), held.get(), std::move(observer)});
}

bool LinuxDeviceCaptureSession::removeObserver(const CaptureSessionObserver* observer, std::string_view keyPath) {
    const std::lock_guard lock(mutex_);
    const auto found = std::find_if(observations_.begin(), observations_.end(), [&](const Observation& one) {
        return one.key == observer && one.keyPath == keyPath && !one.observer.expired();
    });
    if (found == observations_.end()) return false;
    observations_.erase(found);
    return true;
}

}  // namespace lumacast
