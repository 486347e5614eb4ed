// A hostile extension in each of the port's sandboxes: what it tries, and what comes of it.

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>

#include <map>
#include <sstream>

#include "base/Limits.h"
#include "tests/contract/ExtensionTools.h"
#include "tests/contract/LinuxExtensionsWorld.h"

namespace lumacast {
namespace {

using ::testing::AnyOf;
using ::testing::Contains;
using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::StartsWith;

LinuxExtensionsWorld::Change only(Confinement confinement) {
    return [confinement](LinuxAppExtensions::Options& options) {
        if (confinement != Confinement::Bubblewrap) options.sandbox.bubblewrap.clear();
        if (confinement == Confinement::None) options.sandbox.landlock = false;
    };
}

/// Some process of this user's outside of every sandbox.
class Victim {
public:
    Victim() : pid_(::fork()) {
        if (pid_ == 0)
            for (;;) ::pause();
    }
    ~Victim() {
        if (pid_ <= 1) return;
        ::kill(pid_, SIGKILL);
        ::waitpid(pid_, nullptr, 0);
    }
    Victim(const Victim&) = delete;
    Victim& operator=(const Victim&) = delete;
    pid_t pid() const { return pid_; }

private:
    const pid_t pid_;
};

class ExtensionSandboxTest : public ::testing::TestWithParam<Confinement> {
protected:
    void SetUp() override {
        world_ = std::make_unique<LinuxExtensionsWorld>(only(GetParam()));
        extension_ = installed("org.example.Hostile");
        ASSERT_TRUE(extension_);
    }
    std::shared_ptr<AppExtension> installed(const std::string& identifier, const std::string& more = {}) {
        ExtensionToInstall entry{identifier};
        entry.point = identifier;
        world_->installFolder(identifier, LinuxExtensionsWorld::manifestOf(entry, more));
        const auto found = findExtensions(*world_, identifier).found;
        return found.empty() ? nullptr : found.front();
    }
    /// What the extension returns for a command.
    static std::vector<ExtensionItem> ask(AppExtension& extension, const std::string& command,
                                          std::vector<ExtensionItem> items = {}) {
        Completions completions(extension);
        const auto begun = begin(extension, command, std::move(items));
        EXPECT_TRUE(begun.request) << command << ": " << (begun.error ? describe(*begun.error) : "");
        if (!begun.request || !eventually([&] { return completions.count() == 1; })) return {};
        return completions.get().front().items;
    }
    std::map<std::string, std::string> open(AppExtension& extension, const std::vector<std::string>& paths) {
        std::map<std::string, std::string> answers;
        for (std::size_t at = 0; at < paths.size(); at += limitOf(Limit::ExtensionItemsReturned)) {
            std::vector<ExtensionItem> items;
            for (std::size_t i = at; i < std::min(paths.size(), at + limitOf(Limit::ExtensionItemsReturned)); ++i)
                items.push_back(textItem("path", paths[i]));
            for (const ExtensionItem& item : ask(extension, "open", std::move(items)))
                answers[item.attributedTitle] = textOf(item);
        }
        return answers;
    }
    static ExtensionItem tokenItem(const std::string& token) {
        return {"token", {{std::string(kGenericDataType), Value(Data(token.begin(), token.end())), std::nullopt}}};
    }
    std::vector<std::string> exchange(AppExtension& extension, const std::vector<std::string>& tokens) {
        std::vector<ExtensionItem> items;
        for (const std::string& token : tokens) items.push_back(tokenItem(token));
        std::vector<std::string> answers;
        for (const ExtensionItem& item : ask(extension, "exchange", std::move(items))) answers.push_back(textOf(item));
        return answers;
    }
    std::string token(const std::string& name, const std::string& text) {
        return extension_->issueReadOnlyFileToken("class", world_->makeFile(name, text)).value_or("");
    }
    bool isInNamespaces() const { return GetParam() == Confinement::Bubblewrap; }

