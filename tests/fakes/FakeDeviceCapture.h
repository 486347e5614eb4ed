#pragma once
// A microphone whose samples, and an audio session whose interruptions, the test decides on.

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "platform/DeviceCapture.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {

class FakeCaptureInput final : public CaptureInput {};

class FakeCaptureOutput final : public CaptureOutput, public std::enable_shared_from_this<FakeCaptureOutput> {
public:
    void setSampleBufferDelegate(std::weak_ptr<CaptureOutputDelegate> delegate,
                                 std::shared_ptr<SerialQueue> queue) override {
        const std::lock_guard lock(mutex_);
        delegate_ = std::move(delegate);
        queue_ = std::move(queue);
    }
    void deliver(SampleRef sample) {
        std::weak_ptr<CaptureOutputDelegate> whom;
        std::shared_ptr<SerialQueue> where;
        {
            const std::lock_guard lock(mutex_);
            whom = delegate_;
            where = queue_;
        }
        if (!where) return;
        where->async([self = shared_from_this(), delegate = std::move(whom), sample = std::move(sample)] {
            if (const auto told = delegate.lock()) told->captureOutputDidOutputSampleBuffer(self, sample);
        });
    }

private:
    std::mutex mutex_;
    std::weak_ptr<CaptureOutputDelegate> delegate_;
    std::shared_ptr<SerialQueue> queue_;
};

/// Runs as soon as it is started, unless it is told to wait. Changes are told on a serial queue of its own.
class FakeDeviceCaptureSession final : public DeviceCaptureSession,
                                       public std::enable_shared_from_this<FakeDeviceCaptureSession> {
public:
    explicit FakeDeviceCaptureSession(Scheduler& scheduler) : lane_(scheduler.serialQueue("capture session")) {}

    void setUsesApplicationAudioSession(bool uses) override { usesApplicationAudioSession = uses; }
    void setAutomaticallyConfiguresApplicationAudioSession(bool configures) override {
        configuresAutomatically = configures;
    }
    bool canAddInput(const std::shared_ptr<CaptureInput>& input) const override {
        const std::lock_guard lock(mutex_);
        return accepts && dynamic_cast<const FakeCaptureInput*>(input.get()) && inputs_.empty();
    }
    void addInput(const std::shared_ptr<CaptureInput>& input) override {
        if (!canAddInput(input)) return;
        const std::lock_guard lock(mutex_);
        inputs_.push_back(input);
    }
    void removeInput(const std::shared_ptr<CaptureInput>& input) override {
        const std::lock_guard lock(mutex_);
        std::erase(inputs_, input);
    }
    bool canAddOutput(const std::shared_ptr<CaptureOutput>& output) const override {
        const std::lock_guard lock(mutex_);
        return accepts && dynamic_cast<const FakeCaptureOutput*>(output.get()) && outputs_.empty();
    }
    void addOutput(const std::shared_ptr<CaptureOutput>& output) override {
        if (!canAddOutput(output)) return;
        const std::lock_guard lock(mutex_);
        outputs_.push_back(output);
    }
    void removeOutput(const std::shared_ptr<CaptureOutput>& output) override {
        const std::lock_guard lock(mutex_);
        std::erase(outputs_, output);
    }
    void startRunning() override { setRunning(true); }
    void stopRunning() override { setRunning(false); }
    bool isRunning() const override {
        const std::lock_guard lock(mutex_);
        return running_;
    }
    void addObserver(std::weak_ptr<CaptureSessionObserver> observer, std::string_view keyPath) override {
        const std::lock_guard lock(mutex_);
        observers_.emplace_back(std::string(keyPath), std::move(observer));
    }
    bool removeObserver(const CaptureSessionObserver* observer, std::string_view keyPath) override {
        const std::lock_guard lock(mutex_);
        const auto found = std::find_if(observers_.begin(), observers_.end(), [&](const auto& entry) {
            return entry.first == keyPath && entry.second.lock().get() == observer;
        });
        if (found == observers_.end()) return false;
        observers_.erase(found);
        return true;
    }

    /// A sample of the microphone, to every output, if the session runs and has an input.
    void deliver(const SampleRef& sample) {
        std::vector<std::shared_ptr<CaptureOutput>> outputs;
        {
            const std::lock_guard lock(mutex_);
            if (running_ && !inputs_.empty()) outputs = outputs_;
        }
        for (const auto& output : outputs) static_cast<FakeCaptureOutput&>(*output).deliver(sample);
    }
    /// The key paths observed now, in order.
    std::vector<std::string> observed() const {
        const std::lock_guard lock(mutex_);
        std::vector<std::string> paths;
        for (const auto& [path, observer] : observers_) paths.push_back(path);
        return paths;
    }
    std::size_t inputCount() const {
        const std::lock_guard lock(mutex_);
        return inputs_.size();
    }
    std::size_t outputCount() const {
        const std::lock_guard lock(mutex_);
        return outputs_.size();
    }

    std::atomic<bool> usesApplicationAudioSession{false}, configuresAutomatically{true}, accepts{true};

private:
    void setRunning(bool running) {
        std::vector<std::weak_ptr<CaptureSessionObserver>> whom;
        {
            const std::lock_guard lock(mutex_);
            if (running_ == running) return;
            running_ = running;
            for (const auto& [path, observer] : observers_)
                if (path == kRunning) whom.push_back(observer);
        }
        for (const auto& observer : whom) {
            lane_->async([observer] {
                if (const auto told = observer.lock()) told->observeValueForKeyPath(kRunning);
            });
        }
    }

    const std::shared_ptr<SerialQueue> lane_;
    mutable std::mutex mutex_;
    bool running_ = false;
    std::vector<std::shared_ptr<CaptureInput>> inputs_;
    std::vector<std::shared_ptr<CaptureOutput>> outputs_;
    std::vector<std::pair<std::string, std::weak_ptr<CaptureSessionObserver>>> observers_;
};

