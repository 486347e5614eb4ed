#pragma once

#include <cstdint>
#include <deque>

namespace lumacast::mp4 {

inline constexpr std::uint32_t kMaxSampleBytes = 0x0FFF'FFFF;  // 256 MiB less one: keeps a fragment below 4 GiB

// Size, duration and kind of one sample. Packed into 8 bytes, so that an hour at 60 pictures a second takes 1.7 MB.
struct IndexedSample {
    std::uint32_t size : 31;
    std::uint32_t isSync : 1;
    std::uint32_t duration;  // ticks of the track
};
static_assert(sizeof(IndexedSample) == 8);

// All samples of one track in decoding order, and where they lie: 8 bytes a sample and 12 a chunk, in pieces that are
// never moved. A chunk is the run of a track's samples within one fragment.
class SampleIndex {
public:
    void add(IndexedSample sample) {
        samples_.push_back(sample);
        totalDuration_ += sample.duration;
        syncCount_ += sample.isSync;
    }

    // Corrects the duration of the last sample once the next one is known. There must be one.
    void setLastDuration(std::uint32_t duration) {
        totalDuration_ += duration;
        totalDuration_ -= samples_.back().duration;
        samples_.back().duration = duration;
    }

    // Takes the last sample back. There must be one, and every sample must lie in a chunk.
    void removeLast() {
        totalDuration_ -= samples_.back().duration;
        syncCount_ -= samples_.back().isSync;
        samples_.pop_back();
        chunkCounts_.back() -= 1;
        if (chunkCounts_.back() == 0) {
            chunkCounts_.pop_back();
            chunkOffsets_.pop_back();
        }
    }

    // The `count` samples after those of the chunk before lie one after the other from `offset` on.
    void addChunk(std::uint64_t offset, std::uint32_t count) {
        chunkOffsets_.push_back(offset);
        chunkCounts_.push_back(count);
    }

    [[nodiscard]] const std::deque<IndexedSample>& samples() const { return samples_; }
    [[nodiscard]] const std::deque<std::uint64_t>& chunkOffsets() const { return chunkOffsets_; }
    [[nodiscard]] const std::deque<std::uint32_t>& chunkCounts() const { return chunkCounts_; }
    [[nodiscard]] std::size_t count() const { return samples_.size(); }
    [[nodiscard]] std::size_t syncCount() const { return syncCount_; }
    [[nodiscard]] std::uint64_t totalDuration() const { return totalDuration_; }

private:
    std::deque<IndexedSample> samples_;
    std::deque<std::uint64_t> chunkOffsets_;
    std::deque<std::uint32_t> chunkCounts_;
    std::uint64_t totalDuration_ = 0;
    std::size_t syncCount_ = 0;
};

}  // namespace lumacast::mp4
