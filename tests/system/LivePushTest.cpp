// A live broadcast from the window to the media server: the daemon, the extension in its sandbox, a server that records
// what it gets.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>

#include "tests/checkers/ToneChecker.h"
#include "tests/extension/PrivateNginx.h"
#include "tests/sound/PrivateSoundServer.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;

constexpr double kTone = 440, kNoTone = 3100;

// A sanitizer's daemon is many times slower.
#ifdef LC_SANITIZED
const std::vector<std::string> kPushed{"--size", "320x180", "--fps", "10", "--tone", "440"};
constexpr std::uint32_t kFrames = 60;
constexpr double kMostMissing = 0.7;
#else
const std::vector<std::string> kPushed{"--size", "1280x720", "--fps", "30", "--tone", "440"};
constexpr std::uint32_t kFrames = 180;
constexpr double kMostMissing = 0.4;
#endif

/// A number that a line of the application has behind a key; -1 without one.
long numberIn(const std::string& line, const std::string& key) {
    const auto at = line.find(key);
    const auto digits = at == std::string::npos ? at : line.find_first_of("0123456789", at + key.size());
    return digits == std::string::npos ? -1 : std::stol(line.substr(digits));
}

/// What the extension said last, up to its word that the broadcast has ended.
std::string lastInfo(Application& application) {
    for (std::string line = application.nextEvent(); !line.empty(); line = application.nextEvent())
        if (line.find("service info") != std::string::npos && line.find("ended") != std::string::npos) return line;
    return {};
}

struct Order {
    std::size_t pictures = 0, unreadable = 0, repeats = 0, missing = 0;
    std::uint32_t first = 0, last = 0;
};

/// Fails the test where a picture is older than the one before it.
Order orderOf(const std::vector<checkers::NumberedPicture>& pictures) {
    Order order;
    for (const auto& picture : pictures) {
        ++order.pictures;
        if (!picture.number) {
            ++order.unreadable;
            continue;
        }
        const std::uint32_t number = *picture.number;
        if (order.pictures - order.unreadable == 1) {
            order.first = number;
        } else {
            EXPECT_GE(number, order.last) << "at " << picture.time.count() << " ns";
            if (number == order.last) ++order.repeats;
            if (number > order.last + 1) order.missing += number - order.last - 1;
        }
        order.last = number;
    }
    return order;
}

/// The part of the windows of 100 ms in which the tone is heard.
double heardPart(const checkers::Sound& sound) {
    const std::size_t length = static_cast<std::size_t>(sound.rate) / 10, windows = sound.samples.size() / length;
    std::size_t heard = 0;
    for (std::size_t at = 0; at < windows; ++at)
        if (checkers::toneLevel(std::span(sound.samples).subspan(at * length, length), sound.rate, kTone) > -20)
            ++heard;
    return static_cast<double>(heard) / static_cast<double>(std::max<std::size_t>(1, windows));
}

/// Whether the process is confined by a system call filter, and can't be otherwise again.
bool isConfined(pid_t pid) {
    std::ifstream file("/proc/" + std::to_string(pid) + "/status");
    const std::string text{std::istreambuf_iterator<char>(file), {}};
    return text.find("Seccomp:\t2\n") != std::string::npos && text.find("NoNewPrivs:\t1\n") != std::string::npos;
}

/// The example, broadcast through the extension; what is said of it.
class PushedBroadcast final {
public:
    PushedBroadcast() {
        world.addVariable("PULSE_SERVER=" + sounds_.address());
        world.startDaemon();
        app_ = world.application(kPushed);
    }

    void run(const std::string& url) {
        begin_ = app_->askForFrame("broadcast org.lumacast.SelfRecorder org.lumacast.live-push url=" + url);
        const pid_t extension = processRunning(program_);
        ASSERT_GT(extension, 0) << world.daemonLog();
        EXPECT_TRUE(isConfined(extension));
        ASSERT_TRUE(app_->waitForFrame(begin_ + kFrames));
        const std::string stopped = app_->ask("stop");
        EXPECT_THAT(stopped, HasSubstr("without movie")) << world.daemonLog();
        end_ = static_cast<std::uint32_t>(numberIn(stopped, "frame "));
        const std::string said = lastInfo(*app_);
        sent = numberIn(said, "sentFrames");
        leftOut_ = numberIn(said, "droppedFrames");
        EXPECT_EQ(numberIn(said, "reconnects"), 0) << said;
        EXPECT_TRUE(waitUntil([&] { return processRunning(program_) == 0; })) << "it ends with its broadcast";
    }

