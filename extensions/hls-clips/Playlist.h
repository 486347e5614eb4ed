#pragma once
#include <cstdint>
#include <deque>
#include <string>
#include <vector>

namespace lumacast::extensions {

/// One line of the playlist and what stands above it.
struct PlaylistEntry {
    std::string name;        ///< of the segment
    std::string init;        ///< of the header it needs
    std::int64_t ticks = 0;  ///< its length
    bool isDiscontinuous = false;
};

/// A live playlist (RFC 8216) of fragmented MP4 segments: pure text. With `keep` 0 it only grows.
class Playlist final {
public:
    Playlist(std::int64_t targetSeconds, std::size_t keep) : target_(targetSeconds), keep_(keep) {}

    /// Adds a segment; answers those that fell out of the list.
    std::vector<PlaylistEntry> add(PlaylistEntry entry);
    /// Nothing follows.
    void end() { isEnded_ = true; }
    bool isEnded() const { return isEnded_; }
    const std::deque<PlaylistEntry>& entries() const { return entries_; }
    std::string text() const;

private:
    std::int64_t target_;  ///< seconds; grows only if a segment is longer against all intent
    const std::size_t keep_;
    std::uint64_t sequence_ = 0, discontinuities_ = 0;
    std::deque<PlaylistEntry> entries_;
    bool isEnded_ = false;
};

}  // namespace lumacast::extensions
