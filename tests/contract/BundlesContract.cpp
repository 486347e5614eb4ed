#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <map>

#include "linux/apps/LinuxBundles.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/fakes/FakeBundles.h"
#include "tests/unit/linux_apps/RunningProgram.h"

namespace lumacast {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::UnorderedElementsAre;

const BundleIdentifier kPlayer("org.example.Player");

/// An installed application, as the user sees it.
struct Application {
    BundleIdentifier identifier;
    std::string name;
    std::optional<std::string> nameInUsersLanguage;
};

/// A user who speaks German, then English, and what is installed for that user.
class BundlesWorld {
public:
    virtual ~BundlesWorld() = default;
    virtual Bundles& bundles() = 0;
    virtual void install(const Application& application) = 0;
    virtual void uninstall(const BundleIdentifier& identifier) = 0;
    /// Gives the application's icon in this format.
    virtual void setIcon(const BundleIdentifier& identifier, IconFormat format, const Data& png) = 0;
    /// Starts the application; nothing when that is not possible.
    virtual std::optional<ProcessID> run(const BundleIdentifier& identifier) = 0;
    virtual void end(ProcessID pid) = 0;
    /// Starts a program that belongs to no application.
    virtual std::optional<ProcessID> runTool() = 0;
    /// Makes the framework's resource bundle: the texts of the table "Localizable" by language and key. English is its
    /// development language.
    virtual void installFramework(const std::map<std::string, std::map<std::string, std::string>>& texts) = 0;
};

class FakeBundlesWorld final : public BundlesWorld {
public:
    FakeBundlesWorld() { bundles_.setPreferredLanguages({"de", "en"}); }
    Bundles& bundles() override { return bundles_; }
    void install(const Application& application) override {
        FakeBundle bundle;
        bundle.bundleIdentifier = application.identifier;
        bundle.path = "/fake/apps/" + application.identifier.text();
        bundle.infos = {{std::string(kInfoName), application.name}, {std::string(kInfoIcon), "the-icon"}};
        if (application.nameInUsersLanguage)
            bundle.localizedInfos = {{std::string(kInfoDisplayName), *application.nameInUsersLanguage}};
        bundles_.install(std::move(bundle));
    }
    void uninstall(const BundleIdentifier& identifier) override { bundles_.uninstall(identifier); }
    void setIcon(const BundleIdentifier& identifier, IconFormat format, const Data& png) override {
        bundles_.setIcon(identifier, format, png);
    }
    std::optional<ProcessID> run(const BundleIdentifier& identifier) override {
        bundles_.run(ProcessID(++last_), identifier);
        return ProcessID(last_);
    }
    void end(ProcessID pid) override { bundles_.processEnded(pid); }
    std::optional<ProcessID> runTool() override {
        bundles_.runExecutable(ProcessID(++last_), "/fake/bin/tool");
        return ProcessID(last_);
    }
    void installFramework(const std::map<std::string, std::map<std::string, std::string>>& texts) override {
        FakeBundle framework;
        framework.path = bundles_.frameworkBundlePath();
        for (const auto& [language, table] : texts) {
            FakeBundle folder;
            folder.path = framework.path + "/" + language + ".lproj";
            folder.tables["Localizable"] = {table.begin(), table.end()};
            framework.languages.push_back(language);
            framework.resources.emplace(language + "/Localizable.strings", folder.path + "/Localizable.strings");
            if (language == "en") framework.tables = folder.tables;
            bundles_.install(std::move(folder));
        }
        bundles_.install(std::move(framework));
    }

private:
    FakeBundles bundles_;
    std::int32_t last_ = 1000;
};

class PortBundlesWorld final : public BundlesWorld {
public:
    PortBundlesWorld() : bundles_(options()) {}
    Bundles& bundles() override { return bundles_; }
    void install(const Application& application) override {
        const std::string& id = application.identifier.text();
        installExecutable(scratch_.path("bin/" + id));
        std::string entry = "[Desktop Entry]\nType=Application\nName=" + application.name + "\nIcon=the-icon\nExec=" + id + " %U\n";
        if (application.nameInUsersLanguage) entry += "Name[de]=" + *application.nameInUsersLanguage + "\n";
        scratch_.write("applications/" + id + ".desktop", entry);
    }
    void uninstall(const BundleIdentifier& identifier) override {
        std::filesystem::remove(scratch_.path("applications/" + identifier.text() + ".desktop"));
    }
    void setIcon(const BundleIdentifier&, IconFormat format, const Data& png) override {
        const char* const sizes[] = {"32x32", "64x64", "128x128"};
        scratch_.write("data/icons/hicolor/" + std::string(sizes[static_cast<int>(format)]) + "/apps/the-icon.png",
                       std::string(png.begin(), png.end()));
    }
    std::optional<ProcessID> run(const BundleIdentifier& identifier) override {
        return start(scratch_.path("bin/" + identifier.text()));
    }
    void end(ProcessID pid) override { running_.erase(pid); }
    std::optional<ProcessID> runTool() override { return start(installExecutable(scratch_.path("bin/tool"))); }
    void installFramework(const std::map<std::string, std::map<std::string, std::string>>& texts) override {
        for (const auto& [language, table] : texts) {
            std::string strings = "/* by a test */\n";
            for (const auto& [key, text] : table) strings += "\"" + key + "\" = \"" + text + "\";\n";
            scratch_.write("Framework.bundle/" + language + ".lproj/Localizable.strings", strings);
        }
    }

private:
    LinuxBundles::Options options() {
        LinuxBundles::Options result;
        result.applicationDirectories = {scratch_.makeDirectory("applications")};
        result.searchPath = {scratch_.makeDirectory("bin")};
        result.frameworkBundlePath = scratch_.path("Framework.bundle");
        result.locales = userLocales("de:en", "");
        result.icons = {scratch_.path("home"), {scratch_.path("data")}, {}};
        result.patience = std::chrono::seconds(30);
        return result;
    }
    std::optional<ProcessID> start(const std::string& program) {
        auto running = std::make_unique<RunningProgram>(program);
        const ProcessID pid = running->pid();
        if (number(pid) <= 0) return std::nullopt;
        running_.emplace(pid, std::move(running));
        return pid;
    }

