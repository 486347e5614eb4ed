#include "tests/checkers/BoxSampleTables.h"

#include <algorithm>

namespace lumacast::checkers {
namespace {

constexpr char kTimes[] = "14496-12, 8.6.1.2", kCompositions[] = "14496-12, 8.6.1.3", kSync[] = "14496-12, 8.6.2",
               kSizes[] = "14496-12, 8.7.3", kChunks[] = "14496-12, 8.7.4", kOffsets[] = "14496-12, 8.7.5";

struct ChunkRun {
    std::uint32_t firstChunk, samplesPerChunk;
};

class TableCheck final {
public:
    TableCheck(const std::vector<Extent>& media, std::uint64_t fileBytes, CheckedTrack& track,
               const Complaints& complaints)
        : media_(media), fileBytes_(fileBytes), checked_(track), track_(track.track), complaints_(complaints) {}

    void run(const std::vector<Box>& boxes) {
        if (const Box* box = onlyBox(boxes, "stsz", kSizes, complaints_)) readSizes(*box);
        if (const Box* box = onlyBox(boxes, "stts", kTimes, complaints_)) readTimes(*box);
        readOffsets(boxes);
        if (const Box* box = onlyBox(boxes, "stsc", kChunks, complaints_)) placeChunks(*box);
        track_.syncSamples = track_.samples;
        if (const Box* box = anyBox(boxes, "stss", kSync, complaints_)) readSyncSamples(*box);
        else
            for (MediaSample& sample : checked_.samples) sample.isSync = true;
        if (const Box* box = anyBox(boxes, "ctts", kCompositions, complaints_)) readCompositionOffsets(*box);
    }

private:
    void require(bool isSo, const char* clause, const std::string& otherwise) const {
        complaints_.require(isSo, clause, otherwise);
    }

    void readSizes(const Box& box) {
        FullBox table(box, 0, complaints_);
        const std::uint32_t same = table.fields.u32();
        if (same != 0) {
            track_.samples = table.fields.u32();
            requireEnd(table.fields, "stsz", kSizes, complaints_);
            require(track_.samples <= fileBytes_ / same, kSizes, "stsz has more samples than the file can hold");
            track_.samples = std::min(track_.samples, fileBytes_ / same);
            checked_.samples.assign(track_.samples, {0, same, false});
        } else {
            track_.samples = entriesOf(table.fields, 4, "stsz", kSizes, complaints_);
            for (std::uint64_t sample = 0; sample < track_.samples; ++sample) {
                checked_.samples.push_back({0, table.fields.u32(), false});
                if (checked_.samples.back().size == 0)
                    complaints_.find(kSizes, "sample " + std::to_string(sample + 1) + " is empty");
            }
        }
        for (const MediaSample& sample : checked_.samples) track_.bytes += sample.size;
        require(track_.samples != 0, kSizes, "there are no samples");
    }

    void readTimes(const Box& box) {
        FullBox table(box, 0, complaints_);
        std::uint64_t samples = 0, ticks = 0;
        bool still = false, none = false;
        for (std::uint64_t left = entriesOf(table.fields, 8, "stts", kTimes, complaints_); left > 0; --left) {
            const std::uint64_t count = table.fields.u32(), delta = table.fields.u32();
            samples += count;
            ticks += count * delta;
            still = still || delta == 0;
            none = none || count == 0;
        }
        require(!still, kTimes, "stts has samples of no duration");
        require(!none, kTimes, "stts has an entry for no sample");
        require(samples == track_.samples, kTimes,
                "stts has times for " + std::to_string(samples) + " samples, stsz sizes for " +
                    std::to_string(track_.samples));
        require(ticks == track_.mediaDuration, "14496-12, 8.4.2",
                "stts adds up to " + std::to_string(ticks) + ", mdhd says " + std::to_string(track_.mediaDuration));
    }

    void readOffsets(const std::vector<Box>& boxes) {
        const Box* narrow = anyBox(boxes, "stco", kOffsets, complaints_);
        const Box* wide = anyBox(boxes, "co64", kOffsets, complaints_);
        require(narrow == nullptr || wide == nullptr, kOffsets, "there are several tables of chunk offsets");
        const Box* const found = wide != nullptr ? wide : narrow;
        if (found == nullptr) return complaints_.find(kOffsets, "there is no table of chunk offsets");
        FullBox table(*found, 0, complaints_);
        const std::size_t bytes = wide != nullptr ? 8 : 4;
        for (std::uint64_t left = entriesOf(table.fields, bytes, found->type, kOffsets, complaints_); left > 0; --left)
            offsets_.push_back(table.fields.unsignedOf(bytes));
        track_.chunks = offsets_.size();
    }

