#include <gtest/gtest.h>

#include <functional>
#include <memory>

#include "headless/display/SyntheticRenderServer.h"
#include "headless/display/SyntheticWindows.h"
#include "linux/display/X11RenderServer.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/Skip.h"
#include "tests/contract/TestWindow.h"
#include "tests/contract/XClientProcess.h"
#include "tests/fakes/FakeRenderServer.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;

class RenderServerWorld {
public:
    virtual ~RenderServerWorld() = default;
    virtual RenderServer& server() = 0;
    /// A new application with one window.
    virtual ContextID openApplication() = 0;
    virtual ProcessID applicationProcess() = 0;
    virtual void endApplication() = 0;
    /// What names the whole screen.
    virtual ContextID screen() = 0;
    /// From now on the server does not answer.
    virtual void stopAnswering() = 0;
    virtual void answerAgain() = 0;
    /// Why nothing can keep this server from answering; empty where something can.
    virtual std::string whyItAlwaysAnswers() const { return {}; }
};

class FakeRenderServerWorld final : public RenderServerWorld {
public:
    RenderServer& server() override { return server_; }
    ContextID openApplication() override {
        server_.addLayer(ContextID{77}, ProcessID{4242});
        return ContextID{77};
    }
    ProcessID applicationProcess() override { return ProcessID{4242}; }
    void endApplication() override { server_.processEnded(ProcessID{4242}); }
    ContextID screen() override { return ContextID{1}; }
    void stopAnswering() override { faults_.failNext("RenderServer.clientPort", 1'000'000); }
    void answerAgain() override { faults_.clear(); }

private:
    FaultPlan faults_;
    FakeRenderServer server_{faults_};
};

class PortRenderServerWorld final : public RenderServerWorld {
public:
    RenderServer& server() override { return server_; }
    ContextID openApplication() override {
        application_ = std::make_unique<test::XClientProcess>(display_.name());
        return application_->window();
    }
    ProcessID applicationProcess() override { return application_->pid(); }
    void endApplication() override { application_->end(); }
    ContextID screen() override {
        const test::TestWindow window(display_.name(), {.mapped = false});
        return ContextID{window.screen().root};
    }
    void stopAnswering() override { display_.hang(); }
    void answerAgain() override { display_.goOn(); }

private:
    test::PrivateDisplay display_;
    X11RenderServer server_{display_.name()};
    std::unique_ptr<test::XClientProcess> application_;
};

/// Every process has windows here, this one the last of its own.
class HeadlessRenderServerWorld final : public RenderServerWorld {
public:
    RenderServer& server() override { return server_; }
    ContextID openApplication() override {
        application_ = std::make_unique<test::ChildProcess>(std::vector<std::string>{"sleep", "1000"});
        return headless::windowOf(applicationProcess(), headless::kWindowsOfAProcess - 1);
    }
    ProcessID applicationProcess() override { return ProcessID{application_->pid()}; }
    void endApplication() override { application_->end(); }
    ContextID screen() override { return ContextID{1}; }
    void stopAnswering() override {}
    void answerAgain() override {}
    std::string whyItAlwaysAnswers() const override { return "there is no display server that could hang"; }

private:
    headless::SyntheticRenderServer server_;
    std::unique_ptr<test::ChildProcess> application_;
};

using Maker = std::function<std::unique_ptr<RenderServerWorld>()>;

class RenderServerContract : public ::testing::TestWithParam<Maker> {
protected:
    /// The owner as the server says now, asking again as long as `expected` is not what it says.
    std::optional<ProcessID> ownerOf(ContextID context) {
        const auto port = server_.clientPort(context);
        return port ? port->processIdentifier() : std::nullopt;
    }
    bool becomes(const std::function<bool()>& condition) {
        const auto limit = std::chrono::steady_clock::now() + 20s;
        while (!condition())
            if (std::chrono::steady_clock::now() > limit) return false;
        return true;
    }
    const std::unique_ptr<RenderServerWorld> world_ = GetParam()();
    RenderServer& server_ = world_->server();
};

TEST_P(RenderServerContract, NamesTheProcessThatOwnsALayer) {
    const ContextID window = world_->openApplication();
    ASSERT_NE(window, ContextID{0});
    // More than once: on a busy machine the very first answer may come too late.
    EXPECT_TRUE(becomes([&] { return ownerOf(window) == world_->applicationProcess(); }));
}