/// Interruptions come inline from interrupt().
class FakeAudioSession final : public AudioSession {
public:
    bool setCategory(std::string_view category, std::uint32_t options) override {
        const std::lock_guard lock(mutex_);
        if (category != kPlayAndRecord || (options & ~(kMixWithOthers | kAllowBluetoothHandsFree)) != 0) return false;
        category_ = category;
        options_ = options;
        return true;
    }
    [[nodiscard]] std::unique_ptr<Registration> observeInterruptions(InterruptionHandler handler) override {
        auto kept = std::make_shared<InterruptionHandler>(std::move(handler));
        const std::lock_guard lock(mutex_);
        handlers_.push_back(kept);
        return std::make_unique<Kept>(std::move(kept));
    }
    void interrupt(std::uint64_t type) {
        std::vector<std::shared_ptr<InterruptionHandler>> told;
        {
            const std::lock_guard lock(mutex_);
            for (const auto& weak : handlers_)
                if (auto handler = weak.lock()) told.push_back(std::move(handler));
        }
        for (const auto& handler : told) (*handler)(type);
    }
    std::string category() const {
        const std::lock_guard lock(mutex_);
        return category_;
    }
    std::uint32_t options() const {
        const std::lock_guard lock(mutex_);
        return options_;
    }
    std::size_t observerCount() const {
        const std::lock_guard lock(mutex_);
        return static_cast<std::size_t>(
            std::count_if(handlers_.begin(), handlers_.end(), [](const auto& weak) { return !weak.expired(); }));
    }

private:
    struct Kept final : Registration {
        explicit Kept(std::shared_ptr<InterruptionHandler> handler) : handler(std::move(handler)) {}
        const std::shared_ptr<InterruptionHandler> handler;
    };
    mutable std::mutex mutex_;
    std::string category_;
    std::uint32_t options_ = 0;
    std::vector<std::weak_ptr<InterruptionHandler>> handlers_;
};

/// Has a microphone, until it is taken away.
class FakeDeviceCapture final : public DeviceCapture {
public:
    explicit FakeDeviceCapture(Scheduler& scheduler) : scheduler_(scheduler) {}

    std::shared_ptr<DeviceCaptureSession> makeSession() override {
        auto session = std::make_shared<FakeDeviceCaptureSession>(scheduler_);
        const std::lock_guard lock(mutex_);
        session->accepts = accepts_;
        sessions_.push_back(session);
        return session;
    }
    std::shared_ptr<CaptureInput> defaultAudioInput() override {
        const std::lock_guard lock(mutex_);
        return microphone_ ? std::make_shared<FakeCaptureInput>() : nullptr;
    }
    std::shared_ptr<CaptureOutput> makeAudioDataOutput() override { return std::make_shared<FakeCaptureOutput>(); }
    FakeAudioSession& sharedAudioSession() override { return audioSession_; }

    void setMicrophone(bool there) {
        const std::lock_guard lock(mutex_);
        microphone_ = there;
    }
    /// Whether sessions made from now on accept inputs and outputs.
    void setAccepts(bool accepts) {
        const std::lock_guard lock(mutex_);
        accepts_ = accepts;
    }
    /// The newest session that lives, or null.
    std::shared_ptr<FakeDeviceCaptureSession> lastSession() const {
        const std::lock_guard lock(mutex_);
        for (auto it = sessions_.rbegin(); it != sessions_.rend(); ++it)
            if (auto session = it->lock()) return session;
        return nullptr;
    }

private:
    Scheduler& scheduler_;
    FakeAudioSession audioSession_;
    mutable std::mutex mutex_;
    bool microphone_ = true, accepts_ = true;
    std::vector<std::weak_ptr<FakeDeviceCaptureSession>> sessions_;
};

}  // namespace lumacast