    void placeChunks(const Box& box) {
        FullBox table(box, 0, complaints_);
        std::vector<ChunkRun> runs;
        for (std::uint64_t left = entriesOf(table.fields, 12, "stsc", kChunks, complaints_); left > 0; --left) {
            runs.push_back({table.fields.u32(), table.fields.u32()});
            require(table.fields.u32() == 1, kChunks, "stsc names a sample entry that isn't there");
            require(runs.back().samplesPerChunk != 0, kChunks, "stsc has an empty chunk");
            const bool rising = runs.size() == 1 ? runs.back().firstChunk == 1
                                                 : runs.back().firstChunk > runs[runs.size() - 2].firstChunk;
            if (!rising || runs.back().firstChunk > offsets_.size())
                return complaints_.find(kChunks, "stsc names chunks out of order or not there");
        }
        std::uint64_t sample = 0, counted = 0;
        auto run = runs.begin();
        for (std::size_t chunk = 1; chunk <= offsets_.size() && run != runs.end(); ++chunk) {
            if (std::next(run) != runs.end() && std::next(run)->firstChunk == chunk) ++run;
            const std::uint64_t begin = offsets_[chunk - 1];
            std::uint64_t end = begin;
            for (std::uint32_t left = run->samplesPerChunk; left > 0 && sample < checked_.samples.size(); --left) {
                checked_.samples[sample].offset = end;
                end += checked_.samples[sample++].size;
            }
            counted += run->samplesPerChunk;
            placeChunk(chunk, {begin, end});
        }
        require(counted == track_.samples, kChunks,
                "stsc has " + std::to_string(counted) + " samples in its chunks, stsz has " +
                    std::to_string(track_.samples));
    }

    void placeChunk(std::size_t chunk, const Extent& extent) {
        require(isWithin(media_, extent), kOffsets, "chunk " + std::to_string(chunk) + " isn't within the media data");
    }

    void readSyncSamples(const Box& box) {
        FullBox table(box, 0, complaints_);
        std::uint64_t previous = 0;
        track_.syncSamples = entriesOf(table.fields, 4, "stss", kSync, complaints_);
        for (std::uint64_t left = track_.syncSamples; left > 0; --left) {
            const std::uint64_t sample = table.fields.u32();
            // Else nothing could be played from the beginning on; the standard does not ask for it.
            require(previous != 0 || sample == 1, "", "the first sample isn't a sync sample");
            const bool isNext = sample > previous && sample <= track_.samples;
            require(isNext, kSync, "stss names samples out of order or not there");
            if (isNext) checked_.samples[sample - 1].isSync = true;
            previous = sample;
        }
        require(previous != 0, kSync, "stss is empty");
    }

    void readCompositionOffsets(const Box& box) {
        FullBox table(box, 1, complaints_);
        std::uint64_t samples = 0;
        for (std::uint64_t left = entriesOf(table.fields, 8, "ctts", kCompositions, complaints_); left > 0; --left) {
            samples += table.fields.u32();
            const std::uint32_t offset = table.fields.u32();
            const bool negative = table.version == 1 && offset > 0x7FFFFFFF;
            checked_.latestComposition = std::max<std::uint64_t>(checked_.latestComposition, negative ? 0 : offset);
        }
        require(samples == track_.samples, kCompositions, "ctts has another number of samples than stsz");
    }

    const std::vector<Extent>& media_;
    std::uint64_t fileBytes_;
    CheckedTrack& checked_;
    BoxTrack& track_;
    const Complaints& complaints_;
    std::vector<std::uint64_t> offsets_;
};

}  // namespace

void checkSampleTables(const std::vector<Box>& stbl, const std::vector<Extent>& media, std::uint64_t fileBytes,
                       CheckedTrack& track, const Complaints& complaints) {
    TableCheck(media, fileBytes, track, complaints).run(stbl);
}

void checkEmptySampleTables(const std::vector<Box>& stbl, const Complaints& complaints) {
    struct Table {
        const char *type, *clause;
        std::size_t countAt;  // after the version and flags
    };
    for (const Table& table : {Table{"stts", kTimes, 0}, {"stsz", kSizes, 4}, {"stsc", kChunks, 0}, {"stco", kOffsets, 0}}) {
        const Box* box = onlyBox(stbl, table.type, table.clause, complaints);
        if (box == nullptr) continue;
        FullBox fields(*box, 0, complaints);
        fields.fields.skip(table.countAt);
        const std::uint32_t count = fields.fields.u32();
        complaints.require(count == 0, "14496-12, 8.8.1",
                           std::string(table.type) + " has entries, though the samples are in fragments");
        requireEnd(fields.fields, table.type, table.clause, complaints);
    }
}

}  // namespace lumacast::checkers
