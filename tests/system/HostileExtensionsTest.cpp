// An installed upload extension that misbehaves at one of its turns, against the whole daemon: its own broadcast hears
// of it or goes on, and the next one, with a good extension, works.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "tests/system/World.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;
using ::testing::AnyOf;
using ::testing::HasSubstr;
using ::testing::StartsWith;

constexpr char kSamples[] = "org.lumacast.HostileSamples", kClips[] = "org.lumacast.HostileClips",
               kGood[] = "org.lumacast.SampleTaker";
const std::vector<std::string> kBeeping{"--size", "320x180", "--fps", "30", "--beep-every", "15"};

std::size_t countOfLines(const std::string& file, const std::string& part) {
    std::ifstream text(file);
    std::size_t count = 0;
    for (std::string line; std::getline(text, line);)
        if (line.find(part) != std::string::npos) ++count;
    return count;
}

class HostileExtensions : public ::testing::Test {
protected:
    HostileExtensions()
        : samples_(world_.installExtension(kSamples, LC_EXTENSION_HOSTILE, true)),
          clips_(world_.installExtension(kClips, LC_EXTENSION_HOSTILE, false)),
          good_(world_.installExtension(kGood, LC_SAMPLE_TAKER, true)) {
        world_.startDaemon();
        app_ = world_.application(kBeeping);
        EXPECT_TRUE(app_->waitForFrame(1));
    }
    void choose(const std::string& home, const std::string& turn) {
        std::ofstream(home + "/turn") << turn << "\n";
        fs::remove(home + "/report");
    }
    std::string report(const std::string& home) {
        std::ifstream file(home + "/report");
        return {std::istreambuf_iterator<char>(file), {}};
    }
    std::string begin(const std::string& extension) {
        return app_->ask("broadcast org.lumacast.SelfRecorder " + extension + " -");
    }
    /// The next event that tells of an end.
    std::string end() {
        for (;;) {
            const std::string event = app_->nextEvent();
            if (event.empty() || event.find("stopped") != std::string::npos) return event;
        }
    }
    /// A broadcast through a good extension gets its frames, and then nothing is left of these extensions.
    void expectTheNextOneWorks(const std::string& after,
                               const std::vector<const char*>& gone = {kSamples, kClips, kGood}) {
        const auto frames = [&] { return countOfLines(good_ + "/samples.log", "frame "); };
        const std::size_t before = frames();
        ASSERT_THAT(begin(kGood), StartsWith("started")) << "after " << after;
        EXPECT_TRUE(waitUntil([&] { return frames() >= before + 10; })) << "after " << after;
        EXPECT_THAT(app_->ask("stop"), HasSubstr("without movie")) << "after " << after;
        for (const char* extension : gone)
            EXPECT_TRUE(waitUntil([&] { return world_.extensionProcess(extension) == 0; }))
                << extension << " after " << after;
        app_->forgetEvents();
    }
    /// Records another application for a while; how many of the frames it drew are missing in its movie, in percent.
    double lossOf(Application& other) {
        const std::uint32_t first = other.askForFrame("start");
        EXPECT_TRUE(other.waitForFrame(first + 60));
        const std::string movie = other.stop();
        EXPECT_FALSE(movie.empty()) << world_.daemonLog();
        if (movie.empty()) return 100;
        std::uint32_t last = 0;
        std::size_t drawn = 0, missing = 0;
        for (const auto& picture : picturesOf(movie)) {
            if (!picture.number) continue;  // the first one may show what was there before
            if (last != 0 && *picture.number > last)
                drawn += *picture.number - last, missing += *picture.number - last - 1;
            last = *picture.number;
        }
        EXPECT_GT(drawn, 45u);
        return drawn == 0 ? 100.0 : 100.0 * static_cast<double>(missing) / static_cast<double>(drawn);
    }
    /// The daemon has no more than it had when this was made.
    struct Possessions {
        std::size_t memory, descriptors;
    };
    Possessions possessions() { return {world_.daemonNumber("VmRSS"), world_.daemonDescriptors()}; }
    void expectNoMoreThan(const Possessions& before) {
        EXPECT_LT(world_.daemonNumber("VmRSS"), before.memory + 20'000) << "kB";
        EXPECT_TRUE(waitUntil([&] { return world_.daemonDescriptors() <= before.descriptors + 2; }))
            << world_.daemonDescriptors() << " were " << before.descriptors;
    }

    World world_;
    const std::string samples_, clips_, good_;
    std::unique_ptr<Application> app_;
};

TEST_F(HostileExtensions, WhatEndsABroadcastOfSamplesEndsItAlone) {
    expectTheNextOneWorks("nothing");
    const auto before = possessions();
    for (const char* turn : {"closes-at-endpoint", "closes-after-ping", "closes-at-payload", "oversized", "too-deep",
                             "ill-typed", "unknown", "answers-nothing-asked", "answers-twice", "guesses-there",
                             "guesses-tokens", "keeps-planes", "finishes-often"}) {
        choose(samples_, turn);
        const std::string answer = begin(kSamples);
        const std::string heard = answer.starts_with("started") ? end() : answer;
        std::printf("    %s: %s\n", turn, heard.c_str());
        EXPECT_THAT(heard, turn == std::string("finishes-often")
                               ? AnyOf(HasSubstr("stopped"), StartsWith("error"))
                               : AnyOf(HasSubstr("stopped -5808"), StartsWith("error -5808")))
            << turn;
        expectTheNextOneWorks(turn);
    }
    expectNoMoreThan(before);
}

TEST_F(HostileExtensions, WhoNeverTakesItsRequestIsNotBroadcastThrough) {
    // What was begun goes on as a recording that nobody gets anything of.
    for (const char* turn : {"closes-unheard", "closes-after-hello", "closes-at-request"}) {
        choose(samples_, turn);
        EXPECT_THAT(begin(kSamples), StartsWith("started")) << turn;
        EXPECT_TRUE(waitUntil([&] { return world_.extensionProcess(kSamples) == 0; })) << turn;
        EXPECT_TRUE(app_->waitForFrame(app_->askForFrame("frame") + 15));
        EXPECT_THAT(app_->ask("stop"), StartsWith("stopped")) << turn;
        expectTheNextOneWorks(turn);
    }
}

TEST_F(HostileExtensions, WhatDoesNoHarmIsPassedOver) {
    expectTheNextOneWorks("nothing");
    const auto before = possessions();
    for (const char* turn : {"keeps-endpoint", "completes-others", "floods-info", "floods-pings", "writes", "forks"}) {
        choose(samples_, turn);
        ASSERT_THAT(begin(kSamples), StartsWith("started")) << turn;
        ASSERT_TRUE(waitUntil([&] { return countOfLines(samples_ + "/report", "frame") > 20; }))
            << turn << report(samples_);
        EXPECT_EQ(countOfLines(samples_ + "/report", "GOT AWAY"), 0u) << report(samples_);
        if (turn == std::string("writes")) {
            EXPECT_GT(countOfLines(samples_ + "/report", "tried to write"), 20u);
        }
        EXPECT_THAT(app_->ask("stop"), HasSubstr("without movie")) << turn;
        expectTheNextOneWorks(turn);
    }
    expectNoMoreThan(before);
}

TEST_F(HostileExtensions, WhoKeepsItsFramesGetsNoMoreThanThreeAndGoesOnWithSound) {
    expectTheNextOneWorks("nothing");
    const auto before = possessions();
    choose(samples_, "keeps-frames");
    const std::uint32_t first = app_->askForFrame("frame");
    ASSERT_THAT(begin(kSamples), StartsWith("started"));
    // Three seconds of pictures were drawn and of sound handed over meanwhile.
    EXPECT_TRUE(app_->waitForFrame(first + 90));
    EXPECT_TRUE(waitUntil([&] { return countOfLines(samples_ + "/report", "payload") > 40; })) << report(samples_);
    EXPECT_EQ(countOfLines(samples_ + "/report", "frame"), 3u);
    EXPECT_THAT(app_->ask("stop"), HasSubstr("without movie"));
    expectTheNextOneWorks("keeps-frames");
    expectNoMoreThan(before);
}

TEST_F(HostileExtensions, WhoNeverPingsHoldsUpItsOwnStartAlone) {
    expectTheNextOneWorks("nothing");
    const auto before = possessions();
    int number = 0;
    for (const char* turn : {"no-ping", "silent", "keeps-request"}) {
        choose(samples_, turn);
        app_->send("broadcast org.lumacast.SelfRecorder " + std::string(kSamples) + " -");
        ASSERT_TRUE(waitUntil([&] {
            return report(samples_).find(turn == std::string("no-ping") ? "connected" : "here") != std::string::npos;
        })) << turn;
        auto other = world_.otherApplication("Other" + std::to_string(++number), kBeeping);
        const double loss = lossOf(*other);
        std::printf("    %s: another one's recording lost %.1f %% meanwhile\n", turn, loss);
        EXPECT_LT(loss, 15) << turn;
        const pid_t extension = world_.extensionProcess(kSamples);
        ASSERT_GT(extension, 1) << "the start is over";
        other.reset();
        // It is held up until its extension ends.
        ::kill(extension, SIGKILL);
        const std::string answer = app_->answer();
        std::printf("    %s: %s\n", turn, answer.c_str());
        if (turn == std::string("no-ping"))
            EXPECT_THAT(answer, StartsWith("error -5808")) << turn;
        else
            EXPECT_THAT(answer, StartsWith("started")) << "it goes on without the broadcast";
        if (answer.starts_with("started")) {
            EXPECT_TRUE(app_->waitForFrame(app_->askForFrame("frame") + 15));
            EXPECT_THAT(app_->ask("stop"), StartsWith("stopped"));
        }
        expectTheNextOneWorks(turn);
    }
    expectNoMoreThan(before);
}

TEST_F(HostileExtensions, WhatIsWrongWithAClipsAnswerIsPassedOverAndOthersLoseNothing) {
    expectTheNextOneWorks("nothing");
    const auto before = possessions();
    auto other = world_.otherApplication("Other", kBeeping);
    std::printf("    another one's recording lost %.1f %% before\n", lossOf(*other));
    other.reset();
    int number = 0;
    for (const char* turn : {"completes-twice", "completes-others", "returns-many", "returns-none", "returns-archives",
                             "returns-too-much", "guesses", "never-completes", "floods"}) {
        choose(clips_, turn);
        EXPECT_THAT(begin(kClips), StartsWith("started")) << turn;
        EXPECT_TRUE(app_->waitForFrame(app_->askForFrame("frame") + 15));
        EXPECT_THAT(app_->ask("stop"), HasSubstr("without movie")) << turn;
        EXPECT_TRUE(waitUntil([&] { return countOfLines(clips_ + "/report", "clip") > 0; })) << turn << world_.daemonLog();
        if (turn == std::string("floods") || turn == std::string("never-completes")) {
            other = world_.otherApplication("Other" + std::to_string(++number), kBeeping);
            const double loss = lossOf(*other);
            std::printf("    %s: another one's recording lost %.1f %%\n", turn, loss);
            EXPECT_LT(loss, 25) << turn;
            other.reset();
        }
        // What has not completed its clip has a minute for it.
        expectTheNextOneWorks(turn, {kSamples, kGood});
        if (const pid_t left = world_.extensionProcess(kClips); left > 1) ::kill(left, SIGKILL);
        EXPECT_TRUE(waitUntil([&] { return world_.extensionProcess(kClips) == 0; })) << turn;
    }
    expectNoMoreThan(before);
}

}  // namespace
}  // namespace lumacast::test
