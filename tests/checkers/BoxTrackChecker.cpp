#include "tests/checkers/BoxTrackChecker.h"

#include <algorithm>

#include "tests/checkers/BoxReader.h"

namespace lumacast::checkers {
namespace {

// Sample entries have this many bytes before the boxes they contain (ISO/IEC 14496-12, 12.1.3 and 12.2.3).
constexpr std::size_t kVisualEntryBytes = 78;
constexpr std::size_t kAudioEntryBytes = 28;

struct FullBox {
    std::uint8_t version;
    BoxReader fields;

    explicit FullBox(const Box& box) : version(0), fields(box.content) {
        version = fields.u8();
        fields.skip(3);
    }
};

struct ChunkRun {
    std::uint32_t firstChunk, samplesPerChunk;
};

class TrackCheck final {
public:
    TrackCheck(std::uint32_t movieTimescale, const std::vector<Extent>& media, std::vector<Extent>& chunks,
               Findings& findings)
        : movieTimescale_(movieTimescale), media_(media), chunks_(chunks), findings_(findings) {}

    BoxTrack run(const Box& trak) {
        const auto boxes = children(trak);
        if (const Box* header = only(boxes, "tkhd")) readTrackHeader(*header);
        where_ = "track " + std::to_string(track_.identifier);
        if (const Box* media = only(boxes, "mdia")) readMedia(*media);
        const auto edits = std::find_if(boxes.begin(), boxes.end(), [](const Box& box) { return box.type == "edts"; });
        checkDuration(edits == boxes.end() ? nullptr : &*edits);
        return track_;
    }

private:
    void find(const std::string& text) { findings_.push_back(where_ + ": " + text); }
    std::vector<Box> children(const Box& box) {
        return boxesIn(box.content, box.offset, where_ + " " + box.type, findings_);
    }
    const Box* only(const std::vector<Box>& boxes, const char* type) { return onlyBox(boxes, type, where_, findings_); }

    void require(bool condition, const std::string& text) {
        if (!condition) find(text);
    }
    // A table must end where its box ends.
    void requireEnd(const BoxReader& fields, const char* type) {
        require(fields.good() && fields.left() == 0, std::string(type) + " has another size than its entries");
    }
    // Entries that its own bytes can hold, so that a wrong count can't make the walk endless.
    std::uint64_t entries(BoxReader& fields, std::size_t entryBytes, const char* type) {
        const std::uint64_t count = fields.u32();
        if (count * entryBytes == fields.left()) return count;
        find(std::string(type) + " has another size than its entries");
        return std::min<std::uint64_t>(count, fields.left() / entryBytes);
    }

    void readTrackHeader(const Box& box) {
        FullBox header(box);
        header.fields.skip(header.version == 0 ? 8 : 16);
        track_.identifier = header.fields.u32();
        header.fields.skip(4);
        track_.duration = header.fields.byVersion(header.version);
        require(track_.identifier != 0, "the identifier is 0");
        header.fields.skip(60);
        requireEnd(header.fields, "tkhd");
    }

    void readMedia(const Box& box) {
        const auto boxes = children(box);
        if (const Box* header = only(boxes, "mdhd")) {
            FullBox fields(*header);
            fields.fields.skip(fields.version == 0 ? 8 : 16);
            track_.timescale = fields.fields.u32();
            track_.mediaDuration = fields.fields.byVersion(fields.version);
            fields.fields.skip(4);
            requireEnd(fields.fields, "mdhd");
            require(track_.timescale != 0, "the time scale is 0");
        }
        if (const Box* handler = only(boxes, "hdlr")) {
            FullBox fields(*handler);
            fields.fields.skip(4);
            track_.handler = fields.fields.fourCharacters();
        }
        const Box* information = only(boxes, "minf");
        if (information == nullptr) return;
        const auto inside = children(*information);
        if (track_.handler == "vide") (void)only(inside, "vmhd");
        if (track_.handler == "soun") (void)only(inside, "smhd");
        if (const Box* data = only(inside, "dinf")) (void)only(children(*data), "dref");
        if (const Box* table = only(inside, "stbl")) readSampleTable(children(*table));
    }

    void readSampleTable(const std::vector<Box>& boxes) {
        if (const Box* box = only(boxes, "stsd")) readEntries(*box);
        if (const Box* box = only(boxes, "stsz")) readSizes(*box);
        if (const Box* box = only(boxes, "stts")) readTimes(*box);
        readOffsets(boxes);
        if (const Box* box = only(boxes, "stsc")) placeChunks(*box);
        track_.syncSamples = track_.samples;
        for (const Box& box : boxes) {
            if (box.type == "stss") readSyncSamples(box);
            if (box.type == "ctts") readCompositionOffsets(box);
        }
    }

