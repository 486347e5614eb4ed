#include "tests/checkers/BoxSampleEntries.h"

#include <array>
#include <optional>

#include "tests/checkers/SequenceParameterSet.h"

namespace lumacast::checkers {
namespace {

// Sample entries have this many bytes before the boxes they contain (ISO/IEC 14496-12, 12.1.3 and 12.2.3).
constexpr std::size_t kVisualEntryBytes = 78;
constexpr std::size_t kAudioEntryBytes = 28;
constexpr char kAvcRecord[] = "14496-15, 5.3.3.1";

std::string pair(std::uint32_t one, std::uint32_t other) { return std::to_string(one) + "x" + std::to_string(other); }

/// The decoder configuration record of H.264.
class AvcRecord final {
public:
    AvcRecord(const Box& box, const Complaints& complaints) : complaints_(complaints), fields_(box.content) {}

    /// What the first sequence parameter set says.
    std::optional<SequenceFormat> check() {
        const std::uint8_t version = fields_.u8(), profile = fields_.u8(), compatibility = fields_.u8(),
                           level = fields_.u8(), lengths = fields_.u8(), sets = fields_.u8();
        require(version == 1, "avcC has configuration version " + std::to_string(version));
        require((lengths & 0xFC) == 0xFC && (sets & 0xE0) == 0xE0, "reserved bits of avcC are not ones");
        lengthBytes = static_cast<std::uint8_t>((lengths & 3) + 1);
        require(lengthBytes != 3, "avcC gives NAL units lengths of 3 bytes");
        const auto format = readSets(sets & 0x1F, 7, "sequence");
        (void)readSets(fields_.u8(), 8, "picture");
        if (!format) {
            complaints_.find("14496-10, 7.3.2.1.1", "no sequence parameter set of avcC can be read");
            return std::nullopt;
        }
        require(profile == format->profile && compatibility == format->compatibility && level == format->level,
                "avcC has another profile, compatibility or level than its sequence parameter set");
        if (format->hasChromaFields) checkChroma(*format);
        require(fields_.good() && fields_.left() == 0, "avcC has another size than its record");
        return format;
    }

    std::uint8_t lengthBytes = 0;

private:
    void require(bool isSo, const std::string& otherwise) const { complaints_.require(isSo, kAvcRecord, otherwise); }

    std::optional<SequenceFormat> readSets(int count, std::uint8_t type, const std::string& kind) {
        require(count > 0, "avcC has no " + kind + " parameter set");
        std::optional<SequenceFormat> first;
        for (int place = 0; place < count && fields_.good(); ++place) {
            const auto nal = fields_.take(fields_.u16());
            require(!nal.empty() && (nal[0] & 0x9F) == type, "avcC has something else for a " + kind + " parameter set");
            if (place == 0 && type == 7) first = readSequenceParameterSet(nal);
        }
        return first;
    }

    void checkChroma(const SequenceFormat& format) {
        const std::uint32_t chroma = fields_.u8(), luma = fields_.u8(), colour = fields_.u8();
        require((chroma & 3) == format.chromaFormat && 8 + (luma & 7) == format.lumaDepth &&
                    8 + (colour & 7) == format.chromaDepth,
                "avcC has another chroma format or depth than its sequence parameter set");
        for (int left = fields_.u8(); left > 0; --left) fields_.skip(fields_.u16());
    }

