// When what was encoded has to be in the file.

#include "linux/media/FlushPace.h"

#include <gtest/gtest.h>

namespace lumacast::media {
namespace {

using Content = FlushPace::Content;
using std::chrono::milliseconds;

FlushPace::Moment at(int milli) { return FlushPace::Moment(milliseconds(milli)); }

/// Flushed at zero with nothing since, what was then being sure.
FlushPace flushedAtZero() {
    FlushPace pace;
    pace.flushed(at(0));
    return pace;
}

TEST(FlushPace, NothingIsDueWhereNothingWaits) {
    EXPECT_EQ(FlushPace().due(), std::nullopt);
    EXPECT_EQ(flushedAtZero().due(), std::nullopt);
}

TEST(FlushPace, APictureIsDueHalfASecondAfterTheLastFlushWhateverItShows) {
    for (const Content content : {Content::News, Content::Repeat}) {
        FlushPace pace = flushedAtZero();
        pace.added(content);
        EXPECT_EQ(pace.due(), at(500));
    }
}

TEST(FlushPace, SilenceAloneWaitsUntilTheSecondIsNearlyOver) {
    FlushPace pace = flushedAtZero();
    pace.added(Content::Silence);
    EXPECT_EQ(pace.due(), at(950));
    pace.added(Content::Repeat);
    EXPECT_EQ(pace.due(), at(500)) << "it goes with the picture";
}

TEST(FlushPace, WhatCanBeHeardDoesNotWaitWithTheSilence) {
    FlushPace pace = flushedAtZero();
    pace.added(Content::Silence);
    pace.added(Content::News);
    EXPECT_EQ(pace.due(), at(500));
}

TEST(FlushPace, WhatShowsNewsIsSyncedHalfASecondLaterThoughNothingElseWaits) {
    FlushPace pace = flushedAtZero();
    pace.added(Content::News);
    pace.flushed(at(600));
    EXPECT_TRUE(pace.newsIsUnsure());
    EXPECT_EQ(pace.due(), at(1100));
    pace.added(Content::Silence);
    EXPECT_EQ(pace.due(), at(1100));
    pace.flushed(at(1100));
    EXPECT_FALSE(pace.newsIsUnsure());
    EXPECT_EQ(pace.due(), std::nullopt);
}

TEST(FlushPace, ARepeatedPictureIsSureAtOnce) {
    FlushPace pace = flushedAtZero();
    pace.added(Content::Repeat);
    pace.added(Content::Silence);
    pace.flushed(at(900));
    EXPECT_FALSE(pace.newsIsUnsure());
    EXPECT_EQ(pace.due(), std::nullopt);
}

}  // namespace
}  // namespace lumacast::media
