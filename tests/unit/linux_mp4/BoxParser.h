#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <span>
#include <string>
#include <vector>

namespace lumacast::mp4::test {

// A small reader of boxes, written apart from the writer: it knows nothing of the writer's code and checks that sizes
// add up.

struct ParsedBox {
    std::string type;
    std::uint64_t offset = 0;  // of the box in the file
    std::uint64_t size = 0;
    std::uint64_t headerSize = 0;
    std::span<const std::uint8_t> payload;
    std::vector<ParsedBox> children;

    // The first child of that path, such as "mdia/minf/stbl". Throws when there is none.
    [[nodiscard]] const ParsedBox& at(const std::string& path) const;
    [[nodiscard]] bool has(const std::string& path) const;
    [[nodiscard]] std::vector<const ParsedBox*> all(const std::string& type) const;
    [[nodiscard]] std::string childTypes() const;  // "mvhd trak trak"
    [[nodiscard]] std::uint8_t version() const { return payload[0]; }
    [[nodiscard]] std::uint32_t flags() const;
};

// Throws std::runtime_error when a box reaches past its parent or a table past its box.
[[nodiscard]] std::vector<ParsedBox> parseBoxes(std::span<const std::uint8_t> file);
// The same for a file that was cut off: only the boxes of the top level that are wholly there.
[[nodiscard]] std::vector<ParsedBox> parseWholeBoxes(std::span<const std::uint8_t> file);
[[nodiscard]] std::string typesOf(const std::vector<ParsedBox>& boxes);

// Big-endian fields one after the other.
class Fields {
public:
    explicit Fields(std::span<const std::uint8_t> bytes) : bytes_(bytes) {}
    [[nodiscard]] std::uint64_t number(std::size_t size);
    std::uint8_t u8() { return static_cast<std::uint8_t>(number(1)); }
    std::uint16_t u16() { return static_cast<std::uint16_t>(number(2)); }
    std::uint32_t u32() { return static_cast<std::uint32_t>(number(4)); }
    std::int32_t i32() { return static_cast<std::int32_t>(number(4)); }
    std::uint64_t u64() { return number(8); }
    void skip(std::size_t count) { (void)take(count); }
    [[nodiscard]] std::span<const std::uint8_t> take(std::size_t count);
    [[nodiscard]] std::size_t left() const { return bytes_.size() - position_; }

private:
    std::span<const std::uint8_t> bytes_;
    std::size_t position_ = 0;
};

struct ParsedSample {
    std::uint64_t offset = 0;
    std::uint32_t size = 0;
    std::uint64_t decodeTime = 0;
    std::uint32_t duration = 0;
    bool isSync = false;
};

struct ParsedEdit {
    std::uint64_t duration = 0;
    std::int64_t mediaTime = 0;
};

struct ParsedTrack {
    std::uint32_t id = 0;
    std::string handler;
    std::string name;
    std::uint32_t timescale = 0;
    std::uint64_t mediaDuration = 0;
    std::uint64_t movieDuration = 0;
    std::vector<std::int32_t> matrix;
    std::uint32_t width = 0;
    std::uint32_t height = 0;
    std::vector<ParsedEdit> edits;
    std::vector<ParsedSample> samples;
};

// A track box with its tables expanded to samples.
[[nodiscard]] ParsedTrack parseTrack(const ParsedBox& trak);
// Of a moov: all its tracks, and how long it says that it is.
[[nodiscard]] std::vector<ParsedTrack> tracksOf(const ParsedBox& movie);
[[nodiscard]] std::uint64_t movieDuration(const ParsedBox& movie);

struct ParsedRun {
    std::uint32_t trackId = 0;
    std::uint64_t decodeTime = 0;
    std::vector<ParsedSample> samples;
};
// One moof, offsets made absolute.
[[nodiscard]] std::vector<ParsedRun> parseFragment(const ParsedBox& moof);

}  // namespace lumacast::mp4::test
