// An application that is handed its own frames and sound, through the real daemon's socket.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <png.h>
#include <signal.h>
#include <sys/mman.h>

#include <cmath>
#include <cstring>
#include <filesystem>
#include <future>
#include <iterator>
#include <mutex>
#include <thread>

#include "base/Limits.h"
#include "base/Log.h"
#include "base/MessageTables.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"
#include "tests/checkers/tests/Child.h"
#include "tests/contract/TestWindow.h"
#include "tests/system/World.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast::test {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

constexpr std::int64_t kApplicationSound = 2;
constexpr std::uint32_t kColour = 0x336699;

/// This process as an application: a window, and a connection whose messages are kept as they come.
class RawCapture : public ::testing::Test, public IpcExportedObject {
protected:
    struct Message {
        ClientMessage number;
        Array arguments;
    };

    RawCapture() {
        world_.install("org.lumacast.Tester", "Tester", std::filesystem::read_symlink("/proc/self/exe"));
        world_.startDaemon();
        window_ = std::make_unique<TestWindow>(world_.display().name(), TestWindow::Look{.colour = kColour});
        reactor_.sync([&] {
            connection_ = ipc_.connectToService("com.orvane.lumacastd");
            connection_->setExportedInterface(clientProtocol());
            connection_->setExportedObject(itself_);  // which the connection does not own
            connection_->setRemoteInterface(daemonProtocol());
            connection_->resume();
        });
    }
    ~RawCapture() override {
        reactor_.sync([&] { connection_->invalidate(); });
        reactor_.requestStop();
        loop_.join();
    }

    void receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t message, Array arguments,
                        IpcReply) override {
        const std::lock_guard lock(mutex_);
        if (!keeps_) return;
        messages_.push_back({static_cast<ClientMessage>(message), std::move(arguments)});
    }
    /// False when the daemon answers with an error.
    bool start() {
        std::promise<bool> answered;
        reactor_.sync([&] {
            connection_->remoteProxy([&](const Error&) { answered.set_value(false); })
                ->send(static_cast<std::uint16_t>(DaemonMessage::StartRecording),
                       {Array{Value(std::uint64_t{window_->id()})}, Array{320.0, 240.0}, false, false, false, false,
                        true, Value()},
                       [&](Array answer) { answered.set_value(!answer.empty() && answer[0].asError() == nullptr); });
        });
        return answered.get_future().get();
    }
    std::vector<Message> received(ClientMessage number) const {
        const std::lock_guard lock(mutex_);
        std::vector<Message> all;
        std::copy_if(messages_.begin(), messages_.end(), std::back_inserter(all),
                     [&](const Message& message) { return message.number == number; });
        return all;
    }
    void forget() {
        const std::lock_guard lock(mutex_);
        keeps_ = false;
        messages_.clear();
    }

    World world_;
    std::unique_ptr<TestWindow> window_;
    mutable std::mutex mutex_;
    bool keeps_ = true;
    std::vector<Message> messages_;
    Log log_;
    const std::shared_ptr<IpcExportedObject> itself_{this, [](IpcExportedObject*) {}};
    Reactor reactor_;
    LinuxIpc ipc_{reactor_, log_, {.runtimeDirectory = world_.path("run/lumacast")}};
    std::shared_ptr<IpcConnection> connection_;
    std::thread loop_{[this] { reactor_.run(); }};
};

template <class Record>
Record recordIn(const Value& value) {
    Record record{};
    const Data* bytes = value.as<Data>();
    EXPECT_TRUE(bytes);
    EXPECT_EQ(bytes ? bytes->size() : 0, sizeof record);
    if (bytes && bytes->size() == sizeof record) std::memcpy(static_cast<void*>(&record), bytes->data(), sizeof record);
    return record;
}

TEST_F(RawCapture, HandsOverPicturesWithTheirThreeTimesInSeventyTwoBytes) {
    static_assert(sizeof(SampleTiming) == 72);
    ASSERT_TRUE(start()) << world_.daemonLog();
    std::uint32_t shown = kColour;
    ASSERT_TRUE(waitUntil([&] {
        window_->paint(shown ^= 0x808080);
        return received(ClientMessage::CaptureHandlerWithSample).size() >= 3;
    })) << world_.daemonLog();
    double last = -1;
    for (const Message& message : received(ClientMessage::CaptureHandlerWithSample)) {
        const auto* plane = message.arguments.at(0).as<Value::PlaneRef>();
        ASSERT_TRUE(plane && *plane);
        EXPECT_EQ((*plane)->width(), 320);
        EXPECT_EQ((*plane)->height(), 240);
        // Whoever is handed a picture can look at it, and no more.
        EXPECT_EQ(::mmap(nullptr, 4096, PROT_READ | PROT_WRITE, MAP_SHARED, (*plane)->descriptor(), 0), MAP_FAILED);
        const auto timing = recordIn<SampleTiming>(message.arguments.at(1));
        EXPECT_TRUE(timing.presentation.isValid());
        EXPECT_FALSE(timing.decode.isValid());
        EXPECT_GT(timing.presentation.seconds(), last);
        last = timing.presentation.seconds();
    }
    const auto first = received(ClientMessage::CaptureHandlerWithSample).front();
    const auto pixels = (*first.arguments.at(0).as<Value::PlaneRef>())->pixels();
    EXPECT_TRUE(pixels[0] == (kColour & 0xFF) || pixels[0] == ((kColour ^ 0x808080) & 0xFF)) << int{pixels[0]};
}

