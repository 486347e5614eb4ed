#include "tests/unit/linux_mp4/BoxDump.h"

#include <algorithm>
#include <cstdio>
#include <map>

namespace lumacast::mp4::test {
namespace {

using View = std::span<const std::uint8_t>;

struct Kind {
    const char* what;
    int own = -1;  // bytes before the boxes in it; -1: it holds none
};

const Kind& kindOf(const std::string& type) {
    static const std::map<std::string, Kind> kinds{
        {"ftyp", {"major brand, minor version, compatible brands"}},
        {"free", {"not for readers"}},
        {"moov", {"the movie", 0}},
        {"mvhd", {"version and flags, two times, time scale, duration; speed, volume; matrix; next track"}},
        {"trak", {"a track", 0}},
        {"tkhd", {"version and flags, two times, track, duration; layer, group, volume; matrix; width, height"}},
        {"edts", {"", 0}},
        {"elst", {"version and flags, count; of each edit duration, media time, speed"}},
        {"mdia", {"", 0}},
        {"mdhd", {"version and flags, two times, time scale, duration; language"}},
        {"hdlr", {"version and flags, 0, kind; name"}},
        {"minf", {"", 0}},
        {"vmhd", {"version and flags, mode, colour"}},
        {"smhd", {"version and flags, balance"}},
        {"dinf", {"", 0}},
        {"dref", {"version and flags, count", 8}},
        {"url ", {"version and flags: in this file"}},
        {"stbl", {"", 0}},
        {"stsd", {"version and flags, count", 8}},
        {"avc1", {"data reference; width, height, resolution, frames, name, depth", 78}},
        {"avcC", {"version, profile, compatibility, level, length size, parameter sets"}},
        {"colr", {"kind; primaries, transfer, matrix, range"}},
        {"pasp", {"a pixel's width and height"}},
        {"mp4a", {"data reference; channels, bits, rate", 28}},
        {"esds", {"version and flags; stream, decoder and its configuration, sync layer"}},
        {"stts", {"version and flags, count; of each run samples, duration"}},
        {"stss", {"version and flags, count; sync samples"}},
        {"stsc", {"version and flags, count; of each run first chunk, samples, description"}},
        {"stsz", {"version and flags, 0, count; sizes"}},
        {"stco", {"version and flags, count; offsets"}},
        {"mvex", {"fragments follow", 0}},
        {"trex", {"version and flags, track; description, duration, size, flags"}},
        {"moof", {"a fragment", 0}},
        {"mfhd", {"version and flags, number"}},
        {"traf", {"of one track", 0}},
        {"tfhd", {"version and flags, track"}},
        {"tfdt", {"version and flags, decoding time"}},
        {"trun", {"version and flags, count, data offset; of each sample duration, size and, of a picture, flags"}},
        {"mdat", {"samples"}},
    };
    static const Kind unknown{"?"};
    const auto found = kinds.find(type);
    return found == kinds.end() ? unknown : found->second;
}

std::uint64_t number(View bytes, std::size_t count) {
    std::uint64_t value = 0;
    for (std::size_t place = 0; place < count && place < bytes.size(); ++place) value = value << 8 | bytes[place];
    return value;
}

class Dump final {
public:
    explicit Dump(View before) : before_(before) {}

    void boxes(View bytes, std::size_t depth) {
        while (!bytes.empty()) {
            std::uint64_t size = number(bytes, 4);
            const std::size_t header = size == 1 ? 16 : 8;
            if (size == 1) size = number(bytes.subspan(std::min<std::size_t>(8, bytes.size())), 8);
            if (size < header || size > bytes.size()) {
                line(depth, "no box:");
                return hex(bytes, depth);
            }
            box(bytes.first(size), header, depth);
            bytes = bytes.subspan(size);
        }
    }

    [[nodiscard]] const std::string& text() const { return text_; }

private:
    void box(View bytes, std::size_t header, std::size_t depth) {
        const std::string type(bytes.begin() + 4, bytes.begin() + 8);
        const Kind& kind = kindOf(type);
        line(depth, type + (*kind.what != 0 ? "  " : "") + kind.what);
        if (kind.own >= 0 && bytes.size() >= header + static_cast<std::size_t>(kind.own)) {
            const std::size_t own = header + static_cast<std::size_t>(kind.own);
            hex(bytes.first(own), depth + 1);
            return boxes(bytes.subspan(own), depth + 1);
        }
        const View content = bytes.subspan(header);
        const bool repeats = !before_.empty() && type == "mdat" && content.size() >= before_.size() &&
                             std::equal(before_.begin(), before_.end(), content.begin());
        if (!repeats) return hex(bytes, depth + 1);
        hex(bytes.first(header), depth + 1);
        line(depth + 1, std::to_string(before_.size()) + " bytes as they were recorded");
        hex(content.subspan(before_.size()), depth + 1);
    }

    void line(std::size_t depth, const std::string& text) { text_ += std::string(2 * depth, ' ') + text + "\n"; }

    void hex(View bytes, std::size_t depth) {
        constexpr std::size_t kPerLine = 32, kPerNumber = 4;
        std::string row;
        for (std::size_t place = 0; place < bytes.size(); ++place) {
            if (place % kPerNumber == 0 && place % kPerLine != 0) row += ' ';
            char digits[3];
            std::snprintf(digits, sizeof digits, "%02x", bytes[place]);
            row += digits;
            if (place % kPerLine == kPerLine - 1 || place + 1 == bytes.size()) {
                line(depth, ": " + row);
                row.clear();
            }
        }
    }

    View before_;
    std::string text_;
};

}  // namespace

std::string dumpOf(View file, View before) {
    Dump dump(before);
    dump.boxes(file, 0);
    return dump.text();
}

}  // namespace lumacast::mp4::test
