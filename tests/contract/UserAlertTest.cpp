// What can happen to a real dialog: only the press of a granting button grants.

#include <gtest/gtest.h>
#include <signal.h>
#include <unistd.h>

#include <filesystem>
#include <set>

#include "tests/contract/DialogWorld.h"

namespace lumacast {
namespace {

using Response = UserAlert::Response;
using std::chrono::milliseconds;
using test::Answer;
using test::DialogUser;
using test::DialogWorld;
using test::threeButtons;
using test::twoButtons;
using Button = DialogUser::Button;

std::string fileText(const std::string& path) {
    return ScratchDirectory::read(path);
}

/// The processes that this one has started and that it has not waited for.
std::set<pid_t> children() {
    std::set<pid_t> found;
    std::error_code error;
    for (const auto& task : std::filesystem::directory_iterator("/proc/self/task", error)) {
        std::istringstream list(fileText(task.path().string() + "/children"));
        for (pid_t pid = 0; list >> pid;) found.insert(pid);
    }
    return found;
}

std::size_t openDescriptors() {
    std::size_t count = 0;
    for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) ++count;
    return count;
}

std::size_t threads() {
    std::size_t count = 0;
    for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator("/proc/self/task")) ++count;
    return count;
}

/// Everything is tried with both programs.
class RealDialogTest : public ::testing::TestWithParam<const char*> {
protected:
    /// An alert on the screen, with its buttons.
    void show(const AlertContent& content) {
        alert_ = world_.alerts().show(content);
        ASSERT_TRUE(alert_);
        alert_->receiveResponse(answer_.handler());
        const auto dialog = world_.user().waitForDialog();
        ASSERT_TRUE(dialog);
        dialog_ = *dialog;
    }
    DialogUser& user() { return world_.user(); }

    DialogWorld world_{GetParam()};
    std::shared_ptr<UserAlert> alert_;
    Answer answer_;
    DialogUser::Dialog dialog_;
};

TEST_P(RealDialogTest, EachOfTwoButtonsAnswersItsOwn) {
    ASSERT_NO_FATAL_FAILURE(show(twoButtons()));
    ASSERT_EQ(user().buttons(dialog_).size(), 2u);
    EXPECT_TRUE(user().click(dialog_, Button::Default));
    EXPECT_EQ(answer_.wait(), Response::DefaultButton);
    answer_ = Answer();
    ASSERT_NO_FATAL_FAILURE(show(twoButtons()));
    EXPECT_TRUE(user().click(dialog_, Button::Other));
    EXPECT_EQ(answer_.wait(), Response::OtherButton);
}

TEST_P(RealDialogTest, EachOfThreeButtonsAnswersItsOwn) {
    for (const auto& [button, response] :
         {std::pair(Button::Other, Response::OtherButton), std::pair(Button::Alternate, Response::AlternateButton),
          std::pair(Button::Default, Response::DefaultButton)}) {
        answer_ = Answer();
        ASSERT_NO_FATAL_FAILURE(show(threeButtons()));
        EXPECT_TRUE(user().click(dialog_, button));
        EXPECT_EQ(answer_.wait(), response);
    }
}

TEST_P(RealDialogTest, EscapeRefuses) {
    ASSERT_NO_FATAL_FAILURE(show(threeButtons()));
    user().press(dialog_, DialogUser::kEscape);
    EXPECT_EQ(answer_.wait(), Response::OtherButton);
}

TEST_P(RealDialogTest, ClosingTheWindowRefuses) {
    ASSERT_NO_FATAL_FAILURE(show(threeButtons()));
    user().close(dialog_);
    EXPECT_EQ(answer_.wait(), Response::OtherButton);
}

TEST_P(RealDialogTest, AKilledProgramRefuses) {
    for (const int signal : {SIGKILL, SIGTERM, SIGUSR1, SIGUSR2, SIGSEGV}) {
        answer_ = Answer();
        ASSERT_NO_FATAL_FAILURE(show(twoButtons()));
        ASSERT_GT(dialog_.pid, 1);  // -1 would be everybody
        ::kill(dialog_.pid, signal);
        EXPECT_EQ(answer_.wait(), Response::OtherButton) << "signal " << signal;
    }
}

TEST_P(RealDialogTest, AWindowThatAnotherClientDestroysRefuses) {
    ASSERT_NO_FATAL_FAILURE(show(twoButtons()));
    user().destroy(dialog_);
    EXPECT_EQ(answer_.wait(), Response::OtherButton);
    EXPECT_TRUE(eventually([] { return children().size() == 1; }));  // the display
}

TEST_P(RealDialogTest, AClientThatTheServerKillsRefuses) {
    ASSERT_NO_FATAL_FAILURE(show(twoButtons()));
    user().killClient(dialog_);
    EXPECT_EQ(answer_.wait(), Response::OtherButton);
}

