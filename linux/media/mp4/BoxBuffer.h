#pragma once

#include <cstdint>
#include <span>
#include <string_view>
#include <vector>

namespace lumacast::mp4 {

// Four printable characters naming a box, a brand or a handler.
struct FourCC {
    // Implicit on purpose: a box is named by its literal, and a literal of another length does not compile.
    consteval FourCC(const char (&text)[5])
        : value((static_cast<std::uint32_t>(text[0]) << 24U) | (static_cast<std::uint32_t>(text[1]) << 16U) |
                (static_cast<std::uint32_t>(text[2]) << 8U) | static_cast<std::uint32_t>(text[3])) {}
    std::uint32_t value;
};

// Bytes under construction, most significant byte first (ISO/IEC 14496-12 clause 4.1).
class BoxBuffer {
public:
    void u8(std::uint8_t value) { bytes_.push_back(value); }
    void u16(std::uint16_t value) { number<2>(value); }
    void u24(std::uint32_t value) { number<3>(value); }
    void u32(std::uint32_t value) { number<4>(value); }
    void u64(std::uint64_t value) { number<8>(value); }
    void i16(std::int16_t value) { u16(static_cast<std::uint16_t>(value)); }
    void i32(std::int32_t value) { u32(static_cast<std::uint32_t>(value)); }
    void i64(std::int64_t value) { u64(static_cast<std::uint64_t>(value)); }
    void code(FourCC value) { u32(value.value); }
    void zeros(std::size_t count) { bytes_.resize(bytes_.size() + count); }
    void raw(std::span<const std::uint8_t> value) { bytes_.insert(bytes_.end(), value.begin(), value.end()); }
    // UTF-8 with a terminating zero; a zero inside would end it early, so the text is cut there.
    void text(std::string_view value) {
        value = value.substr(0, value.find('\0'));
        bytes_.insert(bytes_.end(), value.begin(), value.end());
        u8(0);
    }

    void patch32(std::size_t at, std::uint32_t value) {
        for (std::size_t i = 0; i < 4; ++i) {
            bytes_[at + i] = static_cast<std::uint8_t>(value >> (24U - 8U * i));
        }
    }

    [[nodiscard]] std::size_t size() const { return bytes_.size(); }
    [[nodiscard]] std::span<const std::uint8_t> view() const { return bytes_; }
    void clear() { bytes_.clear(); }
    void reserve(std::size_t count) { bytes_.reserve(count); }

private:
    template <unsigned kBytes>
    void number(std::uint64_t value) {
        for (unsigned i = kBytes; i-- > 0;) {
            bytes_.push_back(static_cast<std::uint8_t>(value >> (8U * i)));
        }
    }

    std::vector<std::uint8_t> bytes_;
};

// An open box: what is written to the buffer while it lives is the box's payload; its end fills in the size
// (ISO/IEC 14496-12 clause 4.2). The buffer must outlive it.
class Box {
public:
    Box(BoxBuffer& buffer, FourCC type) : buffer_(buffer), start_(buffer.size()) {
        buffer_.u32(0);
        buffer_.code(type);
    }
    // A FullBox, with its version and flags.
    Box(BoxBuffer& buffer, FourCC type, std::uint8_t version, std::uint32_t flags) : Box(buffer, type) {
        buffer_.u8(version);
        buffer_.u24(flags);
    }
    ~Box() { buffer_.patch32(start_, static_cast<std::uint32_t>(buffer_.size() - start_)); }

    Box(const Box&) = delete;
    Box& operator=(const Box&) = delete;

private:
    BoxBuffer& buffer_;
    std::size_t start_;
};

}  // namespace lumacast::mp4
