#include <gtest/gtest.h>

#include <functional>
#include <thread>

#include "linux/accessibility/LinuxScreenReader.h"
#include "tests/contract/PrivateBus.h"
#include "tests/fakes/FakeScreenReader.h"

namespace lumacast {
namespace {

using test::AccessibilityService;
using test::PrivateBus;

class ScreenReaderWorld {
public:
    virtual ~ScreenReaderWorld() = default;
    virtual const ScreenReader& reader() = 0;
    virtual void setRunning(bool running) = 0;
};

class FakeScreenReaderWorld final : public ScreenReaderWorld {
public:
    const ScreenReader& reader() override { return reader_; }
    void setRunning(bool running) override { reader_.setRunning(running); }

private:
    FakeScreenReader reader_;
};

LinuxScreenReader::Options quickly(const std::string& address) {
    return {address, std::chrono::milliseconds(20), std::chrono::milliseconds(100)};
}

class PortScreenReaderWorld final : public ScreenReaderWorld {
public:
    PortScreenReaderWorld() {
        EXPECT_TRUE(bus_.start());
        service_ = std::make_unique<AccessibilityService>(bus_.address());
        EXPECT_TRUE(service_->isThere());
        reader_ = std::make_unique<LinuxScreenReader>(quickly(bus_.address()));
    }
    const ScreenReader& reader() override { return *reader_; }
    void setRunning(bool running) override { service_->setRunning(running); }

private:
    PrivateBus bus_;
    std::unique_ptr<AccessibilityService> service_;
    std::unique_ptr<LinuxScreenReader> reader_;
};

using Maker = std::function<std::unique_ptr<ScreenReaderWorld>()>;

class ScreenReaderContract : public ::testing::TestWithParam<Maker> {
protected:
    bool comesToBe(bool running) {
        return eventually([&] { return world_->reader().isRunning() == running; });
    }
    std::unique_ptr<ScreenReaderWorld> world_ = GetParam()();
};

TEST_P(ScreenReaderContract, NoneRunsUntilOneDoes) {
    EXPECT_FALSE(world_->reader().isRunning());
    world_->setRunning(true);
    EXPECT_TRUE(comesToBe(true));
}

TEST_P(ScreenReaderContract, OneThatEndsDoesNotRun) {
    for (int round = 0; round < 5; ++round) {
        world_->setRunning(true);
        EXPECT_TRUE(comesToBe(true));
        world_->setRunning(false);
        EXPECT_TRUE(comesToBe(false));
    }
}

TEST_P(ScreenReaderContract, AnyLaneMayAsk) {
    world_->setRunning(true);
    ASSERT_TRUE(comesToBe(true));
    std::vector<std::thread> lanes;
    for (int lane = 0; lane < 4; ++lane)
        lanes.emplace_back([this] {
            for (int i = 0; i < 1000; ++i) EXPECT_TRUE(world_->reader().isRunning());
        });
    for (std::thread& lane : lanes) lane.join();
}

INSTANTIATE_TEST_SUITE_P(Fake, ScreenReaderContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeScreenReaderWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, ScreenReaderContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortScreenReaderWorld>(); })));

class LinuxScreenReaderTest : public ::testing::Test {
protected:
    void serve(bool running) {
        service_ = std::make_unique<AccessibilityService>(bus_.address());
        ASSERT_TRUE(service_->isThere());
        service_->setRunning(running);
    }
    bool comesToBe(bool running) {
        return eventually([&] { return reader_.isRunning() == running; });
    }

    PrivateBus bus_;
    std::unique_ptr<AccessibilityService> service_;
    LinuxScreenReader reader_{quickly(bus_.address())};
};

TEST_F(LinuxScreenReaderTest, OneThatRanBeforeIsKnown) {
    ASSERT_TRUE(bus_.start());
    serve(true);
    EXPECT_TRUE(comesToBe(true));
    const LinuxScreenReader later(quickly(bus_.address()));
    EXPECT_TRUE(eventually([&] { return later.isRunning(); }));
}

TEST_F(LinuxScreenReaderTest, ABusThatDiesAndReturnsIsFollowed) {
    EXPECT_FALSE(reader_.isRunning());
    for (int round = 0; round < 2; ++round) {
        ASSERT_TRUE(bus_.start());
        serve(true);
        EXPECT_TRUE(comesToBe(true));
        bus_.kill();
        EXPECT_TRUE(comesToBe(false));
    }
}

