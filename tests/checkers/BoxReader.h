#pragma once

#include <cstdint>
#include <span>
#include <string>

namespace lumacast::checkers {

/// Reads big-endian fields from bytes. Reading past the end gives zeros and makes `good` false for ever.
class BoxReader final {
public:
    explicit BoxReader(std::span<const std::uint8_t> bytes) : bytes_(bytes) {}

    [[nodiscard]] std::uint64_t unsignedOf(std::size_t count) {
        std::uint64_t value = 0;
        for (const std::uint8_t byte : take(count)) value = value << 8 | byte;
        return value;
    }
    std::uint8_t u8() { return static_cast<std::uint8_t>(unsignedOf(1)); }
    std::uint16_t u16() { return static_cast<std::uint16_t>(unsignedOf(2)); }
    std::uint32_t u32() { return static_cast<std::uint32_t>(unsignedOf(4)); }
    std::uint64_t u64() { return unsignedOf(8); }
    /// A 32-bit field in version 0 of a box, a 64-bit one in version 1.
    std::uint64_t byVersion(std::uint8_t version) { return version == 0 ? u32() : u64(); }
    std::string fourCharacters() {
        const auto bytes = take(4);
        return {bytes.begin(), bytes.end()};
    }
    void skip(std::size_t count) { take(count); }
    std::span<const std::uint8_t> take(std::size_t count) {
        if (count > bytes_.size()) {
            good_ = false;
            bytes_ = {};
            return {};
        }
        const auto taken = bytes_.first(count);
        bytes_ = bytes_.subspan(count);
        return taken;
    }

    [[nodiscard]] std::size_t left() const { return bytes_.size(); }
    [[nodiscard]] bool good() const { return good_; }

private:
    std::span<const std::uint8_t> bytes_;
    bool good_ = true;
};

}  // namespace lumacast::checkers
