// Only what changed is read and converted, and the picture is the same as if everything were.

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <memory>
#include <mutex>
#include <random>
#include <vector>

#include "linux/media/PlaneConverter.h"
#include "tests/contract/TestWindow.h"
#include "tests/contract/X11CaptureFixture.h"

namespace lumacast::test {
namespace {

constexpr int kWidth = 640, kHeight = 360;

std::vector<std::uint8_t> bytesOf(const media::I420Picture& picture) {
    std::vector<std::uint8_t> bytes;
    const auto take = [&](const std::uint8_t* from, int stride, int width, int height) {
        for (int row = 0; row < height; ++row, from += stride) bytes.insert(bytes.end(), from, from + width);
    };
    take(picture.y(), picture.lumaStride(), kWidth, kHeight);
    take(picture.u(), picture.chromaStride(), kWidth / 2, kHeight / 2);
    take(picture.v(), picture.chromaStride(), kWidth / 2, kHeight / 2);
    return bytes;
}

/// The pictures as an encoder has them: each plane converted after the one before.
class Converted final {
public:
    struct Both {
        std::vector<std::uint32_t> pixels;
        std::vector<std::uint8_t> planar, planarOfWhole;
    };

    void take(const SharedPlane& plane) {
        const std::lock_guard lock(mutex_);
        latest_.pixels.resize(kWidth * kHeight);
        for (int y = 0; y < kHeight; ++y)
            std::memcpy(latest_.pixels.data() + y * kWidth,
                        plane.pixels().data() + static_cast<std::size_t>(y) * plane.stride(), kWidth * 4);
        for (std::uint32_t& pixel : latest_.pixels) pixel &= 0xFFFFFF;
        latest_.planar = bytesOf(*inParts_.convert(plane));
        media::PlaneConverter whole(kWidth, kHeight);
        latest_.planarOfWhole = bytesOf(*whole.convert(plane));
        ++pictures_;
    }
    Both latest() const {
        const std::lock_guard lock(mutex_);
        return latest_;
    }
    double partConverted() const {
        const std::lock_guard lock(mutex_);
        return static_cast<double>(inParts_.convertedPixels()) / (static_cast<double>(pictures_) * kWidth * kHeight);
    }

private:
    mutable std::mutex mutex_;
    media::PlaneConverter inParts_{kWidth, kHeight};
    Both latest_;
    std::uint64_t pictures_ = 0;
};

std::vector<std::uint32_t> wholeGrab(const TestWindow& window) {
    xcb_connection_t* const x = window.connection();
    const x11::Owned<xcb_get_image_reply_t> reply(xcb_get_image_reply(
        x, xcb_get_image(x, XCB_IMAGE_FORMAT_Z_PIXMAP, window.id(), 0, 0, kWidth, kHeight, ~0u), nullptr));
    std::vector<std::uint32_t> pixels(kWidth * kHeight);
    if (!reply) return {};
    std::memcpy(pixels.data(), xcb_get_image_data(reply.get()), pixels.size() * 4);
    for (std::uint32_t& pixel : pixels) pixel &= 0xFFFFFF;
    return pixels;
}

class X11Parts : public X11CaptureFixture {};

TEST_F(X11Parts, TenThousandRandomChangesShowAsAWholeReadingWould) {
    TestWindow window(display.name(), {.place = {20, 10, kWidth, kHeight}, .colour = 0x406080, .repaints = false});
    window.paint(0x406080);
    const auto converted = std::make_shared<Converted>();
    frames->isOdd = [converted](const SharedPlane& plane) {
        converted->take(plane);
        return false;
    };
    const auto made = startOn(window, kWidth, kHeight, 240);
    std::mt19937 random(20261122);
    const auto below = [&random](int limit) { return static_cast<int>(random() % static_cast<unsigned>(limit)); };
    constexpr int kRounds = 200, kChanges = 50;
    for (int round = 0; round < kRounds; ++round) {
        for (int change = 0; change < kChanges; ++change) {
            const bool isLarge = change == 0 && round % 4 == 0;
            const int width = 1 + below(isLarge ? kWidth : 60), height = 1 + below(isLarge ? kHeight : 40);
            window.paintPart({below(kWidth + 20) - 10, below(kHeight + 20) - 10, width, height}, random() & 0xFFFFFF);
        }
        const auto whole = wholeGrab(window);
        ASSERT_FALSE(whole.empty());
        ASSERT_TRUE(frames->waitFor([&](const auto&) { return converted->latest().pixels == whole; })) << "round " << round;
        const auto latest = converted->latest();
        ASSERT_EQ(latest.planar, latest.planarOfWhole) << "round " << round;
    }
    // How much depends on how many changes one picture has.
    EXPECT_LT(converted->partConverted(), 1) << "of the pixels were converted";
}

// What paints everything each time is soon taken to do so without a question to the server.
TEST_F(X11Parts, DamageIsSmallAgainWhenAWindowCeasesToPaintEverything) {
    TestWindow window(display.name(), {.place = {0, 0, kWidth, kHeight}, .colour = 0x406080, .repaints = false});
    const auto made = startOn(window, kWidth, kHeight);
    for (std::uint32_t red = 0x080000; red <= 0xF00000; red += 0x080000) {
        window.paint(red);
        ASSERT_TRUE(frames->waitForColour(red));
    }
    for (const CapturedFrame& frame : frames->frames()) {
        if (frame.damage.empty()) continue;  // a repeat
        EXPECT_EQ(frame.damage, (std::vector<PixelRect>{{0, 0, kWidth, kHeight}})) << frame.number;
    }
    const auto damageOf = [&](std::uint32_t colour) -> std::vector<PixelRect> {
        window.paintPart({310, 170, 30, 20}, colour);
        const auto isThere = [&](const CapturedFrames::Frames& got) { return got.back().colour == colour; };
        if (!frames->waitFor(isThere)) return {};
        const CapturedFrames::Frames got = frames->frames();
        return std::find_if(got.begin(), got.end(), [&](const auto& frame) { return frame.colour == colour; })->damage;
    };
    const std::vector<PixelRect> painted{{310, 170, 30, 20}};
    constexpr std::uint32_t kFirst = 0x10B030;
    std::uint32_t colour = kFirst;
    while (colour < kFirst + 10 && damageOf(colour) != painted) ++colour;
    EXPECT_LT(colour, kFirst + 10) << "ten pictures later the whole window is read still";
    EXPECT_EQ(damageOf(0x2030D0), painted);
}

}  // namespace
}  // namespace lumacast::test
