#pragma once
// Capture from devices (microphones, cameras), and the audio session that the device's applications share.

#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>

#include "platform/Scheduler.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast {

/// Where a capture session takes from: one device.
class CaptureInput {
public:
    virtual ~CaptureInput() = default;
};

class CaptureOutput;

/// Told of samples by outputs.
class CaptureOutputDelegate {
public:
    virtual ~CaptureOutputDelegate() = default;
    /// `captureOutput:didOutputSampleBuffer:fromConnection:` on the queue that the output was given, one at a time.
    virtual void captureOutputDidOutputSampleBuffer(const std::shared_ptr<CaptureOutput>& output,
                                                    const SampleRef& sample) = 0;
};

/// Where a capture session delivers to.
class CaptureOutput {
public:
    virtual ~CaptureOutput() = default;
    /// Whom to deliver to, held weakly, and on which queue. An empty pointer for nobody.
    virtual void setSampleBufferDelegate(std::weak_ptr<CaptureOutputDelegate> delegate,
                                         std::shared_ptr<SerialQueue> queue) = 0;
};

/// Told of a property that has changed.
class CaptureSessionObserver {
public:
    virtual ~CaptureSessionObserver() = default;
    /// `observeValueForKeyPath:ofObject:change:context:` on a lane of the platform, never inline.
    virtual void observeValueForKeyPath(std::string_view keyPath) = 0;
};

/// Captures from its inputs to its outputs while it runs. Samples of an audio output are linear PCM, 44100 Hz, one
/// channel of 16-bit big-endian integers, a few hundredths of a second each, and stamped with the capture clock that is
/// current when the session is started, each not before the end of the one before; what is heard while that clock
/// stands still is thrown away, and so is what finds a delegate a second or more behind. A device that goes away, or is
/// taken by a stream of higher priority, gives no samples until it is back.
///
/// Callable from any lane; waits for nobody. Samples and changes never come inline from an operation. Destroying a
/// session stops it.
class DeviceCaptureSession {
public:
    /// The key path under which isRunning() is observed.
    static constexpr std::string_view kRunning = "running";

    virtual ~DeviceCaptureSession() = default;

    /// Whether the session takes part in the application's audio session, and whether it may change that by itself.
    virtual void setUsesApplicationAudioSession(bool uses) = 0;
    virtual void setAutomaticallyConfiguresApplicationAudioSession(bool configures) = 0;

    /// Whether adding it would succeed: not null, not here yet, made by the same platform, one of its kind at most.
    virtual bool canAddInput(const std::shared_ptr<CaptureInput>& input) const = 0;
    /// Adding what can't be added does nothing; so does removing what is not here. Both also while running.
    virtual void addInput(const std::shared_ptr<CaptureInput>& input) = 0;
    virtual void removeInput(const std::shared_ptr<CaptureInput>& input) = 0;
    virtual bool canAddOutput(const std::shared_ptr<CaptureOutput>& output) const = 0;
    virtual void addOutput(const std::shared_ptr<CaptureOutput>& output) = 0;
    virtual void removeOutput(const std::shared_ptr<CaptureOutput>& output) = 0;

    /// Starts; the session runs soon after, whether there is anything to capture or not.
    virtual void startRunning() = 0;
    virtual void stopRunning() = 0;
    virtual bool isRunning() const = 0;

    /// Observers are told of each change of the property that `keyPath` names; any key path can be observed, and one
    /// that names nothing never changes. Held weakly, by their (key path, observer) pair.
    virtual void addObserver(std::weak_ptr<CaptureSessionObserver> observer, std::string_view keyPath) = 0;
    /// False, changing nothing, for a pair that is not there. The same pair added twice is removed once.
    virtual bool removeObserver(const CaptureSessionObserver* observer, std::string_view keyPath) = 0;
};

/// What the applications of the device share when they play and record.
class AudioSession {
public:
    static constexpr std::string_view kPlayAndRecord = "PlayAndRecord";
    static constexpr std::uint32_t kMixWithOthers = 1;
    static constexpr std::uint32_t kAllowBluetoothHandsFree = 4;

    /// What an interruption handler is told. Others are possible.
    static constexpr std::uint64_t kInterruptionEnded = 0;
    static constexpr std::uint64_t kInterruptionBegan = 1;
    /// A registration; destroying it ends it. A call in progress may still be running then.
    class Registration {
    public:
        virtual ~Registration() = default;
    };
    using InterruptionHandler = std::function<void(std::uint64_t type)>;

    virtual ~AudioSession() = default;
    /// False for a category or an option that is not known.
    virtual bool setCategory(std::string_view category, std::uint32_t options) = 0;
    /// `handler` is called on a lane of the platform when the audio of this process is interrupted (the device it
    /// records from is suspended, taken by a stream of a higher-priority role, or has gone after it was heard) and when
    /// that is over: when sound comes again, or nothing records any more. The two come in turns.
    [[nodiscard]] virtual std::unique_ptr<Registration> observeInterruptions(InterruptionHandler handler) = 0;
};

/// Makes what device capture needs. Callable from any lane; waits for nobody.
class DeviceCapture {
public:
    virtual ~DeviceCapture() = default;
    virtual std::shared_ptr<DeviceCaptureSession> makeSession() = 0;
    /// The default microphone, whichever that is while a session runs; null where it is known that there is none.
    virtual std::shared_ptr<CaptureInput> defaultAudioInput() = 0;
    virtual std::shared_ptr<CaptureOutput> makeAudioDataOutput() = 0;
    /// The one of this process.
    virtual AudioSession& sharedAudioSession() = 0;
};

}  // namespace lumacast