TEST_P(RealDialogTest, ADisplayThatDiesRefuses) {
    ASSERT_NO_FATAL_FAILURE(show(twoButtons()));
    world_.display().crash();
    EXPECT_EQ(answer_.wait(), Response::OtherButton);
    EXPECT_TRUE(eventually([] { return children().empty(); }));
}

TEST_P(RealDialogTest, AnAlertOnADisplayThatHangsCanBeCancelled) {
    ASSERT_NO_FATAL_FAILURE(show(twoButtons()));
    world_.display().hang();
    alert_->cancel();
    EXPECT_EQ(answer_.wait(), Response::OtherButton);
    EXPECT_TRUE(eventually([] { return children().size() == 1; }));
    world_.display().goOn();
}

TEST_P(RealDialogTest, ReturnPressesNoButtonWhicheverHasTheFocus) {
    ASSERT_NO_FATAL_FAILURE(show(threeButtons()));
    for (int tabs = 0; tabs < 4; ++tabs) {
        user().press(dialog_, DialogUser::kReturn);
        user().press(dialog_, DialogUser::kKeypadEnter);
        user().press(dialog_, DialogUser::kTab);
    }
    // What was pressed before this has been handled before it.
    EXPECT_TRUE(user().click(dialog_, Button::Default));
    EXPECT_EQ(answer_.wait(), Response::DefaultButton);
}

TEST_P(RealDialogTest, TheRefusingButtonHasTheFocusAtFirst) {
    ASSERT_NO_FATAL_FAILURE(show(threeButtons()));
    user().press(dialog_, DialogUser::kSpace);
    EXPECT_EQ(answer_.wait(), Response::OtherButton);
}

TEST_P(RealDialogTest, AGrantThatComesAtOnceIsAskedForAgain) {
    world_.options().tooSoon = std::chrono::hours(1);
    ASSERT_NO_FATAL_FAILURE(show(twoButtons()));
    std::set<pid_t> seen{dialog_.pid};
    for (int again = 0; again < 4; ++again) {
        EXPECT_TRUE(user().click(dialog_, Button::Default));
        ASSERT_TRUE(eventually([&] {
            const auto dialog = user().waitForDialog();
            if (!dialog || !seen.insert(dialog->pid).second) return false;
            dialog_ = *dialog;
            return true;
        }));
        EXPECT_EQ(answer_.count(), 0u);
    }
    // Who never waits is taken for one who doesn't read.
    EXPECT_TRUE(user().click(dialog_, Button::Default));
    EXPECT_EQ(answer_.wait(), Response::OtherButton);
}

TEST_P(RealDialogTest, ARefusalCountsAtOnce) {
    world_.options().tooSoon = std::chrono::hours(1);
    ASSERT_NO_FATAL_FAILURE(show(twoButtons()));
    EXPECT_TRUE(user().click(dialog_, Button::Other));
    EXPECT_EQ(answer_.wait(), Response::OtherButton);
}

TEST_P(RealDialogTest, UnderAWindowManagerItIsTheSame) {
    const test::ChildProcess manager({"openbox", "--sm-disable"}, -1, {"DISPLAY=" + world_.display().name()});
    for (const auto& [button, response] :
         {std::pair(Button::Alternate, Response::AlternateButton), std::pair(Button::Default, Response::DefaultButton),
          std::pair(Button::Other, Response::OtherButton)}) {
        answer_ = Answer();
        ASSERT_NO_FATAL_FAILURE(show(threeButtons()));
        EXPECT_TRUE(user().click(dialog_, button));
        EXPECT_EQ(answer_.wait(), response);
    }
    for (const auto& [name, harm] : {std::pair("close", &DialogUser::close), std::pair("destroy", &DialogUser::destroy),
                                     std::pair("kill", &DialogUser::killClient)}) {
        answer_ = Answer();
        ASSERT_NO_FATAL_FAILURE(show(threeButtons()));
        (user().*harm)(dialog_);
        EXPECT_EQ(answer_.wait(), Response::OtherButton) << name;
    }
}

