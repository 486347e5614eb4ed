#include "linux/media/mp4/SampleCheck.h"

#include <algorithm>
#include <array>

#include "linux/media/mp4/BoxSource.h"

namespace lumacast::mp4 {
namespace {

constexpr std::uint64_t kSectorBytes = 512;  // the smallest that disks have
constexpr std::size_t kPieceBytes = 16 * kSectorBytes;

// Looks at a picture byte by byte.
class PictureCheck {
public:
    void take(std::uint8_t byte) {
        if (lengthBytes_ < 4) {
            length_ = (length_ << 8U) | byte;
            if (++lengthBytes_ == 4) {
                isBad_ = isBad_ || length_ == 0;
                isFirst_ = true;
                zeros_ = 0;
            }
            return;
        }
        if (isFirst_) {
            const unsigned type = byte & 0x1FU;
            isBad_ = isBad_ || (byte & 0x80U) != 0 || type == 0;
            hasSlice_ = hasSlice_ || (type >= 1 && type <= 5);
            isFirst_ = false;
        }
        isBad_ = isBad_ || (zeros_ >= 2 && byte < 3);
        zeros_ = byte == 0 ? zeros_ + 1 : 0;
        if (--length_ == 0) {
            isBad_ = isBad_ || byte == 0;
            lengthBytes_ = 0;
        }
    }
    // At its end.
    [[nodiscard]] bool isWhole() const { return !isBad_ && hasSlice_ && lengthBytes_ == 0; }

private:
    unsigned lengthBytes_ = 0;
    std::uint32_t length_ = 0;
    unsigned zeros_ = 0;
    bool isFirst_ = false;
    bool hasSlice_ = false;
    bool isBad_ = false;
};

// Looks at a sound packet piece by piece.
class SoundCheck {
public:
    void take(std::uint64_t offset, std::span<const std::uint8_t> bytes) {
        for (std::size_t at = 0; at < bytes.size();) {
            const auto count = std::min<std::size_t>(kSectorBytes - (offset + at) % kSectorBytes, bytes.size() - at);
            const auto sector = bytes.subspan(at, count);
            isBad_ = isBad_ || std::all_of(sector.begin(), sector.end(), [](std::uint8_t byte) { return byte == 0; });
            at += count;
        }
        last_ = bytes.back();
    }
    [[nodiscard]] bool isWhole() const { return !isBad_ && last_ != 0; }

private:
    std::uint8_t last_ = 0;
    bool isBad_ = false;
};

}  // namespace

bool carriesData(BoxSource& source, std::uint64_t offset, std::uint32_t size, SampleKind kind) {
    if (offset > source.size() || size > source.size() - offset || size == 0) {
        return false;
    }
    PictureCheck picture;
    SoundCheck sound;
    std::array<std::uint8_t, kPieceBytes> piece;
    const std::uint64_t end = offset + size;
    while (offset < end) {
        // Pieces begin and end with sectors.
        const std::uint64_t pieceEnd = std::min(end, offset - offset % kSectorBytes + kPieceBytes);
        const std::span bytes(piece.data(), static_cast<std::size_t>(pieceEnd - offset));
        if (!source.read(offset, bytes)) {
            return false;
        }
        if (kind == SampleKind::video) {
            std::for_each(bytes.begin(), bytes.end(), [&](std::uint8_t byte) { picture.take(byte); });
        } else {
            sound.take(offset, bytes);
        }
        offset = pieceEnd;
    }
    return kind == SampleKind::video ? picture.isWhole() : sound.isWhole();
}

}  // namespace lumacast::mp4
