#pragma once
// Writing a movie file.

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <variant>

#include "base/Identifiers.h"
#include "base/Value.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast {

/// The keys of a video track's settings dictionary and of its compression properties.
namespace VideoSettings {
inline constexpr std::string_view kCodec = "Codec";                                    ///< text, "avc1"
inline constexpr std::string_view kWidth = "Width";                                    ///< double, pixels
inline constexpr std::string_view kHeight = "Height";                                  ///< double, pixels
inline constexpr std::string_view kCompressionProperties = "CompressionProperties";    ///< dictionary of the following
inline constexpr std::string_view kExpectedSourceFrameRate = "ExpectedSourceFrameRate";  ///< int64
inline constexpr std::string_view kMaxKeyFrameInterval = "MaxKeyFrameInterval";        ///< int64, frames
inline constexpr std::string_view kProfileLevel = "ProfileLevel";                      ///< text
inline constexpr std::string_view kAverageBitRate = "AverageBitRate";                  ///< int64, bits per second
inline constexpr std::string_view kProfileHighAutoLevel = "H264_High_AutoLevel";
inline constexpr std::string_view kCodecH264 = "avc1";
}  // namespace VideoSettings

/// The keys of an audio track's settings dictionary.
namespace AudioSettings {
inline constexpr std::string_view kFormatID = "FormatID";                ///< uint64, four-character code
inline constexpr std::string_view kNumberOfChannels = "NumberOfChannels";  ///< int64
inline constexpr std::string_view kSampleRate = "SampleRate";            ///< double, Hz
inline constexpr std::string_view kChannelLayout = "ChannelLayout";      ///< bytes, a channel-layout record
inline constexpr std::string_view kBitRate = "EncoderBitRate";           ///< int64, bits per second
}  // namespace AudioSettings

/// One track that is being written.
class TrackInput {
public:
    virtual ~TrackInput() = default;
    virtual void setExpectsMediaInRealTime(bool realTime) = 0;
    /// How the pictures are to be shown. Ignored once writing has started.
    virtual void setTransform(const AffineTransform& transform) = 0;
    /// Whether the track's own buffer has room. Always true before the first sample, encoder open or not.
    virtual bool isReadyForMoreMediaData() const = 0;
    /// Takes a reference to the sample and returns at once: conversion, encoding and the disk are behind it. Drops, and
    /// answers true for, a sample that is not to be in the movie: its stamp is not later than the track's one before,
    /// or a picture's is before the start of the session, or it is after the end of it. False, the sample not taken,
    /// when there is no room, when the stamp is not valid or the sample of the other kind, and when the writer can't
    /// take samples (any more): before the session is started, after finishing was asked for and after a failure.
    virtual bool append(const SampleRef& sample) = 0;
};

enum class ContainerStatus : std::int32_t { Unknown = 0, Writing = 1, Completed = 2, Failed = 3, Cancelled = 4 };

/// Writes one MPEG-4 file. Unknown becomes Writing by startWriting; Writing becomes Completed or Failed by
/// finishWriting, and Failed at any time when the disk or an encoder fails; Completed and Failed stay. Its operations
/// are called on one lane at a time (the movie writer's queue); completions come on a lane of the platform, never
/// inline. The file appears at creation and can be played while it grows, up to a second ago. It is closed as soon as
/// the movie is Completed or Failed, however long the writer is kept. Destroying a writer that has not finished closes
/// the file as it is and never re-creates it.
class ContainerWriter {
public:
    virtual ~ContainerWriter() = default;

    /// Adds a track. Null once writing has started or failed, for a second video track, and for settings that no
    /// encoder can take. The video track is the picture, the first audio track the application's sound, the second the
    /// microphone.
    virtual std::shared_ptr<TrackInput> addVideoInput(const Dictionary& settings) = 0;
    virtual std::shared_ptr<TrackInput> addAudioInput(const Dictionary& settings) = 0;

    virtual ContainerStatus status() const = 0;
    /// Why the status is Failed; none otherwise.
    virtual std::optional<Error> error() const = 0;
    virtual URL outputURL() const = 0;

    /// Begins writing. False, changing nothing, in every state but Unknown, and without a track; false and Failed with
    /// EAGAIN when the system has no thread left for it.
    virtual bool startWriting() = 0;
    /// The movie begins at `time` of the samples' clock. Only the first one counts, and only while writing.
    virtual void startSession(MediaTime time) = 0;
    /// The movie ends at `time`: what was appended with a later stamp is not in it.
    virtual void endSession(MediaTime time) = 0;
    /// Writes what is still on its way and the index. The last picture is extended to the end of the session where one
    /// was set, else to the time of the recording's capture clock. A movie without a sample, started or not, fails.
    /// `completion` is called once, whatever came of it; where nothing is being written any more only that happens.
    virtual void finishWriting(std::function<void()> completion) = 0;

    /// For status reports, callable from any lane: bytes written so far.
    virtual std::uint64_t bytesWritten() const = 0;
    /// The same of the pictures: those that the movie was given and keeps, up to now. Not counted are the refused ones
    /// and those that append drops.
    virtual std::uint64_t picturesTaken() const = 0;
};

enum class ContainerType { Mpeg4 };

/// Makes container writers.
class ContainerWriters {
public:
    virtual ~ContainerWriters() = default;
    /// Creates the file and a writer for it, taking the current capture clock. Waits at most 40 ms for the disk. An
    /// error when the file can't be made (one that exists already is an error too).
    virtual std::variant<std::unique_ptr<ContainerWriter>, Error> make(const URL& outputURL, ContainerType type) = 0;
};

}  // namespace lumacast
