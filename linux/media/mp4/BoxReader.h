#pragma once

#include <cstdint>
#include <optional>
#include <span>

#include "linux/media/mp4/BoxBuffer.h"

namespace lumacast::mp4 {

// Fields of a box, most significant byte first (ISO/IEC 14496-12 clause 4.1), of bytes that may be anything. Reading past
// the end answers zeros and nothing, and is remembered: ask `failed` once in the end.
class BoxReader {
public:
    explicit BoxReader(std::span<const std::uint8_t> bytes) : rest_(bytes) {}

    [[nodiscard]] std::uint64_t number(unsigned size) {
        std::uint64_t value = 0;
        for (const std::uint8_t byte : take(size)) {
            value = (value << 8U) | byte;
        }
        return value;
    }
    std::uint8_t u8() { return static_cast<std::uint8_t>(number(1)); }
    std::uint16_t u16() { return static_cast<std::uint16_t>(number(2)); }
    std::uint32_t u32() { return static_cast<std::uint32_t>(number(4)); }
    std::uint64_t u64() { return number(8); }
    void skip(std::size_t count) { (void)take(count); }

    std::span<const std::uint8_t> take(std::size_t count) {
        if (count > rest_.size()) {
            failed_ = true;
            rest_ = {};
            return {};
        }
        const auto taken = rest_.first(count);
        rest_ = rest_.subspan(count);
        return taken;
    }

    [[nodiscard]] std::size_t left() const { return rest_.size(); }
    [[nodiscard]] bool failed() const { return failed_; }

private:
    std::span<const std::uint8_t> rest_;
    bool failed_ = false;
};

struct BoxView {
    std::uint32_t type = 0;
    std::span<const std::uint8_t> payload;
};

// The next of the boxes that lie one after the other, with a 32-bit size each; none at the end, and when the rest is no
// box.
[[nodiscard]] inline std::optional<BoxView> nextBox(BoxReader& in) {
    constexpr std::uint32_t kHeader = 8;
    if (in.left() < kHeader) {
        return std::nullopt;
    }
    const std::uint32_t size = in.u32();
    const std::uint32_t type = in.u32();
    if (size < kHeader || size - kHeader > in.left()) {
        return std::nullopt;
    }
    return BoxView{type, in.take(size - kHeader)};
}

// The payload of the first box of that type; empty when there is none.
[[nodiscard]] inline std::span<const std::uint8_t> findBox(std::span<const std::uint8_t> boxes, FourCC type) {
    BoxReader in(boxes);
    while (const auto box = nextBox(in)) {
        if (box->type == type.value) {
            return box->payload;
        }
    }
    return {};
}

}  // namespace lumacast::mp4
