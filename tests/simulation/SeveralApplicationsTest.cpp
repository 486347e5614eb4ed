// Several applications compete for the recording on a platform that may fail: starts of every kind, pauses, resumes
// with windows of their own and of others, stops, clips, discards, changes of the foreground, purges, a full disk,
// capture that fails, is pre-empted or reset, and deaths at any step, in every interleaving that a seed gives. One of
// them may record the whole display. The user is asked, and grants, refuses, takes a long time or never answers.
// LC_SEED=n replays one seed; LC_SEEDS=n runs so many.

#include <gtest/gtest.h>

#include "tests/simulation/Contest.h"
#include "tests/simulation/Seeds.h"

namespace lumacast {
namespace {

using Tally = ContestTally;

TEST(SeveralApplications, LeaveNothingBehindInAnyOfManySeeds) {
    Tally tally;
    const Seeds seeds(2000);
    for (std::uint64_t seed = seeds.first; seed <= seeds.last; ++seed) {
        Seeds::begin(seed);
        SCOPED_TRACE("LC_SEED=" + std::to_string(seed));
        Contest contest(seed, tally);
        contest.run();
        if (HasFailure()) {
            if (!seeds.isOne()) FAIL() << "seed " << seed;
            for (const std::string& line : contest.log()) ADD_FAILURE() << line;
            return;
        }
    }
    if (!seeds.areAllOrdinary()) return;
    // The seeds really went everywhere.
    EXPECT_GT(tally.movies, 50);
    EXPECT_GT(tally.clips, 5);
    EXPECT_GT(tally.purges, 50);
    EXPECT_GT(tally.deaths, 100);
    EXPECT_GT(tally.granted, 100);
    EXPECT_GT(tally.refusedByUser, 50);
    EXPECT_GT(tally.leftStanding, 50);
    EXPECT_GT(tally.systemRecordings, 100);
    EXPECT_GT(tally.inLibrary, 50);
    EXPECT_GT(tally.interrupted, 0);
    EXPECT_GT(tally.interruptionsChecked, 50);
    EXPECT_GT(tally.purgedAway, 50);
    EXPECT_GT(tally.begunInThePurge, 50);
    for (const std::int64_t code : {-5801, -5803, -5805, -5808, -5810}) EXPECT_GT(tally.refused[code], 3) << code;
    for (const std::int64_t code : {-5805, -5806, -5816, -5817}) EXPECT_GT(tally.told[code], 3) << code;
}

TEST(SeveralApplications, ASeedReplaysExactly) {
    for (const std::uint64_t seed : {3u, 77u}) {
        Tally tally;
        Contest once(seed, tally);
        once.run();
        Contest again(seed, tally);
        again.run();
        EXPECT_EQ(once.traceHash(), again.traceHash());
        EXPECT_EQ(once.log(), again.log());
    }
}

}  // namespace
}  // namespace lumacast
