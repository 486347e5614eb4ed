#pragma once
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <vector>

#include "writer/media/PixelBuffer.h"

namespace lumacast {

/// A picture in ordinary memory. Its pixels are made when somebody looks at them: every byte is the low byte of the
/// picture number, but for the first eight, which are the number itself (little-endian). Thread-safe; never changes.
class FakePlane final : public SharedPlane {
public:
    using Pixels = std::shared_ptr<const std::vector<std::uint8_t>>;

    FakePlane(std::int32_t width, std::int32_t height, std::uint64_t pictureNumber, std::vector<PixelRect> damage,
              std::optional<std::int64_t> capturedAt = {})
        : width_(width),
          height_(height),
          pictureNumber_(pictureNumber),
          damage_(std::move(damage)),
          capturedAt_(capturedAt) {}

    std::int32_t width() const override { return width_; }
    std::int32_t height() const override { return height_; }
    std::size_t stride() const override { return static_cast<std::size_t>(width_) * 4; }
    std::span<const std::uint8_t> pixels() const override { return *sharedPixels(); }
    std::span<const PixelRect> damage() const override { return damage_; }
    std::uint64_t pictureNumber() const override { return pictureNumber_; }
    int descriptor() const override { return -1; }

    /// The capture clock's ticks when the picture was taken, where the maker has said so.
    std::optional<std::int64_t> capturedAt() const { return capturedAt_; }

    /// The pixels, for whoever keeps them longer than the plane.
    Pixels sharedPixels() const {
        const std::lock_guard lock(mutex_);
        if (!pixels_) {
            std::vector<std::uint8_t> bytes(stride() * static_cast<std::size_t>(height_),
                                            static_cast<std::uint8_t>(pictureNumber_));
            for (std::size_t i = 0; i < 8 && i < bytes.size(); ++i)
                bytes[i] = static_cast<std::uint8_t>(pictureNumber_ >> (8 * i));
            pixels_ = std::make_shared<const std::vector<std::uint8_t>>(std::move(bytes));
        }
        return pixels_;
    }

private:
    const std::int32_t width_, height_;
    const std::uint64_t pictureNumber_;
    const std::vector<PixelRect> damage_;
    const std::optional<std::int64_t> capturedAt_;
    mutable std::mutex mutex_;
    mutable Pixels pixels_;
};

}  // namespace lumacast
