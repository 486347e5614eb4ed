#include "tests/checkers/BoxTrackChecker.h"

#include "tests/checkers/BoxSampleEntries.h"

namespace lumacast::checkers {
namespace {

__extension__ using Wide = unsigned __int128;

constexpr char kTrackHeader[] = "14496-12, 8.3.2", kMediaHeader[] = "14496-12, 8.4.2", kHandler[] = "14496-12, 8.4.3",
               kEdits[] = "14496-12, 8.6.6", kReferences[] = "14496-12, 8.7.2";

/// What is hidden of AAC, whose encoders put at least one packet before the first real sound.
constexpr std::uint64_t kLeastPriming = 1024;

struct EditEntry {
    std::uint64_t length = 0;  // ticks of the movie
    std::uint64_t start = 0;   // ticks of the track
    bool isEmpty = false;
};

class TrackCheck final {
public:
    TrackCheck(const TrackContext& context, const Complaints& movie)
        : context_(context), complaints_(movie.about("a track")) {}

    CheckedTrack run(const Box& trak) {
        const auto boxes = childrenOf(trak, complaints_);
        const Box* header = onlyBox(boxes, "tkhd", kTrackHeader, complaints_);
        if (header != nullptr) readTrackHeader(*header);
        if (const Box* media = onlyBox(boxes, "mdia", "14496-12, 8.4.1", complaints())) readMedia(*media);
        checkEdits(anyBox(boxes, "edts", "14496-12, 8.6.5", complaints()));
        return checked_;
    }

private:
    [[nodiscard]] Complaints complaints() const {
        return track_.identifier == 0 ? complaints_ : complaints_.about("track " + std::to_string(track_.identifier));
    }
    void require(bool isSo, const char* clause, const std::string& otherwise) const {
        complaints().require(isSo, clause, otherwise);
    }
    [[nodiscard]] bool isFinished() const { return context_.shape == BoxShape::Finished; }

    void readTrackHeader(const Box& box) {
        constexpr std::uint32_t kEnabled = 1;
        FullBox header(box, 1, complaints_);
        header.fields.skip(header.version == 0 ? 8 : 16);
        track_.identifier = header.fields.u32();
        header.fields.skip(4);
        track_.duration = header.fields.byVersion(header.version);
        require(track_.identifier != 0, kTrackHeader, "the identifier is 0");
        require((header.flags & kEnabled) != 0, kTrackHeader, "the track is disabled");
        header.fields.skip(16);
        std::uint32_t last[3]{};
        for (auto& row : last) {
            header.fields.skip(8);
            row = header.fields.u32();
        }
        require(last[0] == 0 && last[1] == 0 && last[2] == 0x40000000, "14496-12, 6.2.2",
                "the last column of the matrix is not 0, 0, 1");
        width_ = header.fields.u32();
        height_ = header.fields.u32();
        requireEnd(header.fields, "tkhd", kTrackHeader, complaints());
    }

    void readMedia(const Box& box) {
        const auto boxes = childrenOf(box, complaints());
        if (const Box* header = onlyBox(boxes, "mdhd", kMediaHeader, complaints())) readMediaHeader(*header);
        if (const Box* handler = onlyBox(boxes, "hdlr", kHandler, complaints())) readHandler(*handler);
        if (const Box* information = onlyBox(boxes, "minf", "14496-12, 8.4.4", complaints()))
            readInformation(childrenOf(*information, complaints()));
    }

    void readInformation(const std::vector<Box>& boxes) {
        if (track_.handler == "vide") {
            require(width_ != 0 && height_ != 0, kTrackHeader, "the picture has no width or no height");
            if (const Box* header = onlyBox(boxes, "vmhd", "14496-12, 12.1.2", complaints()))
                require(FullBox(*header).flags == 1, "14496-12, 12.1.2", "vmhd doesn't have the flags 1");
        }
        if (track_.handler == "soun") (void)onlyBox(boxes, "smhd", "14496-12, 12.2.2", complaints());
        std::uint64_t references = 0;
        if (const Box* data = onlyBox(boxes, "dinf", "14496-12, 8.7.1", complaints())) {
            const auto inside = childrenOf(*data, complaints());
            if (const Box* table = onlyBox(inside, "dref", kReferences, complaints())) references = readReferences(*table);
        }
        if (const Box* table = onlyBox(boxes, "stbl", "14496-12, 8.5.1", complaints()))
            readTables(childrenOf(*table, complaints()), references);
    }

    void readTables(const std::vector<Box>& boxes, std::uint64_t references) {
        if (const Box* entries = onlyBox(boxes, "stsd", "14496-12, 8.5.2", complaints())) {
            const auto entry = checkSampleEntries(*entries, {track_.handler, track_.timescale, references}, complaints());
            track_.codec = entry.codec;
            checked_.nalLengthBytes = entry.nalLengthBytes;
        }
        if (isFinished()) checkSampleTables(boxes, context_.media, context_.fileBytes, checked_, complaints());
        else checkEmptySampleTables(boxes, complaints());
    }