    ScratchDirectory scratch_;
    std::map<ProcessID, std::unique_ptr<RunningProgram>> running_;
    LinuxBundles bundles_;
};

using Maker = std::function<std::unique_ptr<BundlesWorld>()>;

class BundlesContract : public ::testing::TestWithParam<Maker> {
protected:
    std::shared_ptr<const Bundle> bundleOf(ProcessID pid) {
        const auto executable = bundles_.executablePath(pid);
        const auto path = executable ? bundles_.bundlePathForExecutable(*executable) : std::nullopt;
        return path ? bundles_.open(*path) : nullptr;
    }
    std::unique_ptr<BundlesWorld> world_ = GetParam()();
    Bundles& bundles_ = world_->bundles();
};

TEST_P(BundlesContract, AProcessLeadsToItsApplication) {
    world_->install({kPlayer, "Player", "Spieler"});
    const auto pid = world_->run(kPlayer);
    ASSERT_TRUE(pid);
    const auto bundle = bundleOf(*pid);
    ASSERT_TRUE(bundle);
    EXPECT_EQ(bundle->identifier(), kPlayer);
    EXPECT_EQ(bundle->localizedInfo(kInfoDisplayName), "Spieler");
    EXPECT_EQ(bundle->info(kInfoName), "Player");
    EXPECT_EQ(bundle->info(kInfoIcon), "the-icon");
    EXPECT_EQ(bundle->info("NoSuchKey"), std::nullopt);
    EXPECT_EQ(bundle->localizedInfo("NoSuchKey"), std::nullopt);
}

TEST_P(BundlesContract, AnUntranslatedNameIsNoLocalizedOne) {
    world_->install({kPlayer, "Player", std::nullopt});
    const auto bundle = bundles_.withIdentifier(kPlayer);
    ASSERT_TRUE(bundle);
    EXPECT_EQ(bundle->localizedInfo(kInfoDisplayName), std::nullopt);
    EXPECT_EQ(bundle->info(kInfoName), "Player");
}

TEST_P(BundlesContract, ApplicationsAreApart) {
    const BundleIdentifier other("org.example.Other");
    world_->install({kPlayer, "Player", std::nullopt});
    world_->install({other, "Other", std::nullopt});
    const auto player = world_->run(kPlayer);
    const auto second = world_->run(other);
    ASSERT_TRUE(player && second);
    ASSERT_TRUE(bundleOf(*player) && bundleOf(*second));
    EXPECT_EQ(bundleOf(*player)->identifier(), kPlayer);
    EXPECT_EQ(bundleOf(*second)->identifier(), other);
}

TEST_P(BundlesContract, AToolBelongsToNoApplication) {
    world_->install({kPlayer, "Player", std::nullopt});
    const auto pid = world_->runTool();
    ASSERT_TRUE(pid);
    EXPECT_TRUE(bundles_.executablePath(*pid));
    EXPECT_FALSE(bundleOf(*pid));
}

TEST_P(BundlesContract, AnEndedProcessHasNoExecutable) {
    world_->install({kPlayer, "Player", std::nullopt});
    const auto pid = world_->run(kPlayer);
    ASSERT_TRUE(pid);
    EXPECT_TRUE(bundles_.executablePath(*pid));
    world_->end(*pid);
    EXPECT_EQ(bundles_.executablePath(*pid), std::nullopt);
    EXPECT_EQ(bundles_.executablePath(ProcessID(0)), std::nullopt);
    EXPECT_EQ(bundles_.executablePath(ProcessID(-1)), std::nullopt);
}

TEST_P(BundlesContract, WhatIsInstalledAndUninstalledIsSeen) {
    EXPECT_FALSE(bundles_.withIdentifier(kPlayer));
    world_->install({kPlayer, "Player", std::nullopt});
    EXPECT_TRUE(bundles_.withIdentifier(kPlayer));
    EXPECT_FALSE(bundles_.withIdentifier(BundleIdentifier("org.example.play")));
    world_->uninstall(kPlayer);
    EXPECT_FALSE(bundles_.withIdentifier(kPlayer));
}

TEST_P(BundlesContract, NothingOpensWhereNothingIs) {
    EXPECT_FALSE(bundles_.open("/no/such/folder"));
    EXPECT_FALSE(bundles_.open(""));
    EXPECT_EQ(bundles_.bundlePathForExecutable("/no/such/program"), std::nullopt);
    EXPECT_EQ(bundles_.bundlePathForExecutable(""), std::nullopt);
}

TEST_P(BundlesContract, AFolderOfResourcesHasItsLocalizations) {
    world_->installFramework({{"en", {{"A", "one"}, {"B", "two"}}}, {"de", {{"A", "eins"}}}, {"pt-BR", {{"A", "um"}}}});
    const auto framework = bundles_.open(bundles_.frameworkBundlePath());
    ASSERT_TRUE(framework);
    EXPECT_EQ(framework->resourcePath(), bundles_.frameworkBundlePath());
    EXPECT_THAT(framework->localizations(), UnorderedElementsAre("en", "de", "pt-BR"));
    EXPECT_EQ(framework->resource("Localizable", "strings", "de"),
              bundles_.frameworkBundlePath() + "/de.lproj/Localizable.strings");
    EXPECT_EQ(framework->resource("Localizable", "strings", "fr"), std::nullopt);
    EXPECT_EQ(framework->resource("Other", "strings", "de"), std::nullopt);
}

TEST_P(BundlesContract, TextsComeFromTheFolderOrTheDevelopmentLanguage) {
    world_->installFramework({{"en", {{"A", "one"}, {"B", "two"}}}, {"de", {{"A", "eins"}}}});
    const auto framework = bundles_.open(bundles_.frameworkBundlePath());
    const auto german = bundles_.open(bundles_.frameworkBundlePath() + "/de.lproj");
    ASSERT_TRUE(framework && german);
    EXPECT_EQ(framework->string("A", "Localizable"), "one");
    EXPECT_EQ(framework->string("B", "Localizable"), "two");
    EXPECT_EQ(german->string("A", "Localizable"), "eins");
    EXPECT_EQ(german->string("B", "Localizable"), std::nullopt);
    EXPECT_EQ(german->string("A", "Other"), std::nullopt);
    EXPECT_EQ(german->identifier(), std::nullopt);
}

TEST_P(BundlesContract, TheUsersLanguagesAreInTheirOrder) {
    EXPECT_THAT(bundles_.preferredLanguages(), ElementsAre("de", "en"));
    EXPECT_THAT(bundles_.preferredLocalizations({"en", "fr", "de"}), ElementsAre("de", "en"));
    EXPECT_THAT(bundles_.preferredLocalizations({"fr", "it"}), IsEmpty());
    EXPECT_THAT(bundles_.preferredLocalizations({}), IsEmpty());
}

TEST_P(BundlesContract, AnApplicationsIconIsThePngOfItsFormat) {
    world_->install({kPlayer, "Player", std::nullopt});
    EXPECT_EQ(bundles_.applicationIcon(kPlayer, IconFormat::Medium), std::nullopt);
    const std::pair<IconFormat, std::uint8_t> formats[] = {
        {IconFormat::Small, 1}, {IconFormat::Medium, 2}, {IconFormat::Large, 3}};
    const auto png = [](std::uint8_t contents) { return Data{0x89, 'P', 'N', 'G', '\r', '\n', 0x1a, '\n', contents}; };
    for (const auto& [format, contents] : formats) world_->setIcon(kPlayer, format, png(contents));
    for (const auto& [format, contents] : formats) EXPECT_EQ(bundles_.applicationIcon(kPlayer, format), png(contents));
    EXPECT_EQ(bundles_.applicationIcon(BundleIdentifier("org.example.Other"), IconFormat::Large), std::nullopt);
    world_->uninstall(kPlayer);
    EXPECT_EQ(bundles_.applicationIcon(kPlayer, IconFormat::Large), std::nullopt);
}

INSTANTIATE_TEST_SUITE_P(Fake, BundlesContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeBundlesWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, BundlesContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortBundlesWorld>(); })));

}  // namespace
}  // namespace lumacast
