#include <gtest/gtest.h>

#include <unistd.h>
#include <cmath>
#include <functional>
#include <mutex>
#include <numbers>
#include <set>
#include <thread>

#include "headless/sound/NotedSystemSounds.h"
#include "linux/sounds/LinuxSystemSounds.h"
#include "tests/contract/MonitorSound.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/fakes/FakeSystemSounds.h"
#include "tests/sound/PrivateSoundServer.h"

namespace lumacast {
namespace {

using test::MonitorSound;
using test::PrivateSoundServer;

constexpr std::uint32_t kBegin = SystemSounds::kBeginRecording, kEnd = SystemSounds::kEndRecording;

/// A WAVE file of a tone: 16 bits, one channel, 44.1 kHz.
std::string toneFile(double frequency, double seconds) {
    const auto frames = static_cast<std::uint32_t>(44100 * seconds);
    std::string file;
    const auto put = [&file](std::uint32_t value, int bytes) {
        for (int byte = 0; byte < bytes; ++byte) file += static_cast<char>(value >> 8 * byte);
    };
    file += "RIFF", put(36 + frames * 2, 4), file += "WAVEfmt ";
    put(16, 4), put(1, 2), put(1, 2), put(44100, 4), put(88200, 4), put(2, 2), put(16, 2);
    file += "data", put(frames * 2, 4);
    for (std::uint32_t frame = 0; frame < frames; ++frame)
        put(static_cast<std::uint16_t>(std::lround(16000 * std::sin(2 * std::numbers::pi * frequency * frame / 44100))),
            2);
    return file;
}

/// A theme of the two sounds: a begin of 1000 Hz and an end of 2500 Hz.
void writeTheme(const ScratchDirectory& data) {
    data.write("sounds/freedesktop/index.theme",
               "[Sound Theme]\nName=Default\nDirectories=stereo\n[stereo]\nOutputProfile=stereo\n");
    data.write("sounds/freedesktop/stereo/camera-shutter.wav", toneFile(1000, 0.3));
    data.write("sounds/freedesktop/stereo/complete.wav", toneFile(2500, 0.3));
}

class SystemSoundsWorld {
public:
    virtual ~SystemSoundsWorld() = default;
    virtual SystemSounds& sounds() = 0;
    /// Whether the sound comes to be heard.
    virtual bool isHeard(std::uint32_t sound) = 0;
    /// Whether it has been heard so far.
    virtual bool wasHeard(std::uint32_t sound) = 0;
};

class FakeSystemSoundsWorld final : public SystemSoundsWorld {
public:
    SystemSounds& sounds() override { return sounds_; }
    bool isHeard(std::uint32_t sound) override { return wasHeard(sound); }
    bool wasHeard(std::uint32_t sound) override {
        const auto played = sounds_.played();
        return std::find(played.begin(), played.end(), sound) != played.end();
    }

private:
    FakeSystemSounds sounds_;
};

class PortSystemSoundsWorld final : public SystemSoundsWorld {
public:
    PortSystemSoundsWorld() {
        writeTheme(data_);
        EXPECT_TRUE(monitor_.isListening());
    }
    SystemSounds& sounds() override { return sounds_; }
    bool isHeard(std::uint32_t sound) override {
        return eventually([&] { return wasHeard(sound); });
    }
    bool wasHeard(std::uint32_t sound) override { return monitor_.loudest(sound == kBegin ? 1000 : 2500) > -20; }

private:
    PrivateSoundServer server_;
    ScratchDirectory data_;
    MonitorSound monitor_{server_.address()};
    LinuxSystemSounds sounds_{
        std::make_shared<sound::PulseConnection>(sound::PulseConnection::Options{.server = server_.address()}),
        {{data_.path()}, {}}};
};

/// What is noted counts as heard.
class HeadlessSystemSoundsWorld final : public SystemSoundsWorld {
public:
    SystemSounds& sounds() override { return sounds_; }
    bool isHeard(std::uint32_t sound) override { return wasHeard(sound); }
    bool wasHeard(std::uint32_t sound) override {
        const std::lock_guard lock(mutex_);
        return noted_.contains(sound);
    }

private:
    std::mutex mutex_;
    std::set<std::uint32_t> noted_;
    headless::NotedSystemSounds sounds_{[this](std::uint32_t sound) {
        const std::lock_guard lock(mutex_);
        noted_.insert(sound);
    }};
};

using Maker = std::function<std::unique_ptr<SystemSoundsWorld>()>;

class SystemSoundsContract : public ::testing::TestWithParam<Maker> {
protected:
    std::unique_ptr<SystemSoundsWorld> world_ = GetParam()();
};

TEST_P(SystemSoundsContract, TheBeginOfARecordingIsHeardAsThat) {
    world_->sounds().play(kBegin);
    EXPECT_TRUE(world_->isHeard(kBegin));
    EXPECT_FALSE(world_->wasHeard(kEnd));
}

TEST_P(SystemSoundsContract, TheEndOfARecordingIsHeardAsThat) {
    world_->sounds().play(kEnd);
    EXPECT_TRUE(world_->isHeard(kEnd));
    EXPECT_FALSE(world_->wasHeard(kBegin));
}

TEST_P(SystemSoundsContract, TwoSoundsDoNotCutEachOther) {
    world_->sounds().play(kBegin);
    world_->sounds().play(kEnd);
    EXPECT_TRUE(world_->isHeard(kBegin));
    EXPECT_TRUE(world_->isHeard(kEnd));
}

TEST_P(SystemSoundsContract, AnyLaneMayPlay) {
    std::vector<std::thread> lanes;
    for (int lane = 0; lane < 4; ++lane)
        lanes.emplace_back([&] {
            for (int i = 0; i < 25; ++i) world_->sounds().play(i % 2 ? kBegin : kEnd);
        });
    for (std::thread& lane : lanes) lane.join();
    EXPECT_TRUE(world_->isHeard(kEnd));
}

INSTANTIATE_TEST_SUITE_P(Fake, SystemSoundsContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeSystemSoundsWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, SystemSoundsContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortSystemSoundsWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Headless, SystemSoundsContract,
                         ::testing::Values(Maker([] { return std::make_unique<HeadlessSystemSoundsWorld>(); })));

/// A server, a theme if the test writes one, and the sounds.
class LinuxSystemSoundsTest : public ::testing::Test {
protected:
    void listen() {
        monitor_ = std::make_unique<MonitorSound>(server_.address());
        ASSERT_TRUE(monitor_->isListening());
    }
    bool isQuietAgain() {
        return eventually([this] { return sounds_->soundsInFlight() == 0; });
    }

