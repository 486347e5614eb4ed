// What every purge service must do. In virtual time: the port too, on a file system in memory.

#include <gtest/gtest.h>

#include <functional>
#include <memory>

#include "base/Limits.h"
#include "linux/storage/LinuxStoragePurgeService.h"
#include "tests/fakes/FakeClock.h"
#include "tests/fakes/FakeFileSystem.h"
#include "tests/fakes/FakeStoragePurgeService.h"
#include "tests/fakes/SimScheduler.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;

/// A device with a service that watches its storage.
class PurgeWorld {
public:
    virtual ~PurgeWorld() = default;
    virtual StoragePurgeService& service() = 0;
    /// The free space is as short as this urgency says, 0 for enough, and the service has seen it.
    virtual void becomeShort(std::int32_t urgency) = 0;
    /// A day, from the last periodic call on or from the beginning.
    virtual void passDay() = 0;

    void settle() { scheduler.runUntilIdle(); }

    SimScheduler scheduler{1};
};

class FakePurgeWorld final : public PurgeWorld {
public:
    ~FakePurgeWorld() override { scheduler.endWorld(); }
    StoragePurgeService& service() override { return service_; }
    void becomeShort(std::int32_t urgency) override {
        service_.setShortage(urgency);
        settle();
    }
    void passDay() override {
        service_.passDay();
        settle();
    }

private:
    FakeStoragePurgeService service_{scheduler};
};

class PortPurgeWorld final : public PurgeWorld {
public:
    PortPurgeWorld() { EXPECT_FALSE(fileSystem.createDirectory(fileSystem.temporaryDirectory())); }
    ~PortPurgeWorld() override { scheduler.endWorld(); }
    StoragePurgeService& service() override { return service_; }
    void becomeShort(std::int32_t urgency) override {
        setFree(urgency == 0 ? kPurgeLevels.front().freeBytesBelow
                             : kPurgeLevels.at(static_cast<std::size_t>(urgency - 1)).freeBytesBelow - 1);
    }
    void passDay() override { scheduler.advance(LinuxStoragePurgeService::kPeriod); }
    void setFree(std::uint64_t bytes) {
        fileSystem.setFreeSize(bytes);
        scheduler.advance(LinuxStoragePurgeService::kPace);
    }

    FakeClock clock;
    FaultPlan faults;
    FakeFileSystem fileSystem{clock, faults};

private:
    LinuxStoragePurgeService service_{scheduler, fileSystem};
};

/// Registered callbacks that write down what they are asked.
class Asked {
public:
    explicit Asked(PurgeWorld& world) {
        const auto on = [this, &world](const std::string& what) {
            calls.push_back(what);
            if (world.scheduler.mainQueue().isCurrent()) ++onMainQueue;
            EXPECT_EQ(++inside, 1) << what;
            world.scheduler.mainQueue().sync([this] { ++mainQueueTasks; });  // as the daemon does
            --inside;
        };
        world.service().registerCallbacks("com.example.cache", {.purgeableSpace =
                                                                    [on] {
                                                                        on("space");
                                                                        return PurgeRecord{11};
                                                                    },
                                                                .purge =
                                                                    [this, on](std::int32_t urgency) {
                                                                        on("purge " + std::to_string(urgency));
                                                                        return purged;
                                                                    },
                                                                .cancelPurge =
                                                                    [on](std::int32_t urgency) {
                                                                        on("cancel " + std::to_string(urgency));
                                                                        return urgency;
                                                                    },
                                                                .periodic =
                                                                    [on] {
                                                                        on("periodic");
                                                                        return PurgeRecord{33};
                                                                    }});
    }
    std::vector<std::string> take() { return std::exchange(calls, {}); }

    std::vector<std::string> calls;
    std::optional<PurgeRecord> purged{PurgeRecord{22}};
    int inside = 0, onMainQueue = 0, mainQueueTasks = 0;
};

using Calls = std::vector<std::string>;
using Maker = std::function<std::unique_ptr<PurgeWorld>()>;

class StoragePurgeServiceContract : public ::testing::TestWithParam<Maker> {
protected:
    using Answers = std::vector<std::optional<PurgeRecord>>;
    auto into(Answers& answers) {
        return [&answers](std::optional<PurgeRecord> record) { answers.push_back(record); };
    }

    std::unique_ptr<PurgeWorld> world_ = GetParam()();
};

TEST_P(StoragePurgeServiceContract, WhereNobodyHasRegisteredNothingIsGivenBack) {
    Answers answers;
    world_->service().requestPurge(3, into(answers));
    world_->service().requestPurgeableSpace(into(answers));
    EXPECT_TRUE(answers.empty()) << "the caller does not wait";
    world_->settle();
    EXPECT_EQ(answers, (Answers{std::nullopt, std::nullopt}));
}

TEST_P(StoragePurgeServiceContract, TheAdministratorIsAnsweredWithWhatTheCallbacksAnswer) {
    Asked asked(*world_);
    Answers answers;
    world_->service().requestPurge(2, into(answers));
    world_->service().requestPurgeableSpace(into(answers));
    world_->settle();
    asked.purged.reset();
    world_->service().requestPurge(7, into(answers));
    world_->settle();
    EXPECT_EQ(answers, (Answers{PurgeRecord{22}, PurgeRecord{11}, std::nullopt}));
    EXPECT_EQ(asked.take(), (Calls{"purge 2", "space", "purge 7"}));
}

TEST_P(StoragePurgeServiceContract, EnoughSpaceAsksForNothing) {
    Asked asked(*world_);
    world_->becomeShort(0);
    EXPECT_EQ(asked.take(), Calls{});
}

