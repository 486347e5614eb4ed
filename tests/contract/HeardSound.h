#pragma once
// What a tap delivers, kept.

#include <bit>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "platform/AudioInputQueue.h"
#include "tests/checkers/ToneChecker.h"
#include "tests/contract/Eventually.h"

namespace lumacast::test {

/// The format that the recorder asks for: 16 bits, mono, big-endian, 44.1 kHz.
inline AudioFormat recorderFormat() {
    AudioFormat format;
    format.sampleRate = 44100;
    format.formatID = kAudioFormatLinearPCM;
    format.formatFlags = AudioFormat::kFlagBigEndian | AudioFormat::kFlagSignedInteger | AudioFormat::kFlagPacked;
    format.bytesPerPacket = format.bytesPerFrame = 2;
    format.framesPerPacket = format.channelsPerFrame = 1;
    format.bitsPerChannel = 16;
    return format;
}

/// A queue for one process in the recorder's format, with the recorder's ten buffers, each of which goes back at once;
/// what came is kept. Thread-safe.
class HeardSound final {
public:
    struct Piece {
        AudioTimeStamp start;
        std::size_t first = 0, frames = 0;  ///< in the whole sound
        std::int64_t arrived = 0;
    };

    enum class Silence { OnTime, MayBeLate };
    HeardSound(AudioInputQueues& queues, ProcessID pid, Silence silence = Silence::OnTime) : state_(std::make_shared<State>()) {
        auto made = queues.makeInputQueue(
            recorderFormat(),
            [state = state_](const AudioQueueBufferRef& buffer, const AudioTimeStamp& start, std::uint32_t packets,
                             std::span<const AudioPacketDescription>) { state->take(buffer, start, packets); },
            AudioInputQueues::kCaptureProcessOutput);
        status_ = made.status;
        queue_ = made.queue;
        {
            const std::lock_guard lock(state_->mutex);
            state_->queue = queue_;
        }
        if (number(pid) != 0 && status_ == AudioStatus::kSuccess) status_ = queue_->setProcessTap(pid);
        if (silence == Silence::MayBeLate) queue_->allowLateSilence();
        for (int buffer = 0; buffer < 10; ++buffer) {
            AudioQueueBufferRef ref;
            if (queue_->allocateBuffer(57344, ref) == AudioStatus::kSuccess) queue_->enqueueBuffer(ref);
        }
        if (status_ == AudioStatus::kSuccess) status_ = queue_->start();
    }
    ~HeardSound() { queue_->dispose(); }
    HeardSound(const HeardSound&) = delete;
    HeardSound& operator=(const HeardSound&) = delete;

    std::int32_t status() const { return status_; }
    AudioInputQueue& queue() { return *queue_; }

    std::size_t frames() const {
        const std::lock_guard lock(state_->mutex);
        return state_->samples.size();
    }
    /// The sound from frame `from` on, `frames` of it or all.
    checkers::Sound sound(std::size_t from = 0, std::size_t frames = SIZE_MAX) const {
        const std::lock_guard lock(state_->mutex);
        checkers::Sound sound{44100, {}};
        const auto& all = state_->samples;
        from = std::min(from, all.size());
        frames = std::min(frames, all.size() - from);
        sound.samples.assign(all.begin() + static_cast<std::ptrdiff_t>(from),
                             all.begin() + static_cast<std::ptrdiff_t>(from + frames));
        return sound;
    }
    std::vector<Piece> pieces() const {
        const std::lock_guard lock(state_->mutex);
        return state_->pieces;
    }
    /// The level of a tone in the last `seconds`; -200 when there is not so much yet.
    double level(double frequency, double seconds = 0.25) const {
        const auto frames = static_cast<std::size_t>(seconds * 44100);
        const std::size_t all = this->frames();
        if (all < frames) return -200;
        return checkers::toneLevel(sound(all - frames).samples, 44100, frequency);
    }
    bool waitForTone(double frequency, double leastLevel = -20) const {
        return eventually([&] { return level(frequency) >= leastLevel; });
    }
    /// Until the last quarter of a second is digital silence.
    bool waitForSilence() const {
        return eventually([&] {
            const std::size_t all = frames();
            return all >= 11025 && isSilent(all - 11025, 11025);
        });
    }
    /// Until so much more sound has come; answers the frame at which it begins.
    std::size_t waitFor(double seconds) const {
        const std::size_t before = frames();
        const auto wanted = before + static_cast<std::size_t>(seconds * 44100);
        return eventually([&] { return frames() >= wanted; }) ? before : SIZE_MAX;
    }
    bool isSilent(std::size_t from, std::size_t frames = SIZE_MAX) const {
        for (const float sample : sound(from, frames).samples)
            if (sample != 0) return false;
        return true;
    }

private:
    struct State {
        mutable std::mutex mutex;
        std::weak_ptr<AudioInputQueue> queue;
        std::vector<float> samples;
        std::vector<Piece> pieces;

        void take(const AudioQueueBufferRef& buffer, const AudioTimeStamp& start, std::uint32_t packets) {
            std::shared_ptr<AudioInputQueue> owner;
            {
                const std::lock_guard lock(mutex);
                pieces.push_back({start, samples.size(), packets,
                                  std::chrono::steady_clock::now().time_since_epoch() / std::chrono::nanoseconds(1)});
                for (std::uint32_t byte = 0; byte + 1 < buffer->byteSize; byte += 2) {
                    const auto word = static_cast<std::uint16_t>(buffer->bytes[byte] << 8 | buffer->bytes[byte + 1]);
                    samples.push_back(static_cast<float>(std::bit_cast<std::int16_t>(word)) / 32768.0f);
                }
                owner = queue.lock();
            }
            if (owner) owner->enqueueBuffer(buffer);
        }
    };

    const std::shared_ptr<State> state_;
    std::shared_ptr<AudioInputQueue> queue_;
    std::int32_t status_ = 0;
};

/// What is wrong with the stamps: they must go on without a hole or an overlap, to half a frame.
inline std::vector<std::string> holesIn(const std::vector<HeardSound::Piece>& pieces) {
    std::vector<std::string> findings;
    for (std::size_t next = 1; next < pieces.size(); ++next) {
        const auto& before = pieces[next - 1];
        const double expected = static_cast<double>(before.frames) / 44100 * 1e9;
        const double found = static_cast<double>(static_cast<std::int64_t>(pieces[next].start.hostTime - before.start.hostTime));
        if (std::abs(found - expected) > 12'000 ||
            pieces[next].start.sampleTime != before.start.sampleTime + static_cast<double>(before.frames))
            findings.push_back("piece " + std::to_string(next) + ": " + std::to_string(found - expected) + " ns off");
    }
    return findings;
}

}  // namespace lumacast::test
