#include "linux/media/mp4/FileHead.h"

#include <algorithm>
#include <array>

#include "linux/media/mp4/BoxReader.h"
#include "linux/media/mp4/BoxSource.h"
#include "linux/media/mp4/MovieLayout.h"

namespace lumacast::mp4 {
namespace {

constexpr std::uint64_t kHeaderBytes = 8;

// Whether each letter is one of the two names', as an overwrite leaves it that was torn.
bool isBetween(std::span<const std::uint8_t> type, FourCC before, FourCC after) {
    for (unsigned i = 0; i < 4; ++i) {
        const unsigned shift = 24 - 8 * i;
        if (type[i] != ((before.value >> shift) & 0xFFU) && type[i] != ((after.value >> shift) & 0xFFU)) {
            return false;
        }
    }
    return true;
}

}  // namespace

HeadView readFileHead(BoxSource& source) {
    std::array<std::uint8_t, kFileStartBytes> bytes;
    if (source.size() < bytes.size()) {
        return {FileHead::notOurs, 0};
    }
    if (!source.read(0, bytes)) {
        return {FileHead::unreadable, 0};
    }
    BoxBuffer start;
    writeFileStart(start);
    const std::span all(bytes);
    if (!std::ranges::equal(all.first(kReserveOffset), start.view().first(kReserveOffset))) {
        return {FileHead::notOurs, 0};
    }
    BoxReader reserve(all.subspan(kReserveOffset));
    const std::uint32_t size = reserve.u32();
    const auto type = reserve.take(4);
    const std::uint64_t mediaBytes = reserve.u64();
    if (!isBetween(type, "free", "mdat")) {
        return {FileHead::notOurs, 0};
    }
    if (size == kFileStartBytes - kReserveOffset) {
        return {FileHead::unfinished, 0};
    }
    const bool hasMovie = mediaBytes >= kFileStartBytes - kReserveOffset && source.size() >= kReserveOffset + kHeaderBytes &&
                          mediaBytes <= source.size() - kReserveOffset - kHeaderBytes;
    if (size != 1 || !hasMovie) {
        return {FileHead::notOurs, 0};
    }
    const bool isWhole = BoxReader(type).u32() == FourCC("mdat").value;
    return {isWhole ? FileHead::finished : FileHead::halfSwitched, kReserveOffset + mediaBytes};
}

}  // namespace lumacast::mp4
