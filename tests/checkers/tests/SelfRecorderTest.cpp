// The recorded application on a display of its own.

#include <gtest/gtest.h>
#include <signal.h>
#include <xcb/xcb.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <memory>
#include <thread>

#include "tests/checkers/FramesLog.h"
#include "tests/checkers/Luma.h"
#include "tests/checkers/tests/Child.h"
#include "tests/checkers/tests/FileBytes.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::checkers {
namespace {

template <typename T>
using Reply = std::unique_ptr<T, decltype(&std::free)>;

template <typename T>
Reply<T> own(T* reply) {
    return {reply, &std::free};
}

// Looks until the condition holds; false when it doesn't within the bound.
bool eventually(const std::function<bool()>& condition) {
    const auto until = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    while (!condition()) {
        if (std::chrono::steady_clock::now() > until) return false;
        std::this_thread::yield();
    }
    return true;
}

class SelfRecorder : public ::testing::Test {
protected:
    void SetUp() override {
        server_ = std::make_unique<Child>(std::vector<std::string>{"Xvfb", "-displayfd", "1", "-noreset", "-nolisten",
                                                                   "tcp", "-screen", "0", "800x600x24"},
                                          std::vector<std::string>{}, folder_.path("server"));
        const std::string number = server_->readLine();
        ASSERT_NE(number, "") << "Xvfb doesn't start";
        display_ = ":" + number;
        connection_.reset(xcb_connect(display_.c_str(), nullptr));
        ASSERT_EQ(xcb_connection_has_error(connection_.get()), 0);
    }

    void start(std::vector<std::string> options, std::vector<std::string> environment = {}) {
        options.insert(options.begin(), LC_SELF_RECORDER);
        options.insert(options.end(), {"--frames-log", log_});
        environment.push_back("DISPLAY=" + display_);
        application_ = std::make_unique<Child>(options, environment, folder_.path("errors"));
        const std::string line = application_->readLine();
        ASSERT_EQ(line.substr(0, 9), "window 0x") << line;
        window_ = static_cast<xcb_window_t>(std::stoul(line.substr(7), nullptr, 16));
    }

    int frame() { return std::stoi(application_->ask("frame").substr(6)); }

    bool reachesFrame(int number) {
        return eventually([&] { return frame() >= number; });
    }

    // Waits until the number has stood still for the time of twelve frames.
    int standingFrame() {
        int last = frame();
        auto since = std::chrono::steady_clock::now();
        EXPECT_TRUE(eventually([&] {
            const int now = frame();
            if (now != last) since = std::chrono::steady_clock::now();
            last = now;
            return std::chrono::steady_clock::now() - since > std::chrono::milliseconds(200);
        })) << "the number doesn't stand still";
        return last;
    }

    // Every frame is in the log, and none was sent before the one before it was shown.
    void expectLogWithoutHole() {
        std::string error;
        const auto log = readFramesLog(log_, error);
        ASSERT_TRUE(log) << error;
        ASSERT_FALSE(log->empty());
        EXPECT_EQ(log->begin()->first, 1U);
        EXPECT_EQ(log->rbegin()->first, log->size());
        for (auto entry = std::next(log->begin()); entry != log->end(); ++entry)
            EXPECT_GT(entry->second.sent, std::prev(entry)->second.shown) << entry->first;
    }

    Reply<xcb_get_geometry_reply_t> geometry() {
        return own(xcb_get_geometry_reply(connection_.get(), xcb_get_geometry(connection_.get(), window_), nullptr));
    }

    // The window's content as luma, nothing when it can't be read.
    LumaPlane content() {
        const auto size = geometry();
        if (!size) return {};
        const auto image = own(xcb_get_image_reply(
            connection_.get(),
            xcb_get_image(connection_.get(), XCB_IMAGE_FORMAT_Z_PIXMAP, window_, 0, 0, size->width, size->height, ~0U),
            nullptr));
        if (!image) return {};
        const std::uint8_t* bytes = xcb_get_image_data(image.get());
        LumaPlane plane{size->width, size->height, {}};
        for (int place = 0; place < plane.width * plane.height; ++place, bytes += 4)
            plane.samples.push_back(static_cast<std::uint8_t>((bytes[0] + 2 * bytes[1] + bytes[2]) / 4));
        return plane;
    }