    std::unique_ptr<LinuxExtensionsWorld> world_;
    std::shared_ptr<AppExtension> extension_;
};

TEST_P(ExtensionSandboxTest, NothingThatNoExtensionMayDoIsLetThrough) {
    const Victim victim;
    const auto answers = ask(*extension_, "attack", {textItem("victim", std::to_string(victim.pid()))});
    ASSERT_EQ(answers.size(), 1u);
    std::istringstream lines(textOf(answers.front()));
    int attempts = 0;
    for (std::string line; std::getline(lines, line); ++attempts) EXPECT_THAT(line, Not(::testing::EndsWith("=0")));
    EXPECT_GE(attempts, 60);
    EXPECT_EQ(::kill(victim.pid(), 0), 0);
}

TEST_P(ExtensionSandboxTest, OnlyWhatIsItsOwnAndTheSystemsProgramsCanBeOpened) {
    installed("org.example.Other");
    const std::string other = world_->dataHome() + "/lumacast/extensions/org.example.Other";
    const std::string clip = world_->makeFile("clip.mp4", "a clip");
    const std::string stray = world_->scratch().write("stray.txt", "the user's");
    // A home below /tmp is not seen either: there the sandbox has a folder of its own.
    const char* home = ::getenv("HOME");
    if (home && std::string_view(home).starts_with("/tmp/")) home = nullptr;
    const std::string folder = world_->dataHome() + "/lumacast/extensions/org.example.Hostile";
    const std::string own = world_->ownDirectories() + "/org.example.Hostile";
    const std::vector<std::string> closed{clip,
                                          stray,
                                          other + "/manifest.json",
                                          other + "/program",
                                          "/etc/passwd",
                                          "/etc/shadow",
                                          "/etc/lumacast",
                                          home ? home : "/root",
                                          "/home",
                                          "/var",
                                          "/run",
                                          "/run/user",
                                          "/tmp/.X11-unix",
                                          "/proc/1/environ",
                                          "/proc/" + std::to_string(::getpid()) + "/cmdline",
                                          "/sys/kernel",
                                          "/dev/shm/x",
                                          LC_SOURCE_DIR "/README.md"};
    const auto answers = open(*extension_, closed);
    for (const std::string& path : closed) {
        const auto found = answers.find(path);
        ASSERT_NE(found, answers.end()) << path;
        // An empty folder of the sandbox's own may stand in a path's way; it holds nothing of the user's.
        EXPECT_THAT(found->second, AnyOf("ENOENT", "EACCES", "EPERM", isInNamespaces() ? "empty" : "EACCES")) << path;
    }
    for (const std::string& path :
         {clip, stray, std::string("/etc/passwd"), std::string("/etc/shadow"), other + "/program"})
        EXPECT_THAT(answers.at(path), AnyOf("ENOENT", "EACCES")) << path;
    const auto allowed = open(*extension_, {own, folder + "/manifest.json", folder, "/usr/bin/env", "/usr"});
    EXPECT_EQ(allowed.at(own), "write");
    EXPECT_EQ(allowed.at(folder + "/manifest.json"), "read");
    EXPECT_EQ(allowed.at(folder), "read");
    EXPECT_EQ(allowed.at("/usr/bin/env"), "read");
    EXPECT_EQ(allowed.at("/usr"), "read");
}

TEST_P(ExtensionSandboxTest, NoGrantReachesTheDaemonsOwnFilesOrAnotherExtensions) {
    const std::string own = world_->ownDirectories() + "/org.example.Granted/sub",
                      others = world_->ownDirectories() + "/org.example.Hostile", files = world_->directory();
    for (const std::string& folder : {own, others}) std::filesystem::create_directories(folder);
    const auto granted = installed("org.example.Granted", R"("grants": {"directories": [")" + own + R"(", ")" + others +
                                                              R"(", ")" + files + R"("]})");
    ASSERT_TRUE(granted);
    const auto answers = open(*granted, {own, others, files});
    EXPECT_EQ(answers.at(own), "write");
    for (const std::string& folder : {others, files}) {
        EXPECT_THAT(answers.at(folder), AnyOf("ENOENT", "EACCES"));
        EXPECT_EQ(world_->linesWith("is not granted the directory " + folder), 1u);
    }
    EXPECT_EQ(world_->linesWith("is not granted the directory"), 2u);
}

