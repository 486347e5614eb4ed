#include "extensions/hls-clips/Playlist.h"

#include <algorithm>
#include <cstdio>
#include <utility>

#include "extensions/hls-clips/ClipMedia.h"

namespace lumacast::extensions {

std::vector<PlaylistEntry> Playlist::add(PlaylistEntry entry) {
    // Rounded to whole seconds no segment may be longer than the target (4.3.3.1).
    target_ = std::max(target_, (entry.ticks + kTicksPerSecond / 2) / kTicksPerSecond);
    // Another header means other encoding parameters: players are to expect them.
    if (!entries_.empty() && entries_.back().init != entry.init) entry.isDiscontinuous = true;
    if (entries_.empty() && sequence_ == 0) entry.isDiscontinuous = false;
    entries_.push_back(std::move(entry));
    std::vector<PlaylistEntry> gone;
    while (keep_ > 0 && entries_.size() > keep_) {
        ++sequence_;
        if (entries_.front().isDiscontinuous) ++discontinuities_;
        gone.push_back(std::move(entries_.front()));
        entries_.pop_front();
    }
    return gone;
}

std::string Playlist::text() const {
    std::string text = "#EXTM3U\n#EXT-X-VERSION:7\n#EXT-X-TARGETDURATION:" + std::to_string(target_) + "\n";
    text += "#EXT-X-MEDIA-SEQUENCE:" + std::to_string(sequence_) + "\n";
    if (discontinuities_ > 0) text += "#EXT-X-DISCONTINUITY-SEQUENCE:" + std::to_string(discontinuities_) + "\n";
    if (keep_ == 0) text += "#EXT-X-PLAYLIST-TYPE:EVENT\n";
    text += "#EXT-X-INDEPENDENT-SEGMENTS\n";
    const std::string* init = nullptr;
    for (const PlaylistEntry& entry : entries_) {
        if (entry.isDiscontinuous) text += "#EXT-X-DISCONTINUITY\n";
        if (!init || *init != entry.init) text += "#EXT-X-MAP:URI=\"" + entry.init + "\"\n";
        init = &entry.init;
        // A tick is 1/90000 s: seven decimals tell two of them apart.
        char length[48];
        std::snprintf(length, sizeof length, "#EXTINF:%lld.%07lld,\n",
                      static_cast<long long>(entry.ticks / kTicksPerSecond),
                      static_cast<long long>(entry.ticks % kTicksPerSecond * 10'000'000 / kTicksPerSecond));
        text += length + entry.name + "\n";
    }
    if (isEnded_) text += "#EXT-X-ENDLIST\n";
    return text;
}

}  // namespace lumacast::extensions
