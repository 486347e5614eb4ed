#include "linux/system/Termination.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <unistd.h>

#include <atomic>
#include <string>
#include <thread>

namespace lumacast {
namespace {

using namespace std::chrono_literals;

/// A process whose main thread never gets anywhere: it can only end by the signal.
[[noreturn]] void hang() {
    while (true) ::pause();
}

class TerminationDeathTest : public testing::Test {
protected:
    void SetUp() override { testing::FLAGS_gtest_death_test_style = "threadsafe"; }
};

TEST_F(TerminationDeathTest, ATerminatedProcessDoesItsWorkAndEndsWithStatus0) {
    for (const int signal : {SIGTERM, SIGINT})
        EXPECT_EXIT(
            {
                const Termination termination([] { (void)!::write(2, "movies closed", 13); });
                ::kill(::getpid(), signal);
                hang();
            },
            testing::ExitedWithCode(0), "movies closed");
}

TEST_F(TerminationDeathTest, WorkThatHangsIsNotWaitedForWithoutLimit) {
    EXPECT_EXIT(
        {
            const Termination termination([] { hang(); }, 50ms);
            ::kill(::getpid(), SIGTERM);
            hang();
        },
        testing::ExitedWithCode(0), "");
}

TEST_F(TerminationDeathTest, MoreTimeIsAskedForAgainAndAgainWhileTheWorkGoesOn) {
    EXPECT_EXIT(
        {
            std::atomic<int> asked{0};
            const Termination termination(
                [&] {
                    while (asked < 5) std::this_thread::yield();
                    (void)!::write(2, "done", 4);
                },
                60s, {[&] { ++asked; }, 1ms});
            ::kill(::getpid(), SIGTERM);
            hang();
        },
        testing::ExitedWithCode(0), "^done$");
}

TEST_F(TerminationDeathTest, TimeIsAskedForAtOnceAndOnlyUntilTheLimit) {
    EXPECT_EXIT(
        {
            const Termination termination([] { hang(); }, 50ms, {[] { (void)!::write(2, "more ", 5); }, 1h});
            ::kill(::getpid(), SIGTERM);
            hang();
        },
        testing::ExitedWithCode(0), "^more $");
}

TEST_F(TerminationDeathTest, FurtherSignalsChangeNothing) {
    EXPECT_EXIT(
        {
            const Termination termination([] {
                ::kill(::getpid(), SIGTERM);
                ::kill(::getpid(), SIGINT);
                (void)!::write(2, "once ", 5);
            });
            ::kill(::getpid(), SIGTERM);
            hang();
        },
        testing::ExitedWithCode(0), "^once $");
}

TEST_F(TerminationDeathTest, ThreadsStartedLaterTakeNoSignal) {
    EXPECT_EXIT(
        {
            const Termination termination([] { (void)!::write(2, "orderly", 7); });
            std::thread([] { hang(); }).detach();
            std::thread([] { hang(); }).detach();
            ::kill(::getpid(), SIGTERM);
            hang();
        },
        testing::ExitedWithCode(0), "orderly");
}

TEST_F(TerminationDeathTest, ItMayEndBeforeAnySignal) {
    EXPECT_EXIT(
        {
            {
                const Termination termination([] { ::_exit(3); });
                if (!termination.isWatching()) ::_exit(4);
            }
            ::_exit(5);
        },
        testing::ExitedWithCode(5), "");
}

}  // namespace
}  // namespace lumacast