TEST_P(ExtensionSandboxTest, ATokenIsGoodOnceForItsFileAndTheFileCanOnlyBeRead) {
    const std::string one = token("one.mp4", "the first clip"), other = token("two.mp4", "the second clip");
    ASSERT_FALSE(one.empty() || other.empty());
    EXPECT_EQ(one.size(), 64u) << "256 bits";
    const auto answers = exchange(*extension_, {one, one, other, "0" + one.substr(1), one.substr(1), one + "0"});
    ASSERT_EQ(answers.size(), 6u);
    EXPECT_EQ(answers[0], "read the first clip");
    EXPECT_EQ(answers[1], "error " + std::to_string(EACCES)) << "once";
    EXPECT_EQ(answers[2], "read the second clip");
    for (int i = 3; i < 6; ++i) EXPECT_EQ(answers[i], "error " + std::to_string(EACCES)) << i;
    EXPECT_EQ(ScratchDirectory::read(world_->directory() + "/one.mp4"), "the first clip");
}

TEST_P(ExtensionSandboxTest, ATokenIsDeadWithItsRequest) {
    const std::string first = token("one.mp4", "a clip");
    ask(*extension_, "echo", {tokenItem(first)});
    EXPECT_THAT(exchange(*extension_, {first}), ::testing::ElementsAre("error " + std::to_string(EACCES)));
}

TEST_P(ExtensionSandboxTest, ATokenBelongsToTheRequestThatItIsHandedOverWith) {
    const std::string first = token("one.mp4", "a clip"), second = token("two.mp4", "the last clip");
    EXPECT_THAT(exchange(*extension_, {second}), ::testing::ElementsAre("read the last clip"));
    // The other request's end has taken nothing from this one.
    EXPECT_THAT(exchange(*extension_, {first}), ::testing::ElementsAre("read a clip"));
}

TEST_P(ExtensionSandboxTest, ATokenOfAnotherExtensionIsNone) {
    const auto other = installed("org.example.Other");
    ASSERT_TRUE(other);
    const std::string own = token("one.mp4", "a clip");
    EXPECT_THAT(exchange(*other, {own}), ::testing::ElementsAre("error " + std::to_string(EACCES)));
    EXPECT_THAT(exchange(*extension_, {own}), ::testing::ElementsAre("read a clip")) << "and is not spent by it";
}

TEST_P(ExtensionSandboxTest, WhoGuessesTokensIsDropped) {
    Completions completions(*extension_);
    std::vector<ExtensionItem> guesses;
    for (int i = 0; i < 20; ++i) guesses.push_back(tokenItem(std::string(64, static_cast<char>('a' + i))));
    ASSERT_TRUE(begin(*extension_, "exchange", guesses).request);
    EXPECT_TRUE(eventually([&] { return world_->linesWith("too many tokens that were never issued") == 1; }));
    EXPECT_TRUE(eventually([&] { return world_->processCount() == 0; })) << "and its process is ended";
    EXPECT_EQ(completions.count(), 0u);
    EXPECT_TRUE(begin(*extension_, "echo").request) << "the next request launches it anew";
}

TEST_P(ExtensionSandboxTest, ATokenIsOfTheFileThatWasThereWhenItWasIssued) {
    const std::string issued = token("one.mp4", "the clip");
    ::unlink((world_->directory() + "/one.mp4").c_str());
    world_->makeFile("one.mp4", "another");
    EXPECT_THAT(exchange(*extension_, {issued}), ::testing::ElementsAre("read the clip"));
}

TEST_P(ExtensionSandboxTest, ATokenIsNeverIssuedThroughALink) {
    const std::string stray = world_->scratch().write("stray.txt", "the user's");
    std::filesystem::create_symlink(stray, world_->directory() + "/link.mp4");
    std::filesystem::create_directory_symlink(world_->scratch().path("data"), world_->directory() + "/folder");
    for (const std::string name :
         {"/link.mp4", "/folder/lumacast/extensions/org.example.Hostile/manifest.json", "/../stray.txt"})
        EXPECT_FALSE(extension_->issueReadOnlyFileToken("class", world_->directory() + name)) << name;
}

