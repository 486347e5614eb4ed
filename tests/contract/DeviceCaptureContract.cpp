// What a capture session is made of, and who is told that it runs.

#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "tests/contract/DeviceCaptureFixture.h"

namespace lumacast {
namespace {

using testing::DeviceCaptureContract;
using testing::DeviceCaptureWorldMaker;
using testing::Observer;

class ForeignInput final : public CaptureInput {};
class ForeignOutput final : public CaptureOutput {
public:
    void setSampleBufferDelegate(std::weak_ptr<CaptureOutputDelegate>, std::shared_ptr<SerialQueue>) override {}
};

TEST_P(DeviceCaptureContract, ASessionRunsOnceItIsStartedAndUntilItIsStopped) {
    const auto session = devices_.makeSession();
    ASSERT_TRUE(session);
    EXPECT_FALSE(session->isRunning());
    session->startRunning();
    EXPECT_TRUE(eventually([&] { return session->isRunning(); }));
    session->stopRunning();
    EXPECT_TRUE(eventually([&] { return !session->isRunning(); }));
}

TEST_P(DeviceCaptureContract, ObserversOfRunningAreToldOfEachChangeAndNeverInline) {
    const auto session = devices_.makeSession();
    const auto observer = std::make_shared<Observer>();
    session->addObserver(observer, DeviceCaptureSession::kRunning);
    session->startRunning();
    session->startRunning();  // no change
    ASSERT_TRUE(observer->wasTold(1));
    EXPECT_TRUE(session->isRunning());
    session->stopRunning();
    session->stopRunning();
    ASSERT_TRUE(observer->wasTold(2));
    session->startRunning();
    ASSERT_TRUE(observer->wasTold(3));
    EXPECT_EQ(observer->told(), std::vector<std::string>(3, "running"));
    EXPECT_FALSE(observer->wasToldOn(std::this_thread::get_id()));
}

TEST_P(DeviceCaptureContract, OnlyThePairOfKeyPathAndObserverThatIsThereCanBeRemoved) {
    const auto session = devices_.makeSession();
    const auto observer = std::make_shared<Observer>(), other = std::make_shared<Observer>();
    session->addObserver(observer, DeviceCaptureSession::kRunning);
    EXPECT_FALSE(session->removeObserver(observer.get(), "isRunning"));
    EXPECT_FALSE(session->removeObserver(other.get(), DeviceCaptureSession::kRunning));
    session->startRunning();
    EXPECT_TRUE(observer->wasTold(1)) << "still there";
    EXPECT_TRUE(session->removeObserver(observer.get(), DeviceCaptureSession::kRunning));
    EXPECT_FALSE(session->removeObserver(observer.get(), DeviceCaptureSession::kRunning));
    session->addObserver(other, DeviceCaptureSession::kRunning);
    session->stopRunning();
    ASSERT_TRUE(other->wasTold(1));
    EXPECT_EQ(observer->told().size(), 1u);
}

TEST_P(DeviceCaptureContract, AKeyPathThatNamesNothingCanBeObservedAndNeverChanges) {
    const auto session = devices_.makeSession();
    const auto observer = std::make_shared<Observer>(), witness = std::make_shared<Observer>();
    session->addObserver(observer, "isRunning");
    session->addObserver(witness, DeviceCaptureSession::kRunning);
    session->startRunning();
    ASSERT_TRUE(witness->wasTold(1));
    EXPECT_TRUE(observer->told().empty());
    EXPECT_TRUE(session->removeObserver(observer.get(), "isRunning"));
}

TEST_P(DeviceCaptureContract, APairAddedTwiceIsRemovedOnceAtATime) {
    const auto session = devices_.makeSession();
    const auto observer = std::make_shared<Observer>();
    session->addObserver(observer, DeviceCaptureSession::kRunning);
    session->addObserver(observer, DeviceCaptureSession::kRunning);
    EXPECT_TRUE(session->removeObserver(observer.get(), DeviceCaptureSession::kRunning));
    session->startRunning();
    EXPECT_TRUE(observer->wasTold(1));
    EXPECT_TRUE(session->removeObserver(observer.get(), DeviceCaptureSession::kRunning));
    EXPECT_FALSE(session->removeObserver(observer.get(), DeviceCaptureSession::kRunning));
}

TEST_P(DeviceCaptureContract, ObserversAreHeldWeakly) {
    const auto session = devices_.makeSession();
    auto observer = std::make_shared<Observer>();
    const std::weak_ptr<Observer> weak = observer;
    const auto* const key = observer.get();
    session->addObserver(observer, DeviceCaptureSession::kRunning);
    observer.reset();
    EXPECT_TRUE(weak.expired());
    EXPECT_FALSE(session->removeObserver(key, DeviceCaptureSession::kRunning));
    const auto witness = std::make_shared<Observer>();
    session->addObserver(witness, DeviceCaptureSession::kRunning);
    session->startRunning();
    EXPECT_TRUE(witness->wasTold(1));
}

TEST_P(DeviceCaptureContract, ASessionTakesOneInputOfItsOwnPlatform) {
    const auto session = devices_.makeSession();
    const auto input = devices_.defaultAudioInput(), second = devices_.defaultAudioInput();
    ASSERT_TRUE(input);
    EXPECT_FALSE(session->canAddInput(nullptr));
    EXPECT_FALSE(session->canAddInput(std::make_shared<ForeignInput>()));
    EXPECT_TRUE(session->canAddInput(input));
    session->addInput(input);
    EXPECT_FALSE(session->canAddInput(input)) << "here already";
    EXPECT_FALSE(session->canAddInput(second)) << "one of its kind";
    session->addInput(second);  // refused
    session->removeInput(second);
    session->removeInput(nullptr);
    EXPECT_FALSE(session->canAddInput(second));
    session->removeInput(input);
    EXPECT_TRUE(session->canAddInput(second));
    session->removeInput(input);
    EXPECT_TRUE(session->canAddInput(input));
}

TEST_P(DeviceCaptureContract, ASessionTakesOneOutputOfItsOwnPlatform) {
    const auto session = devices_.makeSession();
    const auto output = devices_.makeAudioDataOutput(), second = devices_.makeAudioDataOutput();
    ASSERT_TRUE(output);
    EXPECT_FALSE(session->canAddOutput(nullptr));
    EXPECT_FALSE(session->canAddOutput(std::make_shared<ForeignOutput>()));
    EXPECT_TRUE(session->canAddOutput(output));
    session->addOutput(output);
    EXPECT_FALSE(session->canAddOutput(output)) << "here already";
    EXPECT_FALSE(session->canAddOutput(second)) << "one of its kind";
    session->addOutput(second);  // refused
    session->removeOutput(second);
    session->removeOutput(nullptr);
    EXPECT_FALSE(session->canAddOutput(second));
    session->removeOutput(output);
    EXPECT_TRUE(session->canAddOutput(second));
}

INSTANTIATE_TEST_SUITE_P(Fake, DeviceCaptureContract,
                         ::testing::Values(DeviceCaptureWorldMaker([] { return std::make_unique<testing::FakeDeviceCaptureWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, DeviceCaptureContract,
                         ::testing::Values(DeviceCaptureWorldMaker([] { return std::make_unique<testing::PortDeviceCaptureWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Headless, DeviceCaptureContract,
                         ::testing::Values(DeviceCaptureWorldMaker([] { return std::make_unique<testing::HeadlessDeviceCaptureWorld>(); })));

}  // namespace
}  // namespace lumacast
