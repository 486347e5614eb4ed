// The samples of a capture session: when they come, and to whom.

#include <algorithm>
#include <memory>
#include <vector>

#include "tests/contract/DeviceCaptureFixture.h"

namespace lumacast {
namespace {

using testing::DeviceCaptureContract;
using testing::SampleListener;

TEST_P(DeviceCaptureContract, SamplesComeOnTheOutputsQueueInTheDescribedFormat) {
    const auto listened = listen();
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened, 10));
    EXPECT_TRUE(listened.listener->cameOnItsQueue());
    EXPECT_TRUE(listened.listener->cameFrom(listened.output));
    AudioFormat expected;
    expected.sampleRate = 44100;
    expected.formatID = fourCC("lpcm");
    expected.formatFlags = 14;  // signed, packed, big-endian
    expected.bytesPerPacket = expected.bytesPerFrame = 2;
    expected.framesPerPacket = expected.channelsPerFrame = 1;
    expected.bitsPerChannel = 16;
    for (const SampleRef& sample : listened.listener->samples()) {
        ASSERT_EQ(sample->format().type, MediaType::Audio);
        ASSERT_EQ(sample->format().audio, expected);
        ASSERT_GT(sample->sampleCount(), 0);
        ASSERT_EQ(sample->data()->size(), static_cast<std::size_t>(sample->sampleCount()) * 2);
        ASSERT_EQ(compare(sample->duration(), MediaTime::make(sample->sampleCount(), 44100)), 0);
        ASSERT_EQ(sample->presentationTime().timescale, CaptureClock::kTimescale);
    }
}

TEST_P(DeviceCaptureContract, NoSampleBeginsBeforeTheOneBeforeItEnds) {
    const auto listened = listen();
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened, 20));
    const auto samples = listened.listener->samples();
    for (std::size_t next = 1; next < samples.size(); ++next) {
        const double end = samples[next - 1]->presentationTime().seconds() + samples[next - 1]->duration().seconds();
        EXPECT_GE(samples[next]->presentationTime().seconds() - end, -1.0 / 44100) << next;
    }
}

TEST_P(DeviceCaptureContract, NothingComesBeforeTheStartNorAfterTheStop) {
    const auto listened = listen();
    EXPECT_TRUE(hearsNothing(listened));
    EXPECT_EQ(listened.listener->count(), 0u);
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened));
    listened.session->stopRunning();
    EXPECT_TRUE(hearsNothing(listened));
    listened.session->startRunning();
    EXPECT_TRUE(hears(listened));
}

TEST_P(DeviceCaptureContract, NothingComesWithoutAnInputWhichMayComeAndGoMeanwhile) {
    const auto listened = listen();
    listened.session->removeInput(listened.input);
    listened.session->startRunning();
    EXPECT_TRUE(hearsNothing(listened));
    EXPECT_TRUE(listened.session->isRunning());
    listened.session->addInput(listened.input);
    EXPECT_TRUE(hears(listened));
    listened.session->removeInput(listened.input);
    EXPECT_TRUE(hearsNothing(listened));
    EXPECT_TRUE(listened.session->isRunning());
}

TEST_P(DeviceCaptureContract, NothingComesFromAnOutputThatWasRemovedUntilItIsBack) {
    const auto listened = listen();
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened));
    listened.session->removeOutput(listened.output);
    EXPECT_TRUE(hearsNothing(listened));
    listened.session->addOutput(listened.output);
    EXPECT_TRUE(hears(listened));
}

TEST_P(DeviceCaptureContract, ADelegateCanBeReplacedAndTakenAway) {
    const auto listened = listen();
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened));
    const auto other = std::make_shared<SampleListener>(listened.queue);
    listened.output->setSampleBufferDelegate(other, listened.queue);
    EXPECT_TRUE(hearsNothing(listened));
    EXPECT_TRUE(eventually([&] {
        world_->hear();
        return other->count() >= 3;
    }));
    listened.output->setSampleBufferDelegate({}, nullptr);
    world_->letSoundPass();
    listened.drain();
    const std::size_t before = other->count();
    world_->letSoundPass();
    listened.drain();
    EXPECT_EQ(other->count(), before);
}

TEST_P(DeviceCaptureContract, DelegatesAreHeldWeakly) {
    const auto listened = listen();
    auto other = std::make_shared<SampleListener>(listened.queue);
    const std::weak_ptr<SampleListener> weak = other;
    listened.output->setSampleBufferDelegate(other, listened.queue);
    listened.session->startRunning();
    ASSERT_TRUE(eventually([&] {
        world_->hear();
        return other->count() >= 3;
    }));
    other.reset();
    EXPECT_TRUE(eventually([&] { return weak.expired(); }));
    world_->letSoundPass();
    listened.drain();
}

TEST_P(DeviceCaptureContract, DestroyingASessionStopsIt) {
    auto listened = listen();
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened));
    listened.session.reset();
    EXPECT_TRUE(hearsNothing(listened));
}

}  // namespace
}  // namespace lumacast
