#pragma once
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "extensions/hls-clips/ClipMedia.h"
#include "extensions/hls-clips/FragmentWriter.h"
#include "extensions/media/AacEncoder.h"

namespace lumacast::extensions {

/// One segment of the stream.
struct Segment {
    Data init;  ///< see SegmentBytes
    Data media;
    std::int64_t ticks = 0;        ///< from its first picture to the next segment's, exactly
    bool isDiscontinuous = false;  ///< what comes before it does not lead to it
};

/// Makes segments of clips, one stream of time: a clip begins where the one before has ended. Pictures stay as they are
/// (no pixel is decoded); the sound of all tracks is mixed and goes through one encoder for the whole stream, so that
/// no cut is heard. A clip without sound is silent. Not thread-safe; blocks while it works.
class Segmenter final {
public:
    /// A clip that is longer than `longestSeconds` becomes several segments, each beginning with a key frame.
    explicit Segmenter(std::int64_t longestSeconds) : longest_(longestSeconds * kTicksPerSecond) {}

    /// The segments of the next clip. `error` says why there are none; the clip is left out then, and the stream goes
    /// on with a discontinuity.
    std::vector<Segment> add(const Fd& movie, bool isLast, std::string& error);
    /// A clip that can't be had is left out.
    void leaveOut() { isDiscontinuous_ = true; }

private:
    bool accept(const ClipMedia& media, std::string& error);
    std::int64_t endOf(const ClipMedia& media) const;
    void encodeSound(const ClipMedia& media, std::int64_t end, bool isLast);
    std::vector<std::size_t> cutsOf(const ClipMedia& media, std::int64_t end) const;
    std::optional<Segment> write(ClipMedia& media, std::size_t from, std::size_t to, std::int64_t end,
                                 bool takesAllSound, std::string& error);

    const std::int64_t longest_;
    std::int64_t position_ = 0;  ///< ticks; where the next clip begins
    std::uint32_t segments_ = 0;
    bool isDiscontinuous_ = false;
    std::unique_ptr<AacEncoder> encoder_;
    std::vector<AvOwned<AVPacket>> sounds_;  ///< encoded and not in a segment yet
};

}  // namespace lumacast::extensions
