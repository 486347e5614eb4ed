// Which extensions are found, in which order, and what they declare.

#include "broadcast/ExtensionDiscovery.h"

#include <gtest/gtest.h>

#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/StubExtension.h"

namespace lumacast {
namespace {

constexpr char kPoint[] = "com.orvane.broadcast-services-upload";

class Discovery : public ::testing::Test {
protected:
    ~Discovery() override { world_.scheduler.endWorld(); }

    void install(const std::string& identifier, Dictionary attributes = {}, const std::string& point = kPoint) {
        FakeInstalledExtension extension;
        extension.identifier = BundleIdentifier(identifier);
        extension.point = point;
        extension.attributes = std::move(attributes);
        fakes_.appExtensions.install(std::move(extension));
    }
    static Dictionary rule(Dictionary entries) {
        return {{std::string(kExtensionActivationRule), Value(std::move(entries))}};
    }
    ExtensionDiscovery::Completion note() {
        return [this](const std::vector<std::shared_ptr<AppExtension>>& found, const std::optional<Error>& error) {
            ++answers_;
            error_ = error;
            found_.clear();
            for (const auto& extension : found) found_.push_back(extension->identifier().text());
        };
    }
    using Names = std::vector<std::string>;
    Names found() {
        world_.scheduler.runUntilIdle();
        EXPECT_EQ(answers_, 1);
        answers_ = 0;
        return found_;
    }

