#include <gtest/gtest.h>

#include <functional>
#include <thread>
#include <vector>

#include "linux/system/LinuxKeepAlive.h"
#include "tests/fakes/FakeKeepAlive.h"

namespace lumacast {
namespace {

class KeepAliveWorld {
public:
    virtual ~KeepAliveWorld() = default;
    virtual KeepAlive& keepAlive() = 0;
    /// Whether the platform would let an idle daemon run on.
    virtual bool isKeptAlive() = 0;
};

class FakeKeepAliveWorld final : public KeepAliveWorld {
public:
    KeepAlive& keepAlive() override { return keepAlive_; }
    bool isKeptAlive() override { return keepAlive_.open() > 0; }

private:
    FakeKeepAlive keepAlive_;
};

class PortKeepAliveWorld final : public KeepAliveWorld {
public:
    KeepAlive& keepAlive() override { return keepAlive_; }
    bool isKeptAlive() override { return keepAlive_.openTransactions() > 0; }

private:
    // Where there is no bus, nobody is asked to keep the device awake, and nothing else is different.
    LinuxKeepAlive keepAlive_{"", SleepInhibitor::Options{.busAddress = "unix:path=/no/such/bus", .beforeSleep = {}}};
};

using Maker = std::function<std::unique_ptr<KeepAliveWorld>()>;

class KeepAliveContract : public ::testing::TestWithParam<Maker> {
protected:
    std::unique_ptr<KeepAliveWorld> world_ = GetParam()();
    KeepAlive& keepAlive_ = world_->keepAlive();
};

TEST_P(KeepAliveContract, AnIdleDaemonIsNotKept) { EXPECT_FALSE(world_->isKeptAlive()); }

TEST_P(KeepAliveContract, ATransactionKeepsItUntilItsEnd) {
    keepAlive_.beginTransaction();
    EXPECT_TRUE(world_->isKeptAlive());
    keepAlive_.endTransaction();
    EXPECT_FALSE(world_->isKeptAlive());
}

TEST_P(KeepAliveContract, EveryTransactionCounts) {
    keepAlive_.beginTransaction();
    keepAlive_.beginTransaction();
    keepAlive_.endTransaction();
    EXPECT_TRUE(world_->isKeptAlive());
    keepAlive_.endTransaction();
    EXPECT_FALSE(world_->isKeptAlive());
}

TEST_P(KeepAliveContract, ManyLanesBeginAndEnd) {
    keepAlive_.beginTransaction();
    std::vector<std::thread> lanes;
    for (int lane = 0; lane < 4; ++lane)
        lanes.emplace_back([this] {
            for (int i = 0; i < 500; ++i) {
                keepAlive_.beginTransaction();
                EXPECT_TRUE(world_->isKeptAlive());
                keepAlive_.endTransaction();
            }
        });
    for (std::thread& lane : lanes) lane.join();
    EXPECT_TRUE(world_->isKeptAlive());
    keepAlive_.endTransaction();
    EXPECT_FALSE(world_->isKeptAlive());
}

INSTANTIATE_TEST_SUITE_P(Fake, KeepAliveContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeKeepAliveWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, KeepAliveContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortKeepAliveWorld>(); })));

}  // namespace
}  // namespace lumacast
