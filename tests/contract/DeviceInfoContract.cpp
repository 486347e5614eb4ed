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
};

class FakeDeviceInfoWorld final : public DeviceInfoWorld {
public:
    const DeviceInfo& device() override { return device_; }
    void describe(Number idiom, Number chip, Number reducedChip) override {
        device_.setUserInterfaceIdiom(idiom);
        device_.setChipID(chip);
        device_.setReducedCaptureChipID(reducedChip);
    }

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
        scratch_.write("device.conf", text);
    }

private:
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

INSTANTIATE_TEST_SUITE_P(Fake, DeviceInfoContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeDeviceInfoWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, DeviceInfoContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortDeviceInfoWorld>(); })));

}  // namespace
}  // namespace lumacast
