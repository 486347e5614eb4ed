#pragma once
// What the suites of the movie roles share: a clock that is moved by hand, planes that are painted, and files of their
// own.

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "platform/Clock.h"
#include "platform/ContainerWriter.h"
#include "writer/media/SampleBuffer.h"
#include "tests/contract/Eventually.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::testing {

/// A clock whose time is what the test says.
class HandClock final : public Clock {
public:
    Date now() const override { return {}; }
    CalendarFields localCalendar(Date) const override { return {}; }
    HostTime hostTime() const override { return HostTime{nanoseconds_->load()}; }
    void startCaptureClock() override {
        capture_ = std::make_shared<CaptureClock>([time = nanoseconds_] { return HostTime{time->load()}; });
    }
    std::shared_ptr<CaptureClock> captureClock() const override { return capture_; }

    void advance(std::chrono::nanoseconds by) { *nanoseconds_ += by.count(); }

private:
    std::shared_ptr<std::atomic<std::int64_t>> nanoseconds_ = std::make_shared<std::atomic<std::int64_t>>(0);
    std::shared_ptr<CaptureClock> capture_;
};

/// A plane in ordinary memory.
class PaintedPlane final : public SharedPlane {
public:
    PaintedPlane(std::int32_t width, std::int32_t height, std::uint64_t number)
        : width_(width), height_(height), number_(number),
          pixels_(static_cast<std::size_t>(width) * static_cast<std::size_t>(height) * 4) {
        damage_.push_back({0, 0, width, height});
    }

    std::int32_t width() const override { return width_; }
    std::int32_t height() const override { return height_; }
    std::size_t stride() const override { return static_cast<std::size_t>(width_) * 4; }
    std::span<const std::uint8_t> pixels() const override { return pixels_; }
    std::span<const PixelRect> damage() const override { return damage_; }
    std::uint64_t pictureNumber() const override { return number_; }
    int descriptor() const override { return -1; }

    void fill(PixelRect rect, std::uint8_t grey) {
        for (std::int32_t y = rect.y; y < rect.y + rect.height; ++y) {
            for (std::int32_t x = rect.x; x < rect.x + rect.width; ++x) setPixel(x, y, grey, grey, grey);
        }
    }
    void setPixel(std::int32_t x, std::int32_t y, std::uint8_t red, std::uint8_t green, std::uint8_t blue) {
        std::uint8_t* const pixel =
            pixels_.data() + static_cast<std::size_t>(y) * stride() + static_cast<std::size_t>(x) * 4;
        pixel[0] = blue;
        pixel[1] = green;
        pixel[2] = red;
    }
    void setDamage(std::vector<PixelRect> damage) { damage_ = std::move(damage); }

private:
    std::int32_t width_, height_;
    std::uint64_t number_;
    std::vector<std::uint8_t> pixels_;
    std::vector<PixelRect> damage_;
};

/// Something that happens on another thread, counted.
class Happening final {
public:
    static constexpr std::chrono::seconds kBound{60};

    void happen() {
        const std::lock_guard lock(mutex_);
        count_ += 1;
        thread_ = std::this_thread::get_id();
        changed_.notify_all();
    }
    /// Whether it has happened that often before the bound.
    bool waitFor(int times = 1) {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, kBound, [&] { return count_ >= times; });
    }
    int count() const {
        const std::lock_guard lock(mutex_);
        return count_;
    }
    std::thread::id thread() const {
        const std::lock_guard lock(mutex_);
        return thread_;
    }

private:
    mutable std::mutex mutex_;
    std::condition_variable changed_;
    int count_ = 0;
    std::thread::id thread_;
};

inline MediaTime atNanoseconds(std::int64_t value) { return MediaTime::make(value, CaptureClock::kTimescale); }
inline MediaTime atSeconds(double seconds) { return MediaTime::fromSeconds(seconds, CaptureClock::kTimescale); }

inline Dictionary videoSettings(int width, int height, std::int64_t bitRate = 2'000'000) {
    Dictionary compression;
    compression.set(std::string(VideoSettings::kExpectedSourceFrameRate), Value(std::int64_t{60}));
    compression.set(std::string(VideoSettings::kMaxKeyFrameInterval), Value(std::int64_t{60}));
    compression.set(std::string(VideoSettings::kProfileLevel), Value(VideoSettings::kProfileHighAutoLevel));
    compression.set(std::string(VideoSettings::kAverageBitRate), Value(bitRate));
    Dictionary settings;
    settings.set(std::string(VideoSettings::kCodec), Value(VideoSettings::kCodecH264));
    settings.set(std::string(VideoSettings::kWidth), Value(static_cast<double>(width)));
    settings.set(std::string(VideoSettings::kHeight), Value(static_cast<double>(height)));
    settings.set(std::string(VideoSettings::kCompressionProperties), Value(compression));
    return settings;
}

inline Dictionary audioSettings() {
    Dictionary settings;
    settings.set(std::string(AudioSettings::kFormatID), Value(std::uint64_t{kAudioFormatAAC}));
    settings.set(std::string(AudioSettings::kNumberOfChannels), Value(std::int64_t{2}));
    settings.set(std::string(AudioSettings::kSampleRate), Value(44100.0));
    settings.set(std::string(AudioSettings::kBitRate), Value(std::int64_t{128000}));
    return settings;
}

/// The tap's own format: 16-bit big-endian mono.
inline AudioFormat tapFormat() {
    AudioFormat format;
    format.sampleRate = 44100;
    format.formatID = kAudioFormatLinearPCM;
    format.formatFlags = AudioFormat::kFlagBigEndian | AudioFormat::kFlagSignedInteger | AudioFormat::kFlagPacked;
    format.bytesPerPacket = format.bytesPerFrame = 2;
    format.framesPerPacket = 1;
    format.channelsPerFrame = 1;
    format.bitsPerChannel = 16;
    return format;
}

inline SampleRef picture(std::shared_ptr<PaintedPlane> plane, MediaTime stamp) {
    return SampleBuffer::makeVideo(PixelBuffer(std::move(plane)), stamp, kInvalidMediaTime);
}

inline SampleRef greyPicture(std::int32_t width, std::int32_t height, std::uint64_t number, std::uint8_t grey,
                             MediaTime stamp) {
    auto plane = std::make_shared<PaintedPlane>(width, height, number);
    plane->fill({0, 0, width, height}, grey);
    return picture(std::move(plane), stamp);
}

}  // namespace lumacast::testing