TEST_P(ExtensionSandboxTest, ItsEnvironmentIsItsOwn) {
    ::setenv("LUMACAST_SECRET_OF_THE_TEST", "secret", 1);
    const auto granted = installed("org.example.Granted", R"("grants": {"environment": ["GRANTED", "NOT_THERE"]})");
    ASSERT_TRUE(granted);
    const auto answers = ask(*granted, "environment");
    ::unsetenv("LUMACAST_SECRET_OF_THE_TEST");
    ASSERT_EQ(answers.size(), 1u);
    const std::string environment = textOf(answers.front());
    const std::string home = world_->ownDirectories() + "/org.example.Granted";
    EXPECT_THAT(environment, HasSubstr("HOME=" + home + "\n"));
    EXPECT_THAT(environment, HasSubstr("LANG=de_DE.UTF-8\n"));
    EXPECT_THAT(environment, HasSubstr("GRANTED=granted value\n"));
    for (const char* unwanted : {"secret", "DISPLAY=", "XDG_RUNTIME_DIR=", "NOT_THERE"})
        EXPECT_THAT(environment, Not(HasSubstr(unwanted)));
}

TEST_P(ExtensionSandboxTest, ItHasNoDescriptorButItsTwoConnections) {
    // One that a library has forgotten to close in programs that are started.
    const Fd file(::open("/etc/passwd", O_RDONLY));
    const Fd high(::fcntl(file.get(), F_DUPFD, 200));
    ASSERT_TRUE(file && high);
    const auto answers = ask(*extension_, "descriptors");
    ASSERT_EQ(answers.size(), 1u);
    EXPECT_EQ(textOf(answers.front()), "2");
}

TEST_P(ExtensionSandboxTest, NoProcessOfItsOutlivesIt) {
    const std::string lock = world_->ownDirectories() + "/org.example.Hostile/lock";
    const auto answers = ask(*extension_, "leave-child", {textItem("path", lock)});
    ASSERT_EQ(answers.size(), 1u);
    EXPECT_EQ(textOf(answers.front()), isInNamespaces() ? "left" : "none") << "without namespaces it gets no children";
    const int file = ::open(lock.c_str(), O_RDWR | O_CLOEXEC);
    ASSERT_GE(file, 0);
    if (isInNamespaces()) {
        EXPECT_NE(::flock(file, LOCK_EX | LOCK_NB), 0) << "the child holds it";
    }
    extension_->kill(SIGKILL);
    EXPECT_TRUE(eventually([&] { return ::flock(file, LOCK_EX | LOCK_NB) == 0; }));
    ::close(file);
}

TEST_P(ExtensionSandboxTest, ASignalReachesTheProgramItself) {
    Completions completions(*extension_);
    ASSERT_TRUE(begin(*extension_, "hold").request);
    extension_->kill(SIGSTOP);
    std::atomic<bool> isBegun{false};
    extension_->beginExtensionRequestWithInputItems({textItem("command", "echo"), textItem("later", "")},
                                                    [&](auto request, auto) { isBegun = request.has_value(); });
    // Others go on meanwhile: a whole launch of another one is time enough for an answer that must not come.
    const auto other = installed("org.example.Other");
    ASSERT_TRUE(other);
    ask(*other, "echo");
    EXPECT_FALSE(isBegun) << "a stopped process takes nothing";
    extension_->kill(SIGCONT);
    EXPECT_TRUE(eventually([&] { return completions.hasTitle("later"); }));
}

