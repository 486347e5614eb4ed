// What a tap costs, when its sound is stamped to have been, and how it ends.

#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "tests/contract/AudioTapFixture.h"

namespace lumacast {
namespace {

using test::AudioTapTest;
using test::kOwn;
using test::TonePlayer;

TEST_P(AudioTapTest, ABeepIsStampedWithTheTimeAtWhichItWasHeard) {
    TonePlayer one(server_->address());
    ASSERT_TRUE(one.tell("play a 997 0.05 2"));
    const auto heard = hear(one.pid());
    ASSERT_TRUE(heard->waitForTone(kOwn, -40));
    std::vector<double> errors;
    std::string text;
    for (int beep = 0; beep < 5; ++beep) {
        heard->waitFor(0.1);
        const std::int64_t played = one.beep("a");
        ASSERT_NE(played, 0);
        const auto onsets = [&] { return checkers::beepOnsets(heard->sound(), kOwn, -6); };
        ASSERT_TRUE(eventually([&] { return onsets().size() == static_cast<std::size_t>(beep + 1); }))
            << beep << ": " << onsets().size() << " beeps heard";
        // The capture clock has run all the time: what it says now gives its zero.
        const std::int64_t zero = LinuxClock::currentHostTime().nanoseconds - clock_.captureClock()->now().value;
        const auto begin = static_cast<std::int64_t>(heard->pieces().front().start.hostTime);
        errors.push_back(static_cast<double>(zero + begin + onsets().back().count() - played) / 1e6);
        text += " " + std::to_string(errors.back()).substr(0, 5);
    }
    std::printf("%s: beeps stamped%s ms after the player's account\n", server_->name().c_str(), text.c_str());
    for (const double error : errors) EXPECT_LT(std::abs(error), 25) << "a picture at 40 a second";
    // On a busy machine single accounts come late.
    std::sort(errors.begin(), errors.end());
    EXPECT_LT(std::abs(errors[errors.size() / 2]), 5);
}

TEST_P(AudioTapTest, ATapCostsLittle) {
    const auto one = play(kOwn);
    const auto heard = hear(one->pid());
    ASSERT_TRUE(heard->waitForTone(kOwn));
    heard->waitFor(0.3);
    rusage before{}, after{};
    ::getrusage(RUSAGE_SELF, &before);
    heard->waitFor(1);
    ::getrusage(RUSAGE_SELF, &after);
    const auto seconds = [](const rusage& usage) {
        return static_cast<double>(usage.ru_utime.tv_sec + usage.ru_stime.tv_sec) +
               static_cast<double>(usage.ru_utime.tv_usec + usage.ru_stime.tv_usec) / 1e6;
    };
    // The test's own polling (200 times a second) is in it.
    const double share = (seconds(after) - seconds(before)) * 100;
    const double switches = static_cast<double>(after.ru_nvcsw - before.ru_nvcsw);
    std::printf("%s: %.2f %% of a core, %.0f wake-ups a second, of which the test's own about 200\n",
                server_->name().c_str(), share, switches);
    EXPECT_LT(share, 10);
}

TEST_P(AudioTapTest, WithoutAQueueThereIsNoThread) {
    EXPECT_FALSE(connection_->hasThread());
    {
        const auto one = play(kOwn);
        const auto heard = hear(one->pid());
        ASSERT_TRUE(heard->waitForTone(kOwn));
        EXPECT_TRUE(connection_->hasThread());
    }
    EXPECT_TRUE(eventually([this] { return !connection_->hasThread(); }));
}

/// The inotify descriptors of this process, each with the number of places that it watches.
std::map<std::string, int> watchesOfThisProcess() {
    std::map<std::string, int> watches;
    for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
        std::error_code gone;
        if (std::filesystem::read_symlink(entry, gone) != "anon_inode:inotify") continue;
        std::ifstream info("/proc/self/fdinfo/" + entry.path().filename().string());
        int& count = watches[entry.path().filename()];
        for (std::string line; std::getline(info, line);) count += line.starts_with("inotify wd:") ? 1 : 0;
    }
    return watches;
}

// Closing it makes the kernel wait, for seconds when the machine is busy, and the next queue's thread with it.
TEST_P(AudioTapTest, TheWatchForAServerIsNotClosedBetweenTwoQueuesAndRests) {
    const auto before = watchesOfThisProcess();
    std::map<std::string, int> first;
    for (int time = 0; time < 3; ++time) {
        auto heard = hear(ProcessID{::getpid()});
        ASSERT_TRUE(eventually([&] { return watchesOfThisProcess().size() > before.size(); }));
        const auto used = [&] {
            const auto watches = watchesOfThisProcess();
            return std::count_if(watches.begin(), watches.end(), [](const auto& watch) { return watch.second > 0; });
        };
        EXPECT_TRUE(eventually([&] { return used() == 1; }));
        heard.reset();
        ASSERT_TRUE(eventually([this] { return !connection_->hasThread(); }));
        EXPECT_EQ(used(), 0) << "nobody would take what it tells";
        if (time == 0) first = watchesOfThisProcess();
        EXPECT_EQ(watchesOfThisProcess(), first);
        EXPECT_EQ(first.size(), before.size() + 1);
    }
}

TEST_P(AudioTapTest, ACallbackThatOwnsItsQueueEndsItWithoutATrace) {
    const auto threads = [] {
        const std::filesystem::directory_iterator tasks("/proc/self/task");
        return std::distance(begin(tasks), end(tasks));
    };
    const auto before = threads();
    struct Owner {
        std::shared_ptr<AudioInputQueue> queue;
    };
    auto owner = std::make_shared<Owner>();
    owner->queue = queues_
                       .makeInputQueue(
                           test::recorderFormat(),
                           [owner](const AudioQueueBufferRef&, const AudioTimeStamp&, std::uint32_t, auto) {
                               owner->queue->dispose();
                           },
                           AudioInputQueues::kCaptureProcessOutput)
                       .queue;
    AudioQueueBufferRef buffer;
    ASSERT_EQ(owner->queue->allocateBuffer(882 * 2, buffer), AudioStatus::kSuccess);
    ASSERT_EQ(owner->queue->enqueueBuffer(buffer), AudioStatus::kSuccess);
    ASSERT_EQ(owner->queue->start(), AudioStatus::kSuccess);
    const std::weak_ptr<Owner> weak = owner;
    owner.reset();
    EXPECT_TRUE(eventually([&] { return weak.expired() && threads() <= before; })) << threads() << " threads, " << before;
}

TEST_P(AudioTapTest, AQueueWithoutABufferForASecondGivesItsStreamBackAndTheNextBufferBringsItBack) {
    const auto one = play(kOwn);
    struct Heard {
        std::mutex mutex;
        std::vector<AudioQueueBufferRef> buffers;
        bool isLoud = false;
    };
    const auto heard = std::make_shared<Heard>();
    const auto made = queues_.makeInputQueue(
        test::recorderFormat(),
        [heard](const AudioQueueBufferRef& buffer, const AudioTimeStamp&, std::uint32_t, auto) {
            const std::lock_guard lock(heard->mutex);
            for (std::uint32_t byte = 0; byte < buffer->byteSize; ++byte)
                if (buffer->bytes[byte] != 0) heard->isLoud = true;
            heard->buffers.push_back(buffer);
        },
        AudioInputQueues::kCaptureProcessOutput);
    AudioInputQueue& queue = *made.queue;
    ASSERT_EQ(queue.setProcessTap(one->pid()), AudioStatus::kSuccess);
    AudioQueueBufferRef buffer;
    ASSERT_EQ(queue.allocateBuffer(8820, buffer), AudioStatus::kSuccess);
    ASSERT_EQ(queue.enqueueBuffer(buffer), AudioStatus::kSuccess);
    ASSERT_EQ(queue.start(), AudioStatus::kSuccess);
    EXPECT_TRUE(connection_->hasThread());
    EXPECT_TRUE(eventually([&] { return !connection_->hasThread(); })) << "nobody is tapped";
    {
        const std::lock_guard lock(heard->mutex);
        heard->isLoud = false;
    }
    // Whoever gives it back each time hears the process again.
    EXPECT_TRUE(eventually([&] {
        const std::lock_guard lock(heard->mutex);
        for (const auto& each : std::exchange(heard->buffers, {})) queue.enqueueBuffer(each);
        return heard->isLoud;
    }));
    queue.dispose();
}

}  // namespace
}  // namespace lumacast