    SimWorld world_{1};
    FakePlatform& fakes_ = world_.fakes;
    ExtensionDiscovery discovery_{fakes_.log, fakes_.appExtensions};
    int answers_ = 0;
    Names found_;
    std::optional<Error> error_;
};

TEST_F(Discovery, FindsThoseOfThePointInThePlatformsOrderAndLogsThePointOfEachItLooksAt) {
    install("org.example.Zebra.upload");
    install("org.example.Ant.upload");
    install("org.example.Other", {}, "com.orvane.broadcast-services");
    discovery_.extensionsWithMatchingPointName(kPoint, note());
    EXPECT_EQ(found(), (Names{"org.example.Zebra.upload", "org.example.Ant.upload"}));
    discovery_.extensionsWithMatchingPointName(kPoint, BaseIdentifier{"org.example.Ant"}, note());
    EXPECT_EQ(found(), Names{"org.example.Ant.upload"});
    EXPECT_EQ(fakes_.logSink.count(kPoint), 4u);  // the one that was passed over too
    EXPECT_EQ(fakes_.appExtensions.lookups(), (Names{kPoint, kPoint}));
}

TEST_F(Discovery, ABaseIdentifierIsAPlainPrefixWithoutASeparator) {
    install("org.example.X.upload");
    install("org.example.Xtra");
    install("org.example.xylophone");
    install("com.org.example.X");
    discovery_.extensionsWithMatchingPointName(kPoint, BaseIdentifier{"org.example.X"}, note());
    EXPECT_EQ(found(), (Names{"org.example.X.upload", "org.example.Xtra"}));
    discovery_.extensionsWithMatchingPointName(kPoint, BaseIdentifier{""}, note());
    EXPECT_EQ(found().size(), 4u);
}

TEST_F(Discovery, WithoutARuleAnExtensionIsKeptByAnUnwantedRuleAndDroppedByAWantedOne) {
    install("org.example.NoRule");
    install("org.example.Malformed", {{std::string(kExtensionActivationRule), "TRUEPREDICATE"}});
    discovery_.extensionsWithMatchingPointName(kPoint, UnwantedActivationRule{"Streams"}, note());
    EXPECT_EQ(found(), (Names{"org.example.NoRule", "org.example.Malformed"}));
    discovery_.extensionsWithMatchingPointName(kPoint, ActivationRule{"Streams"}, note());
    EXPECT_EQ(found(), Names{});
    // The unwanted rule is not consulted then.
    discovery_.extensionsWithMatchingPointName(kPoint, std::nullopt, ActivationRule{"Streams"},
                                               UnwantedActivationRule{"Other"}, note());
    EXPECT_EQ(found(), Names{});
}

TEST_F(Discovery, ARulesValueDecides) {
    install("org.example.True", rule({{"Streams", true}}));
    install("org.example.One", rule({{"Streams", 1}}));
    install("org.example.False", rule({{"Streams", false}}));
    install("org.example.Zero", rule({{"Streams", 0}}));
    install("org.example.Without", rule({{"Else", true}}));
    discovery_.extensionsWithMatchingPointName(kPoint, ActivationRule{"Streams"}, note());
    EXPECT_EQ(found(), (Names{"org.example.True", "org.example.One"}));
    discovery_.extensionsWithMatchingPointName(kPoint, BaseIdentifier{"org"}, UnwantedActivationRule{"Streams"}, note());
    EXPECT_EQ(found(), (Names{"org.example.False", "org.example.Zero", "org.example.Without"}));
    discovery_.extensionsWithMatchingPointName(kPoint, std::nullopt, ActivationRule{"Streams"},
                                               UnwantedActivationRule{"Streams"}, note());
    EXPECT_EQ(found(), Names{});
}

TEST_F(Discovery, AnErrorIsPassedOnWithAnEmptyListAndAMissingCompletionIsNoHarm) {
    install("org.example.X.upload");
    fakes_.faults.failNext("AppExtensions.match");
    discovery_.extensionsWithMatchingPointName(kPoint, note());
    EXPECT_EQ(found(), Names{});
    ASSERT_TRUE(error_);
    EXPECT_EQ(error_->code(), 2);
    discovery_.extensionsWithMatchingPointName(kPoint, {});
    world_.scheduler.runUntilIdle();
    EXPECT_EQ(answers_, 0);
}

class Mode final : public StubExtension {
public:
    explicit Mode(Dictionary info) : StubExtension(BundleIdentifier("org.example.X")), info_(std::move(info)) {}
    const Dictionary& infoDictionary() const override { return info_; }

private:
    const Dictionary info_;
};

TEST(ProcessMode, IsSamplesForTheExactValueInTheExtensionsOwnDictionaryOnly) {
    const auto mode = [](Dictionary info) { return ExtensionDiscovery::processMode(Mode(std::move(info))); };
    const std::string key = "LCBroadcastProcessMode", value = "LCBroadcastProcessModeSampleBuffer";
    EXPECT_EQ(mode({{"Extension", Dictionary{{key, value}}}}), 1);
    EXPECT_EQ(mode({{"Extension", Dictionary{{key, "LCBroadcastProcessModeMP4Clip"}}}}), 0);
    EXPECT_EQ(mode({{"Extension", Dictionary{{key, "lcbroadcastprocessmodesamplebuffer"}}}}), 0);
    EXPECT_EQ(mode({{"Extension", Dictionary{{key, 1}}}}), 0);
    EXPECT_EQ(mode({{"Extension", Dictionary()}}), 0);
    EXPECT_EQ(mode({{key, value}}), 0);
    EXPECT_EQ(mode({{"Extension", value}}), 0);
    EXPECT_EQ(mode({}), 0);
}

TEST(InputItem, HasItsTitleAndOneAttachmentOfGenericData) {
    const ExtensionItem item = ExtensionDiscovery::itemWithTitle("title", Data{1, 2});
    EXPECT_EQ(item.attributedTitle, "title");
    ASSERT_EQ(item.attachments.size(), 1u);
    EXPECT_EQ(item.attachments[0].typeIdentifier, kGenericDataType);
    EXPECT_EQ(item.attachments[0].item, Value(Data{1, 2}));
    EXPECT_TRUE(ExtensionDiscovery::itemWithTitle("title", Value()).attachments.at(0).item.isNull());
}

}  // namespace
}  // namespace lumacast