    void readEntries(const Box& box) {
        FullBox table(box);
        const std::uint32_t count = table.fields.u32();
        const std::size_t before = box.content.size() - table.fields.left();
        const auto described = boxesIn(box.content.subspan(before), box.offset + before, where_ + " stsd", findings_);
        require(count == 1 && described.size() == 1, "there isn't exactly one sample entry");
        if (described.empty()) return;
        const Box& entry = described.front();
        track_.codec = entry.type;
        const std::size_t fixed = track_.handler == "vide" ? kVisualEntryBytes : kAudioEntryBytes;
        if (track_.handler != "vide" && track_.handler != "soun") return;
        if (entry.content.size() < fixed) return find("the sample entry is too short");
        const auto inside =
            boxesIn(entry.content.subspan(fixed), entry.offset + fixed, where_ + " " + entry.type, findings_);
        if (entry.type == "avc1") (void)only(inside, "avcC");
        if (entry.type == "mp4a") (void)only(inside, "esds");
    }

    void readSizes(const Box& box) {
        FullBox table(box);
        const std::uint32_t same = table.fields.u32();
        if (same != 0) {
            track_.samples = table.fields.u32();
            sameSize_ = same;
            track_.bytes = track_.samples * same;
            requireEnd(table.fields, "stsz");
        } else {
            track_.samples = entries(table.fields, 4, "stsz");
            for (std::uint64_t sample = 0; sample < track_.samples; ++sample) {
                sizes_.push_back(table.fields.u32());
                track_.bytes += sizes_.back();
                if (sizes_.back() == 0) find("sample " + std::to_string(sample + 1) + " is empty");
            }
        }
        require(track_.samples != 0, "there are no samples");
    }

    void readTimes(const Box& box) {
        FullBox table(box);
        std::uint64_t samples = 0;
        bool still = false;
        for (std::uint64_t left = entries(table.fields, 8, "stts"); left > 0; --left) {
            const std::uint64_t count = table.fields.u32(), delta = table.fields.u32();
            samples += count;
            timed_ += count * delta;
            still = still || delta == 0;
        }
        require(!still, "stts has samples of no duration");
        require(samples == track_.samples, "stts has times for " + std::to_string(samples) +
                                               " samples, stsz sizes for " + std::to_string(track_.samples));
        require(timed_ == track_.mediaDuration,
                "stts adds up to " + std::to_string(timed_) + ", mdhd says " + std::to_string(track_.mediaDuration));
    }

    void readOffsets(const std::vector<Box>& boxes) {
        const Box* found = nullptr;
        for (const Box& box : boxes) {
            if (box.type != "stco" && box.type != "co64") continue;
            require(found == nullptr, "there are several tables of chunk offsets");
            found = &box;
        }
        if (found == nullptr) return find("there is no table of chunk offsets");
        const bool wide = found->type == "co64";
        FullBox table(*found);
        for (std::uint64_t left = entries(table.fields, wide ? 8 : 4, found->type.c_str()); left > 0; --left)
            offsets_.push_back(wide ? table.fields.u64() : table.fields.u32());
        track_.chunks = offsets_.size();
    }

    void placeChunks(const Box& box) {
        FullBox table(box);
        std::vector<ChunkRun> runs;
        for (std::uint64_t left = entries(table.fields, 12, "stsc"); left > 0; --left) {
            runs.push_back({table.fields.u32(), table.fields.u32()});
            require(table.fields.u32() == 1, "stsc names a sample entry that isn't there");
            require(runs.back().samplesPerChunk != 0, "stsc has an empty chunk");
            const bool rising = runs.size() == 1 ? runs.back().firstChunk == 1
                                                 : runs.back().firstChunk > runs[runs.size() - 2].firstChunk;
            if (!rising || runs.back().firstChunk > offsets_.size())
                return find("stsc names chunks out of order or not there");
        }
        std::uint64_t sample = 0;
        auto run = runs.begin();
        for (std::size_t chunk = 1; chunk <= offsets_.size() && run != runs.end(); ++chunk) {
            if (std::next(run) != runs.end() && std::next(run)->firstChunk == chunk) ++run;
            std::uint64_t size = 0;
            for (std::uint32_t left = run->samplesPerChunk; left > 0 && sample < track_.samples; --left, ++sample)
                size += sizes_.empty() ? sameSize_ : sizes_[sample];
            counted_ += run->samplesPerChunk;
            placeChunk(chunk, {offsets_[chunk - 1], offsets_[chunk - 1] + size});
        }
        require(counted_ == track_.samples, "stsc has " + std::to_string(counted_) +
                                                " samples in its chunks, stsz has " + std::to_string(track_.samples));
    }

    void placeChunk(std::size_t chunk, const Extent& extent) {
        chunks_.push_back(extent);
        const bool inside = std::any_of(media_.begin(), media_.end(), [&](const Extent& whole) {
            return extent.begin >= whole.begin && extent.end <= whole.end && extent.end >= extent.begin;
        });
        require(inside, "chunk " + std::to_string(chunk) + " isn't within the media data");
    }