TEST_F(RawCapture, HandsOverSoundWithItsFormatInFortyBytes) {
    static_assert(sizeof(AudioFormat) == 40);
    ASSERT_TRUE(start()) << world_.daemonLog();
    ASSERT_TRUE(waitUntil([&] { return received(ClientMessage::CaptureHandlerWithAudioSample).size() >= 3; }))
        << world_.daemonLog();
    for (const Message& message : received(ClientMessage::CaptureHandlerWithAudioSample)) {
        const auto format = recordIn<AudioFormat>(message.arguments.at(1));
        const auto timing = recordIn<SampleTiming>(message.arguments.at(4));
        EXPECT_TRUE(timing.presentation.isValid());
        EXPECT_EQ(format.formatID, kAudioFormatLinearPCM);
        EXPECT_GT(format.sampleRate, 0);
        const Data* bytes = message.arguments.at(0).as<Data>();
        const auto* frames = message.arguments.at(2).as<std::int64_t>();
        const auto* type = message.arguments.at(3).as<std::int64_t>();
        ASSERT_TRUE(bytes && frames && type);
        EXPECT_EQ(*type, kApplicationSound);
        EXPECT_EQ(bytes->size(), static_cast<std::size_t>(*frames) * format.bytesPerFrame);
    }
}

TEST_F(RawCapture, LendsOnlyAFewPicturesAtATimeAndGoesOnWhenTheyAreLetGo) {
    ASSERT_TRUE(start()) << world_.daemonLog();
    std::uint32_t shown = kColour;
    const auto pictures = [&] { return received(ClientMessage::CaptureHandlerWithSample).size(); };
    ASSERT_TRUE(waitUntil([&] {
        window_->paint(shown ^= 0x808080);
        return pictures() >= limitOf(Limit::PlanesLeased) && world_.recording()["framesDelivered"] > 20;
    })) << world_.daemonLog();
    EXPECT_EQ(pictures(), limitOf(Limit::PlanesLeased));
    forget();
    {
        const std::lock_guard lock(mutex_);
        keeps_ = true;
    }
    EXPECT_TRUE(waitUntil([&] {
        window_->paint(shown ^= 0x808080);
        return pictures() >= 1;
    }));
}

TEST(Capture, AnApplicationIsHandedItsOwnPicturesAndSounds) {
    World world;
    world.install("org.lumacast.OwnFrames", "Own Frames", LC_OWN_FRAMES);
    world.startDaemon();
    const std::string picture = world.path("last.png");
    checkers::Child child({LC_OWN_FRAMES, picture}, world.environment(), world.path("own_frames.log"));
    const std::string summary = child.readLine();
    EXPECT_THAT(summary, HasSubstr(" pictures of 480 x 270, at most "));
    EXPECT_GT(std::atoi(summary.c_str()), 30) << summary;
    ASSERT_EQ(child.wait(), 0) << world.daemonLog();
    std::printf("    %s\n", summary.c_str());

    png_image image{};
    image.version = PNG_IMAGE_VERSION;
    ASSERT_TRUE(png_image_begin_read_from_file(&image, picture.c_str()));
    image.format = PNG_FORMAT_RGB;
    std::vector<std::uint8_t> pixels(PNG_IMAGE_SIZE(image));
    ASSERT_TRUE(png_image_finish_read(&image, nullptr, pixels.data(), 0, nullptr));
    const auto at = [&](std::size_t x, std::size_t y) {
        const std::uint8_t* const pixel = &pixels[(y * 480 + x) * 3];
        return std::vector<int>(pixel, pixel + 3);
    };
    EXPECT_EQ(at(80, 100), (std::vector<int>{0xC0, 0x20, 0x20}));
    EXPECT_EQ(at(240, 100), (std::vector<int>{0x20, 0xC0, 0x20}));
    EXPECT_EQ(at(400, 100), (std::vector<int>{0x20, 0x20, 0xC0}));
}

TEST(Capture, AClientThatStopsReadingCostsItsOwnFramesAndNothingElse) {
    World world;
    world.startDaemon();
    const auto app = world.application({"--size", "1280x720", "--fps", "30", "--beep-every", "15"});
    ASSERT_TRUE(app->waitForFrame(1));
    ASSERT_THAT(app->ask("capture"), StartsWith("started frame")) << world.daemonLog();
    const auto pictures = [&] {
        std::istringstream words(app->ask("captured"));
        std::string word;
        std::size_t count = 0;
        words >> word >> count;
        return count;
    };
    ASSERT_TRUE(waitUntil([&] { return pictures() > 10; }));
    const std::size_t before = world.daemonNumber("VmRSS");
    const double from = world.recording()["elapsedSeconds"];
    ::kill(app->pid(), SIGSTOP);
    const auto other = world.otherApplication("Other", {"--size", "320x240", "--fps", "10"});
    EXPECT_THAT(other->ask("state"), StartsWith("state"));
    ASSERT_TRUE(world.waitForElapsed(from + 4)) << "it goes on all the while";
    EXPECT_THAT(other->ask("state"), StartsWith("state"));
    EXPECT_LT(world.daemonNumber("VmRSS"), before + 20'000) << "kB";
    ::kill(app->pid(), SIGCONT);
    const std::size_t then = pictures();
    EXPECT_TRUE(waitUntil([&] { return pictures() > then + 10; })) << world.daemonLog();
    EXPECT_THAT(app->ask("stop"), HasSubstr("without movie"));
    // Another application's recording is as if nothing had been.
    ASSERT_THAT(other->ask("start"), StartsWith("started frame")) << world.daemonLog();
    ASSERT_TRUE(other->waitForFrame(other->askForFrame("frame") + 10));
    EXPECT_NE(other->stop(), "");
}

}  // namespace
}  // namespace lumacast::test
