#pragma once
#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "extensions/media/Av.h"

namespace lumacast::extensions {

/// The tracks of a stream, as their encoders describe them.
struct StreamTracks {
    AvOwned<AVCodecParameters> video, sound;
    AVRational videoBase{1, 1}, soundBase{1, 1};  ///< of the packets' times
};

/// One connection to a media server, from its hello to its end. Blocks, but no call for longer than it is told to. Not
/// thread-safe.
class MediaOutput final {
public:
    /// `isGivenUp` is asked while it waits for the server; when it says so, or nothing came of a call in `patience`,
    /// the waiting ends as a failure.
    MediaOutput(std::chrono::milliseconds patience, std::function<bool()> isGivenUp)
        : patience_(patience), isGivenUp_(std::move(isGivenUp)) {}
    MediaOutput(const MediaOutput&) = delete;
    MediaOutput& operator=(const MediaOutput&) = delete;
    /// Ends the stream, properly if the server still listens.
    ~MediaOutput();

    /// Connects and announces the tracks. The reason when that fails, else empty.
    [[nodiscard]] std::string open(const std::string& url, const char* format, const StreamTracks& tracks);
    /// Sends one packet; the first one's time is the stream's zero, what is from before is left out. The reason when
    /// the server can't be reached any more, else empty.
    [[nodiscard]] std::string write(const AVPacket& packet, bool isVideo);

private:
    static int interrupt(void* self);
    void waitForPlayout() const;
    void expectProgress() { deadline_ = std::chrono::steady_clock::now() + patience_; }

    const std::chrono::milliseconds patience_;
    const std::function<bool()> isGivenUp_;
    std::chrono::steady_clock::time_point deadline_;
    AVFormatContext* format_ = nullptr;
    bool hasHeader_ = false, isSrt_ = false, isBroken_ = false;
    AVRational videoBase_{1, 1}, soundBase_{1, 1};
    std::optional<std::int64_t> zero_;  ///< nanoseconds
};

}  // namespace lumacast::extensions