    void readSyncSamples(const Box& box) {
        FullBox table(box);
        std::uint64_t previous = 0;
        track_.syncSamples = entries(table.fields, 4, "stss");
        for (std::uint64_t left = track_.syncSamples; left > 0; --left) {
            const std::uint64_t sample = table.fields.u32();
            require(previous != 0 || sample == 1, "the first sample isn't a sync sample");
            require(sample > previous && sample <= track_.samples, "stss names samples out of order or not there");
            previous = sample;
        }
        require(previous != 0, "stss is empty");
    }

    void readCompositionOffsets(const Box& box) {
        FullBox table(box);
        std::uint64_t samples = 0;
        for (std::uint64_t left = entries(table.fields, 8, "ctts"); left > 0; --left) {
            samples += table.fields.u32();
            const std::uint32_t offset = table.fields.u32();
            const bool negative = table.version == 1 && offset > 0x7FFFFFFF;
            largestOffset_ = std::max<std::uint64_t>(largestOffset_, negative ? 0 : offset);
        }
        require(samples == track_.samples, "ctts has another number of samples than stsz");
    }

    // Converts to the movie's time scale, rounded up.
    [[nodiscard]] std::uint64_t inMovieTime(std::uint64_t media) const {
        return track_.timescale == 0 ? 0 : (media * movieTimescale_ + track_.timescale - 1) / track_.timescale;
    }

    void checkDuration(const Box* edits) {
        if (edits == nullptr) return requireNear(inMovieTime(track_.mediaDuration), 1, "the media");
        const auto boxes = children(*edits);
        const Box* list = only(boxes, "elst");
        if (list == nullptr) return;
        FullBox table(*list);
        std::uint64_t total = 0;
        const bool wide = table.version == 1;
        const std::uint64_t count = entries(table.fields, wide ? 20 : 12, "elst");
        for (std::uint64_t left = count; left > 0; --left) {
            const std::uint64_t length = table.fields.byVersion(table.version);
            const std::uint64_t start = table.fields.byVersion(table.version);
            require(table.fields.u32() == 0x00010000, "an edit changes the speed");
            total += length;
            const bool empty = start == (wide ? ~0ULL : 0xFFFFFFFFULL);
            // Composition may put the last sample later than decoding ends; both ends may be rounded.
            require(empty || inMovieTime(start) + length <= inMovieTime(track_.mediaDuration + largestOffset_) + 2,
                    "an edit reaches beyond the media");
        }
        requireNear(total, count, "the edit list");
    }

    void requireNear(std::uint64_t expected, std::uint64_t slack, const std::string& what) {
        const std::uint64_t apart =
            expected > track_.duration ? expected - track_.duration : track_.duration - expected;
        require(apart <= slack,
                what + " lasts " + std::to_string(expected) + ", tkhd says " + std::to_string(track_.duration));
    }

    std::uint32_t movieTimescale_;
    const std::vector<Extent>& media_;
    std::vector<Extent>& chunks_;
    Findings& findings_;
    std::string where_ = "a track";
    BoxTrack track_;
    std::vector<std::uint32_t> sizes_;
    std::uint32_t sameSize_ = 0;
    std::vector<std::uint64_t> offsets_;
    std::uint64_t timed_ = 0;
    std::uint64_t largestOffset_ = 0;  // of composition
    std::uint64_t counted_ = 0;
};

}  // namespace

std::vector<Box> boxesIn(std::span<const std::uint8_t> bytes, std::uint64_t offset, const std::string& inside,
                         Findings& findings) {
    std::vector<Box> boxes;
    while (!bytes.empty()) {
        BoxReader header(bytes);
        std::uint64_t size = header.u32();
        const std::string type = header.fourCharacters();
        if (size == 1) size = header.u64();
        const std::size_t headerBytes = bytes.size() - header.left();
        if (!header.good() || size < headerBytes || size > bytes.size()) {
            findings.push_back(inside + ": the box at " + std::to_string(offset) + " doesn't fit where it is");
            return boxes;
        }
        boxes.push_back({type, offset + headerBytes, bytes.subspan(headerBytes, size - headerBytes)});
        bytes = bytes.subspan(size);
        offset += size;
    }
    return boxes;
}

const Box* onlyBox(const std::vector<Box>& boxes, const std::string& type, const std::string& inside,
                   Findings& findings) {
    const auto isIt = [&](const Box& box) { return box.type == type; };
    const auto count = std::count_if(boxes.begin(), boxes.end(), isIt);
    if (count == 1) return &*std::find_if(boxes.begin(), boxes.end(), isIt);
    findings.push_back(inside + ": there are " + std::to_string(count) + " " + type + " boxes instead of one");
    return nullptr;
}

BoxTrack checkTrack(const Box& trak, std::uint32_t movieTimescale, const std::vector<Extent>& media,
                    std::vector<Extent>& chunks, Findings& findings) {
    return TrackCheck(movieTimescale, media, chunks, findings).run(trak);
}

}  // namespace lumacast::checkers
