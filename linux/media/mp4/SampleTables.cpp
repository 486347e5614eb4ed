#include "linux/media/mp4/SampleTables.h"

#include <limits>

#include "linux/media/mp4/BoxBuffer.h"
#include "linux/media/mp4/SampleIndex.h"

namespace lumacast::mp4 {
namespace {

// ISO/IEC 14496-12 clause 8.6.1.2: runs of equal durations.
void writeTimeToSample(BoxBuffer& out, const SampleIndex& index) {
    const Box box(out, "stts", 0, 0);
    const std::size_t countAt = out.size();
    out.u32(0);
    std::uint32_t entries = 0;
    const auto& samples = index.samples();
    for (std::size_t i = 0; i < samples.size();) {
        std::size_t end = i + 1;
        while (end < samples.size() && samples[end].duration == samples[i].duration) {
            ++end;
        }
        out.u32(static_cast<std::uint32_t>(end - i));
        out.u32(samples[i].duration);
        ++entries;
        i = end;
    }
    out.patch32(countAt, entries);
}

// ISO/IEC 14496-12 clause 8.6.2: numbers of the sync samples, from 1; its absence says that all are.
void writeSyncSamples(BoxBuffer& out, const SampleIndex& index) {
    if (index.syncCount() == index.count()) {
        return;
    }
    const Box box(out, "stss", 0, 0);
    out.u32(static_cast<std::uint32_t>(index.syncCount()));
    std::uint32_t number = 0;
    for (const IndexedSample& sample : index.samples()) {
        ++number;
        if (sample.isSync != 0) {
            out.u32(number);
        }
    }
}

// ISO/IEC 14496-12 clause 8.7.4: runs of chunks with equally many samples.
void writeSampleToChunk(BoxBuffer& out, const SampleIndex& index) {
    const Box box(out, "stsc", 0, 0);
    const std::size_t countAt = out.size();
    out.u32(0);
    std::uint32_t entries = 0;
    std::uint32_t number = 0;
    std::uint32_t previous = 0;
    for (const std::uint32_t samplesInChunk : index.chunkCounts()) {
        ++number;
        if (samplesInChunk == previous) {
            continue;
        }
        out.u32(number);
        out.u32(samplesInChunk);
        out.u32(1);  // sample_description_index
        previous = samplesInChunk;
        ++entries;
    }
    out.patch32(countAt, entries);
}

// ISO/IEC 14496-12 clause 8.7.3.2.
void writeSampleSizes(BoxBuffer& out, const SampleIndex& index) {
    const Box box(out, "stsz", 0, 0);
    out.u32(0);  // sample_size: they differ
    out.u32(static_cast<std::uint32_t>(index.count()));
    for (const IndexedSample& sample : index.samples()) {
        out.u32(sample.size);
    }
}

// ISO/IEC 14496-12 clause 8.7.5. Offsets only grow, so the last one decides.
void writeChunkOffsets(BoxBuffer& out, const SampleIndex& index) {
    const auto& offsets = index.chunkOffsets();
    const bool wide = !offsets.empty() && offsets.back() > std::numeric_limits<std::uint32_t>::max();
    const Box box(out, wide ? FourCC("co64") : FourCC("stco"), 0, 0);
    out.u32(static_cast<std::uint32_t>(offsets.size()));
    for (const std::uint64_t offset : offsets) {
        if (wide) {
            out.u64(offset);
        } else {
            out.u32(static_cast<std::uint32_t>(offset));
        }
    }
}

}  // namespace

void writeSampleTables(BoxBuffer& out, const SampleIndex& index) {
    writeTimeToSample(out, index);
    writeSyncSamples(out, index);
    writeSampleToChunk(out, index);
    writeSampleSizes(out, index);
    writeChunkOffsets(out, index);
}

std::size_t sampleTableBytes(const SampleIndex& index) {
    constexpr std::size_t kHeaders = 100;           // five tables, 20 bytes at most
    constexpr std::size_t kBytesPerSample = 8 + 4;  // stts without runs, stsz
    constexpr std::size_t kBytesPerChunk = 12 + 8;  // stsc without runs, co64
    return kHeaders + index.count() * kBytesPerSample + index.syncCount() * 4 +
           index.chunkOffsets().size() * kBytesPerChunk;
}

}  // namespace lumacast::mp4
