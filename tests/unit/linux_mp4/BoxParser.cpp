#include "tests/unit/linux_mp4/BoxParser.h"

#include <set>
#include <stdexcept>

namespace lumacast::mp4::test {
namespace {

void require(bool holds, const std::string& what) {
    if (!holds) {
        throw std::runtime_error(what);
    }
}

const std::set<std::string>& containers() {
    static const std::set<std::string> kTypes{"moov", "trak", "edts", "mdia", "minf",
                                              "dinf", "stbl", "mvex", "moof", "traf"};
    return kTypes;
}

std::vector<ParsedBox> parseLevel(std::span<const std::uint8_t> bytes, std::uint64_t base) {
    std::vector<ParsedBox> boxes;
    std::uint64_t at = 0;
    while (at < bytes.size()) {
        require(bytes.size() - at >= 8, "box header cut off");
        Fields fields(bytes.subspan(at));
        ParsedBox box;
        box.offset = base + at;
        box.size = fields.u32();
        const auto type = fields.take(4);
        box.type.assign(type.begin(), type.end());
        box.headerSize = 8;
        if (box.size == 1) {
            box.size = fields.u64();
            box.headerSize = 16;
        }
        require(box.size >= box.headerSize && box.size <= bytes.size() - at, "box " + box.type + " has a wrong size");
        box.payload = bytes.subspan(at + box.headerSize, box.size - box.headerSize);
        if (containers().contains(box.type)) {
            box.children = parseLevel(box.payload, box.offset + box.headerSize);
        }
        at += box.size;
        boxes.push_back(std::move(box));
    }
    return boxes;
}

void requireAllRead(const Fields& fields, const ParsedBox& box) {
    require(fields.left() == 0, "box " + box.type + " has bytes left over");
}

std::vector<std::uint32_t> expandDurations(const ParsedBox& stts) {
    Fields fields(stts.payload);
    fields.skip(4);
    std::vector<std::uint32_t> durations;
    for (std::uint32_t entries = fields.u32(); entries > 0; --entries) {
        const std::uint32_t count = fields.u32();
        durations.insert(durations.end(), count, fields.u32());
    }
    requireAllRead(fields, stts);
    return durations;
}

std::vector<std::uint64_t> chunkOffsets(const ParsedBox& stbl) {
    const bool wide = stbl.has("co64");
    const ParsedBox& box = stbl.at(wide ? "co64" : "stco");
    Fields fields(box.payload);
    fields.skip(4);
    std::vector<std::uint64_t> offsets;
    for (std::uint32_t count = fields.u32(); count > 0; --count) {
        offsets.push_back(wide ? fields.u64() : fields.u32());
    }
    requireAllRead(fields, box);
    return offsets;
}

std::vector<std::uint32_t> samplesPerChunk(const ParsedBox& stsc, std::size_t chunks) {
    Fields fields(stsc.payload);
    fields.skip(4);
    std::vector<std::uint32_t> counts(chunks, 0);
    for (std::uint32_t entries = fields.u32(); entries > 0; --entries) {
        const std::uint32_t first = fields.u32();
        const std::uint32_t count = fields.u32();
        require(fields.u32() == 1, "sample description index");
        require(first >= 1 && first <= chunks, "first chunk");
        for (std::size_t chunk = first - 1; chunk < chunks; ++chunk) {
            counts[chunk] = count;
        }
    }
    requireAllRead(fields, stsc);
    return counts;
}

std::vector<ParsedSample> expandSamples(const ParsedBox& stbl) {
    const auto durations = expandDurations(stbl.at("stts"));
    Fields sizes(stbl.at("stsz").payload);
    sizes.skip(4);
    require(sizes.u32() == 0, "sample_size");
    const std::uint32_t count = sizes.u32();
    require(durations.size() == count, "stts and stsz differ");
    std::set<std::uint32_t> syncs;
    if (stbl.has("stss")) {
        Fields fields(stbl.at("stss").payload);
        fields.skip(4);
        for (std::uint32_t left = fields.u32(); left > 0; --left) {
            syncs.insert(fields.u32());
        }
        requireAllRead(fields, stbl.at("stss"));
    }
    const auto offsets = chunkOffsets(stbl);
    const auto perChunk = samplesPerChunk(stbl.at("stsc"), offsets.size());
    std::vector<ParsedSample> samples;
    std::uint64_t time = 0;
    for (std::size_t chunk = 0; chunk < offsets.size(); ++chunk) {
        std::uint64_t offset = offsets[chunk];
        for (std::uint32_t i = 0; i < perChunk[chunk]; ++i) {
            require(samples.size() < count, "stsc has more samples than stsz");
            const auto number = static_cast<std::uint32_t>(samples.size()) + 1;
            ParsedSample sample{offset, sizes.u32(), time, durations[samples.size()],
                                !stbl.has("stss") || syncs.contains(number)};
            offset += sample.size;
            time += sample.duration;
            samples.push_back(sample);
        }
    }
    require(samples.size() == count, "stsc has fewer samples than stsz");
    requireAllRead(sizes, stbl.at("stsz"));
    return samples;
}

void parseTrackHeader(const ParsedBox& tkhd, ParsedTrack& track) {
    const std::size_t wide = tkhd.version() == 1 ? 8 : 4;
    Fields fields(tkhd.payload);
    fields.skip(4 + 2 * wide);
    track.id = fields.u32();
    fields.skip(4);
    track.movieDuration = fields.number(wide);
    fields.skip(16);
    for (int i = 0; i < 9; ++i) {
        track.matrix.push_back(fields.i32());
    }
    track.width = fields.u32();
    track.height = fields.u32();
    requireAllRead(fields, tkhd);
}

void parseEdits(const ParsedBox& elst, ParsedTrack& track) {
    const std::size_t wide = elst.version() == 1 ? 8 : 4;
    Fields fields(elst.payload);
    fields.skip(4);
    for (std::uint32_t count = fields.u32(); count > 0; --count) {
        ParsedEdit edit;
        edit.duration = fields.number(wide);
        const std::uint64_t mediaTime = fields.number(wide);
        edit.mediaTime = wide == 8 ? static_cast<std::int64_t>(mediaTime) : static_cast<std::int32_t>(mediaTime);
        require(fields.u32() == 0x00010000, "media rate");
        track.edits.push_back(edit);
    }
    requireAllRead(fields, elst);
}

}  // namespace

std::uint32_t ParsedBox::flags() const {
    Fields fields(payload);
    return fields.u32() & 0xFFFFFFU;
}

bool ParsedBox::has(const std::string& path) const {
    try {
        (void)at(path);
        return true;
    } catch (const std::runtime_error&) {
        return false;
    }
}

const ParsedBox& ParsedBox::at(const std::string& path) const {
    const std::size_t slash = path.find('/');
    const std::string first = path.substr(0, slash);
    for (const ParsedBox& child : children) {
        if (child.type == first) {
            return slash == std::string::npos ? child : child.at(path.substr(slash + 1));
        }
    }
    throw std::runtime_error("no box " + first + " in " + type);
}

std::vector<const ParsedBox*> ParsedBox::all(const std::string& wanted) const {
    std::vector<const ParsedBox*> found;
    for (const ParsedBox& child : children) {
        if (child.type == wanted) {
            found.push_back(&child);
        }
    }
    return found;
}

std::string ParsedBox::childTypes() const {
    return typesOf(children);
}

std::vector<ParsedBox> parseBoxes(std::span<const std::uint8_t> file) {
    return parseLevel(file, 0);
}

std::vector<ParsedBox> parseWholeBoxes(std::span<const std::uint8_t> file) {
    std::uint64_t end = 0;
    while (file.size() - end >= 8) {
        Fields fields(file.subspan(end));
        std::uint64_t size = fields.u32();
        if (size == 1 && file.size() - end >= 16) {
            fields.skip(4);
            size = fields.u64();
        }
        if (size < 8 || size > file.size() - end) {
            break;
        }
        end += size;
    }
    return parseBoxes(file.first(end));
}

std::string typesOf(const std::vector<ParsedBox>& boxes) {
    std::string types;
    for (const ParsedBox& box : boxes) {
        types += (types.empty() ? "" : " ") + box.type;
    }
    return types;
}

std::uint64_t Fields::number(std::size_t size) {
    std::uint64_t value = 0;
    for (const std::uint8_t byte : take(size)) {
        value = (value << 8U) | byte;
    }
    return value;
}

std::span<const std::uint8_t> Fields::take(std::size_t count) {
    require(left() >= count, "fields end early");
    position_ += count;
    return bytes_.subspan(position_ - count, count);
}

ParsedTrack parseTrack(const ParsedBox& trak) {
    ParsedTrack track;
    parseTrackHeader(trak.at("tkhd"), track);
    if (trak.has("edts")) {
        parseEdits(trak.at("edts/elst"), track);
    }
    const ParsedBox& mdhd = trak.at("mdia/mdhd");
    const std::size_t wide = mdhd.version() == 1 ? 8 : 4;
    Fields header(mdhd.payload);
    header.skip(4 + 2 * wide);
    track.timescale = header.u32();
    track.mediaDuration = header.number(wide);
    header.skip(4);
    requireAllRead(header, mdhd);
    Fields handler(trak.at("mdia/hdlr").payload);
    handler.skip(8);
    const auto type = handler.take(4);
    track.handler.assign(type.begin(), type.end());
    handler.skip(12);
    const auto name = handler.take(handler.left());
    require(!name.empty() && name.back() == 0, "handler name is not terminated");
    track.name.assign(name.begin(), name.end() - 1);
    track.samples = expandSamples(trak.at("mdia/minf/stbl"));
    return track;
}

std::vector<ParsedTrack> tracksOf(const ParsedBox& movie) {
    std::vector<ParsedTrack> tracks;
    for (const ParsedBox* trak : movie.all("trak")) {
        tracks.push_back(parseTrack(*trak));
    }
    return tracks;
}

std::uint64_t movieDuration(const ParsedBox& movie) {
    const ParsedBox& header = movie.at("mvhd");
    const std::size_t wide = header.version() == 1 ? 8 : 4;
    Fields fields(header.payload);
    fields.skip(4 + 2 * wide + 4);
    return fields.number(wide);
}

std::vector<ParsedRun> parseFragment(const ParsedBox& moof) {
    std::vector<ParsedRun> runs;
    for (const ParsedBox* traf : moof.all("traf")) {
        ParsedRun run;
        require(traf->childTypes() == "tfhd tfdt trun", "order in traf");
        require(traf->at("tfhd").flags() == 0x020000, "default-base-is-moof alone");
        Fields header(traf->at("tfhd").payload);
        header.skip(4);
        run.trackId = header.u32();
        requireAllRead(header, traf->at("tfhd"));
        require(traf->at("tfdt").version() == 1, "tfdt version");
        Fields time(traf->at("tfdt").payload);
        time.skip(4);
        run.decodeTime = time.u64();
        const ParsedBox& trun = traf->at("trun");
        Fields fields(trun.payload);
        fields.skip(4);
        const std::uint32_t count = fields.u32();
        require((trun.flags() & 0x301U) == 0x301U, "trun flags");
        std::uint64_t offset = moof.offset + fields.u32();
        std::uint64_t decodeTime = run.decodeTime;
        for (std::uint32_t i = 0; i < count; ++i) {
            ParsedSample sample;
            sample.duration = fields.u32();
            sample.size = fields.u32();
            const std::uint32_t flags = (trun.flags() & 0x400U) != 0 ? fields.u32() : 0x02000000U;
            require(flags == 0x02000000U || flags == 0x01010000U, "sample flags");
            sample.isSync = flags == 0x02000000U;
            sample.offset = offset;
            sample.decodeTime = decodeTime;
            offset += sample.size;
            decodeTime += sample.duration;
            run.samples.push_back(sample);
        }
        requireAllRead(fields, trun);
        runs.push_back(std::move(run));
    }
    return runs;
}

}  // namespace lumacast::mp4::test
