#include "linux/media/mp4/TornEnd.h"

#include <algorithm>

#include "linux/media/mp4/BoxBuffer.h"

namespace lumacast::mp4 {

void writeBridge(BoxBuffer& out, const TornEnd& end, std::uint64_t fileBytes, std::uint64_t appended) {
    constexpr std::uint32_t kHeaderBytes = 8;
    std::optional<std::uint64_t> next = end.nextBox;
    std::uint64_t position = fileBytes;
    if (!end.header.empty()) {
        std::uint32_t size = 0;
        for (std::size_t i = 0; i < 4; ++i) {
            size = (size << 8U) | (i < end.header.size() ? end.header[i] : 0U);
        }
        if (size < kHeaderBytes && end.header.size() < 4) {
            size = kHeaderBytes;
        }
        BoxBuffer header;
        header.u32(size);
        header.code("free");
        out.raw(header.view().subspan(end.header.size()));
        const std::uint64_t start = fileBytes - end.header.size();
        position = start + kHeaderBytes;
        next = size < kHeaderBytes ? std::nullopt : std::optional(start + size);
    }
    if (next && *next > position && *next - position < appended) {
        out.zeros(static_cast<std::size_t>(*next - position));
    }
}

}  // namespace lumacast::mp4