TEST_P(ExtensionSandboxTest, WhatItPrintsIsLoggedCutAndNoMoreThanALogCanBear) {
    std::vector<ExtensionItem> lines{textItem("line", "a\x1b[31mwarning"), textItem("line", std::string(2000, 'x'))};
    for (int i = 0; i < 300; ++i) lines.push_back(textItem("line", "flood " + std::to_string(i)));
    ask(*extension_, "print", std::move(lines));
    ASSERT_TRUE(eventually([&] { return world_->linesWith("org.example.Hostile: a [31mwarning") == 1; }));
    EXPECT_TRUE(eventually([&] { return world_->linesWith(std::string(512, 'x') + " [...]") == 1; }));
    EXPECT_EQ(world_->linesWith(std::string(513, 'x')), 0u);
    EXPECT_LE(world_->linesWith("flood "), 60u);
    extension_->kill(SIGKILL);
    EXPECT_TRUE(eventually([&] { return world_->linesWith("lines left out]") >= 1; }));
}

TEST_P(ExtensionSandboxTest, ItemsThatAreNoneAreDroppedAndTheOthersStay) {
    const auto items = ask(*extension_, "ill-formed");
    ASSERT_EQ(items.size(), 2u);
    EXPECT_EQ(items[0].attributedTitle, "good");
    EXPECT_EQ(items[1].attributedTitle, "also good");
    EXPECT_EQ(world_->linesWith("has returned 5 items that are none"), 1u);
}

TEST_P(ExtensionSandboxTest, WhoBreaksTheTransportsRulesIsEndedAlone) {
    const auto other = installed("org.example.Other");
    ASSERT_TRUE(other);
    ask(*other, "echo");
    Completions completions(*extension_);
    ASSERT_TRUE(begin(*extension_, "hold").request);
    static_cast<void>(begin(*extension_, "garbage"));
    EXPECT_TRUE(eventually([&] { return world_->linesWith("dropped: ") == 1; }));
    EXPECT_TRUE(eventually([&] { return world_->processCount() == 1; })) << "the other goes on";
    ask(*other, "echo");
    EXPECT_EQ(completions.count(), 0u);
}

TEST_P(ExtensionSandboxTest, WithoutTheNetworkThereIsNone) {
    const auto alone = installed("org.example.Alone", R"("grants": {"network": false})");
    ASSERT_TRUE(alone);
    EXPECT_EQ(textOf(ask(*alone, "connect", {textItem("x", "")}).front()), "EPERM");
    EXPECT_EQ(textOf(ask(*extension_, "connect", {textItem("x", "")}).front()), "0") << "others have it";
}

TEST_P(ExtensionSandboxTest, ItsResourcesAreLimitedForGood) {
    const ExtensionResources resources;
    std::map<std::string, std::string> limits;
    for (const ExtensionItem& item : ask(*extension_, "limits")) limits[item.attributedTitle] = textOf(item);
#ifndef LC_SANITIZED  // it maps far more than it uses: the launcher leaves this limit out
    EXPECT_EQ(limits["address-space"], std::to_string(resources.addressSpace));
#endif
    EXPECT_EQ(limits["file-size"], std::to_string(resources.fileBytes));
    EXPECT_EQ(limits["open-files"], std::to_string(resources.openFiles));
    EXPECT_EQ(limits["core"], "0");
    // Among the user's other processes it gets none at all.
    if (isInNamespaces()) {
        EXPECT_EQ(limits["processes"], std::to_string(resources.processes));
    }
}

TEST_P(ExtensionSandboxTest, ItsProcessesAreLimitedAndAllEndWithIt) {
    const auto answers = ask(*extension_, "forks");
    ASSERT_EQ(answers.size(), 1u);
    const int made = std::stoi(textOf(answers.front()));
    if (!isInNamespaces())
        EXPECT_EQ(made, 0) << "without namespaces it gets no processes at all";
    else if (::geteuid() != 0)
        EXPECT_LT(made, static_cast<int>(ExtensionResources().processes));
    else
        std::printf("    the kernel counts no process of the administrator's: %d were made\n", made);
    if (isInNamespaces()) {
        EXPECT_GT(made, 100);
    }
    const std::string program = world_->dataHome() + "/lumacast/extensions/org.example.Hostile/program";
    EXPECT_GE(processesWith(program), static_cast<std::size_t>(made));
    extension_->kill(SIGKILL);
    EXPECT_TRUE(eventually([&] { return processesWith(program) == 0; })) << "all end with it";
}

