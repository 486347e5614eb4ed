#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <future>
#include <optional>
#include <thread>
#include <vector>

#include "linux/admin/LinuxAdminService.h"
#include "linux/system/Json.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/fakes/FakeAdminService.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {
namespace {

constexpr std::chrono::seconds kPatience{30};

/// A daemon's main queue, and its administrator.
class AdminWorld {
public:
    virtual ~AdminWorld() = default;
    virtual AdminService& admin() = 0;
    virtual void endService() = 0;
    /// The administrator asks how the daemon is, from a lane of its own. None when nobody answers.
    virtual std::optional<Dictionary> ask() = 0;
    /// The administrator gives a command, a line of words; none when nobody answers in time.
    virtual std::optional<Dictionary> command(const std::string& line) = 0;

    SerialQueue& mainQueue() { return scheduler_.mainQueue(); }

protected:
    const std::shared_ptr<ThreadLoop> loop_ = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler_{loop_};
    RunningThreadLoop running_{*loop_};
};

class FakeAdminWorld final : public AdminWorld {
public:
    AdminService& admin() override { return *admin_; }
    void endService() override { admin_.reset(); }
    std::optional<Dictionary> ask() override {
        auto answer = std::make_shared<std::promise<Dictionary>>();
        auto future = answer->get_future();
        if (!admin_->ask([answer](Dictionary status) { answer->set_value(std::move(status)); })) return std::nullopt;
        answer.reset();
        return answerIn(future);
    }
    std::optional<Dictionary> command(const std::string& line) override {
        auto answer = std::make_shared<std::promise<Dictionary>>();
        auto future = answer->get_future();
        if (!admin_->command(line, [answer](Dictionary result) { answer->set_value(std::move(result)); }))
            return std::nullopt;
        answer.reset();
        return answerIn(future);
    }

private:
    /// None as well when the service has let go of the question.
    static std::optional<Dictionary> answerIn(std::future<Dictionary>& future) {
        if (future.wait_for(kPatience) != std::future_status::ready) return std::nullopt;
        try {
            return future.get();
        } catch (const std::future_error&) {
            return std::nullopt;
        }
    }

