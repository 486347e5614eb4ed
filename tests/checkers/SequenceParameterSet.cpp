#include "tests/checkers/SequenceParameterSet.h"

#include <algorithm>
#include <array>
#include <vector>

namespace lumacast::checkers {
namespace {

constexpr std::array<std::uint8_t, 13> kProfilesWithChroma{100, 110, 122, 244, 44, 83, 86, 118, 128, 138, 139, 134, 135};

class Bits final {
public:
    /// Without the bytes that keep start codes out (14496-10, 7.4.1).
    explicit Bits(std::span<const std::uint8_t> nal) {
        int zeros = 0;
        for (const std::uint8_t byte : nal) {
            if (zeros >= 2 && byte == 3) {
                zeros = 0;
                continue;
            }
            zeros = byte == 0 ? zeros + 1 : 0;
            bytes_.push_back(byte);
        }
    }

    std::uint32_t take(int count) {
        std::uint32_t value = 0;
        for (; count > 0; --count, ++place_) {
            if (place_ / 8 >= bytes_.size()) {
                good_ = false;
                return 0;
            }
            value = value << 1 | (bytes_[place_ / 8] >> (7 - place_ % 8) & 1U);
        }
        return value;
    }
    bool flag() { return take(1) != 0; }
    /// ue(v), 14496-10, 9.1.
    std::uint32_t golomb() {
        int zeros = 0;
        while (good_ && !flag()) ++zeros;
        if (zeros > 31) good_ = false;
        return good_ ? (1U << zeros) - 1 + take(zeros) : 0;
    }
    /// se(v), 14496-10, 9.1.1.
    std::int32_t signedGolomb() {
        const std::uint32_t code = golomb();
        const auto half = static_cast<std::int32_t>((std::uint64_t{code} + 1) / 2);
        return code % 2 == 1 ? half : -half;
    }
    [[nodiscard]] bool good() const { return good_; }

private:
    std::vector<std::uint8_t> bytes_;
    std::size_t place_ = 0;
    bool good_ = true;
};

void skipScalingList(Bits& bits, int size) {
    int last = 8, next = 8;
    for (int place = 0; place < size && next != 0 && bits.good(); ++place) {
        next = (last + bits.signedGolomb() + 256) % 256;
        if (next != 0) last = next;
    }
}

void readChroma(Bits& bits, SequenceFormat& format) {
    format.hasChromaFields = true;
    format.chromaFormat = bits.golomb();
    if (format.chromaFormat == 3) bits.take(1);
    format.lumaDepth = 8 + bits.golomb();
    format.chromaDepth = 8 + bits.golomb();
    bits.take(1);
    if (!bits.flag()) return;
    for (int list = 0; list < (format.chromaFormat == 3 ? 12 : 8) && bits.good(); ++list)
        if (bits.flag()) skipScalingList(bits, list < 6 ? 16 : 64);
}

void skipOrderCount(Bits& bits) {
    const std::uint32_t kind = bits.golomb();
    if (kind == 0) bits.golomb();
    if (kind != 1) return;
    bits.take(1);
    bits.signedGolomb();
    bits.signedGolomb();
    for (std::uint32_t left = std::min<std::uint32_t>(bits.golomb(), 255); left > 0; --left) bits.signedGolomb();
}

void readSize(Bits& bits, SequenceFormat& format) {
    const std::uint32_t across = bits.golomb() + 1, down = bits.golomb() + 1;
    const bool isFrames = bits.flag();
    if (!isFrames) bits.take(1);
    bits.take(1);
    const std::uint32_t fields = isFrames ? 1 : 2;
    format.width = across * 16;
    format.height = down * 16 * fields;
    if (!bits.flag()) return;
    // Table 6-1: what one step of cropping is in luma samples.
    const std::uint32_t stepAcross = format.chromaFormat == 1 || format.chromaFormat == 2 ? 2 : 1;
    const std::uint32_t stepDown = (format.chromaFormat == 1 ? 2 : 1) * fields;
    const std::uint32_t left = bits.golomb(), right = bits.golomb(), top = bits.golomb(), bottom = bits.golomb();
    format.width -= std::min(format.width, (left + right) * stepAcross);
    format.height -= std::min(format.height, (top + bottom) * stepDown);
}

void readUsability(Bits& bits, SequenceFormat& format) {
    constexpr std::uint32_t kExtended = 255;
    if (bits.flag() && bits.take(8) == kExtended) bits.take(32);
    if (bits.flag()) bits.take(1);
    if (!bits.flag()) return;
    bits.take(3);
    format.fullRange = bits.flag();
    if (!bits.flag()) return;
    const std::uint32_t primaries = bits.take(8), transfer = bits.take(8), matrix = bits.take(8);
    format.colour = ColourCodes{primaries, transfer, matrix};
}

}  // namespace

std::optional<SequenceFormat> readSequenceParameterSet(std::span<const std::uint8_t> nal) {
    constexpr std::uint8_t kSequenceParameterSet = 7;
    if (nal.size() < 4 || (nal[0] & 0x9F) != kSequenceParameterSet) return std::nullopt;
    SequenceFormat format;
    format.profile = nal[1];
    format.compatibility = nal[2];
    format.level = nal[3];
    Bits bits(nal.subspan(4));
    bits.golomb();
    if (std::find(kProfilesWithChroma.begin(), kProfilesWithChroma.end(), format.profile) != kProfilesWithChroma.end())
        readChroma(bits, format);
    bits.golomb();
    skipOrderCount(bits);
    bits.golomb();
    bits.take(1);
    readSize(bits, format);
    if (bits.flag()) readUsability(bits, format);
    if (!bits.good()) return std::nullopt;
    return format;
}

}  // namespace lumacast::checkers
