#include "linux/media/mp4/FragmentReader.h"

#include "linux/media/mp4/BoxReader.h"
#include "linux/media/mp4/FragmentBoxes.h"

namespace lumacast::mp4 {
namespace {

using Payload = std::span<const std::uint8_t>;

// The payload of the next box if it has this type and, where `size` is given, this length; else empty, and `in` has
// failed.
Payload expectBox(BoxReader& in, FourCC type, std::size_t size = 0) {
    const auto box = nextBox(in);
    if (!box || box->type != type.value || box->payload.empty() || (size != 0 && box->payload.size() != size)) {
        in.skip(in.left() + 1);
        return {};
    }
    return box->payload;
}

// ISO/IEC 14496-12 clause 8.8.8, with the fields in use here. False: not such a run, or not of `offset`.
bool readRun(Payload payload, bool isVideo, std::uint64_t offset, FragmentRun& run, std::uint64_t& bytes) {
    const std::size_t entryBytes = isVideo ? 12 : 8;
    BoxReader in(payload);
    const std::uint32_t flags = kRunHasOffsetDurationsSizes | (isVideo ? kRunHasFlags : 0);
    const bool isOurs = in.u32() == flags;
    const std::uint32_t count = in.u32();
    const std::uint32_t dataOffset = in.u32();
    if (!isOurs || in.failed() || count == 0 || in.left() != std::uint64_t{count} * entryBytes ||
        dataOffset != static_cast<std::uint32_t>(offset)) {
        return false;
    }
    run.mediaOffset = offset;
    run.samples.reserve(count);
    for (std::uint32_t i = 0; i < count; ++i) {
        const std::uint32_t duration = in.u32();
        const std::uint32_t size = in.u32();
        const std::uint32_t kind = isVideo ? in.u32() : kSyncSample;
        if (duration == 0 || size == 0 || size > kMaxSampleBytes || (kind != kSyncSample && kind != kDeltaSample)) {
            return false;
        }
        run.samples.push_back({size, kind == kSyncSample ? 1U : 0U, duration});
        bytes += size;
    }
    return true;
}

}  // namespace

std::optional<Fragment> readFragment(std::span<const std::uint8_t> box, std::span<const MovieTrack> tracks) {
    BoxReader outer(box);
    const auto whole = nextBox(outer);
    if (!whole || outer.left() != 0 || box.size() > kMaxFragmentHeaderBytes) {
        return std::nullopt;
    }
    Fragment fragment;
    BoxReader in(whole->payload);
    BoxReader header(expectBox(in, "mfhd", 8));
    header.skip(4);
    fragment.sequenceNumber = header.u32();
    while (in.left() > 0) {
        BoxReader part(expectBox(in, "traf"));
        BoxReader trackHeader(expectBox(part, "tfhd", 8));
        BoxReader time(expectBox(part, "tfdt", 12));
        FragmentRun run;
        const bool isOurs = trackHeader.u32() == kDefaultBaseIsMoof && time.u32() == 1U << 24U;
        run.trackId = trackHeader.u32();
        run.decodeTime = time.u64();
        const std::uint32_t before = fragment.runs.empty() ? 0 : fragment.runs.back().trackId;
        if (!isOurs || run.trackId <= before || run.trackId > tracks.size() ||
            !readRun(expectBox(part, "trun"), tracks[run.trackId - 1].isVideo(),
                     box.size() + kMediaHeaderBytes + fragment.mediaBytes, run, fragment.mediaBytes) ||
            part.left() != 0) {
            return std::nullopt;
        }
        fragment.runs.push_back(std::move(run));
    }
    return in.failed() || fragment.runs.empty() ? std::nullopt : std::optional(std::move(fragment));
}

}  // namespace lumacast::mp4