TEST_F(LinuxScreenReaderTest, AServiceThatDiesAndReturnsIsFollowed) {
    ASSERT_TRUE(bus_.start());
    for (int round = 0; round < 2; ++round) {
        serve(true);
        EXPECT_TRUE(comesToBe(true));
        service_.reset();
        EXPECT_TRUE(comesToBe(false));
    }
}

TEST_F(LinuxScreenReaderTest, AChangeWithoutItsValueIsAskedFor) {
    ASSERT_TRUE(bus_.start());
    serve(false);
    ASSERT_TRUE(eventually([this] { return service_->questions() > 0; }));
    service_->setRunning(true, AccessibilityService::Announce::Invalidated);
    EXPECT_TRUE(comesToBe(true));
}

TEST_F(LinuxScreenReaderTest, SignalsAreNotBelievedAndDoNotPileUpQuestions) {
    ASSERT_TRUE(bus_.start());
    serve(true);
    ASSERT_TRUE(comesToBe(true));
    service_->holdAnswers(true);
    service_->lie(1000);
    ASSERT_TRUE(eventually([&] { return service_->heldAnswers() == 1; }));
    // One question is open, however long; the wait is for what must not come.
    EXPECT_FALSE(eventually([&] { return service_->heldAnswers() > 1; }, std::chrono::milliseconds(300)));
    const int before = service_->questions();
    service_->holdAnswers(false);
    EXPECT_TRUE(eventually([&] { return service_->questions() > before; }));
    EXPECT_TRUE(reader_.isRunning());
    service_->setRunning(false);
    EXPECT_TRUE(comesToBe(false));
}

TEST_F(LinuxScreenReaderTest, AnAnswerThatWasOldWhenItCameIsAskedForAgain) {
    ASSERT_TRUE(bus_.start());
    serve(false);
    ASSERT_TRUE(eventually([this] { return service_->questions() > 0; }));
    service_->holdAnswers(true);
    service_->lie(1);
    ASSERT_TRUE(eventually([this] { return service_->heldAnswers() == 1; }));
    service_->setRunning(true);
    service_->holdAnswers(false);
    EXPECT_TRUE(comesToBe(true));
}

TEST_F(LinuxScreenReaderTest, NoServiceIsStartedByBeingAsked) {
    ASSERT_TRUE(bus_.start());
    const LinuxScreenReader other(quickly(bus_.address()));
    // By the time a service is followed the questions before it have been answered.
    serve(true);
    EXPECT_TRUE(comesToBe(true));
    EXPECT_TRUE(eventually([&] { return other.isRunning(); }));
    service_.reset();
    EXPECT_TRUE(comesToBe(false));
    EXPECT_FALSE(bus_.hasStartedService());
}

TEST_F(LinuxScreenReaderTest, ABusThatHangsKeepsNobody) {
    ASSERT_TRUE(bus_.start());
    serve(true);
    ASSERT_TRUE(comesToBe(true));
    auto connecting = std::make_unique<LinuxScreenReader>(quickly(bus_.address()));
    bus_.hang();
    const auto before = std::chrono::steady_clock::now();
    auto later = std::make_unique<LinuxScreenReader>(quickly(bus_.address()));
    EXPECT_FALSE(later->isRunning());
    later.reset();
    connecting.reset();
    EXPECT_TRUE(reader_.isRunning());  // the last that was heard
    EXPECT_LT(std::chrono::steady_clock::now() - before, std::chrono::seconds(2));
    bus_.goOn();
}

TEST(LinuxScreenReader, WithoutABusNoneRuns) {
    EXPECT_FALSE(LinuxScreenReader({""}).isRunning());
    EXPECT_FALSE(LinuxScreenReader({"nonsense"}).isRunning());
    EXPECT_FALSE(LinuxScreenReader({"unix:path=/nonexistent/bus"}).isRunning());
}

TEST(LinuxScreenReader, TheSessionBusIsWhereTheUserHasIt) {
    EXPECT_EQ(LinuxScreenReader::sessionBus("unix:abstract=x", "/run/user/7"), "unix:abstract=x");
    EXPECT_EQ(LinuxScreenReader::sessionBus("", "/run/user/7"), "unix:path=/run/user/7/bus");
    EXPECT_EQ(LinuxScreenReader::sessionBus("", ""), "");
}

}  // namespace
}  // namespace lumacast