    const Complaints& complaints_;
    BoxReader fields_;
};

void checkColours(const Box& colr, const SequenceFormat& format, const Complaints& complaints) {
    constexpr char kClause[] = "14496-12, 12.1.5";
    BoxReader fields(colr.content);
    if (fields.fourCharacters() != "nclx") return;
    const std::uint32_t primaries = fields.u16(), transfer = fields.u16(), matrix = fields.u16();
    const bool fullRange = (fields.u8() & 0x80) != 0;
    requireEnd(fields, "colr", kClause, complaints);
    complaints.require(!format.colour || *format.colour == ColourCodes{primaries, transfer, matrix}, kClause,
                       "colr has other colours than the sequence parameter set");
    complaints.require(!format.fullRange || *format.fullRange == fullRange, kClause,
                       "colr has another range than the sequence parameter set");
}

std::uint8_t checkPicture(const Box& entry, const Complaints& complaints) {
    BoxReader fields(entry.content);
    fields.skip(24);
    const std::uint32_t width = fields.u16(), height = fields.u16();
    const auto inside = boxesIn(entry.content.subspan(kVisualEntryBytes), entry.offset + kVisualEntryBytes,
                                complaints.about(complaints.where() + " " + entry.type));
    if (entry.type != "avc1") return 0;
    const Box* record = onlyBox(inside, "avcC", "14496-15, 5.4.2.1", complaints);
    if (record == nullptr) return 0;
    AvcRecord reader(*record, complaints);
    const auto format = reader.check();
    if (!format) return reader.lengthBytes;
    complaints.require(width == format->width && height == format->height, "14496-12, 12.1.3",
                       "avc1 says " + pair(width, height) + ", its sequence parameter set " +
                           pair(format->width, format->height));
    if (const Box* colours = anyBox(inside, "colr", "14496-12, 12.1.5", complaints))
        checkColours(*colours, *format, complaints);
    return reader.lengthBytes;
}

/// A descriptor's content, when it is the one expected. Its length comes in bytes of seven bits.
std::optional<BoxReader> descriptor(BoxReader& fields, std::uint8_t tag) {
    if (fields.u8() != tag) return std::nullopt;
    std::uint32_t size = 0;
    for (int place = 0; place < 4; ++place) {
        const std::uint8_t byte = fields.u8();
        size = size << 7 | (byte & 0x7FU);
        if ((byte & 0x80) == 0) break;
    }
    const auto content = fields.take(size);
    if (!fields.good()) return std::nullopt;
    return BoxReader(content);
}

struct SoundFormat {
    std::uint32_t kind = 0;  // audioObjectType
    std::uint32_t rate = 0;
    std::uint32_t channels = 0;
};

/// AudioSpecificConfig, ISO/IEC 14496-3, 1.6.2.1.
std::optional<SoundFormat> readSoundConfig(BoxReader fields) {
    constexpr std::array<std::uint32_t, 13> kRates{96000, 88200, 64000, 48000, 44100, 32000, 24000,
                                                   22050, 16000, 12000, 11025, 8000,  7350};
    constexpr std::uint32_t kExplicit = 15, kEscape = 31;
    const std::uint32_t bits = fields.u16();
    SoundFormat format;
    format.kind = bits >> 11;
    const std::uint32_t rate = bits >> 7 & 15;
    format.channels = bits >> 3 & 15;
    if (!fields.good() || format.kind == kEscape) return std::nullopt;
    if (rate == kExplicit) {
        const std::uint64_t more = fields.unsignedOf(3);
        // Its 24 bits begin with the last seven of the first two bytes.
        format.rate = static_cast<std::uint32_t>((bits & 0x7F) << 17 | more >> 7);
        format.channels = static_cast<std::uint32_t>(more >> 3 & 15);
        if (!fields.good()) return std::nullopt;
    } else if (rate < kRates.size()) {
        format.rate = kRates[rate];
    }
    return format;
}

/// ISO/IEC 14496-1, 7.2.6.5 to 7.2.6.7 and 7.3.2.3, as ISO/IEC 14496-14 wants them.
std::optional<SoundFormat> checkDescriptors(const Box& esds, const Complaints& complaints) {
    const auto refuse = [&](const char* clause, const char* what) -> std::optional<SoundFormat> {
        complaints.find(clause, std::string("esds ") + what);
        return std::nullopt;
    };
    FullBox box(esds, 0, complaints);
    auto stream = descriptor(box.fields, 3);
    if (!stream || box.fields.left() != 0) return refuse("14496-1, 7.2.6.5", "is not one elementary stream descriptor");
    stream->skip(2);
    if (stream->u8() != 0) return refuse("14496-1, 7.2.6.5", "has flags of a stream that depends on another");
    auto decoder = descriptor(*stream, 4);
    if (!decoder) return refuse("14496-1, 7.2.6.6", "has no decoder configuration that fits");
    auto layer = descriptor(*stream, 6);
    if (!layer || layer->u8() != 2 || layer->left() != 0 || stream->left() != 0)
        return refuse("14496-1, 7.3.2.3", "does not end with the sync layer configuration of MP4 files");
    if (decoder->u8() != 0x40) return refuse("14496-1, 7.2.6.6", "describes something else than MPEG-4 audio");
    const std::uint8_t kind = decoder->u8();
    if (kind >> 2 != 5 || (kind & 1) != 1) return refuse("14496-1, 7.2.6.6", "describes something else than an audio stream");
    decoder->skip(11);
    auto specific = descriptor(*decoder, 5);
    if (!specific) return refuse("14496-1, 7.2.6.7", "has no decoder specific information that fits");
    const auto format = readSoundConfig(*specific);
    return format ? format : refuse("14496-3, 1.6.2.1", "has no AudioSpecificConfig that can be read");
}

void checkSound(const Box& entry, std::uint32_t timescale, const Complaints& complaints) {
    constexpr std::uint32_t kLowComplexity = 2;
    constexpr char kClause[] = "14496-12, 12.2.3";
    BoxReader fields(entry.content);
    fields.skip(16);
    const std::uint32_t channels = fields.u16();
    fields.skip(6);
    const std::uint32_t rate = fields.u32();  // 16.16
    const auto inside = boxesIn(entry.content.subspan(kAudioEntryBytes), entry.offset + kAudioEntryBytes,
                                complaints.about(complaints.where() + " " + entry.type));
    if (entry.type != "mp4a") return;
    const Box* esds = onlyBox(inside, "esds", "14496-14, 5.6", complaints);
    const auto format = esds != nullptr ? checkDescriptors(*esds, complaints) : std::nullopt;
    // Of other kinds the rate that is played is another one than is coded.
    if (!format || format->kind != kLowComplexity) return;
    complaints.require(format->channels == channels || format->channels == 0, kClause,
                       "mp4a says " + std::to_string(channels) + " channels, its AudioSpecificConfig " +
                           std::to_string(format->channels));
    complaints.require(rate == (format->rate <= 0xFFFF ? format->rate << 16 : 0), kClause,
                       "mp4a has another sampling rate than its AudioSpecificConfig, " + std::to_string(format->rate));
    complaints.require(timescale == format->rate, kClause,
                       "the time scale is not the sampling rate, " + std::to_string(format->rate));
}

}  // namespace

SampleEntry checkSampleEntries(const Box& stsd, const EntryContext& context, const Complaints& complaints) {
    constexpr char kClause[] = "14496-12, 8.5.2";
    FullBox table(stsd, 1, complaints);
    const std::uint32_t count = table.fields.u32();
    const std::size_t before = stsd.content.size() - table.fields.left();
    const auto described = boxesIn(stsd.content.subspan(before), stsd.offset + before,
                                   complaints.about(complaints.where() + " stsd"));
    complaints.require(count == 1 && described.size() == 1, kClause, "there isn't exactly one sample entry");
    if (described.empty()) return {};
    const Box& box = described.front();
    SampleEntry entry{box.type, 0};
    const bool isPicture = context.handler == "vide";
    if (!isPicture && context.handler != "soun") return entry;
    if (box.content.size() < (isPicture ? kVisualEntryBytes : kAudioEntryBytes)) {
        complaints.find(kClause, "the sample entry is too short");
        return entry;
    }
    BoxReader fields(box.content);
    fields.skip(6);
    const std::uint32_t reference = fields.u16();
    complaints.require(reference >= 1 && reference <= context.dataReferences, kClause,
                       "the sample entry names a data reference that isn't there");
    if (isPicture) entry.nalLengthBytes = checkPicture(box, complaints);
    else checkSound(box, context.timescale, complaints);
    return entry;
}

}  // namespace lumacast::checkers
