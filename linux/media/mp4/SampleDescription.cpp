#include "linux/media/mp4/SampleDescription.h"

#include <algorithm>

#include "linux/media/mp4/AvcBitstream.h"
#include "linux/media/mp4/BoxBuffer.h"
#include "linux/media/mp4/Ticks.h"

namespace lumacast::mp4 {
namespace {

constexpr std::size_t kMaxSequenceParameterSets = 31;  // 5 bits in the record
constexpr std::size_t kMaxPictureParameterSets = 255;
constexpr std::size_t kMaxAudioConfigBytes = 64;  // keeps every descriptor's length in one byte
constexpr std::uint16_t kDataReferenceIndex = 1;

// Not finer than nanoseconds, which keeps differences of stamps within 64 bits.
bool isTimescale(std::uint32_t value) {
    return value != 0 && value <= kNanosecondTimescale;
}

bool fitsRecord(const std::vector<std::vector<std::uint8_t>>& nals, std::size_t limit) {
    return !nals.empty() && nals.size() <= limit &&
           std::all_of(nals.begin(), nals.end(), [](const auto& nal) { return !nal.empty() && nal.size() <= 0xFFFF; });
}

// AVCDecoderConfigurationRecord, ISO/IEC 14496-15 clause 5.3.3.1.
void writeAvcConfiguration(BoxBuffer& out, const VideoTrackDescription& track) {
    const SequenceInfo info = parseSequenceParameterSet(track.sequenceParameterSets.front()).value_or(SequenceInfo{});
    const Box box(out, "avcC");
    out.u8(1);  // configurationVersion
    out.u8(info.profile);
    out.u8(info.compatibility);
    out.u8(info.level);
    out.u8(0xFC | 3);  // reserved, lengthSizeMinusOne: lengths of 4 bytes
    out.u8(static_cast<std::uint8_t>(0xE0 | track.sequenceParameterSets.size()));
    for (const auto& nal : track.sequenceParameterSets) {
        out.u16(static_cast<std::uint16_t>(nal.size()));
        out.raw(nal);
    }
    out.u8(static_cast<std::uint8_t>(track.pictureParameterSets.size()));
    for (const auto& nal : track.pictureParameterSets) {
        out.u16(static_cast<std::uint16_t>(nal.size()));
        out.raw(nal);
    }
    if (info.hasChromaFields) {
        out.u8(0xFC | info.chromaFormat);
        out.u8(0xF8 | info.bitDepthLumaMinus8);
        out.u8(0xF8 | info.bitDepthChromaMinus8);
        out.u8(0);  // numOfSequenceParameterSetExt
    }
}

// ISO/IEC 14496-12 clause 12.1.5: colour types "nclx".
void writeColour(BoxBuffer& out, const ColourDescription& colour) {
    const Box box(out, "colr");
    out.code("nclx");
    out.u16(colour.primaries);
    out.u16(colour.transfer);
    out.u16(colour.matrix);
    out.u8(colour.fullRange ? 0x80 : 0);
}

// ISO/IEC 14496-12 clause 12.1.4.
void writePixelAspectRatio(BoxBuffer& out, const PixelAspectRatio& ratio) {
    const Box box(out, "pasp");
    out.u32(ratio.horizontal);
    out.u32(ratio.vertical);
}

// SampleEntry, ISO/IEC 14496-12 clause 8.5.2: the fields all entries begin with.
void writeEntryStart(BoxBuffer& out) {
    out.zeros(6);
    out.u16(kDataReferenceIndex);
}

// AVCSampleEntry, ISO/IEC 14496-15 clause 5.4.2.1; VisualSampleEntry, ISO/IEC 14496-12 clause 12.1.3.
void writeVideoEntry(BoxBuffer& out, const VideoTrackDescription& track) {
    constexpr std::uint32_t k72DotsPerInch = 0x00480000;
    constexpr std::size_t kCompressorNameBytes = 32;
    const Box box(out, "avc1");
    writeEntryStart(out);
    out.zeros(16);  // pre_defined, reserved
    out.u16(track.width);
    out.u16(track.height);
    out.u32(k72DotsPerInch);
    out.u32(k72DotsPerInch);
    out.u32(0);
    out.u16(1);  // frame_count
    out.zeros(kCompressorNameBytes);
    out.u16(0x0018);  // depth: colour without alpha
    out.i16(-1);      // pre_defined
    writeAvcConfiguration(out, track);
    if (track.colour) {
        writeColour(out, *track.colour);
    }
    if (track.pixelAspectRatio) {
        writePixelAspectRatio(out, *track.pixelAspectRatio);
    }
}

// ESDBox, ISO/IEC 14496-14 clause 5.6; descriptors, ISO/IEC 14496-1 clauses 7.2.6.5 to 7.2.6.7 and 7.3.2.3.
void writeElementaryStreamDescriptor(BoxBuffer& out, const AudioTrackDescription& track) {
    constexpr std::uint8_t kEsDescriptor = 3;
    constexpr std::uint8_t kDecoderConfigDescriptor = 4;
    constexpr std::uint8_t kDecoderSpecificInfo = 5;
    constexpr std::uint8_t kSyncLayerConfigDescriptor = 6;
    constexpr std::uint8_t kAudioIso14496Part3 = 0x40;
    constexpr std::uint8_t kAudioStream = 5;
    const auto configBytes = static_cast<std::uint8_t>(track.audioSpecificConfig.size());
    const auto decoderBytes = static_cast<std::uint8_t>(13 + 2 + configBytes);

    const Box box(out, "esds", 0, 0);
    out.u8(kEsDescriptor);
    out.u8(static_cast<std::uint8_t>(3 + 2 + decoderBytes + 3));
    out.u16(0);  // ES_ID: 0 within a file, the track says which
    out.u8(0);
    out.u8(kDecoderConfigDescriptor);
    out.u8(decoderBytes);
    out.u8(kAudioIso14496Part3);
    out.u8((kAudioStream << 2) | 1);
    out.u24(0);  // bufferSizeDB: not stated
    out.u32(0);  // maxBitrate: not stated
    out.u32(track.bitRate);
    out.u8(kDecoderSpecificInfo);
    out.u8(configBytes);
    out.raw(track.audioSpecificConfig);
    out.u8(kSyncLayerConfigDescriptor);
    out.u8(1);
    out.u8(2);  // reserved for use in MP4 files
}

// MP4AudioSampleEntry, ISO/IEC 14496-14 clause 5.6; AudioSampleEntry, ISO/IEC 14496-12 clause 12.2.3.
void writeAudioEntry(BoxBuffer& out, const AudioTrackDescription& track) {
    const Box box(out, "mp4a");
    writeEntryStart(out);
    out.zeros(8);
    out.u16(track.channels);
    out.u16(16);  // samplesize
    out.u32(0);
    out.u32(track.sampleRate <= 0xFFFF ? track.sampleRate << 16U : 0);  // 16.16; higher rates stand in the config alone
    writeElementaryStreamDescriptor(out, track);
}

}  // namespace

bool isValid(const VideoTrackDescription& track) {
    const bool ratioValid =
        !track.pixelAspectRatio || (track.pixelAspectRatio->horizontal != 0 && track.pixelAspectRatio->vertical != 0);
    return track.width != 0 && track.height != 0 && isTimescale(track.timescale) && ratioValid &&
           fitsRecord(track.sequenceParameterSets, kMaxSequenceParameterSets) &&
           fitsRecord(track.pictureParameterSets, kMaxPictureParameterSets) &&
           parseSequenceParameterSet(track.sequenceParameterSets.front()).has_value();
}

bool isValid(const AudioTrackDescription& track) {
    return isTimescale(track.sampleRate) && track.channels != 0 && track.audioSpecificConfig.size() >= 2 &&
           track.audioSpecificConfig.size() <= kMaxAudioConfigBytes;
}

void writeSampleDescription(BoxBuffer& out, const VideoTrackDescription& track) {
    const Box box(out, "stsd", 0, 0);  // ISO/IEC 14496-12 clause 8.5.2
    out.u32(1);
    writeVideoEntry(out, track);
}

void writeSampleDescription(BoxBuffer& out, const AudioTrackDescription& track) {
    const Box box(out, "stsd", 0, 0);  // ISO/IEC 14496-12 clause 8.5.2
    out.u32(1);
    writeAudioEntry(out, track);
}

}  // namespace lumacast::mp4