    std::optional<FakeAdminService> admin_{std::in_place, scheduler_};
};

class PortAdminWorld final : public AdminWorld {
public:
    AdminService& admin() override { return *admin_; }
    void endService() override { admin_.reset(); }
    std::optional<Dictionary> ask() override { return command("status"); }
    std::optional<Dictionary> command(const std::string& words) override {
        const auto line = askAdminService(scratch_.path("admin.sock"), words, kPatience);
        const auto value = line ? valueFromJson(*line) : std::nullopt;
        return value && value->as<Dictionary>() ? std::optional(*value->as<Dictionary>()) : std::nullopt;
    }

private:
    ScratchDirectory scratch_;
    std::optional<LinuxAdminService> admin_{std::in_place, scheduler_, scratch_.path("admin.sock"),
                                            LinuxAdminService::Limits{kPatience, kPatience, kPatience}};
};

using Maker = std::function<std::unique_ptr<AdminWorld>()>;

class AdminServiceContract : public ::testing::TestWithParam<Maker> {
protected:
    std::unique_ptr<AdminWorld> world_ = GetParam()();
};

TEST_P(AdminServiceContract, BeforeItResumesNobodyAnswers) { EXPECT_EQ(world_->ask(), std::nullopt); }

TEST_P(AdminServiceContract, AQuestionIsAnsweredWithTheSnapshot) {
    const Dictionary status{
        {"sessions", Array{Dictionary{{"bundleIdentifier", "org.example.Player"}, {"recording", true}}}},
        {"frames", std::int64_t{1234}},
        {"rate", 59.5},
        {"nothing", Value()}};
    world_->admin().resume([status] { return status; });
    const auto answer = world_->ask();
    ASSERT_TRUE(answer);
    EXPECT_EQ(Value(*answer), Value(status));
}

TEST_P(AdminServiceContract, EachQuestionTakesASnapshotOfItsOwnOnTheMainQueue) {
    std::atomic<std::int64_t> count{0};
    std::atomic<bool> elsewhere{false};
    world_->admin().resume([&] {
        if (!world_->mainQueue().isCurrent()) elsewhere = true;
        return Dictionary{{"count", std::int64_t{++count}}};
    });
    for (std::int64_t expected = 1; expected <= 3; ++expected) {
        const auto answer = world_->ask();
        ASSERT_TRUE(answer);
        EXPECT_EQ(*answer->find("count"), Value(expected));
    }
    EXPECT_FALSE(elsewhere);
    world_.reset();
}

TEST_P(AdminServiceContract, SeveralMayAskAtOnce) {
    world_->admin().resume([] { return Dictionary{{"well", true}}; });
    std::vector<std::thread> administrators;
    std::atomic<int> answered{0};
    for (int i = 0; i < 4; ++i)
        administrators.emplace_back([&] {
            for (int question = 0; question < 5; ++question)
                if (world_->ask()) ++answered;
        });
    for (std::thread& administrator : administrators) administrator.join();
    EXPECT_EQ(answered, 20);
}

TEST_P(AdminServiceContract, ACommandIsGivenItsWordsOnTheMainQueueAndAnswersFromAnyLane) {
    std::atomic<bool> elsewhere{false};
    std::vector<std::string> given;
    world_->admin().addCommand("brew", [&](const std::vector<std::string>& arguments, AdminAnswer answer) {
        if (!world_->mainQueue().isCurrent()) elsewhere = true;
        given = arguments;
        std::thread([answer] { answer({{"brewed", true}}); }).detach();
    });
    world_->admin().resume([] { return Dictionary(); });
    const auto answer = world_->command("brew  tea 3");
    ASSERT_TRUE(answer);
    EXPECT_EQ(Value(*answer), Value(Dictionary{{"brewed", true}}));
    EXPECT_EQ(given, (std::vector<std::string>{"tea", "3"}));
    EXPECT_FALSE(elsewhere);
    world_.reset();
}

TEST_P(AdminServiceContract, OnlyACommandsFirstAnswerCounts) {
    world_->admin().addCommand("twice", [](const std::vector<std::string>&, AdminAnswer answer) {
        answer({{"answer", 1}});
        answer({{"answer", 2}});
    });
    world_->admin().resume([] { return Dictionary(); });
    for (int i = 0; i < 3; ++i) EXPECT_EQ(Value(*world_->command("twice")), Value(Dictionary{{"answer", 1}}));
}

TEST_P(AdminServiceContract, ACommandThatTakesItsTimeHoldsNoQuestionUp) {
    AdminAnswer pending;
    std::promise<void> begun;
    world_->admin().addCommand("slow", [&](const std::vector<std::string>&, AdminAnswer answer) {
        pending = std::move(answer);
        begun.set_value();
    });
    world_->admin().resume([] { return Dictionary{{"well", true}}; });
    std::optional<Dictionary> answer;
    std::thread administrator([&] { answer = world_->command("slow"); });
    begun.get_future().wait();
    EXPECT_TRUE(world_->ask());
    pending({{"done", true}});
    administrator.join();
    ASSERT_TRUE(answer);
    EXPECT_EQ(Value(*answer), Value(Dictionary{{"done", true}}));
    pending = {};
}

TEST_P(AdminServiceContract, AnAnswerAfterTheServicesEndIsDroppedAndWhoeverWaitedForItIsLetGo) {
    AdminAnswer pending;
    std::promise<void> begun;
    world_->admin().addCommand("slow", [&](const std::vector<std::string>&, AdminAnswer answer) {
        pending = std::move(answer);
        begun.set_value();
    });
    world_->admin().resume([] { return Dictionary(); });
    std::optional<Dictionary> answer = Dictionary{{"not", "asked yet"}};
    const auto asked = std::chrono::steady_clock::now();
    std::thread administrator([&] { answer = world_->command("slow"); });
    begun.get_future().wait();
    world_->endService();
    pending({{"late", true}});
    administrator.join();
    EXPECT_EQ(answer, std::nullopt);
    EXPECT_LT(std::chrono::steady_clock::now() - asked, kPatience) << "the service's end leaves nobody waiting";
}

INSTANTIATE_TEST_SUITE_P(Fake, AdminServiceContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeAdminWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, AdminServiceContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortAdminWorld>(); })));

}  // namespace
}  // namespace lumacast
