#include "linux/media/MovieSource.h"

#include <algorithm>
#include <utility>

#include "linux/media/mp4/AvcBitstream.h"

namespace lumacast::media {

namespace {

constexpr AVRational kNanoseconds{1, 1'000'000'000};

/// The parameter sets in an AVC configuration record (ISO/IEC 14496-15 clause 5.3.3.1.2). Empty when it makes no sense.
mp4::ParameterSets parameterSetsOfRecord(std::span<const std::uint8_t> record) {
    mp4::ParameterSets sets;
    if (record.size() < 7 || record[0] != 1 || (record[4] & 3) != 3) return {};  // lengths of four bytes
    std::size_t at = 5;
    const auto take = [&](std::vector<std::vector<std::uint8_t>>& list, unsigned mask) {
        if (at >= record.size()) return false;
        for (unsigned left = record[at++] & mask; left > 0; --left) {
            if (at + 2 > record.size()) return false;
            const std::size_t size = static_cast<std::size_t>(record[at]) << 8u | record[at + 1];
            at += 2;
            if (at + size > record.size()) return false;
            list.emplace_back(record.begin() + static_cast<std::ptrdiff_t>(at),
                              record.begin() + static_cast<std::ptrdiff_t>(at + size));
            at += size;
        }
        return true;
    };
    return take(sets.sequence, 0x1F) && take(sets.picture, 0xFF) ? sets : mp4::ParameterSets{};
}

std::span<const std::uint8_t> extradataOf(const AVCodecParameters& parameters) {
    return {parameters.extradata, static_cast<std::size_t>(std::max(parameters.extradata_size, 0))};
}

std::string nameOf(const AVStream& stream) {
    const AVDictionaryEntry* const entry = av_dict_get(stream.metadata, "handler_name", nullptr, 0);
    return entry ? entry->value : "";
}

mp4::VideoTrackDescription describeVideoStream(const AVStream& stream) {
    const AVCodecParameters& parameters = *stream.codecpar;
    mp4::VideoTrackDescription description;
    description.width = static_cast<std::uint16_t>(parameters.width);
    description.height = static_cast<std::uint16_t>(parameters.height);
    description.timescale = static_cast<std::uint32_t>(stream.time_base.den);
    mp4::ParameterSets sets = parameterSetsOfRecord(extradataOf(parameters));
    description.sequenceParameterSets = std::move(sets.sequence);
    description.pictureParameterSets = std::move(sets.picture);
    std::size_t size = 0;
    const auto* const matrix = reinterpret_cast<const std::int32_t*>(
        av_stream_get_side_data(&stream, AV_PKT_DATA_DISPLAYMATRIX, &size));
    if (matrix && size >= 9 * sizeof(std::int32_t)) {
        const auto fixed = [&](int index) { return matrix[index] / 65536.0; };
        description.transform = {fixed(0), fixed(1), fixed(3), fixed(4), fixed(6), fixed(7)};
    }
    description.colour.reset();
    if (parameters.color_space != AVCOL_SPC_UNSPECIFIED) {
        description.colour = {static_cast<std::uint16_t>(parameters.color_primaries),
                              static_cast<std::uint16_t>(parameters.color_trc),
                              static_cast<std::uint16_t>(parameters.color_space),
                              parameters.color_range == AVCOL_RANGE_JPEG};
    }
    if (const AVRational aspect = parameters.sample_aspect_ratio; aspect.num > 0 && aspect.num != aspect.den) {
        description.pixelAspectRatio = {static_cast<std::uint32_t>(aspect.num), static_cast<std::uint32_t>(aspect.den)};
    }
    description.name = nameOf(stream);
    return description;
}

mp4::AudioTrackDescription describeAudioStream(const AVStream& stream) {
    const AVCodecParameters& parameters = *stream.codecpar;
    mp4::AudioTrackDescription description;
    description.sampleRate = static_cast<std::uint32_t>(parameters.sample_rate);
    description.channels = static_cast<std::uint16_t>(parameters.ch_layout.nb_channels);
    const auto config = extradataOf(parameters);
    description.audioSpecificConfig.assign(config.begin(), config.end());
    description.bitRate = static_cast<std::uint32_t>(std::clamp<std::int64_t>(parameters.bit_rate, 0, INT32_MAX));
    description.name = nameOf(stream);
    return description;  // no priming: it lies before the movie's zero, which hides it
}

}  // namespace

MovieSource::MovieSource(AvOwned<AVFormatContext> file) : file_(std::move(file)), packet_(av_packet_alloc()) {}

std::variant<std::unique_ptr<MovieSource>, Error> MovieSource::open(const std::string& path) {
    if (path.empty()) return systemError(ENOENT);
    AVFormatContext* context = nullptr;
    AVDictionary* options = nullptr;
    // Edit lists as an offset of the stamps only: every sample is delivered, also those that are not presented.
    av_dict_set(&options, "advanced_editlist", "0", 0);
    av_dict_set(&options, "protocol_whitelist", "file", 0);
    const int error = avformat_open_input(&context, ("file:" + path).c_str(), av_find_input_format("mov"), &options);
    av_dict_free(&options);
    if (error < 0) return avError(error);
    std::unique_ptr<MovieSource> source(new MovieSource(AvOwned<AVFormatContext>(context)));

    source->trackOfStream_.resize(context->nb_streams);
    for (unsigned i = 0; i < context->nb_streams; ++i) {
        const AVStream& stream = *context->streams[i];
        const AVMediaType type = stream.codecpar->codec_type;
        if (type != AVMEDIA_TYPE_VIDEO && type != AVMEDIA_TYPE_AUDIO) continue;
        const AVCodecID codec = stream.codecpar->codec_id;
        if (codec != AV_CODEC_ID_H264 && codec != AV_CODEC_ID_AAC) return systemError(ENOTSUP);
        if (stream.time_base.num != 1 || stream.time_base.den <= 0) return systemError(ENOTSUP);
        source->trackOfStream_[i] = source->tracks_.size();
        source->streamOfTrack_.push_back(static_cast<int>(i));
        source->tracks_.push_back({type == AVMEDIA_TYPE_VIDEO, stream.time_base.den, stream.id});
    }
    if (source->tracks_.empty()) return systemError(ENODATA);
    // The movie of a recording that was killed says no duration: it takes a look at the samples.
    if (context->duration <= 0 && avformat_find_stream_info(context, nullptr) < 0) return systemError(EPROTO);
    return source;
}

std::int64_t MovieSource::duration() const {
    // A header may say anything; what is longer than a year has no length that one could work with.
    constexpr std::int64_t kLongest = 366LL * 24 * 3600 * AV_TIME_BASE;
    if (file_->duration <= 0 || file_->duration > kLongest) return 0;
    return av_rescale(file_->duration, kNanoseconds.den, AV_TIME_BASE);
}

bool MovieSource::declareTracks(mp4::MovieBoxWriter& movie, std::vector<mp4::TrackId>& ids) const {
    for (std::size_t track = 0; track < tracks_.size(); ++track) {
        const auto id = tracks_[track].isVideo ? movie.addVideoTrack(describeVideo(track))
                                               : movie.addAudioTrack(describeAudio(track));
        if (!id) return false;
        ids.push_back(*id);
    }
    return true;
}

mp4::VideoTrackDescription MovieSource::describeVideo(std::size_t track) const {
    return describeVideoStream(streamOf(track));
}

mp4::AudioTrackDescription MovieSource::describeAudio(std::size_t track) const {
    return describeAudioStream(streamOf(track));
}

double MovieSource::rateOf(std::size_t track) const {
    const AVRational rate = streamOf(track).avg_frame_rate;
    return rate.num > 0 && rate.den > 0 ? av_q2d(rate) : 0;
}

void MovieSource::readOnly(std::size_t track) {
    for (unsigned i = 0; i < file_->nb_streams; ++i) {
        const bool isWanted = static_cast<int>(i) == streamOfTrack_[track];
        file_->streams[i]->discard = isWanted ? AVDISCARD_DEFAULT : AVDISCARD_ALL;
    }
}

const AVStream* MovieSource::videoStream() const {
    for (std::size_t i = 0; i < tracks_.size(); ++i) {
        if (tracks_[i].isVideo) return file_->streams[streamOfTrack_[i]];
    }
    return nullptr;
}

std::optional<std::int64_t> MovieSource::keyFrameBefore(std::int64_t nanoseconds) const {
    AVStream* const stream = const_cast<AVStream*>(videoStream());  // the look-up takes no const, and changes nothing
    if (!stream) return std::nullopt;
    const std::int64_t ticks = av_rescale_q_rnd(nanoseconds, kNanoseconds, stream->time_base, AV_ROUND_DOWN);
    const AVIndexEntry* const entry = avformat_index_get_entry_from_timestamp(stream, ticks, AVSEEK_FLAG_BACKWARD);
    if (!entry) return std::nullopt;
    return entry->timestamp;
}

std::optional<Error> MovieSource::seek(std::int64_t nanoseconds) {
    const AVStream* const stream = videoStream();
    if (!stream) return std::nullopt;  // sound alone is read from the beginning
    const std::int64_t ticks = av_rescale_q_rnd(nanoseconds, kNanoseconds, stream->time_base, AV_ROUND_DOWN);
    // Before the first key frame there is nothing to seek to: the beginning is where reading stands anyway.
    if (!avformat_index_get_entry_from_timestamp(const_cast<AVStream*>(stream), ticks, AVSEEK_FLAG_BACKWARD)) {
        return std::nullopt;
    }
    const int error = av_seek_frame(file_.get(), stream->index, ticks, AVSEEK_FLAG_BACKWARD);
    return error < 0 ? std::optional(avError(error)) : std::nullopt;
}

std::variant<std::optional<MovieSource::Sample>, Error> MovieSource::read() {
    for (;;) {
        av_packet_unref(packet_.get());
        const int error = av_read_frame(file_.get(), packet_.get());
        if (error == AVERROR_EOF) return std::nullopt;
        if (error < 0) return avError(error);
        const auto stream = static_cast<std::size_t>(packet_->stream_index);
        if (stream >= trackOfStream_.size() || !trackOfStream_[stream]) continue;
        if (packet_->flags & AV_PKT_FLAG_CORRUPT) return systemError(EPROTO);
        if (packet_->pts != packet_->dts || packet_->pts == AV_NOPTS_VALUE) return systemError(ENOTSUP);
        return Sample{*trackOfStream_[stream], {packet_->data, static_cast<std::size_t>(packet_->size)}, packet_->pts,
                      packet_->duration, (packet_->flags & AV_PKT_FLAG_KEY) != 0};
    }
}

}  // namespace lumacast::media