    void readMediaHeader(const Box& box) {
        FullBox header(box, 1, complaints());
        header.fields.skip(header.version == 0 ? 8 : 16);
        track_.timescale = header.fields.u32();
        track_.mediaDuration = header.fields.byVersion(header.version);
        const std::uint32_t language = header.fields.u16();
        header.fields.skip(2);
        requireEnd(header.fields, "mdhd", kMediaHeader, complaints());
        require(track_.timescale != 0, kMediaHeader, "the time scale is 0");
        bool isLanguage = language < 0x8000;
        for (const std::uint32_t letter : {language >> 10 & 31, language >> 5 & 31, language & 31})
            isLanguage = isLanguage && letter >= 1 && letter <= 26;
        require(isLanguage, kMediaHeader, "the language is not three letters");
        require(isFinished() || track_.mediaDuration == 0, kMediaHeader,
                "mdhd has a duration, though the samples are in fragments");
    }

    void readHandler(const Box& box) {
        FullBox handler(box, 0, complaints());
        require(handler.fields.u32() == 0, kHandler, "hdlr has something in a field that must be 0");
        track_.handler = handler.fields.fourCharacters();
        handler.fields.skip(12);
        const auto name = handler.fields.take(handler.fields.left());
        require(handler.fields.good() && !name.empty() && name.back() == 0, kHandler, "the name in hdlr doesn't end with 0");
    }

    std::uint64_t readReferences(const Box& box) {
        FullBox table(box, 0, complaints());
        const std::uint64_t count = table.fields.u32();
        const std::size_t before = box.content.size() - table.fields.left();
        const auto references = boxesIn(box.content.subspan(before), box.offset + before, complaints().about(
            complaints().where() + " dref"));
        require(count == references.size() && count != 0, kReferences, "dref has another number of references than it says");
        for (const Box& reference : references)
            require(reference.type == "url " && (FullBox(reference).flags & 1) == 1, kReferences,
                    "the media are not in this file");
        return references.size();
    }

    // Converts to the movie's time scale, rounded up.
    [[nodiscard]] std::uint64_t inMovieTime(std::uint64_t media) const {
        const Wide ticks = Wide{media} * context_.movieTimescale + track_.timescale - 1;
        return track_.timescale == 0 ? 0 : static_cast<std::uint64_t>(ticks / track_.timescale);
    }

    void checkEdits(const Box* edits) {
        if (edits == nullptr) return checkWithoutEdits();
        const auto boxes = childrenOf(*edits, complaints());
        const Box* list = onlyBox(boxes, "elst", kEdits, complaints());
        if (list == nullptr) return;
        const auto entries = readEdits(*list);
        if (entries.empty()) return complaints().find(kEdits, "the edit list is empty");
        std::uint64_t total = 0;
        for (const EditEntry& entry : entries) {
            total += entry.length;
            checkEdit(entry);
        }
        require(!entries.back().isEmpty, kEdits, "the last edit is empty");
        require(total == track_.duration, kTrackHeader,
                "the edit list lasts " + std::to_string(total) + ", tkhd says " + std::to_string(track_.duration));
        for (const EditEntry& entry : entries)
            if (!entry.isEmpty) return requirePriming(entry.start);
    }

    void checkWithoutEdits() {
        const std::uint64_t expected = inMovieTime(track_.mediaDuration);
        const std::uint64_t apart = expected > track_.duration ? expected - track_.duration : track_.duration - expected;
        // One of them is rounded.
        require(apart <= 1, kTrackHeader,
                "the media lasts " + std::to_string(expected) + ", tkhd says " + std::to_string(track_.duration));
        requirePriming(0);
    }

    void requirePriming(std::uint64_t skipped) {
        require(track_.codec != "mp4a" || skipped >= kLeastPriming, "",
                "the sound is presented with its priming: the first edit begins at " + std::to_string(skipped));
    }

    std::vector<EditEntry> readEdits(const Box& box) {
        FullBox table(box, 1, complaints());
        const bool wide = table.version == 1;
        std::vector<EditEntry> entries;
        for (std::uint64_t left = entriesOf(table.fields, wide ? 20 : 12, "elst", kEdits, complaints()); left > 0; --left) {
            EditEntry entry;
            entry.length = table.fields.byVersion(table.version);
            entry.start = table.fields.byVersion(table.version);
            entry.isEmpty = entry.start == (wide ? ~0ULL : 0xFFFFFFFFULL);
            require(table.fields.u32() == 0x00010000, kEdits, "an edit changes the speed");
            const bool isNegative = entry.start > (wide ? ~0ULL >> 1 : 0x7FFFFFFFULL);
            require(entry.isEmpty || !isNegative, kEdits, "an edit begins before the media");
            entries.push_back(entry);
        }
        return entries;
    }

    void checkEdit(const EditEntry& entry) {
        if (!isFinished()) return require(entry.length == 0, kEdits, "an edit has a length, though the media is in fragments");
        require(entry.length != 0, kEdits, "an edit presents nothing");
        if (entry.isEmpty) return;
        // In ticks of both; composition may put the last sample later than decoding ends, and one tick of the movie may
        // be a rounding.
        const Wide media = Wide{track_.mediaDuration} + checked_.latestComposition;
        const Wide end = Wide{entry.start} * context_.movieTimescale + Wide{entry.length} * track_.timescale;
        require(end <= media * context_.movieTimescale + track_.timescale, kEdits, "an edit reaches beyond the media");
    }

    const TrackContext& context_;
    Complaints complaints_;
    CheckedTrack checked_;
    BoxTrack& track_ = checked_.track;
    std::uint32_t width_ = 0;   // 16.16
    std::uint32_t height_ = 0;
};

}  // namespace

CheckedTrack checkTrack(const Box& trak, const TrackContext& context, const Complaints& movie) {
    return TrackCheck(context, movie).run(trak);
}

}  // namespace lumacast::checkers
