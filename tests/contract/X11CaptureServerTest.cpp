// Capturing from X11 servers that hang, die, ask for a key or are not there.

#include <gtest/gtest.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <string>

#include "linux/display/CaptureStatus.h"
#include "linux/display/X11DisplayCapture.h"
#include "linux/system/LinuxClock.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/CapturedFrames.h"
#include "tests/contract/Colours.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/TestWindow.h"
#include "tests/contract/X11CaptureFixture.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast::test {
namespace {

using Frames = CapturedFrames::Frames;
using Look = TestWindow::Look;

class TemporaryFile final {
public:
    TemporaryFile() : descriptor_(::mkstemp(path_.data())) {}
    ~TemporaryFile() { ::unlink(path_.c_str()); }
    const std::string& path() const { return path_; }
    void write(const std::string& text) const {
        EXPECT_EQ(::write(descriptor_.get(), text.data(), text.size()), static_cast<ssize_t>(text.size()));
    }

private:
    std::string path_ = (std::filesystem::temp_directory_path() / "lumacast-key-XXXXXX").string();
    const Fd descriptor_;
};

TEST_F(X11Capture, FailsOnceWhenTheServerDiesAndWorksWithTheNextOne) {
    const std::string name = PrivateDisplay::nameOfOnesOwn();
    auto first = std::make_unique<PrivateDisplay>("800x600x24", name);
    ASSERT_EQ(first->name(), name);
    X11DisplayCapture lasting(name, clock, scheduler);
    auto window = std::make_unique<TestWindow>(name, Look{.colour = kRed});
    lasting.setContexts({window->context()});
    lasting.setMirroringMode(DisplayCloneControl::kCloneContexts);
    const auto made = lasting.makeSource({320, 240}, MediaTime::make(1, 60));
    made->setDelegate(frames);
    made->openGate();
    made->start();
    ASSERT_TRUE(frames->waitForColour(kRed));
    first->crash();
    EXPECT_EQ(frames->waitForFailure(), CaptureStatus::kDisplayLost);
    first.reset();
    made->start();
    ASSERT_TRUE(frames->waitFor([&](const Frames&) { return frames->failuresUnlocked() >= 2; }));
    EXPECT_EQ(frames->failures()[1], CaptureStatus::kNoDisplay);
    window.reset();

    const PrivateDisplay next("800x600x24", name);
    ASSERT_EQ(next.name(), name);
    TestWindow another(name, {.colour = kGreen});
    made->start();
    ASSERT_TRUE(frames->waitFor([&](const Frames&) { return frames->failuresUnlocked() >= 3; }));
    EXPECT_EQ(frames->failures()[2], CaptureStatus::kWindowGone) << "the old server's windows are nobody's";
    lasting.setContexts({another.context()});
    made->start();
    ASSERT_TRUE(frames->waitForColour(kGreen));
    EXPECT_EQ(frames->failures().size(), 3u);
}

TEST_F(X11Capture, NobodyWaitsForAServerThatHangs) {
    TestWindow window(display.name(), {.colour = kRed});
    auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    window.paint(kGreen);
    display.hang();
    const auto began = std::chrono::steady_clock::now();
    made->closeGate(GateWait::UntilDelivered);
    made->stop();
    made->openGate();
    made->start();
    made.reset();
    EXPECT_LT(std::chrono::steady_clock::now() - began, std::chrono::seconds(2));
    display.goOn();
}

TEST_F(X11Capture, EndsWhileTheServerHangs) {
    auto second = std::make_unique<X11DisplayCapture>(display.name(), clock, scheduler);
    second->setMirroringMode(DisplayCloneControl::kMirrorDisplay);
    display.hang();
    const auto made = second->makeSource({320, 240}, MediaTime::make(1, 60));
    made->setDelegate(frames);
    made->openGate();
    made->start();
    const auto began = std::chrono::steady_clock::now();
    second.reset();
    EXPECT_LT(std::chrono::steady_clock::now() - began, std::chrono::seconds(5)) << "its lane waits for the connection";
    display.goOn();
}

TEST(X11CaptureWithKey, ShowsTheServerTheUsersKey) {
    const TemporaryFile authority;
    // This machine's, any display; the secret is sixteen bytes.
    const std::string secret = "sixteen-bytes-ok";
    authority.write(std::string("\xff\xff\0\0\0\0\0\x12MIT-MAGIC-COOKIE-1\0\x10", 28) + secret);
    const PrivateDisplay display("800x600x24", {}, {"-auth", authority.path()});
    ASSERT_FALSE(display.name().empty());
    x11::Interrupt interrupt;
    ::setenv("XAUTHORITY", "/nowhere", 1);
    EXPECT_EQ(x11::X11Connection::open(display.name(), interrupt), nullptr) << "it lets nobody in without the key";
    ::setenv("XAUTHORITY", authority.path().c_str(), 1);
    EXPECT_NE(x11::X11Connection::open(display.name(), interrupt), nullptr);
    ::unsetenv("XAUTHORITY");
}

TEST(X11CaptureWithoutDisplay, FailsAfterTheStart) {
    LinuxClock clock;
    clock.startCaptureClock();
    const auto loop = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler(loop);
    RunningThreadLoop running(*loop);
    for (const char* name : {"", ":4711", "elsewhere:0", "nonsense"}) {
        X11DisplayCapture capture(name, clock, scheduler);
        const auto frames = std::make_shared<CapturedFrames>();
        const auto made = capture.makeSource({320, 240}, MediaTime::make(1, 60));
        ASSERT_NE(made, nullptr);
        made->setDelegate(frames);
        made->openGate();
        made->start();
        EXPECT_EQ(frames->waitForFailure(), CaptureStatus::kNoDisplay) << name;
    }
}

}  // namespace
}  // namespace lumacast::test
