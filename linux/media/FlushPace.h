#pragma once
// When what was encoded has to be in the file. Pure: times come in.

#include <chrono>
#include <optional>

namespace lumacast::media {

/// Decides when what waits becomes a fragment. Every fragment wakes the disk and is waited for, so that there are as few
/// of them as the promise allows: whatever happens, at most a second of the movie is lost. Not thread-safe.
///
/// The newest fragment is seen by a player only once a second write has reached the disk, which the sync of the next one
/// takes along. So one with news in it has another sync soon after it. One without, of a still and silent window, is
/// synced twice at once: the next one comes with the next picture, nearly a second later.
class FlushPace final {
public:
    using Moment = std::chrono::steady_clock::time_point;

    /// From one flush to the next, and from one with news to the sync behind it: both together are the second.
    static constexpr std::chrono::milliseconds kInterval{500};
    /// The same where only silence waits. A still picture is repeated a little earlier, and takes the silence along.
    static constexpr std::chrono::milliseconds kSilentInterval{950};

    enum class Content {
        News,     ///< something to be seen or heard
        Repeat,   ///< the picture before once more
        Silence,
    };

    void added(Content content) {
        if (content == Content::Silence) {
            silenceWaits_ = true;
        } else {
            picturesWait_ = true;
            newsWaits_ |= content == Content::News;
        }
    }
    /// When to flush; none while nothing waits. Before the first flush: long ago.
    std::optional<Moment> due() const {
        if (picturesWait_ || newsIsUnsure_) return last_ + kInterval;
        if (silenceWaits_) return last_ + kSilentInterval;
        return std::nullopt;
    }
    /// Whether the newest fragment has news in it, and needs a sync though nothing else waits.
    bool newsIsUnsure() const { return newsIsUnsure_; }
    void flushed(Moment now) {
        last_ = now;
        newsIsUnsure_ = newsWaits_;
        picturesWait_ = newsWaits_ = silenceWaits_ = false;
    }

private:
    Moment last_{};
    bool picturesWait_ = false, silenceWaits_ = false;
    bool newsWaits_ = false;     ///< to be flushed
    bool newsIsUnsure_ = false;  ///< flushed last time
};

}  // namespace lumacast::media