TEST_P(RenderServerContract, FindsNothingForZeroTheScreenAndLayersThatDontExist) {
    const ContextID window = world_->openApplication();
    ASSERT_TRUE(becomes([&] { return ownerOf(window).has_value(); })) << "so that the server is known to answer";
    EXPECT_EQ(server_.clientPort(ContextID{0}), nullptr);
    EXPECT_EQ(server_.clientPort(world_->screen()), nullptr);
    EXPECT_EQ(server_.clientPort(ContextID{number(window) + 1}), nullptr) << "in the client's own range, never used";
    EXPECT_EQ(server_.clientPort(ContextID{0x7ffffff0}), nullptr);
}

TEST_P(RenderServerContract, APortAnswersNoneOnceItsProcessHasEnded) {
    const ContextID window = world_->openApplication();
    std::unique_ptr<ClientPort> port;
    ASSERT_TRUE(becomes([&] { return (port = server_.clientPort(window)) != nullptr; }));
    EXPECT_EQ(port->processIdentifier(), world_->applicationProcess());
    world_->endApplication();
    EXPECT_TRUE(becomes([&] { return !port->processIdentifier(); }));
    EXPECT_TRUE(becomes([&] { return server_.clientPort(window) == nullptr; }));
}

TEST_P(RenderServerContract, AnswersNothingInTimeWhenTheServerHangs) {
    if (const std::string why = world_->whyItAlwaysAnswers(); !why.empty()) LC_SKIP(why);
    const ContextID window = world_->openApplication();
    ASSERT_TRUE(becomes([&] { return ownerOf(window).has_value(); }));
    world_->stopAnswering();
    for (int question = 0; question < 5; ++question) {
        const auto began = std::chrono::steady_clock::now();
        EXPECT_EQ(server_.clientPort(window), nullptr);
        EXPECT_LT(std::chrono::steady_clock::now() - began, 1s) << "it promises 100 ms; a busy machine adds to it";
    }
    world_->answerAgain();
    EXPECT_TRUE(becomes([&] { return ownerOf(window) == world_->applicationProcess(); }));
}

INSTANTIATE_TEST_SUITE_P(Fake, RenderServerContract,
                         ::testing::Values([] { return std::make_unique<FakeRenderServerWorld>(); }));
INSTANTIATE_TEST_SUITE_P(Port, RenderServerContract,
                         ::testing::Values([] { return std::make_unique<PortRenderServerWorld>(); }));
INSTANTIATE_TEST_SUITE_P(Headless, RenderServerContract,
                         ::testing::Values([] { return std::make_unique<HeadlessRenderServerWorld>(); }));

TEST(X11RenderServer, FindsNothingWithoutADisplay) {
    for (const char* display : {"", ":4711", "elsewhere:0"}) {
        X11RenderServer server(display);
        EXPECT_EQ(server.clientPort(ContextID{0x200001}), nullptr);
    }
}

TEST(X11RenderServer, EndsWhileItsServerHangs) {
    const test::PrivateDisplay display;
    const auto began = std::chrono::steady_clock::now();
    {
        X11RenderServer server(display.name());
        display.hang();
        EXPECT_EQ(server.clientPort(ContextID{0x200001}), nullptr);
    }
    EXPECT_LT(std::chrono::steady_clock::now() - began, 10s);
    display.goOn();
}

TEST(X11RenderServer, DoesNotAskAServerAgainThatHasNotAnswered) {
    const test::PrivateDisplay display;
    X11RenderServer server(display.name());
    display.hang();
    EXPECT_EQ(server.clientPort(ContextID{0x200001}), nullptr);
    const auto began = std::chrono::steady_clock::now();
    for (int question = 0; question < 1000; ++question) EXPECT_EQ(server.clientPort(ContextID{0x200001}), nullptr);
    EXPECT_LT(std::chrono::steady_clock::now() - began, 5s) << "a thousand times the limit would be 90 s";
    display.goOn();
}

TEST(X11RenderServer, WorksWithTheNextServerWhenOneHasDied) {
    const std::string name = test::PrivateDisplay::nameOfOnesOwn();
    auto display = std::make_unique<test::PrivateDisplay>("800x600x24", name);
    ASSERT_EQ(display->name(), name);
    X11RenderServer server(name);
    EXPECT_EQ(server.clientPort(ContextID{0x200001}), nullptr);
    display.reset();
    EXPECT_EQ(server.clientPort(ContextID{0x200001}), nullptr);
    const test::PrivateDisplay next("800x600x24", name);
    ASSERT_EQ(next.name(), name);
    const test::XClientProcess application(next.name());
    const auto limit = std::chrono::steady_clock::now() + 20s;
    std::unique_ptr<ClientPort> port;
    while (!port && std::chrono::steady_clock::now() < limit) port = server.clientPort(application.window());
    ASSERT_NE(port, nullptr);
    EXPECT_EQ(port->processIdentifier(), application.pid());
}

}  // namespace
}  // namespace lumacast
