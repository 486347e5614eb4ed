#include <gtest/gtest.h>

#include <functional>

#include "linux/system/LinuxDeviceInfo.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/fakes/FakeDeviceInfo.h"

namespace lumacast {
namespace {

using Number = std::optional<std::int64_t>;

class DeviceInfoWorld {
public:
    virtual ~DeviceInfoWorld() = default;
    virtual const DeviceInfo& device() = 0;
    virtual void describe(Number idiom, Number chip, Number reducedChip) = 0;
    /// Its region has this rule.
    virtual void setRule(const std::string& name, bool value) = 0;
};

class FakeDeviceInfoWorld final : public DeviceInfoWorld {
public:
    const DeviceInfo& device() override { return device_; }
    void describe(Number idiom, Number chip, Number reducedChip) override {
        device_.setUserInterfaceIdiom(idiom);
        device_.setChipID(chip);
        device_.setReducedCaptureChipID(reducedChip);
    }
    void setRule(const std::string& name, bool value) override { device_.setRegionalRule(name, value); }

private:
    FakeDeviceInfo device_;
};

class PortDeviceInfoWorld final : public DeviceInfoWorld {
public:
    const DeviceInfo& device() override { return device_; }
    void describe(Number idiom, Number chip, Number reducedChip) override {
        std::string text;
        if (idiom) text += "Idiom=" + std::to_string(*idiom) + "\n";
        if (chip) text += "ChipID=" + std::to_string(*chip) + "\n";
        if (reducedChip) text += "ReducedCaptureChipID=" + std::to_string(*reducedChip) + "\n";
        numbers_ = text;
        write();
    }
    void setRule(const std::string& name, bool value) override {
        rules_ += name + (value ? "=yes\n" : "=no\n");
        write();
    }

private:
    void write() { scratch_.write("device.conf", numbers_ + "[Region]\n" + rules_); }

    std::string numbers_, rules_;
    ScratchDirectory scratch_;
    LinuxDeviceInfo device_{{scratch_.path()}, std::chrono::seconds(30)};
};

using Maker = std::function<std::unique_ptr<DeviceInfoWorld>()>;

class DeviceInfoContract : public ::testing::TestWithParam<Maker> {
protected:
    std::unique_ptr<DeviceInfoWorld> world_ = GetParam()();
};

TEST_P(DeviceInfoContract, ADeviceNobodyDescribedDoesNotAnswer) {
    EXPECT_EQ(world_->device().userInterfaceIdiom(), std::nullopt);
    EXPECT_EQ(world_->device().chipID(), std::nullopt);
    EXPECT_EQ(world_->device().reducedCaptureChipID(), std::nullopt);
}

TEST_P(DeviceInfoContract, ADeviceAnswersWhatItIs) {
    world_->describe(1, 0x8000, -5);
    EXPECT_EQ(world_->device().userInterfaceIdiom(), 1);
    EXPECT_EQ(world_->device().chipID(), 0x8000);
    EXPECT_EQ(world_->device().reducedCaptureChipID(), -5);
}

TEST_P(DeviceInfoContract, EachAnswerIsOnItsOwn) {
    world_->describe(std::nullopt, 7, std::nullopt);
    EXPECT_EQ(world_->device().userInterfaceIdiom(), std::nullopt);
    EXPECT_EQ(world_->device().chipID(), 7);
    EXPECT_EQ(world_->device().reducedCaptureChipID(), std::nullopt);
}

TEST_P(DeviceInfoContract, ALaterDescriptionCounts) {
    world_->describe(1, 0, std::nullopt);
    EXPECT_EQ(world_->device().chipID(), 0);
    world_->describe(2, 9, std::nullopt);
    EXPECT_EQ(world_->device().userInterfaceIdiom(), 2);
    EXPECT_EQ(world_->device().chipID(), 9);
}

constexpr const char* kShutter = "RegionalBehaviorShutterClick";

TEST_P(DeviceInfoContract, ARegionHasNoRulesUntilItIsGivenSome) {
    EXPECT_EQ(world_->device().regionalRule(kShutter), std::nullopt);
    world_->describe(1, 2, 3);
    EXPECT_EQ(world_->device().regionalRule(kShutter), std::nullopt);
}

TEST_P(DeviceInfoContract, ARuleIsWhatTheRegionSays) {
    world_->setRule(kShutter, true);
    EXPECT_EQ(world_->device().regionalRule(kShutter), true);
    world_->setRule(kShutter, false);
    EXPECT_EQ(world_->device().regionalRule(kShutter), false);
}

TEST_P(DeviceInfoContract, RulesAndNumbersDoNotMix) {
    world_->setRule("Other", true);
    world_->setRule(kShutter, false);
    world_->setRule("ChipID", true);
    world_->describe(std::nullopt, 7, std::nullopt);
    EXPECT_EQ(world_->device().regionalRule(kShutter), false);
    EXPECT_EQ(world_->device().regionalRule("Other"), true);
    EXPECT_EQ(world_->device().regionalRule("ChipID"), true);
    EXPECT_EQ(world_->device().regionalRule("Idiom"), std::nullopt);
    EXPECT_EQ(world_->device().regionalRule(""), std::nullopt);
    EXPECT_EQ(world_->device().chipID(), 7);
    EXPECT_EQ(world_->device().userInterfaceIdiom(), std::nullopt);
}

INSTANTIATE_TEST_SUITE_P(Fake, DeviceInfoContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeDeviceInfoWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, DeviceInfoContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortDeviceInfoWorld>(); })));

class LinuxDeviceInfoRules : public ::testing::Test {
protected:
    std::optional<bool> ruleIn(const std::string& text) {
        mine_.write("device.conf", text);
        return device_.regionalRule(kShutter);
    }

    ScratchDirectory mine_, vendors_;
    const LinuxDeviceInfo device_{{mine_.path(), vendors_.path()}, std::chrono::seconds(30)};
};

TEST_F(LinuxDeviceInfoRules, ARuleIsReadAsPeopleWriteIt) {
    const std::string rule = std::string("[Region]\n") + kShutter;
    EXPECT_EQ(ruleIn(rule + "=true\n"), true);
    EXPECT_EQ(ruleIn(rule + " = Yes\n"), true);
    EXPECT_EQ(ruleIn(rule + "=FALSE"), false);
    for (const char* nonsense : {"=\n", "=1\n", "=maybe\n", "=\"yes\"\n", "\n", "=yes no\n"})
        EXPECT_EQ(ruleIn(rule + nonsense), std::nullopt) << nonsense;
}

TEST_F(LinuxDeviceInfoRules, ARuleOutsideItsSectionIsNone) {
    EXPECT_EQ(ruleIn(std::string(kShutter) + "=yes\n"), std::nullopt);
    EXPECT_EQ(ruleIn(std::string("[Regions]\n") + kShutter + "=yes\n"), std::nullopt);
}

TEST_F(LinuxDeviceInfoRules, TheFirstFileThatHasTheRuleDecides) {
    vendors_.write("device.conf", std::string("[Region]\n") + kShutter + "=yes\n");
    EXPECT_EQ(device_.regionalRule(kShutter), true);
    EXPECT_EQ(ruleIn("ChipID=1\n"), true);
    EXPECT_EQ(ruleIn(std::string("[Region]\n") + kShutter + "=no\n"), false);
}

}  // namespace
}  // namespace lumacast