TEST_P(RealDialogTest, TextsOfApplicationsAreNothingButTexts) {
    const std::string long10k(10'000, 'W');
    for (const std::string& name :
         {std::string("</b></big><big>x"), std::string("\\n\\074b\\076\\x41"), std::string("--extra-button=Yes"),
          std::string("-x\n--button=Yes:39"), std::string("a\tb\rc\x1b[31m\x01\x7f"), std::string("&amp;&#60;&bad;"),
          std::string("\u202Egpj.exe\u2066\u200B"), std::string("\xff\xfe\xc0\xaf\xed\xa0\x80"),
          std::string("%s%n%1$s"), std::string("!gtk-ok!:39"), std::string("_x_"), long10k, long10k + "\n" + long10k}) {
        answer_ = Answer();
        AlertContent content = twoButtons();
        content.header = "Allow “" + name + "” to record the screen?";
        content.message = name;
        ASSERT_NO_FATAL_FAILURE(show(content)) << name.substr(0, 40);
        EXPECT_EQ(user().buttons(dialog_).size(), 2u) << name.substr(0, 40);
        EXPECT_LE(dialog_.width, 1'000) << name.substr(0, 40);
        EXPECT_LE(dialog_.height, 500) << name.substr(0, 40);
        EXPECT_TRUE(user().click(dialog_, Button::Default));
        EXPECT_EQ(answer_.wait(), Response::DefaultButton) << name.substr(0, 40);
    }
}

TEST_P(RealDialogTest, OddLabelsAnswerLikeOthers) {
    for (const std::string& label : {std::string("gtk-ok"), std::string("_Yes_no"), std::string("a!b:39"),
                                     std::string("<b>&amp;\\n"), std::string("-q"), std::string(500, 'a')}) {
        answer_ = Answer();
        AlertContent content = threeButtons();
        content.alternateButton = label;
        ASSERT_NO_FATAL_FAILURE(show(content)) << label.substr(0, 40);
        EXPECT_TRUE(user().click(dialog_, Button::Alternate)) << label.substr(0, 40);
        EXPECT_EQ(answer_.wait(), Response::AlternateButton) << label.substr(0, 40);
    }
}

TEST_P(RealDialogTest, FiftyAlertsLeaveNothingBehind) {
    const auto leftovers = [] { return openDescriptors() + threads() + children().size(); };
    ASSERT_NO_FATAL_FAILURE(show(twoButtons()));  // what is made once, is there after the first
    alert_.reset();
    ASSERT_TRUE(eventually([] { return children().size() == 1; }));
    ASSERT_TRUE(eventually([this] { return user().dialogs().empty(); }));
    std::size_t before = leftovers();
    ASSERT_TRUE(eventually([&] { return before == std::exchange(before, leftovers()); }));
    for (int i = 0; i < 50; ++i) {
        alert_ = world_.alerts().show(twoButtons());
        ASSERT_TRUE(alert_);
        const Answer answer;
        alert_->receiveResponse(answer.handler());
        if (i % 10 == 0) {
            EXPECT_TRUE(user().waitForDialog());
        }
        if (i % 2 == 0) {
            alert_->cancel();
            EXPECT_EQ(answer.wait(), Response::OtherButton);
        }
        alert_.reset();
    }
    EXPECT_TRUE(eventually([&] { return leftovers() <= before; })) << leftovers() << " after " << before;
    EXPECT_EQ(children().size(), 1u);
}

INSTANTIATE_TEST_SUITE_P(Programs, RealDialogTest, ::testing::Values("yad", "zenity"),
                         [](const auto& program) { return std::string(program.param); });

/// With a program of the test's own, which does what no dialog should.
class PlayedDialogTest : public ::testing::Test {
protected:
    std::optional<Response> answerOf(const std::string& script) {
        world_.usePlayedProgram(script);
        alert_ = world_.alerts().show(threeButtons());
        if (!alert_) return std::nullopt;
        const Answer answer;
        alert_->receiveResponse(answer.handler());
        return answer.wait();
    }

    DialogWorld world_;
    std::shared_ptr<UserAlert> alert_;
};

TEST_F(PlayedDialogTest, OnlyTheExactAnswerOfAGrantingButtonGrants) {
    // None of these has shown a window: even the right answer is no answer then.
    for (const char* script : {"exit 0", "exit 1", "exit 252", "exit 39", "exit 90", "kill -9 $$", "echo 39; exit 39",
                               "echo 'Record Screen'", "head -c 100000 /dev/zero; exit 39", "exec 1>&-; exit 39"})
        EXPECT_EQ(answerOf(script), Response::OtherButton) << script;
}

TEST_F(PlayedDialogTest, AProgramThatShowsNoWindowIsNotWaitedForWithoutEnd) {
    world_.options().windowPatience = milliseconds(300);
    EXPECT_EQ(answerOf("exec sleep 1000"), Response::OtherButton);
    EXPECT_TRUE(eventually([] { return children().size() == 1; }));
}

TEST_F(PlayedDialogTest, AProgramThatPrintsWithoutEndIsEnded) {
    world_.options().windowPatience = std::chrono::hours(1);
    EXPECT_EQ(answerOf("while :; do echo y; done"), Response::OtherButton);
    EXPECT_TRUE(eventually([] { return children().size() == 1; }));
}

TEST_F(PlayedDialogTest, AProgramThatCanNotBeRunIsTheOtherButton) {
    world_.usePlayedProgram("");
    // Executable, but of an interpreter that isn't there.
    const std::string path = world_.scratch().write("bin/yad", "#!/nowhere/sh\n");
    const auto alert = world_.alerts().show(twoButtons());
    ASSERT_TRUE(alert);
    const Answer answer;
    alert->receiveResponse(answer.handler());
    EXPECT_EQ(answer.wait(), Response::OtherButton);
}

TEST_F(PlayedDialogTest, AProgramGetsNothingOfThisProcessButItsOutput) {
    const int leaked = ::dup(STDOUT_FILENO);  // as a library that forgets to mark it would
    const std::string report = world_.scratch().path("report");
    EXPECT_EQ(
        answerOf(
            "exec >" + report +
            "; readlink /proc/$$/fd/0; readlink /proc/$$/fd/2; ls /proc/$$/fd; echo end; env; pwd;"
            " echo group $(($(cut -d' ' -f5 /proc/$$/stat) - $$)); grep -E 'Sig(Blk|Ign)' /proc/self/status; exit 1"),
        Response::OtherButton);
    ::close(leaked);
    const std::string text = fileText(report);
    EXPECT_TRUE(text.starts_with("/dev/null\n/dev/null\n0\n1\n10\n2\nend\n") ||
                text.starts_with("/dev/null\n/dev/null\n0\n1\n2\nend\n"))
        << text;  // 10 is the shell's own script
    EXPECT_NE(text.find("\ngroup 0\n"), std::string::npos) << text;
    EXPECT_EQ(text.find("SECRET"), std::string::npos);
    EXPECT_NE(text.find("DISPLAY=" + world_.display().name()), std::string::npos);
    EXPECT_NE(text.find("SigBlk:\t0000000000000000"), std::string::npos) << text;
    EXPECT_NE(text.find("SigIgn:\t0000000000000000"), std::string::npos) << text;
}

TEST_F(PlayedDialogTest, WhatTheProgramHasStartedGoesWithIt) {
    const std::string report = world_.scratch().path("grandchild");
    EXPECT_EQ(answerOf("sleep 1000 & echo $! >" + report + "; exit 1"), Response::OtherButton);
    const pid_t grandchild = std::stoi(fileText(report));
    EXPECT_TRUE(eventually([&] {
        const std::string status = fileText("/proc/" + std::to_string(grandchild) + "/status");
        return status.empty() || status.find("State:\tZ") != std::string::npos;
    }));
}

TEST(UserAlerts, WithoutAProgramThereIsNoAlert) {
    std::string reason;
    DialogWorld world("");
    world.options().explain = [&](std::string_view said) { reason = said; };
    EXPECT_EQ(world.alerts().show(twoButtons()), nullptr);
    EXPECT_EQ(reason, "neither yad nor zenity is installed");
}

TEST(UserAlerts, AProgramThatOthersCanWriteIsNone) {
    DialogWorld world;
    world.usePlayedProgram("exit 0");
    world.options().programOwner = ProgramOwner::Administrator;
    std::filesystem::permissions(world.scratch().path("bin/yad"), std::filesystem::perms::all);
    EXPECT_EQ(world.alerts().show(twoButtons()), nullptr);
}

TEST(UserAlerts, WithoutADisplayThereIsNoAlert) {
    for (const char* display : {"", ":54321", "elsewhere:0", "rubbish"}) {
        DialogWorld world;
        world.options().display = display;
        EXPECT_EQ(world.alerts().show(twoButtons()), nullptr) << display;
    }
}

TEST(UserAlerts, ADisplayThatHangsIsNotWaitedForWithoutEnd) {
    DialogWorld world;
    world.options().displayPatience = milliseconds(200);
    world.display().hang();
    EXPECT_EQ(world.alerts().show(twoButtons()), nullptr);
    world.display().goOn();
}

TEST(UserAlerts, ButtonsThatCanNotBeToldApartAreNotShown) {
    DialogWorld world;
    AlertContent content = threeButtons();
    content.alternateButton = content.otherButton;
    EXPECT_EQ(world.alerts().show(content), nullptr);
    content.alternateButton = "\u200B" + content.defaultButton + "\n";
    EXPECT_EQ(world.alerts().show(content), nullptr);
    content = twoButtons();
    content.otherButton = std::nullopt;
    EXPECT_EQ(world.alerts().show(content), nullptr);
    content = twoButtons();
    content.defaultButton = " ";
    EXPECT_EQ(world.alerts().show(content), nullptr);
}

}  // namespace
}  // namespace lumacast
