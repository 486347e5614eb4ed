#include <gtest/gtest.h>

#include "extensions/hls-clips/Playlist.h"

namespace lumacast::test {
namespace {

using extensions::Playlist;
using extensions::PlaylistEntry;

TEST(HlsPlaylist, ListsSegmentsWithTheirExactLengths) {
    Playlist playlist(6, 0);
    playlist.add({"a-1.m4s", "a-init-1.mp4", 90'000 * 5 + 1, false});
    playlist.add({"a-2.m4s", "a-init-1.mp4", 45'000, false});
    EXPECT_EQ(playlist.text(),
              "#EXTM3U\n"
              "#EXT-X-VERSION:7\n"
              "#EXT-X-TARGETDURATION:6\n"
              "#EXT-X-MEDIA-SEQUENCE:0\n"
              "#EXT-X-PLAYLIST-TYPE:EVENT\n"
              "#EXT-X-INDEPENDENT-SEGMENTS\n"
              "#EXT-X-MAP:URI=\"a-init-1.mp4\"\n"
              "#EXTINF:5.0000111,\n"
              "a-1.m4s\n"
              "#EXTINF:0.5000000,\n"
              "a-2.m4s\n");
    playlist.end();
    EXPECT_TRUE(playlist.text().ends_with("a-2.m4s\n#EXT-X-ENDLIST\n"));
}

TEST(HlsPlaylist, KeepsAsManyAsItIsToldAndCountsWhatHasGone) {
    Playlist playlist(6, 2);
    EXPECT_TRUE(playlist.add({"1", "i", 90'000, false}).empty());
    EXPECT_TRUE(playlist.add({"2", "i", 90'000, true}).empty());
    EXPECT_EQ(playlist.add({"3", "i", 90'000, false}).at(0).name, "1");
    EXPECT_EQ(playlist.add({"4", "i", 90'000, false}).at(0).name, "2");
    EXPECT_EQ(playlist.text(),
              "#EXTM3U\n"
              "#EXT-X-VERSION:7\n"
              "#EXT-X-TARGETDURATION:6\n"
              "#EXT-X-MEDIA-SEQUENCE:2\n"
              "#EXT-X-DISCONTINUITY-SEQUENCE:1\n"
              "#EXT-X-INDEPENDENT-SEGMENTS\n"
              "#EXT-X-MAP:URI=\"i\"\n"
              "#EXTINF:1.0000000,\n3\n"
              "#EXTINF:1.0000000,\n4\n");
}

TEST(HlsPlaylist, AnotherHeaderIsADiscontinuity) {
    Playlist playlist(6, 0);
    playlist.add({"1", "first", 90'000, false});
    playlist.add({"2", "second", 90'000, false});
    EXPECT_TRUE(
        playlist.text().ends_with("#EXTINF:1.0000000,\n1\n"
                                  "#EXT-X-DISCONTINUITY\n"
                                  "#EXT-X-MAP:URI=\"second\"\n"
                                  "#EXTINF:1.0000000,\n2\n"));
}

TEST(HlsPlaylist, NoSegmentIsLongerThanTheTargetSays) {
    Playlist playlist(2, 0);
    playlist.add({"1", "i", 90'000 * 35 / 10, false});
    EXPECT_NE(playlist.text().find("#EXT-X-TARGETDURATION:4\n"), std::string::npos);
}

}  // namespace
}  // namespace lumacast::test
