// Extensions as folders on the disk: which are found, and which are not.

#include "linux/extensions/InstalledExtensions.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "base/Limits.h"
#include "tests/contract/ExtensionTools.h"
#include "tests/contract/LinuxExtensionsWorld.h"

namespace lumacast {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

class InstalledExtensionsTest : public ::testing::Test {
protected:
    std::string folder(const std::string& name, const std::string& data = "user") const {
        return data + "/lumacast/extensions/" + name;
    }
    void install(const std::string& name, const std::string& manifest, const std::string& data = "user") {
        scratch_.write(folder(name, data) + "/manifest.json", manifest);
        fs::permissions(scratch_.write(folder(name, data) + "/program", "#!/bin/true\n"), fs::perms(0755));
    }
    static std::string manifest(const std::string& identifier, const std::string& more = {}) {
        return R"({"identifier": ")" + identifier + R"(", "extensionPoint": "p", "executable": "program")" +
               (more.empty() ? "" : ", " + more) + "}";
    }
    std::vector<std::shared_ptr<const InstalledExtension>> look() {
        auto found = installed_.look();
        auto* extensions = std::get_if<std::vector<std::shared_ptr<const InstalledExtension>>>(&found);
        return extensions ? std::move(*extensions) : std::vector<std::shared_ptr<const InstalledExtension>>{};
    }
    std::vector<std::string> identifiers() {
        std::vector<std::string> all;
        for (const auto& extension : look()) all.push_back(extension->manifest.identifier);
        return all;
    }
    std::vector<std::string> lines() const { return log_.recentLines(); }
    /// It is passed over with one line that says why, however often it is looked at; mended, it is there.
    void expectPassedOver(const std::string& reason) {
        const std::size_t before = lines().size();
        for (int i = 0; i < 3; ++i) EXPECT_THAT(identifiers(), IsEmpty()) << reason;
        ASSERT_EQ(lines().size(), before + 1) << reason;
        EXPECT_THAT(lines().back(), HasSubstr(reason));
        EXPECT_THAT(lines().back(), HasSubstr("the extension in " + scratch_.path("user")));
    }

