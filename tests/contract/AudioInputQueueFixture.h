#pragma once
// What the suites of audio queues share: a queue that keeps what it delivers.

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <mutex>
#include <thread>
#include <utility>
#include <vector>

#include "tests/contract/HeardSound.h"
#include "tests/contract/SoundWorld.h"

namespace lumacast::test {

using SoundWorldMaker = std::function<std::unique_ptr<SoundWorld>()>;

inline constexpr std::uint32_t kFlags = AudioInputQueues::kCaptureProcessOutput;

inline AudioFormat format(double rate, std::uint32_t bits, std::uint32_t channels, std::uint32_t flags) {
    AudioFormat made;
    made.sampleRate = rate;
    made.formatID = kAudioFormatLinearPCM;
    made.formatFlags = flags;
    made.channelsPerFrame = channels;
    made.bitsPerChannel = bits;
    return made;
}

/// A queue and what came of it. Thread-safe.
class Recorded {
public:
    struct Piece {
        AudioQueueBufferRef buffer;
        Data bytes;
        AudioTimeStamp start;
        std::uint32_t packets = 0;
        std::size_t descriptions = 0;
        std::thread::id thread;
    };
    /// Called with each piece, after it was kept.
    using Then = std::function<void(Recorded&, const AudioQueueBufferRef&)>;

    explicit Recorded(AudioInputQueues& queues, Then then = {}) : state_(std::make_shared<State>()) {
        auto made = queues.makeInputQueue(
            recorderFormat(),
            [this, then, state = state_](const AudioQueueBufferRef& buffer, const AudioTimeStamp& start,
                                         std::uint32_t packets, std::span<const AudioPacketDescription> descriptions) {
                {
                    const std::lock_guard lock(state->mutex);
                    Data bytes(buffer->bytes.begin(), buffer->bytes.begin() + buffer->byteSize);
                    state->pieces.push_back({buffer, std::move(bytes), start, packets, descriptions.size(),
                                             std::this_thread::get_id()});
                }
                if (then) then(*this, buffer);
            },
            kFlags);
        EXPECT_EQ(made.status, AudioStatus::kSuccess);
        queue = std::move(made.queue);
        letGo_ = state_;
    }
    ~Recorded() {
        if (queue) queue->dispose();
        // One that is in progress uses this, and what the test has on its stack.
        EXPECT_TRUE(eventually([this] { return isCallbackLetGo(); }));
    }
    Recorded(const Recorded&) = delete;
    Recorded& operator=(const Recorded&) = delete;

    std::vector<AudioQueueBufferRef> enqueue(int count, std::uint32_t bytes) {
        std::vector<AudioQueueBufferRef> buffers;
        for (int i = 0; i < count; ++i) {
            AudioQueueBufferRef buffer;
            EXPECT_EQ(queue->allocateBuffer(bytes, buffer), AudioStatus::kSuccess);
            EXPECT_EQ(queue->enqueueBuffer(buffer), AudioStatus::kSuccess);
            buffers.push_back(std::move(buffer));
        }
        return buffers;
    }
    std::vector<Piece> pieces() const {
        const std::lock_guard lock(state_->mutex);
        return state_->pieces;
    }
    std::size_t count() const { return pieces().size(); }
    std::size_t bytes() const {
        std::size_t sum = 0;
        for (const Piece& piece : pieces()) sum += piece.bytes.size();
        return sum;
    }
    /// Whether anything but silence came.
    bool isLoud() const {
        for (const Piece& piece : pieces())
            for (const std::uint8_t byte : piece.bytes)
                if (byte != 0) return true;
        return false;
    }
    /// Whether the queue has let go of its callback (which holds a share of this).
    bool isCallbackLetGo() const { return letGo_.use_count() == 1; }

    std::shared_ptr<AudioInputQueue> queue;

private:
    struct State {
        mutable std::mutex mutex;
        std::vector<Piece> pieces;
    };
    const std::shared_ptr<State> state_;
    std::weak_ptr<State> letGo_;
};

inline void giveBack(Recorded& recorded, const AudioQueueBufferRef& buffer) { recorded.queue->enqueueBuffer(buffer); }

class AudioInputQueueContract : public ::testing::TestWithParam<SoundWorldMaker> {
protected:
    AudioInputQueueContract() : world_(GetParam()()) {
        world_->clock().startCaptureClock();
        world_->clock().captureClock()->run();
    }
    AudioInputQueues& queues() { return world_->queues(); }
    std::shared_ptr<AudioInputQueue> make(const AudioFormat& wanted = recorderFormat()) {
        auto made = queues().makeInputQueue(wanted, {}, kFlags);
        EXPECT_EQ(made.status, AudioStatus::kSuccess);
        return made.queue;
    }
    bool eventually(const std::function<bool()>& condition) { return world_->eventually(condition); }

    const std::unique_ptr<SoundWorld> world_;
};

}  // namespace lumacast::test
