// Dialogs that the user never sees, and buses that would keep them from being seen.

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <filesystem>

#include "tests/contract/DialogWorld.h"
#include "tests/contract/PrivateBus.h"

namespace lumacast {
namespace {

using Response = UserAlert::Response;
using std::chrono::milliseconds;
using test::Answer;
using test::DialogWorld;
using test::PrivateBus;
using test::twoButtons;
using Button = test::DialogUser::Button;

/// What an alert says of itself, from any thread; a reason that comes after the answer is too late.
class Said {
public:
    std::function<void(std::string_view)> taker() const {
        return [state = state_](std::string_view text) {
            const std::lock_guard lock(state->mutex);
            state->lines.emplace_back(text);
        };
    }
    std::vector<std::string> lines() const {
        const std::lock_guard lock(state_->mutex);
        return state_->lines;
    }

private:
    struct State {
        std::mutex mutex;
        std::vector<std::string> lines;
    };
    std::shared_ptr<State> state_ = std::make_shared<State>();
};

using Lines = std::vector<std::string>;

class UnseenDialogTest : public ::testing::Test {
protected:
    /// Shows an alert whose program does this, expects it to be nobody's refusal, and answers with what was said of it.
    Lines reasonsOf(const std::string& script) {
        world_.usePlayedProgram(script);
        world_.options().explain = said_.taker();
        const auto alert = world_.alerts().show(twoButtons());
        if (!alert) return {"no alert"};
        const Answer answer;
        alert->receiveResponse(answer.handler());
        EXPECT_EQ(answer.wait(), Response::OtherButton);
        EXPECT_FALSE(alert->wasShown());
        return said_.lines();
    }

    DialogWorld world_;
    Said said_;
};

TEST_F(UnseenDialogTest, AProgramThatShowsNoWindowIsSaidToShowNone) {
    world_.options().windowPatience = milliseconds(300);
    EXPECT_EQ(reasonsOf("exec sleep 1000"), Lines{"the dialog program shows no window"});
}

TEST_F(UnseenDialogTest, AProgramThatEndsAtOnceIsSaidToHaveShownNone) {
    EXPECT_EQ(reasonsOf("exit 39"), Lines{"the dialog program ended without showing a window"});
}

TEST_F(UnseenDialogTest, AProgramThatCanNotBeRunIsSaidSo) {
    world_.usePlayedProgram("");
    world_.scratch().write("bin/yad", "#!/nowhere/sh\n");
    world_.options().explain = said_.taker();
    const auto alert = world_.alerts().show(twoButtons());
    ASSERT_TRUE(alert);
    const Answer answer;
    alert->receiveResponse(answer.handler());
    EXPECT_EQ(answer.wait(), Response::OtherButton);
    EXPECT_FALSE(alert->wasShown());
    EXPECT_EQ(said_.lines(), Lines{"the dialog program can't be run"});
}

TEST_F(UnseenDialogTest, OneThatIsTakenDownBeforeItIsSeenNeedsNoReason) {
    world_.usePlayedProgram("exec sleep 1000");
    world_.options().explain = said_.taker();
    const auto alert = world_.alerts().show(twoButtons());
    ASSERT_TRUE(alert);
    const Answer answer;
    alert->receiveResponse(answer.handler());
    alert->cancel();
    EXPECT_EQ(answer.wait(), Response::OtherButton);
    EXPECT_EQ(said_.lines(), Lines{});
}

/// A socket to which anybody can connect, and on which nobody answers.
class SilentBus {
public:
    SilentBus() {
        sockaddr_un name{};
        name.sun_family = AF_UNIX;
        const std::string path = scratch_.path("bus");
        std::copy(path.begin(), path.end(), name.sun_path);
        EXPECT_EQ(::bind(socket_.get(), reinterpret_cast<const sockaddr*>(&name), sizeof name), 0);
        EXPECT_EQ(::listen(socket_.get(), 16), 0);
    }
    std::string address() const { return "unix:path=" + scratch_.path("bus"); }

private:
    const ScratchDirectory scratch_;
    const Fd socket_{::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)};
};

/// Has the accessibility service's name, and never reads what it is asked.
class SilentService {
public:
    explicit SilentService(const std::string& address) {
        sd_bus* bus = nullptr;
        sd_bus_new(&bus);
        bus_.reset(bus);
        isThere_ = sd_bus_set_address(bus, address.c_str()) >= 0 && sd_bus_set_bus_client(bus, 1) >= 0 &&
                   sd_bus_start(bus) >= 0 && sd_bus_request_name(bus, "org.a11y.Bus", 0) >= 0;
    }
    bool isThere() const { return isThere_; }

private:
    BusHandle bus_;
    bool isThere_ = false;
};

class DialogBusTest : public ::testing::Test {
protected:
    void useBus(const std::string& address) {
        auto& environment = world_.options().environment;
        std::erase_if(environment, [](const std::string& variable) {
            return variable.starts_with("DBUS_SESSION_BUS_ADDRESS=") || variable.starts_with("NO_AT_BRIDGE=");
        });
        environment.push_back("DBUS_SESSION_BUS_ADDRESS=" + address);
        world_.options().note = notes_.taker();
    }
    void expectAQuestionThatCanBeAnswered() {
        const auto before = std::chrono::steady_clock::now();
        const auto alert = world_.alerts().show(twoButtons());
        ASSERT_TRUE(alert);
        const Answer answer;
        alert->receiveResponse(answer.handler());
        const auto dialog = world_.user().waitForDialog();
        ASSERT_TRUE(dialog);
        // Well before the program would stop waiting for the bus.
        EXPECT_LT(std::chrono::steady_clock::now() - before, std::chrono::seconds(15));
        EXPECT_TRUE(world_.user().click(*dialog, Button::Default));
        EXPECT_EQ(answer.wait(), Response::DefaultButton);
        EXPECT_TRUE(alert->wasShown());
    }
    /// The program's own word on the bus it was given.
    std::string busOfTheProgram() {
        const std::string report = world_.scratch().path("report");
        world_.usePlayedProgram("echo $DBUS_SESSION_BUS_ADDRESS $NO_AT_BRIDGE >" + report + "; exit 1");
        const auto alert = world_.alerts().show(twoButtons());
        const Answer answer;
        alert->receiveResponse(answer.handler());
        answer.wait();
        return ScratchDirectory::read(report);
    }