    /// The pictures in order, most of those that were drawn; and the tone. Answers how many pictures there are.
    long expectIn(const std::string& recording) {
        const auto pictures = picturesOf(recording);
        const Order order = orderOf(pictures);
        checkers::MovieReader reader(recording);
        auto sound = reader.readSound();
        EXPECT_TRUE(sound) << reader.error();
        if (!sound || pictures.empty()) return 0;
        // A stream's time does not always begin with zero.
        const auto before = std::chrono::duration<double>(pictures.front().time).count() * sound->rate;
        sound->samples.erase(
            sound->samples.begin(),
            sound->samples.begin() + std::min(std::ssize(sound->samples), static_cast<std::ptrdiff_t>(before)));
        const double heard = heardPart(*sound), length = static_cast<double>(sound->samples.size()) / sound->rate;
        std::printf(
            "%zu pictures, frames %u to %u of %u to %u: %zu missing, %zu repeated, %zu unreadable; the extension "
            "sent %ld and left out %ld; the tone is heard in %.0f %% of %.1f s\n",
            order.pictures, order.first, order.last, begin_, end_, order.missing, order.repeats, order.unreadable, sent,
            leftOut_, heard * 100, length);
        // Until the window has repainted itself, its first picture has whatever the screen showed.
        EXPECT_LE(order.unreadable, 1u);
        EXPECT_LE(order.first, begin_ + kFrames * kMostMissing);
        EXPECT_GE(order.last + kFrames * kMostMissing, end_);
        // A machine in trouble costs frames; most are there.
        EXPECT_LT(static_cast<double>(order.missing), (order.last - order.first) * kMostMissing);
        EXPECT_GT(heard, 0.7);
        EXPECT_LT(checkers::toneLevel(sound->samples, sound->rate, kNoTone), -50);
        return static_cast<long>(order.pictures);
    }

    World world;
    long sent = 0;

private:
    PrivateSoundServer sounds_;
    const std::string program_ = world.installExtensionFolder(LC_EXTENSIONS "/live-push");
    std::unique_ptr<Application> app_;
    std::uint32_t begin_ = 0, end_ = 0;
    long leftOut_ = 0;
};

TEST(LivePushBroadcast, AnRtmpServerGetsTheFramesInOrderAndTheTone) {
    PrivateNginx server;
    PushedBroadcast broadcast;
    ASSERT_NO_FATAL_FAILURE(broadcast.run(server.rtmpURL("show")));
    std::vector<std::string> recordings;
    for (const auto& entry : fs::directory_iterator(server.recordings())) recordings.push_back(entry.path().string());
    ASSERT_EQ(recordings.size(), 1u) << "it was connected to once; " << server.log();
    EXPECT_TRUE(waitUntil([&] {
        checkers::MovieReader reader(recordings[0]);
        std::vector<checkers::NumberedPicture> pictures;
        return readFrameNumbers(reader, pictures) && static_cast<long>(pictures.size()) >= broadcast.sent;
    })) << server.log();
    EXPECT_EQ(broadcast.expectIn(recordings[0]), broadcast.sent);
}

TEST(LivePushBroadcast, AnSrtListenerGetsTheFramesInOrderAndTheTone) {
    PushedBroadcast broadcast;
    const std::string url = "srt://127.0.0.1:" + std::to_string(PrivateNginx::freePort());
    const std::string recording = broadcast.world.path("show.ts"), log = broadcast.world.path("listener.log");
    // It waits for what a busy machine delivers late.
    checkers::Child listener({"ffmpeg", "-nostdin", "-loglevel", "error", "-i", url + "?mode=listener&tlpktdrop=0",
                              "-map", "0", "-c", "copy", "-f", "mpegts", recording},
                             {}, log);
    ASSERT_NO_FATAL_FAILURE(broadcast.run(url + "?streamid=show"));
    EXPECT_EQ(listener.wait(), 0) << ScratchDirectory::read(log);
    EXPECT_EQ(broadcast.expectIn(recording), broadcast.sent);
}

}  // namespace
}  // namespace lumacast::test