    ScratchDirectory scratch_;
    Log log_;
    InstalledExtensions installed_{
        log_, {scratch_.path("user"), scratch_.path("share")}, userLocales("de:fr", "de_DE")};
};

TEST_F(InstalledExtensionsTest, TheUsersComeFirstAndWithinADirectoryTheIdentifiersDecide) {
    install("z", manifest("org.example.a"), "share");
    install("a", manifest("org.example.c"), "share");
    install("m", manifest("org.example.b"));
    install("n", manifest("org.example.z"));
    EXPECT_THAT(identifiers(), ElementsAre("org.example.b", "org.example.z", "org.example.a", "org.example.c"));
}

TEST_F(InstalledExtensionsTest, OfTwoWithTheSameIdentifierTheFirstCounts) {
    install("b", manifest("org.example.x", R"("processMode": "of the user")"));
    install("a", manifest("org.example.x", R"("processMode": "of the system")"), "share");
    const auto found = look();
    ASSERT_EQ(found.size(), 1u);
    EXPECT_EQ(found[0]->manifest.processMode, "of the user");
}

TEST_F(InstalledExtensionsTest, AManifestThatIsMalformedIsPassedOverWithOneLineUntilItChanges) {
    const std::string cases[][2] = {
        {"", "not a JSON object"},
        {"[]", "not a JSON object"},
        {"{\"identifier\": ", "not a JSON object"},
        {R"({"extensionPoint": "p", "executable": "program"})", "identifier"},
        {R"({"identifier": 5, "extensionPoint": "p", "executable": "program"})", "identifier"},
        {R"({"identifier": "a/b", "extensionPoint": "p", "executable": "program"})", "identifier"},
        {R"({"identifier": "a", "executable": "program"})", "extensionPoint"},
        {R"({"identifier": "a", "extensionPoint": "p"})", "executable"},
        {R"({"identifier": "a", "extensionPoint": "p", "executable": "/usr/bin/env"})", "executable"},
        {R"({"identifier": "a", "extensionPoint": "p", "executable": "../program"})", "executable"},
        {R"({"identifier": "a", "extensionPoint": "p", "executable": "x/../../program"})", "executable"},
        {R"({"identifier": "a", "extensionPoint": "p", "executable": "x//program"})", "executable"},
        {R"({"identifier": "a", "extensionPoint": "p", "executable": "not-there"})", "not in its folder"},
        {manifest("a", R"("icons": "icon.png")"), "icons"},
        {manifest("a", R"("icons": ["../../secret.png"])"), "icons"},
        {manifest("a", R"("grants": [])"), "grants"},
        {manifest("a", R"("grants": {"network": "yes"})"), "grants"},
        {manifest("a", R"("grants": {"everything": true})"), "grants"},
        {manifest("a", R"("grants": {"directories": ["relative"]})"), "grants"},
        {manifest("a", R"("grants": {"directories": ["/srv/../home"]})"), "grants"},
        {manifest("a", R"("grants": {"directories": ["/"]})"), "grants"},
        {manifest("a", R"("grants": {"environment": ["LD_PRELOAD"]})"), "grants"},
        {manifest("a", R"("grants": {"environment": ["A=B"]})"), "grants"},
        {manifest("a", R"("grants": {"environment": ["PATH"]})"), "grants"},
        {std::string(70'000, ' ') + manifest("a"), "too large"},
    };
    for (const auto& [text, reason] : cases) {
        install("one", text);
        expectPassedOver(reason);
    }
    install("one", manifest("a"));
    EXPECT_THAT(identifiers(), ElementsAre("a"));
}

TEST_F(InstalledExtensionsTest, WhatOthersMayWriteIsPassedOver) {
    install("one", manifest("a"));
    EXPECT_THAT(identifiers(), ElementsAre("a"));
    const std::string folder = scratch_.path(this->folder("one"));
    for (const std::string& path : {folder, folder + "/manifest.json", folder + "/program"}) {
        const auto before = fs::status(path).permissions();
        for (const fs::perms others : {fs::perms::group_write, fs::perms::others_write}) {
            fs::permissions(path, before | others);
            expectPassedOver("can be written by others");
            fs::permissions(path, before);
            EXPECT_THAT(identifiers(), ElementsAre("a")) << path;
        }
    }
}

TEST_F(InstalledExtensionsTest, WhatBelongsToSomebodyElseIsPassedOver) {
    if (::geteuid() != 0) return;  // only the administrator can give files away
    install("one", manifest("a"));
    const std::string folder = scratch_.path(this->folder("one"));
    for (const std::string& path : {folder, folder + "/manifest.json", folder + "/program"}) {
        ASSERT_EQ(::chown(path.c_str(), 12345, 0), 0);
        expectPassedOver("belongs to another user");
        ASSERT_EQ(::chown(path.c_str(), 0, 0), 0);
        EXPECT_THAT(identifiers(), ElementsAre("a")) << path;
    }
}

TEST_F(InstalledExtensionsTest, ALinkOutOfTheFolderIsNotFollowedOneWithinIs) {
    install("one", manifest("a"));
    const std::string folder = scratch_.path(this->folder("one"));
    fs::rename(folder + "/program", folder + "/real");
    fs::create_symlink("real", folder + "/program");
    const auto found = look();
    ASSERT_EQ(found.size(), 1u);
    EXPECT_EQ(found[0]->program, folder + "/real");
    for (const char* target : {"/usr/bin/env", "../../../../outside"}) {
        fs::permissions(scratch_.write("outside", "#!/bin/true\n"), fs::perms(0755));
        fs::remove(folder + "/program");
        fs::create_symlink(target, folder + "/program");
        EXPECT_THAT(identifiers(), IsEmpty()) << target;
    }
    EXPECT_THAT(lines().back(), HasSubstr("not in its folder"));
}

TEST_F(InstalledExtensionsTest, APipeInAManifestsPlaceIsNotWaitedFor) {
    install("one", manifest("a"));
    fs::remove(scratch_.path(folder("one") + "/manifest.json"));
    ASSERT_EQ(::mkfifo(scratch_.path(folder("one") + "/manifest.json").c_str(), 0600), 0);
    expectPassedOver("no manifest");
}

TEST_F(InstalledExtensionsTest, AnExecutableThatCantBeRunIsNone) {
    install("one", manifest("a"));
    fs::permissions(scratch_.path(folder("one") + "/program"), fs::perms(0644));
    expectPassedOver("can't be run");
    fs::permissions(scratch_.path(folder("one") + "/program"), fs::perms(0755));
    EXPECT_THAT(identifiers(), ElementsAre("a")) << "seen as soon as it is mended";
}

TEST_F(InstalledExtensionsTest, AChangedManifestIsReadAgain) {
    install("one", manifest("a", R"("processMode": "one")"));
    EXPECT_EQ(look().at(0)->manifest.processMode, "one");
    install("one", manifest("a", R"("processMode": "two")"));
    EXPECT_EQ(look().at(0)->manifest.processMode, "two");
}

TEST_F(InstalledExtensionsTest, TheNameIsTheUsersLanguagesBest) {
    install("one", manifest("a", R"("displayName": "plain", "displayName[fr]": "nom", "displayName[es]": "nombre")"));
    install("two", manifest("b", R"("displayName": "plain", "displayName[fr]": "nom", "displayName[de]": "Name")"));
    install("three", manifest("c"));
    std::vector<std::string> names;
    for (const auto& extension : look())
        names.push_back(*extension->information.find("DisplayName")->as<std::string>());
    EXPECT_THAT(names, ElementsAre("nom", "Name", "c"));
}

TEST_F(InstalledExtensionsTest, IconsThatAreNoPngOrTooLargeAreLeftOut) {
    install("one", manifest("a", R"("icons": ["not-there.png", "text.png", "large.png", "good.png", "link.png"])"));
    const std::string png = "\x89PNG\r\n\x1a\n";
    scratch_.write(folder("one") + "/text.png", "no picture");
    scratch_.write(folder("one") + "/large.png", png + std::string(1 << 20, 'x'));
    scratch_.write(folder("one") + "/good.png", png + "good");
    fs::create_symlink(scratch_.write("secret.png", png + "secret"), scratch_.path(folder("one") + "/link.png"));
    const auto icons = readIcons(*look().at(0));
    ASSERT_EQ(icons.size(), 1u);
    EXPECT_EQ(std::string(icons[0].begin() + 8, icons[0].end()), "good");
}

/// Every limit that the port's extensions keep: one overflow for each row. A new row without its case does not compile.
class ExtensionLimitTest : public ::testing::TestWithParam<LimitRow> {
protected:
    static void overflowInstalled(std::uint64_t limit) {
        LinuxExtensionsWorld world;
        const auto number = [](std::uint64_t i) { return std::to_string(1000 + i); };
        for (std::uint64_t i = 0; i <= limit; ++i) {
            ExtensionToInstall extension{"org.example." + number(i)};
            const std::string place = "data/lumacast/extensions/" + number(i);
            world.scratch().write(place + "/manifest.json", LinuxExtensionsWorld::manifestOf(extension));
            fs::permissions(world.scratch().write(place + "/program", "#!/bin/true\n"), fs::perms(0755));
            if (i + 1 != limit) continue;
            EXPECT_EQ(findExtensions(world).found.size(), limit);
            EXPECT_EQ(world.linesWith("extensions are installed"), 0u) << "the limit itself is fine";
        }
        const auto found = findExtensions(world).found;
        ASSERT_EQ(found.size(), limit);
        EXPECT_EQ(found.back()->identifier().text(), "org.example." + number(limit - 1)) << "the first ones";
        EXPECT_EQ(findExtensions(world).found.size(), limit);
        EXPECT_EQ(world.linesWith("extensions are installed"), 1u);
    }

    static void overflowItems(std::uint64_t limit) {
        LinuxExtensionsWorld world;
        world.install({"org.example.Upload"});
        const auto extension = findExtensions(world).found.at(0);
        Completions completions(*extension);
        for (const std::uint64_t count : {limit, limit + 1}) {
            ASSERT_TRUE(begin(*extension, "many", {textItem("count", std::to_string(count))}).request);
            ASSERT_TRUE(eventually([&] { return completions.count() == 1; }));
            EXPECT_EQ(completions.take().front().items.size(), limit);
            EXPECT_EQ(world.linesWith("has returned more than"), count == limit ? 0u : 1u);
        }
    }

    static void overflowRequests(std::uint64_t limit) {
        LinuxExtensionsWorld world;
        world.install({"org.example.Upload"});
        const auto extension = findExtensions(world).found.at(0);
        for (std::uint64_t i = 0; i < limit; ++i) ASSERT_TRUE(begin(*extension, "hold").request) << i;
        EXPECT_EQ(world.linesWith("too many requests"), 0u) << "the limit itself is fine";
        const auto excess = begin(*extension, "hold");
        ASSERT_TRUE(excess.error);
        EXPECT_EQ(excess.error->code(), EAGAIN);
        EXPECT_EQ(world.linesWith("too many requests"), 1u);
    }
};

TEST_P(ExtensionLimitTest, IsKept) {
    const Limit limit = GetParam().limit;
    switch (limit) {
        case Limit::ExtensionsInstalled: return overflowInstalled(limitOf(limit));
        case Limit::ExtensionItemsReturned: return overflowItems(limitOf(limit));
        case Limit::ExtensionRequestsInFlight: return overflowRequests(limitOf(limit));
        case Limit::MessageBytes:
        case Limit::MessageDepth:
        case Limit::HandlesPerMessage:
        case Limit::ConnectionsPerUser:
        case Limit::MessagesInFlight:
        case Limit::QueuedBytesPerReader:
        case Limit::ContextIdentifiersPerRequest:
        case Limit::HelloBytes:
        case Limit::PlanesLeased:
        case Limit::MessageValues:
        case Limit::HeldBytesPerUser:
        case Limit::ConnectionsBeforeHello:
        case Limit::RequestsWithoutReply:
        case Limit::StartsWaitingForUser:
        case Limit::StartsOfApplicationWaitingForUser:
        case Limit::ArchiveBytes:
        case Limit::ArchiveDepth:
        case Limit::FramesAtExtension: FAIL() << "not kept by the extensions";
    }
    FAIL() << "no overflow for this limit";
}

std::vector<LimitRow> limitsOfExtensions() {
    std::vector<LimitRow> rows(kLimits.begin(), kLimits.end());
    std::erase_if(rows, [](const LimitRow& row) { return row.keeper != LimitKeeper::Extensions; });
    return rows;
}
INSTANTIATE_TEST_SUITE_P(Row, ExtensionLimitTest, ::testing::ValuesIn(limitsOfExtensions()));

}  // namespace
}  // namespace lumacast
