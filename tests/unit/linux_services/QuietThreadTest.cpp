#include "linux/ipc/QuietThread.h"

#include <gtest/gtest.h>

#include <cstddef>
#include <set>

namespace lumacast {
namespace {

/// The signals that the thread it is asked on has blocked.
std::set<int> blockedSignals() {
    sigset_t mask;
    EXPECT_EQ(pthread_sigmask(SIG_SETMASK, nullptr, &mask), 0);
    std::set<int> blocked;
    for (int signal = 1; signal < NSIG; ++signal)
        if (sigismember(&mask, signal) == 1) blocked.insert(signal);
    return blocked;
}

/// A process that can't have another thread: each would need more memory for its stack than there are addresses.
class NoThreadLeft {
public:
    NoThreadLeft() {
        pthread_attr_t attributes;
        EXPECT_EQ(pthread_getattr_default_np(&attributes), 0);
        EXPECT_EQ(pthread_attr_getstacksize(&attributes, &before_), 0);
        pthread_attr_destroy(&attributes);
        setStackSize(std::size_t{1} << 60);
    }
    ~NoThreadLeft() { setStackSize(before_); }

private:
    static void setStackSize(std::size_t size) {
        pthread_attr_t attributes;
        EXPECT_EQ(pthread_getattr_default_np(&attributes), 0);
        EXPECT_EQ(pthread_attr_setstacksize(&attributes, size), 0);
        EXPECT_EQ(pthread_setattr_default_np(&attributes), 0);
        pthread_attr_destroy(&attributes);
    }

    std::size_t before_ = 0;
};

TEST(QuietThread, HasAllSignalsBlockedAndItsMakerNone) {
    const std::set<int> before = blockedSignals();
    std::set<int> inside;
    quietThread([&] { inside = blockedSignals(); }).join();
    for (const int signal : {SIGTERM, SIGINT, SIGHUP, SIGPIPE, SIGUSR1, SIGCHLD}) EXPECT_TRUE(inside.contains(signal));
    EXPECT_EQ(blockedSignals(), before);
    EXPECT_FALSE(before.contains(SIGTERM));
}

TEST(QuietThread, ThatCantBeHadLeavesItsMakersSignalsAsTheyWere) {
    const std::set<int> before = blockedSignals();
    const NoThreadLeft none;
    EXPECT_THROW(quietThread([] {}), std::system_error);
    EXPECT_EQ(blockedSignals(), before);
    EXPECT_FALSE(quietThreadIfAny([] {}).joinable());
    EXPECT_EQ(blockedSignals(), before);
}

}  // namespace
}  // namespace lumacast
