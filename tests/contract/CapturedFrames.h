#pragma once
// What a capture source delivered.

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <thread>
#include <vector>

#include "platform/DisplayCapture.h"

namespace lumacast::test {

inline constexpr std::chrono::seconds kGenerous{20};

/// One frame as it was delivered.
struct CapturedFrame {
    MediaTime stamp;
    MediaTime duration;
    std::uint64_t number = 0;
    std::vector<PixelRect> damage;
    std::int64_t width = 0, height = 0;
    std::uint32_t colour = 0;   ///< of the middle, 0xRRGGBB
    bool oneColour = false;     ///< everywhere the middle's
    std::uint32_t transformFlags = 0;
    std::chrono::steady_clock::time_point at;
    std::shared_ptr<SharedPlane> plane;  ///< only while kept
    bool odd = false;                    ///< what the test calls so
};

inline std::uint32_t colourAt(const SharedPlane& plane, int x, int y) {
    std::uint32_t pixel = 0;
    std::memcpy(&pixel,
                plane.pixels().data() + static_cast<std::size_t>(y) * plane.stride() + static_cast<std::size_t>(x) * 4,
                4);
    return pixel & 0xFFFFFF;
}

/// Equal but for what a scaler's rounding changes.
inline bool sameColour(std::uint32_t a, std::uint32_t b) {
    for (const int shift : {0, 8, 16})
        if (std::abs(static_cast<int>(a >> shift & 0xFF) - static_cast<int>(b >> shift & 0xFF)) > 3) return false;
    return true;
}

/// Notes every frame and failure; the test waits for what it expects.
class CapturedFrames final : public DisplayCaptureDelegate {
public:
    void screenCaptureControllerDidReceiveSampleBuffer(DisplayCaptureSource& source, const SampleRef& sample,
                                                       std::uint32_t transformFlags) override {
        const auto& plane = sample->image()->plane();
        CapturedFrame frame{sample->presentationTime(), sample->duration(), plane->pictureNumber(),
                            {plane->damage().begin(), plane->damage().end()}, plane->width(), plane->height(),
                            colourAt(*plane, plane->width() / 2, plane->height() / 2), true,
                            transformFlags, std::chrono::steady_clock::now(), nullptr};
        for (int y = 0; y < plane->height() && frame.oneColour; y += checkEvery)
            for (int x = 0; x < plane->width(); x += checkEvery)
                frame.oneColour &= sameColour(colourAt(*plane, x, y), frame.colour);
        if (isOdd) frame.odd = isOdd(*plane);
        {
            const std::lock_guard lock(mutex_);
            if (keepPlanes) frame.plane = plane;
            threads_.push_back(std::this_thread::get_id());
            frames_.push_back(std::move(frame));
        }
        changed_.notify_all();
        if (onFrame) onFrame(source);
    }
    void screenCaptureControllerDidFailWithStatus(DisplayCaptureSource&, std::int32_t status) override {
        {
            const std::lock_guard lock(mutex_);
            failures_.push_back(status);
            failureThread_ = std::this_thread::get_id();
        }
        changed_.notify_all();
    }
    void screenCaptureControllerWasPreempted(DisplayCaptureSource&) override { count(preemptions_); }
    void screenCaptureControllerMediaServicesWereReset(DisplayCaptureSource&) override { count(resets_); }

    using Frames = std::vector<CapturedFrame>;
    /// Waits until `reached` is true of the frames so far; answers whether it became so.
    bool waitFor(const std::function<bool(const Frames&)>& reached, std::chrono::milliseconds limit = kGenerous) {
        std::unique_lock lock(mutex_);
        return changed_.wait_until(lock, std::chrono::steady_clock::now() + limit, [&] { return reached(frames_); });
    }
    bool waitForCount(std::size_t count) {
        return waitFor([count](const Frames& frames) { return frames.size() >= count; });
    }
    /// Until the newest frame shows this colour and nothing else.
    bool waitForColour(std::uint32_t colour) {
        return waitFor([colour](const Frames& frames) {
            return !frames.empty() && sameColour(frames.back().colour, colour) && frames.back().oneColour;
        });
    }
    std::optional<std::int32_t> waitForFailure() {
        std::unique_lock lock(mutex_);
        if (!changed_.wait_until(lock, std::chrono::steady_clock::now() + kGenerous,
                                 [&] { return !failures_.empty(); }))
            return std::nullopt;
        return failures_.back();
    }
    bool waitForPreemptions(std::size_t number) {
        return waitFor([&](const Frames&) { return preemptions_ >= number; });
    }
    bool waitForReset() {
        return waitFor([&](const Frames&) { return resets_ > 0; });
    }
    std::size_t preemptions() const {
        const std::lock_guard lock(mutex_);
        return preemptions_;
    }
    std::size_t resets() const {
        const std::lock_guard lock(mutex_);
        return resets_;
    }
    Frames frames() const {
        const std::lock_guard lock(mutex_);
        return frames_;
    }
    std::size_t count() const {
        const std::lock_guard lock(mutex_);
        return frames_.size();
    }
    std::vector<std::int32_t> failures() const {
        const std::lock_guard lock(mutex_);
        return failures_;
    }
    /// Within a condition of waitFor.
    std::size_t failuresUnlocked() const { return failures_.size(); }
    std::thread::id failureThread() const {
        const std::lock_guard lock(mutex_);
        return failureThread_;
    }
    std::vector<std::thread::id> threads() const {
        const std::lock_guard lock(mutex_);
        return threads_;
    }
    void clear() {
        const std::lock_guard lock(mutex_);
        frames_.clear();
        threads_.clear();
    }

    // Set before the first frame.
    std::function<void(DisplayCaptureSource&)> onFrame;
    std::function<bool(const SharedPlane&)> isOdd;  ///< asked for every frame
    int checkEvery = 7;
    std::atomic<bool> keepPlanes{false};

private:
    void count(std::size_t& events) {
        {
            const std::lock_guard lock(mutex_);
            ++events;
            failureThread_ = std::this_thread::get_id();
        }
        changed_.notify_all();
    }

    mutable std::mutex mutex_;
    std::condition_variable changed_;
    Frames frames_;
    std::vector<std::thread::id> threads_;
    std::vector<std::int32_t> failures_;
    std::size_t preemptions_ = 0, resets_ = 0;
    std::thread::id failureThread_;
};

}  // namespace lumacast::test