    std::optional<std::uint32_t> numberOnWindow() {
        const LumaPlane plane = content();
        return plane.samples.empty() ? std::nullopt : frameNumberIn(plane.view());
    }

    std::string textProperty(const char* name) {
        const auto atom = own(xcb_intern_atom_reply(
            connection_.get(), xcb_intern_atom(connection_.get(), 1, static_cast<std::uint16_t>(strlen(name)), name),
            nullptr));
        const auto reply = own(xcb_get_property_reply(
            connection_.get(), xcb_get_property(connection_.get(), 0, window_, atom->atom, XCB_ATOM_ANY, 0, 100),
            nullptr));
        return {static_cast<const char*>(xcb_get_property_value(reply.get())),
                static_cast<std::size_t>(xcb_get_property_value_length(reply.get()))};
    }

    struct Disconnect {
        void operator()(xcb_connection_t* connection) const { xcb_disconnect(connection); }
    };

    ScratchDirectory folder_;
    std::string log_ = folder_.path("frames.txt");
    std::string display_;
    std::unique_ptr<Child> server_;
    std::unique_ptr<xcb_connection_t, Disconnect> connection_;
    std::unique_ptr<Child> application_;
    xcb_window_t window_ = 0;
};

TEST_F(SelfRecorder, ShowsRisingNumbersWithoutAHoleInItsLog) {
    start({"--size", "320x180", "--fps", "60"});
    ASSERT_TRUE(reachesFrame(30));
    const auto number = numberOnWindow();
    ASSERT_TRUE(number);
    EXPECT_GE(*number, 30U);
    EXPECT_EQ(application_->ask("quit"), "ok");
    EXPECT_EQ(application_->wait(), 0);
    expectLogWithoutHole();
}

TEST_F(SelfRecorder, GivesNoNumberToAFrameThatASlowDisplayNeverShowed) {
    start({"--size", "320x180", "--fps", "60"});
    ASSERT_TRUE(reachesFrame(5));
    ASSERT_EQ(::kill(server_->pid(), SIGSTOP), 0);
    const int standing = standingFrame();
    EXPECT_EQ(::kill(server_->pid(), SIGCONT), 0);
    EXPECT_TRUE(reachesFrame(standing + 5));
    EXPECT_EQ(application_->ask("quit"), "ok");
    EXPECT_EQ(application_->wait(), 0);
    expectLogWithoutHole();
}

TEST_F(SelfRecorder, NamesItsWindow) {
    start({"--name", "a name"});
    EXPECT_EQ(textProperty("WM_NAME"), "a name");
    EXPECT_EQ(textProperty("_NET_WM_NAME"), "a name");
    EXPECT_EQ(textProperty("WM_CLASS"), std::string("self_recorder\0a name\0", 21));
    const std::string pid = textProperty("_NET_WM_PID");
    ASSERT_EQ(pid.size(), 4U);
    pid_t value = 0;
    std::memcpy(&value, pid.data(), 4);
    EXPECT_EQ(value, application_->pid());
}

TEST_F(SelfRecorder, IsResizedAndMovedByCommand) {
    start({"--size", "320x180"});
    ASSERT_TRUE(reachesFrame(1));
    EXPECT_EQ(application_->ask("size 401 303"), "ok");
    EXPECT_EQ(application_->ask("move 50 60"), "ok");
    EXPECT_TRUE(
        eventually([&] { return geometry()->width == 401 && geometry()->height == 303 && geometry()->x == 50; }));
    EXPECT_TRUE(eventually([&] { return numberOnWindow().has_value(); }));
    EXPECT_EQ(content().width, 401);
    EXPECT_TRUE(reachesFrame(frame() + 2));
}

TEST_F(SelfRecorder, CountsNoFramesWhileHidden) {
    start({});
    ASSERT_TRUE(reachesFrame(3));
    EXPECT_EQ(application_->ask("hide"), "ok");
    const int last = standingFrame();
    EXPECT_EQ(application_->ask("show"), "ok");
    EXPECT_TRUE(reachesFrame(last + 3));
    EXPECT_TRUE(eventually([&] { return numberOnWindow().has_value(); }));
}

TEST_F(SelfRecorder, StillChangesNothingUntilItMovesAgain) {
    start({"--still", "--size", "320x180"});
    ASSERT_TRUE(reachesFrame(1));
    const auto before = content().samples;
    EXPECT_EQ(standingFrame(), 1);
    EXPECT_EQ(content().samples, before);
    // A new size shows the same number, newly drawn.
    EXPECT_EQ(application_->ask("size 480 270"), "ok");
    EXPECT_TRUE(eventually([&] { return content().width == 480 && numberOnWindow() == 1U; }));
    EXPECT_EQ(standingFrame(), 1);
    EXPECT_EQ(application_->ask("moving"), "ok");
    EXPECT_TRUE(reachesFrame(4));
    EXPECT_EQ(application_->ask("still"), "ok");
}

TEST_F(SelfRecorder, MovingInASmallPartStaysReadableAfterHiding) {
    start({"--part", "--size", "320x180"});
    ASSERT_TRUE(reachesFrame(5));
    EXPECT_EQ(application_->ask("hide"), "ok");
    EXPECT_EQ(application_->ask("show"), "ok");
    EXPECT_TRUE(reachesFrame(frame() + 5));
    EXPECT_EQ(application_->ask("still"), "ok");
    EXPECT_TRUE(eventually([&] { return numberOnWindow() == static_cast<std::uint32_t>(frame()); }));
    // The background is there too: bright somewhere in its upper half.
    const LumaPlane plane = content();
    EXPECT_GT(*std::max_element(plane.samples.begin(), plane.samples.begin() + 320 * 90), 100);
}

TEST_F(SelfRecorder, AnswersWrongCommandsWithAnError) {
    start({});
    for (const char* command : {"bogus", "size 10 10", "size 400", "size a b", "move 1 99999", "quit now"})
        EXPECT_EQ(application_->ask(command).substr(0, 6), "error ") << command;
    EXPECT_EQ(application_->ask("still"), "ok");
}

TEST_F(SelfRecorder, EndsWithAnErrorWhenTheDisplayGoes) {
    start({});
    ASSERT_TRUE(reachesFrame(1));
    server_.reset();
    EXPECT_EQ(application_->wait(), 1);
}

TEST_F(SelfRecorder, SaysWhatIsWrongWithItsOptions) {
    for (const std::vector<std::string>& options :
         {std::vector<std::string>{"--size", "10x10"}, {"--size", "x"}, {"--fps", "0"}}) {
        std::vector<std::string> command{LC_SELF_RECORDER};
        command.insert(command.end(), options.begin(), options.end());
        Child child(command, {"DISPLAY=" + display_}, folder_.path("errors"));
        EXPECT_NE(child.wait(), 0);
        EXPECT_FALSE(bytesOf(folder_.path("errors")).empty());
    }
    Child lost({LC_SELF_RECORDER}, {"DISPLAY=:nowhere"}, folder_.path("errors"));
    EXPECT_EQ(lost.wait(), 1);
}

TEST_F(SelfRecorder, MarksFramesAndSaysOnceThatThereIsNobodyToBeepFor) {
    // Nobody serves sound there.
    start({"--size", "320x180", "--fps", "60", "--beep-every", "30"}, {"PULSE_SERVER=unix:" + folder_.path("nobody")});
    EXPECT_TRUE(eventually([&] { return isMarked(content().view()); }));
    EXPECT_TRUE(eventually([&] { return !isMarked(content().view()); })) << "for a moment only";
    EXPECT_TRUE(reachesFrame(100));
    EXPECT_EQ(application_->ask("beeps"), "beeps 0 late 0 left-out 0 underflows 0");
    std::string error;
    const auto log = readFramesLog(log_, error);
    ASSERT_TRUE(log) << error;
    int marked = 0;
    for (const auto& [number, stamp] : *log) marked += stamp.isMarked ? 1 : 0;
    EXPECT_GE(marked, 2);
    EXPECT_LE(marked, 3);
    const auto bytes = bytesOf(folder_.path("errors"));
    const std::string said(bytes.begin(), bytes.end());
    EXPECT_EQ(said.find("no beeps"), said.rfind("no beeps")) << said;
    EXPECT_NE(said.find("no beeps"), std::string::npos) << said;
}

}  // namespace
}  // namespace lumacast::checkers
