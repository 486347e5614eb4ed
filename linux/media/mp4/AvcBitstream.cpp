#include "linux/media/mp4/AvcBitstream.h"

#include <algorithm>
#include <array>

namespace lumacast::mp4 {
namespace {

// NAL unit types, ISO/IEC 14496-10 table 7-1.
constexpr unsigned kSliceFirst = 1;
constexpr unsigned kSliceLast = 5;
constexpr unsigned kSequenceParameterSet = 7;
constexpr unsigned kPictureParameterSet = 8;
constexpr unsigned kAccessUnitDelimiter = 9;

unsigned typeOf(std::span<const std::uint8_t> nal) {
    return nal[0] & 0x1FU;
}

// Bits of an RBSP, the emulation prevention bytes skipped (ISO/IEC 14496-10 clause 7.3.1).
class BitReader {
public:
    explicit BitReader(std::span<const std::uint8_t> bytes) : bytes_(bytes) {}

    [[nodiscard]] bool failed() const { return failed_; }

    unsigned bit() {
        if (mask_ == 0) {
            nextByte();
        }
        const unsigned value = (current_ & mask_) != 0 ? 1 : 0;
        mask_ >>= 1U;
        return value;
    }

    // ue(v), ISO/IEC 14496-10 clause 9.1.
    std::uint32_t exponentialGolomb() {
        unsigned zeros = 0;
        while (!failed_ && bit() == 0) {
            if (++zeros > 31) {
                failed_ = true;
            }
        }
        std::uint32_t value = 1;
        for (unsigned i = 0; i < zeros && !failed_; ++i) {
            value = (value << 1U) | bit();
        }
        return value - 1;
    }

private:
    void nextByte() {
        if (zeroRun_ >= 2 && position_ < bytes_.size() && bytes_[position_] == 3) {
            ++position_;
            zeroRun_ = 0;
        }
        if (position_ >= bytes_.size()) {
            failed_ = true;
            current_ = 0;
        } else {
            current_ = bytes_[position_++];
            zeroRun_ = current_ == 0 ? zeroRun_ + 1 : 0;
        }
        mask_ = 0x80;
    }

    std::span<const std::uint8_t> bytes_;
    std::size_t position_ = 0;
    unsigned zeroRun_ = 0;
    unsigned current_ = 0;
    unsigned mask_ = 0;
    bool failed_ = false;
};

// Offset of the next 00 00 01 at or after `from`, or the size.
std::size_t findStartCode(std::span<const std::uint8_t> stream, std::size_t from) {
    static constexpr std::array<std::uint8_t, 3> kStartCode{0, 0, 1};
    const auto found = std::search(stream.begin() + static_cast<std::ptrdiff_t>(from), stream.end(), kStartCode.begin(),
                                   kStartCode.end());
    return static_cast<std::size_t>(found - stream.begin());
}

bool carriesChromaFields(std::uint8_t profile) {
    static constexpr std::array<std::uint8_t, 12> kProfiles{100, 110, 122, 244, 44, 83, 86, 118, 128, 138, 139, 134};
    return std::find(kProfiles.begin(), kProfiles.end(), profile) != kProfiles.end();
}

/// Without memory of its own: it is done for each picture.
template <class Do>
void forEachUnit(std::span<const std::uint8_t> stream, const Do& act) {
    std::size_t start = findStartCode(stream, 0);
    while (start < stream.size()) {
        const std::size_t begin = start + 3;
        const std::size_t next = findStartCode(stream, begin);
        std::size_t end = next;
        while (end > begin && stream[end - 1] == 0) {
            --end;
        }
        if (end > begin) {
            act(stream.subspan(begin, end - begin));
        }
        start = next;
    }
}

}  // namespace

std::vector<std::span<const std::uint8_t>> splitAnnexB(std::span<const std::uint8_t> stream) {
    std::vector<std::span<const std::uint8_t>> units;
    forEachUnit(stream, [&](std::span<const std::uint8_t> unit) { units.push_back(unit); });
    return units;
}

ParameterSets parameterSetsOf(std::span<const std::uint8_t> annexB) {
    ParameterSets sets;
    for (const auto nal : splitAnnexB(annexB)) {
        if (typeOf(nal) == kSequenceParameterSet) {
            sets.sequence.emplace_back(nal.begin(), nal.end());
        } else if (typeOf(nal) == kPictureParameterSet) {
            sets.picture.emplace_back(nal.begin(), nal.end());
        }
    }
    return sets;
}

bool appendLengthPrefixed(std::span<const std::uint8_t> annexB, std::vector<std::uint8_t>& sample) {
    const std::size_t before = sample.size();
    bool hasSlice = false;
    forEachUnit(annexB, [&](std::span<const std::uint8_t> nal) {
        const unsigned type = typeOf(nal);
        if (type == kSequenceParameterSet || type == kPictureParameterSet || type == kAccessUnitDelimiter) {
            return;
        }
        hasSlice = hasSlice || (type >= kSliceFirst && type <= kSliceLast);
        for (unsigned shift = 32; shift > 0; shift -= 8) {
            sample.push_back(static_cast<std::uint8_t>(nal.size() >> (shift - 8)));
        }
        sample.insert(sample.end(), nal.begin(), nal.end());
    });
    if (!hasSlice) {
        sample.resize(before);
    }
    return hasSlice;
}

std::optional<SequenceInfo> parseSequenceParameterSet(std::span<const std::uint8_t> nal) {
    if (nal.size() < 5 || nal.size() > 0xFFFF || typeOf(nal) != kSequenceParameterSet) {
        return std::nullopt;
    }
    SequenceInfo info;
    info.profile = nal[1];
    info.compatibility = nal[2];
    info.level = nal[3];
    BitReader reader(nal.subspan(4));
    reader.exponentialGolomb();  // seq_parameter_set_id
    info.hasChromaFields = carriesChromaFields(info.profile);
    if (info.hasChromaFields) {
        const std::uint32_t format = reader.exponentialGolomb();
        if (format == 3) {
            reader.bit();  // separate_colour_plane_flag
        }
        const std::uint32_t luma = reader.exponentialGolomb();
        const std::uint32_t chroma = reader.exponentialGolomb();
        if (format > 3 || luma > 6 || chroma > 6) {
            return std::nullopt;
        }
        info.chromaFormat = static_cast<std::uint8_t>(format);
        info.bitDepthLumaMinus8 = static_cast<std::uint8_t>(luma);
        info.bitDepthChromaMinus8 = static_cast<std::uint8_t>(chroma);
    }
    return reader.failed() ? std::nullopt : std::optional(info);
}

}  // namespace lumacast::mp4
