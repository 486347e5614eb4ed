#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "tests/checkers/Luma.h"
#include "tests/checkers/Sound.h"

struct AVFrame;

namespace lumacast::checkers {

using std::chrono::nanoseconds;

struct VideoTrack {
    std::string codec;    ///< "h264"
    std::string profile;  ///< "High"; empty when unknown
    std::string pixelFormat;
    int width = 0;
    int height = 0;
    int rotation = 0;  ///< degrees clockwise that a player turns the picture by
    nanoseconds duration{};
};

struct AudioTrack {
    std::string codec;
    int sampleRate = 0;
    int channels = 0;
    nanoseconds duration{};
};

/// A decoded picture, valid during the callback that receives it.
struct DecodedPicture {
    nanoseconds time{};  ///< when it is shown, from the start of the movie
    LumaView luma;
    const AVFrame* frame = nullptr;
};

/// A picture as 8-bit R, G, B without gaps.
struct RgbPicture {
    int width = 0;
    int height = 0;
    std::vector<std::uint8_t> samples;
};

/// Decodes a movie file with libav. Edit lists are applied, so times are what a player shows. Each read goes through
/// the file anew. Any lane, one at a time; blocks.
class MovieReader final {
public:
    /// On failure `error()` says why and there are no tracks.
    explicit MovieReader(std::string path);

    [[nodiscard]] const std::string& error() const { return error_; }
    [[nodiscard]] nanoseconds duration() const { return duration_; }
    [[nodiscard]] const std::vector<VideoTrack>& videoTracks() const { return video_; }
    [[nodiscard]] const std::vector<AudioTrack>& audioTracks() const { return audio_; }

    /// Calls `each` for every picture of the first video track in the order of showing. False when the track is missing
    /// or any part of it can't be decoded, which `error()` then explains; what could be decoded was delivered.
    [[nodiscard]] bool readPictures(const std::function<void(const DecodedPicture&)>& each);

    /// The sound of an audio track (0 is the first), its channels averaged. It begins at movie time zero; where the
    /// track has no sound there is silence. None when missing or undecodable.
    [[nodiscard]] std::optional<Sound> readSound(std::size_t track = 0);

private:
    std::string path_;
    std::string error_;
    nanoseconds duration_{};
    std::vector<VideoTrack> video_;
    std::vector<AudioTrack> audio_;
};

/// Scales a picture for people to look at.
[[nodiscard]] RgbPicture toRgb(const DecodedPicture& picture, int width, int height);

}  // namespace lumacast::checkers