TEST_P(StoragePurgeServiceContract, AShortageAsksOnceForEachMoreUrgentLevel) {
    Asked asked(*world_);
    world_->becomeShort(1);
    EXPECT_EQ(asked.take(), Calls{"purge 1"});
    world_->becomeShort(1);
    EXPECT_EQ(asked.take(), Calls{}) << "it has been asked for";
    world_->becomeShort(3);
    EXPECT_EQ(asked.take(), Calls{"purge 3"}) << "a level that was passed over is not asked for";
    world_->becomeShort(2);
    EXPECT_EQ(asked.take(), Calls{}) << "it got better";
    world_->becomeShort(3);
    EXPECT_EQ(asked.take(), Calls{"purge 3"});
}

TEST_P(StoragePurgeServiceContract, AShortageThatIsOverIsCancelledWithItsUrgency) {
    Asked asked(*world_);
    world_->becomeShort(2);
    world_->becomeShort(0);
    EXPECT_EQ(asked.take(), (Calls{"purge 2", "cancel 2"}));
    world_->becomeShort(0);
    EXPECT_EQ(asked.take(), Calls{});
    world_->becomeShort(1);
    EXPECT_EQ(asked.take(), Calls{"purge 1"});
}

TEST_P(StoragePurgeServiceContract, EachDayHasItsPeriodicCall) {
    Asked asked(*world_);
    world_->passDay();
    EXPECT_EQ(asked.take(), Calls{"periodic"});
    world_->passDay();
    EXPECT_EQ(asked.take(), Calls{"periodic"});
}

TEST_P(StoragePurgeServiceContract, CallbacksComeOneAtATimeAndMayWaitForTheMainQueue) {
    Asked asked(*world_);
    Answers answers;
    for (std::int32_t urgency = 1; urgency <= 5; ++urgency) world_->service().requestPurge(urgency, into(answers));
    world_->becomeShort(3);
    world_->settle();
    EXPECT_EQ(answers.size(), 5u);
    EXPECT_EQ(asked.take(), (Calls{"purge 1", "purge 2", "purge 3", "purge 4", "purge 5", "purge 3"}));
    EXPECT_EQ(asked.onMainQueue, 0);
    EXPECT_EQ(asked.mainQueueTasks, 6);
}

TEST_P(StoragePurgeServiceContract, ANewRegistrationTakesTheOldOnesPlace) {
    Asked first(*world_), second(*world_);
    Answers answers;
    world_->service().requestPurge(1, into(answers));
    world_->settle();
    EXPECT_EQ(first.take(), Calls{});
    EXPECT_EQ(second.take(), Calls{"purge 1"});
}

INSTANTIATE_TEST_SUITE_P(Fake, StoragePurgeServiceContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakePurgeWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, StoragePurgeServiceContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortPurgeWorld>(); })));

// The port's own: its thresholds, and a disk that does not answer.

TEST(LinuxStoragePurge, EachLevelBeginsStrictlyBelowItsFigure) {
    EXPECT_EQ(LinuxStoragePurgeService::urgencyOf(2'000'000'000), 0);
    EXPECT_EQ(LinuxStoragePurgeService::urgencyOf(1'000'000'000), 0);
    EXPECT_EQ(LinuxStoragePurgeService::urgencyOf(999'999'999), 1);
    EXPECT_EQ(LinuxStoragePurgeService::urgencyOf(500'000'000), 1);
    EXPECT_EQ(LinuxStoragePurgeService::urgencyOf(499'999'999), 2);
    EXPECT_EQ(LinuxStoragePurgeService::urgencyOf(100'000'000), 2);
    EXPECT_EQ(LinuxStoragePurgeService::urgencyOf(99'999'999), 3);
    EXPECT_EQ(LinuxStoragePurgeService::urgencyOf(0), 3);
}

TEST(LinuxStoragePurge, SpaceThatCannotBeReadChangesNothing) {
    PortPurgeWorld world;
    Asked asked(world);
    world.faults.failNext("FileSystem.freeSize", 3);
    world.setFree(1);
    world.setFree(1);
    world.setFree(1);
    EXPECT_EQ(asked.take(), Calls{}) << "no answer is no shortage";
    world.setFree(1);
    EXPECT_EQ(asked.take(), Calls{"purge 3"});
    world.faults.failNext("FileSystem.freeSize");
    world.setFree(2'000'000'000);
    EXPECT_EQ(asked.take(), Calls{}) << "nor the end of one";
    world.setFree(2'000'000'000);
    EXPECT_EQ(asked.take(), Calls{"cancel 3"});
}

TEST(LinuxStoragePurge, TheFirstPeriodicCallComesTenMinutesAfterTheStart) {
    PortPurgeWorld world;
    Asked asked(world);
    world.scheduler.advance(9min + 50s);
    EXPECT_EQ(asked.take(), Calls{});
    world.scheduler.advance(10s);
    EXPECT_EQ(asked.take(), Calls{"periodic"});
    world.scheduler.advance(23h + 59min + 50s);
    EXPECT_EQ(asked.take(), Calls{});
    world.scheduler.advance(10s);
    EXPECT_EQ(asked.take(), Calls{"periodic"});
}

TEST(LinuxStoragePurge, NothingIsAskedAfterTheServiceHasEnded) {
    SimScheduler scheduler(1);
    FakeClock clock;
    FaultPlan faults;
    FakeFileSystem fileSystem(clock, faults);
    int calls = 0;
    {
        LinuxStoragePurgeService service(scheduler, fileSystem);
        service.registerCallbacks("com.example.cache",
                                  {.purgeableSpace = {}, .purge = {}, .cancelPurge = {}, .periodic = [&] {
                                       ++calls;
                                       return PurgeRecord();
                                   }});
    }
    scheduler.advance(48h);
    EXPECT_EQ(calls, 0);
    scheduler.endWorld();
}

}  // namespace
}  // namespace lumacast