    PrivateSoundServer server_;
    ScratchDirectory data_;
    std::unique_ptr<MonitorSound> monitor_;
    const std::shared_ptr<sound::PulseConnection> connection_ =
        std::make_shared<sound::PulseConnection>(sound::PulseConnection::Options{.server = server_.address()});
    std::unique_ptr<LinuxSystemSounds> sounds_ =
        std::make_unique<LinuxSystemSounds>(connection_, sound::SoundThemes{{data_.path()}, {}});
};

TEST_F(LinuxSystemSoundsTest, AnUnknownNumberMakesNoSoundAndNoThread) {
    listen();
    sounds_->play(0);
    sounds_->play(1119);
    EXPECT_EQ(sounds_->soundsInFlight(), 0u);
    EXPECT_FALSE(connection_->hasThread());
    EXPECT_TRUE(monitor_->streams("event.id").empty());
}

TEST_F(LinuxSystemSoundsTest, WithoutAThemeTheTonesOfItsOwnAreHeard) {
    listen();
    sounds_->play(kBegin);
    ASSERT_TRUE(eventually([this] { return monitor_->loudest(825) > -30; }));
    ASSERT_TRUE(isQuietAgain());
    const std::size_t before = monitor_->frames();
    sounds_->play(kEnd);
    EXPECT_TRUE(eventually([&] { return monitor_->loudest(825, before) > -30; }));
}

TEST_F(LinuxSystemSoundsTest, AFileThatIsNoSoundIsPassedOver) {
    writeTheme(data_);
    data_.write("sounds/freedesktop/stereo/camera-shutter.wav", "RIFF of nothing");
    data_.write("sounds/freedesktop/stereo/screen-capture.wav", toneFile(1500, 0.3));
    listen();
    sounds_->play(kBegin);
    EXPECT_TRUE(eventually([this] { return monitor_->loudest(1500) > -20; }));
}

TEST_F(LinuxSystemSoundsTest, TheStreamIsThisProcessesOwnEvent) {
    writeTheme(data_);
    listen();
    sounds_->play(kBegin);
    ASSERT_TRUE(eventually([this] { return !monitor_->streams("event.id").empty(); }));
    EXPECT_EQ(monitor_->streams("event.id").begin()->second, "camera-shutter");
    EXPECT_EQ(monitor_->streams("media.role").begin()->second, "event");
    EXPECT_EQ(monitor_->streams("application.process.id").begin()->second, std::to_string(::getpid()));
}

TEST_F(LinuxSystemSoundsTest, AWholeSoundIsPlayedAndThenNothingIsLeft) {
    writeTheme(data_);
    data_.write("sounds/freedesktop/stereo/camera-shutter.wav", toneFile(1000, 1.5));
    listen();
    sounds_->play(kBegin);
    EXPECT_EQ(sounds_->soundsInFlight(), 1u);
    ASSERT_TRUE(isQuietAgain());
    EXPECT_TRUE(eventually([this] { return !connection_->hasThread(); }));
    // The last of what was heard is silence, and the whole tone was heard.
    ASSERT_TRUE(eventually([this] { return monitor_->isSilent(monitor_->frames() - MonitorSound::kRate / 20); }));
    EXPECT_NEAR(monitor_->secondsOf(1000), 1.5, 0.15);
}

TEST_F(LinuxSystemSoundsTest, AShortSoundEndsBeforeALongOne) {
    writeTheme(data_);
    data_.write("sounds/freedesktop/stereo/camera-shutter.wav", toneFile(1000, 4));
    listen();
    sounds_->play(kBegin);
    sounds_->play(kEnd);
    EXPECT_EQ(sounds_->soundsInFlight(), 2u);
    ASSERT_TRUE(eventually([this] { return sounds_->soundsInFlight() < 2; }));
    EXPECT_EQ(sounds_->soundsInFlight(), 1u);
    const std::size_t since = monitor_->frames() + MonitorSound::kRate / 5;
    EXPECT_TRUE(eventually([&] { return monitor_->loudest(1000, since) > -20; }));
}

TEST_F(LinuxSystemSoundsTest, NoMoreThanFourAreHeardAtOnce) {
    writeTheme(data_);
    data_.write("sounds/freedesktop/stereo/camera-shutter.wav", toneFile(1000, 2));
    listen();
    for (int i = 0; i < 20; ++i) {
        sounds_->play(kBegin);
        EXPECT_LE(sounds_->soundsInFlight(), 4u);
    }
    ASSERT_TRUE(isQuietAgain());
    EXPECT_EQ(monitor_->streams("event.id").size(), 4u);
}

TEST_F(LinuxSystemSoundsTest, WithoutAServerASoundIsGivenUp) {
    server_.kill();
    const auto before = std::chrono::steady_clock::now();
    sounds_->play(kBegin);
    EXPECT_LT(std::chrono::steady_clock::now() - before, std::chrono::milliseconds(500));
    EXPECT_TRUE(isQuietAgain());
    // Not afterwards either, when it would be too late.
    ASSERT_TRUE(server_.start());
    listen();
    EXPECT_TRUE(eventually([this] { return monitor_->frames() > MonitorSound::kRate; }));
    EXPECT_TRUE(monitor_->streams("event.id").empty());
}

TEST_F(LinuxSystemSoundsTest, AServerThatHangsKeepsNeitherThePlayerNorItsEnd) {
    server_.hang();
    const auto before = std::chrono::steady_clock::now();
    for (int i = 0; i < 10; ++i) sounds_->play(kBegin);
    EXPECT_LT(std::chrono::steady_clock::now() - before, std::chrono::seconds(1));
    EXPECT_TRUE(isQuietAgain());
    sounds_->play(kEnd);
    const auto end = std::chrono::steady_clock::now();
    sounds_.reset();
    EXPECT_LT(std::chrono::steady_clock::now() - end, std::chrono::seconds(3));
    server_.goOn();
}

TEST_F(LinuxSystemSoundsTest, AServerThatDiesMeanwhileIsNoHarmAndTheNextSoundIsHeard) {
    writeTheme(data_);
    data_.write("sounds/freedesktop/stereo/camera-shutter.wav", toneFile(1000, 4));
    listen();
    sounds_->play(kBegin);
    ASSERT_TRUE(eventually([this] { return monitor_->loudest(1000) > -20; }));
    monitor_.reset();
    server_.kill();
    ASSERT_TRUE(isQuietAgain());
    ASSERT_TRUE(server_.start());
    listen();
    sounds_->play(kEnd);
    EXPECT_TRUE(eventually([this] { return monitor_->loudest(2500) > -20; }));
}

TEST(LinuxSystemSounds, PipeWirePlaysThemToo) {
    test::PrivatePipeWire server;
    ScratchDirectory data;
    writeTheme(data);
    MonitorSound monitor(server.address());
    ASSERT_TRUE(monitor.isListening());
    LinuxSystemSounds sounds(
        std::make_shared<sound::PulseConnection>(sound::PulseConnection::Options{.server = server.address()}),
        {{data.path()}, {}});
    sounds.play(kEnd);
    EXPECT_TRUE(eventually([&] { return monitor.loudest(2500) > -20; }));
    EXPECT_TRUE(eventually([&] { return sounds.soundsInFlight() == 0; }));
}

}  // namespace
}  // namespace lumacast
