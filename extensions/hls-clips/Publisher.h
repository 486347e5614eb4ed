#pragma once
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

#include "extensions/hls-clips/Destination.h"
#include "extensions/hls-clips/Playlist.h"
#include "extensions/hls-clips/Segmenter.h"

namespace lumacast::extensions {

/// Brings segments and the playlist to their destination, on a thread of its own: whoever hands a segment over never
/// waits. A segment that doesn't get there in three attempts is left out of the playlist; while the destination is dead
/// each gets one. A page that plays the stream lies beside the playlist. At most kMostWaiting segments wait: one more,
/// and the oldest is left out.
class Publisher final {
public:
    static constexpr std::size_t kMostWaiting = 12;
    static constexpr const char* kPlaylistName = "index.m3u8";
    static constexpr const char* kPageName = "watch.html";

    struct Options {
        std::string streamName;  ///< part of the files' names, so that no cache mixes streams up
        std::int64_t targetSeconds = 6;
        std::size_t keep = 0;                            ///< segments in the playlist; 0: all
        std::chrono::milliseconds betweenAttempts{500};  ///< and twice that before the third
    };
    struct State {
        std::uint64_t published = 0, lost = 0;
        bool isStalled = false;  ///< the last segment did not get there
    };

    /// `makeDestination` is called at once, with what tells a transfer that it is given up.
    Publisher(Options options,
              const std::function<std::unique_ptr<Destination>(std::function<bool()> isGivenUp)>& makeDestination);
    Publisher(const Publisher&) = delete;
    Publisher& operator=(const Publisher&) = delete;
    /// Gives up what has not got there.
    ~Publisher();

    void submit(Segment segment);
    /// Ends the playlist behind what was submitted. Waits until all of it is there, at most `limit`; whether it is.
    bool finish(std::chrono::milliseconds limit);
    State state() const;

private:
    void run();
    void publish(Segment segment);
    bool put(const std::string& name, const Data& contents, std::string_view type, int attempts);
    bool putInit(const Data& init, int attempts);
    void putPlaylist(int attempts);
    void removeExpired(std::vector<PlaylistEntry> gone);
    int attempts() const;

    const Options options_;
    mutable std::mutex mutex_;
    std::condition_variable changed_;
    std::deque<Segment> waiting_;
    State state_;
    bool isEnding_ = false, isGivenUp_ = false, isDone_ = false;

    // The thread's own.
    std::unique_ptr<Destination> destination_;
    Playlist playlist_;
    bool hasPage_ = false;
    bool isGap_ = false;  ///< the last segment was left out
    Data init_;
    std::string initName_;
    std::uint64_t segments_ = 0, inits_ = 0;
    std::deque<PlaylistEntry> expired_;
    std::thread thread_;
};

}  // namespace lumacast::extensions