    DialogWorld world_;
    Said notes_;
};

const Lines kWithoutBus{"the session bus does not answer: the dialog does without it, and screen readers"};

TEST_F(DialogBusTest, ABusThatNeverAnswersKeepsNoQuestionFromTheUser) {
    const SilentBus bus;
    useBus(bus.address());
    ASSERT_NO_FATAL_FAILURE(expectAQuestionThatCanBeAnswered());
    EXPECT_EQ(notes_.lines(), kWithoutBus);
}

TEST_F(DialogBusTest, AnAccessibilityServiceThatNeverAnswersKeepsNoQuestionFromTheUser) {
    PrivateBus bus;
    ASSERT_TRUE(bus.start());
    const SilentService service(bus.address());
    ASSERT_TRUE(service.isThere());
    useBus(bus.address());
    ASSERT_NO_FATAL_FAILURE(expectAQuestionThatCanBeAnswered());
    EXPECT_EQ(notes_.lines(), kWithoutBus);
}

TEST_F(DialogBusTest, ABusThatAnswersIsGivenToTheProgramAndNothingIsStartedOnIt) {
    PrivateBus bus;
    ASSERT_TRUE(bus.start());
    useBus(bus.address());
    EXPECT_EQ(busOfTheProgram(), bus.address() + "\n");
    EXPECT_EQ(notes_.lines(), Lines{});
    EXPECT_FALSE(bus.hasStartedService());
}

TEST_F(DialogBusTest, ABusWithAnAccessibilityServiceIsGivenToTheProgram) {
    PrivateBus bus;
    ASSERT_TRUE(bus.start());
    const test::AccessibilityService service(bus.address());
    ASSERT_TRUE(service.isThere());
    useBus(bus.address());
    EXPECT_EQ(busOfTheProgram(), bus.address() + "\n");
}

TEST_F(DialogBusTest, ABusThatIsNotThereIsNotGivenToTheProgram) {
    useBus("unix:path=" + world_.scratch().path("nowhere"));
    EXPECT_EQ(busOfTheProgram(), "disabled: 1\n");
    EXPECT_EQ(notes_.lines(), kWithoutBus);
}

}  // namespace
}  // namespace lumacast