#ifndef LC_SANITIZED  // it maps far more than it uses: the launcher leaves this limit out
TEST_P(ExtensionSandboxTest, ItsMemoryIsLimited) {
    const auto answers = ask(*extension_, "memory");
    ASSERT_EQ(answers.size(), 1u);
    EXPECT_LE(std::stoi(textOf(answers.front())), 4096);
    EXPECT_GE(std::stoi(textOf(answers.front())), 1024);
}
#endif

INSTANTIATE_TEST_SUITE_P(In, ExtensionSandboxTest, ::testing::Values(Confinement::Bubblewrap, Confinement::Landlock),
                         [](const auto& parameter) {
                             return parameter.param == Confinement::Bubblewrap ? "Bubblewrap" : "Landlock";
                         });

/// What is done where neither works.
class UnsandboxedExtensionTest : public ::testing::Test {
protected:
    void launch(bool isAllowed) {
        world_ = std::make_unique<LinuxExtensionsWorld>([isAllowed](LinuxAppExtensions::Options& options) {
            only(Confinement::None)(options);
            options.sandbox.isUnsandboxedAllowed = [isAllowed] { return isAllowed; };
        });
        world_->install({"org.example.Upload"});
        extension_ = findExtensions(*world_).found.at(0);
        begun_ = begin(*extension_, "hold");
        again_ = begin(*extension_, "hold");
    }
    std::unique_ptr<LinuxExtensionsWorld> world_;
    std::shared_ptr<AppExtension> extension_;
    BegunRequest begun_, again_;
};

TEST_F(UnsandboxedExtensionTest, IsNotLaunchedAndSaysSoOnce) {
    launch(false);
    EXPECT_FALSE(begun_.request || again_.request);
    EXPECT_TRUE(begun_.error && again_.error);
    EXPECT_EQ(world_->processCount(), 0u);
    EXPECT_EQ(world_->linesWith("extensions are not launched"), 1u);
}

TEST_F(UnsandboxedExtensionTest, IsLaunchedWhereTheAdministratorHasAllowedItInSoManyWords) {
    launch(true);
    EXPECT_TRUE(begun_.request && again_.request);
    EXPECT_EQ(world_->processCount(), 1u);
    EXPECT_EQ(world_->linesWith("extensions run WITHOUT a sandbox"), 1u);
}

TEST(UnsandboxedExtensions, AreAllowedByTheAdministratorsFileAlone) {
    const ScratchDirectory scratch;
    const unsigned self = ::geteuid();
    const auto allowed = [&](unsigned owner) {
        return unsandboxedExtensionsAllowed({scratch.path("first"), scratch.path("second")}, owner);
    };
    EXPECT_FALSE(allowed(self)) << "no file says so";
    const std::string second = scratch.write("second/daemon.conf", "AllowUnsandboxedExtensions=true\n");
    ::chmod(second.c_str(), 0644);
    EXPECT_TRUE(allowed(self));
    EXPECT_FALSE(allowed(self + 1)) << "a file of somebody else's";
    ::chmod(second.c_str(), 0664);
    EXPECT_FALSE(allowed(self)) << "a file that others may write";
    ::chmod(second.c_str(), 0644);
    ::chmod(scratch.write("first/daemon.conf", "AllowUnsandboxedExtensions=false\n").c_str(), 0644);
    EXPECT_FALSE(allowed(self)) << "the first that has the key decides";
    for (const char* text : {"AllowUnsandboxedExtensions=1\n", "AllowUnsandboxedExtensions=\"true\"\n",
                             "[Section]\nAllowUnsandboxedExtensions=true\n", "allowunsandboxedextensions=true\n"}) {
        scratch.write("first/daemon.conf", text);
        scratch.write("second/daemon.conf", text);
        EXPECT_FALSE(allowed(self)) << text;
    }
}

}  // namespace
}  // namespace lumacast
