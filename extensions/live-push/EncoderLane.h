#pragma once
#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <variant>

#include "client/extension/Samples.h"
#include "extensions/live-push/MediaOutput.h"
#include "extensions/live-push/PacketQueue.h"
#include "extensions/live-push/PictureConverter.h"
#include "extensions/live-push/PictureEncoder.h"
#include "extensions/live-push/PushSettings.h"
#include "extensions/media/AacEncoder.h"
#include "extensions/media/PcmReader.h"
#include "extensions/media/SoundMixer.h"

namespace lumacast::extensions {

/// Encodes frames and sounds on a thread of its own. Whoever hands them over never waits: one frame and kMostSounds
/// sounds may wait; one more, and the oldest of its kind is left out. The first frame is the stream's zero and makes
/// its size.
class EncoderLane final {
public:
    static constexpr std::size_t kMostSounds = 256;
    static constexpr int kSoundRate = 48'000;

    struct Outlet {
        std::function<void(StreamTracks)> begin;  ///< once, before the first packet
        std::function<void(OutgoingPacket)> packet;
        std::function<void(std::uint64_t)> leftOut;  ///< so many frames
        std::function<void(std::string)> failed;     ///< the stream can't be encoded; nothing follows
    };

    /// The outlet is called on the lane's thread, and `leftOut` on the caller's too.
    EncoderLane(PushSettings settings, Outlet outlet);
    EncoderLane(const EncoderLane&) = delete;
    EncoderLane& operator=(const EncoderLane&) = delete;
    ~EncoderLane();

    void frame(extension::Frame frame);
    void sound(extension::Sound sound);
    /// The next picture will need no other.
    void wantKeyFrame() { wantsKeyFrame_ = true; }
    /// Encodes what waits, and the end. Waits for that.
    void finish();

private:
    void run();
    void encode(extension::Frame frame);
    void encode(const extension::Sound& sound);
    bool begin(const extension::Frame& frame);
    void sendSound(const StereoSound& sound);
    void encodeEnd();

    const PushSettings settings_;
    const Outlet outlet_;
    std::atomic<bool> wantsKeyFrame_{false};

    std::mutex mutex_;
    std::condition_variable changed_;
    std::optional<extension::Frame> frame_;
    std::deque<extension::Sound> sounds_;
    bool isEnding_ = false;

    // The thread's own.
    bool hasFailed_ = false;
    std::optional<std::int64_t> zero_;  ///< nanoseconds
    std::int64_t lastTicks_ = -1;
    std::unique_ptr<PictureConverter> converter_;
    std::unique_ptr<PictureEncoder> pictures_;
    std::unique_ptr<AacEncoder> sound_;
    PcmReader application_{kSoundRate}, microphone_{kSoundRate};
    SoundMixer mixer_{kSoundRate};
    std::thread thread_;
};

}  // namespace lumacast::extensions
