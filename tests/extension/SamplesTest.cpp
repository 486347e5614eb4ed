// The library in sample mode, against a host in the test.

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "tests/extension/ListeningHandler.h"
#include "tests/extension/SamplePayload.h"

namespace lumacast::test {
namespace {

class Samples : public ::testing::Test {
protected:
    void SetUp() override {
        EXPECT_EQ(handler.next(), "connected");
        host.begin(1, std::vector<ExtensionItem>{ExtensionItem{}});
        EXPECT_EQ(host.taken.next(), 1);
        ASSERT_NO_FATAL_FAILURE(host.connect());
    }

    ListeningHandler handler;
    StandInHost host{handler};
};

TEST_F(Samples, ActionsAreToldInTheirOrderAndTheFirstWithTheUserInfo) {
    host.send(actionPayload(1, Dictionary{{"url", "rtmp://example"}}));
    host.send(actionPayload(2));
    host.send(actionPayload(3));
    host.send({{std::string(kPayloadFrontmostApp), "org.example.Player"}});
    host.send(actionPayload(4));
    const auto started = handler.events.next();
    ASSERT_TRUE(started);
    EXPECT_EQ(started->what, "started");
    EXPECT_EQ(started->userInfo, (Dictionary{{"url", "rtmp://example"}}));
    EXPECT_EQ(handler.next(), "paused");
    EXPECT_EQ(handler.next(), "resumed");
    EXPECT_EQ(handler.next(), "front: org.example.Player");
    EXPECT_EQ(handler.next(), "finished");
}

TEST_F(Samples, APayloadIsProcessedWhenItsCompletionIsReleased) {
    Told<bool> processed;
    host.send(actionPayload(1), [&] { processed.add(true); });
    auto started = handler.events.next();
    ASSERT_TRUE(started);
    // What is sent later is answered first: the start still waits.
    EXPECT_TRUE(host.sendAndWait({{std::string(kPayloadFrontmostApp), "org.example.Player"}}));
    EXPECT_TRUE(processed.isEmpty());
    started->completion = nullptr;
    EXPECT_TRUE(processed.next());
}

TEST_F(Samples, AFrameIsTheSamePictureWithItsTurnAndItsTime) {
    host.send(videoPayload(greyPlane(77), 1.5, 6));
    const auto frame = handler.frames.next();
    ASSERT_TRUE(frame);
    EXPECT_EQ(frame->plane->width(), 64);
    EXPECT_EQ(frame->plane->height(), 48);
    EXPECT_EQ(frame->plane->pixels()[frame->plane->stride() * 20 + 40], 77);
    EXPECT_EQ(frame->orientation, 6u);
    EXPECT_EQ(frame->timing.presentation.seconds(), 1.5);
}

TEST_F(Samples, AFrameIsProcessedWhenItsPlaneIsLetGoToo) {
    Told<bool> processed;
    const auto plane = greyPlane(1);
    host.send(videoPayload(plane, 1), [&] { processed.add(true); });
    auto frame = handler.frames.next();
    ASSERT_TRUE(frame);
    frame->completion = nullptr;
    EXPECT_TRUE(host.sendAndWait({{std::string(kPayloadFrontmostApp), "org.example.Player"}}));
    EXPECT_TRUE(processed.isEmpty());
    frame->plane = nullptr;
    EXPECT_TRUE(processed.next());
    // It was given back before: nobody but the test has it.
    EXPECT_EQ(plane.use_count(), 1);
}

TEST_F(Samples, APictureThatComesAgainAfterAPauseIsToldOnce) {
    host.send(videoPayload(greyPlane(1), 1));
    host.send(actionPayload(2));
    EXPECT_EQ(handler.next(), "paused");
    EXPECT_TRUE(host.sendAndWait(videoPayload(greyPlane(2), 1)));
    host.send(videoPayload(greyPlane(3), 1.1));
    EXPECT_EQ(handler.frames.next()->plane->pixels()[0], 1);
    EXPECT_EQ(handler.frames.next()->plane->pixels()[0], 3);
    // A new broadcast has a time of its own.
    host.send(actionPayload(1));
    host.send(videoPayload(greyPlane(4), 0));
    EXPECT_EQ(handler.frames.next()->plane->pixels()[0], 4);
}

TEST_F(Samples, SoundComesWithItsFormatItsBytesAndItsTime) {
    host.send(soundPayload(2, {1, 2, 3, 4}, 2, 3));
    host.send(soundPayload(3, {5, 6}, 1, 4));
    const auto application = handler.sounds.next(), microphone = handler.sounds.next();
    ASSERT_TRUE(application && microphone);
    EXPECT_EQ(application->source, extension::Sound::Source::Application);
    EXPECT_EQ(application->format, testing::tapFormat());
    EXPECT_EQ(application->bytes, (Data{1, 2, 3, 4}));
    EXPECT_EQ(application->frames, 2);
    EXPECT_EQ(application->timing.presentation.seconds(), 3);
    EXPECT_EQ(microphone->source, extension::Sound::Source::Microphone);
}

/// Payloads that say what they are and are not it.
std::vector<Dictionary> illTyped() {
    std::vector<Dictionary> all;
    const auto without = [&](const Dictionary& good, std::string_view key, const Value& instead) {
        Dictionary bad = good;
        bad.set(std::string(key), instead);
        all.push_back(bad);
    };
    const Dictionary video = videoPayload(greyPlane(1), 100), sound = soundPayload(2, {1, 2, 3, 4}, 2, 1);
    without(video, kPayloadVideoOrientation, std::uint64_t{0});
    without(video, kPayloadVideoOrientation, std::uint64_t{9});
    without(video, kPayloadVideoOrientation, std::int64_t{1});
    without(video, kPayloadSharedPlane, "a plane");
    without(video, kPayloadTimingInfo, Data(71));
    without(video, kPayloadTimingInfo, Data(72));  // not valid
    without(video, kPayloadSampleType, "1");
    without(sound, kPayloadAudioFormat, Data(41));
    without(sound, kPayloadNumSamples, std::int64_t{-1});
    without(sound, kPayloadNumSamples, std::int64_t{3});
    without(sound, kPayloadNumSamples, std::numeric_limits<std::int64_t>::max());
    without(sound, kPayloadAudioBufferList, 5.0);
    const auto withFormat = [&](auto change) {
        AudioFormat format = testing::tapFormat();
        change(format);
        without(sound, kPayloadAudioFormat, bytesOf(format));
    };
    withFormat([](AudioFormat& format) { format.bytesPerFrame = 0; });
    withFormat([](AudioFormat& format) { format.channelsPerFrame = 0; });
    withFormat([](AudioFormat& format) { format.sampleRate = std::nan(""); });
    withFormat([](AudioFormat& format) { format.sampleRate = 1; });
    withFormat([](AudioFormat& format) { format.formatID = kAudioFormatAAC; });
    AudioFormat slow = testing::tapFormat();
    slow.sampleRate = 1000;
    all.push_back(soundPayload(2, Data(10'001 * slow.bytesPerFrame), 10'001, 1, slow));  // more than ten seconds
    without({}, kPayloadActionType, "1");
    without(actionPayload(1), kPayloadUserInfo, 5.0);
    without({}, kPayloadFrontmostApp, std::int64_t{1});
    return all;
}

TEST_F(Samples, WhatMakesNoSenseIsRefusedAndTheRestGoesOn) {
    for (const Dictionary& payload : illTyped())
        host.send(payload, [] { ADD_FAILURE() << "processed"; });
    EXPECT_TRUE(host.sendAndWait({{std::string(kPayloadFrontmostApp), "org.example.Player"}}));
    EXPECT_EQ(handler.next(), "front: org.example.Player");
    EXPECT_TRUE(handler.frames.isEmpty());
    EXPECT_TRUE(handler.sounds.isEmpty());
    EXPECT_TRUE(handler.events.isEmpty());
}

TEST_F(Samples, WhatALaterDaemonSaysCountsAsProcessed) {
    EXPECT_TRUE(host.sendAndWait({}));
    EXPECT_TRUE(host.sendAndWait({{"LCSomethingElse", true}}));
    EXPECT_TRUE(host.sendAndWait(actionPayload(99)));
    EXPECT_TRUE(host.sendAndWait({{std::string(kPayloadSampleType), std::int64_t{9}}}));
    EXPECT_TRUE(host.sendAndWait(videoPayload(nullptr, 1)));
    EXPECT_TRUE(handler.frames.isEmpty() && handler.events.isEmpty());
}

TEST_F(Samples, WhatTheExtensionReportsReachesTheDaemon) {
    handler.broadcast().updateServiceInfo({{"state", "live"}});
    handler.broadcast().updateBroadcastURL(URL("https://example/live"));
    handler.broadcast().finishWithError(Error("org.example", 7));
    const auto info = host.reports().next(), url = host.reports().next(), error = host.reports().next();
    ASSERT_TRUE(info && url && error);
    EXPECT_EQ(info->number, static_cast<std::uint16_t>(BroadcastDaemonMessage::UpdateServiceInfo));
    EXPECT_EQ(info->arguments[0], Value(Dictionary{{"state", "live"}}));
    EXPECT_EQ(url->number, static_cast<std::uint16_t>(BroadcastDaemonMessage::UpdateBroadcastURL));
    EXPECT_EQ(url->arguments[0], Value(URL("https://example/live")));
    EXPECT_EQ(error->number, static_cast<std::uint16_t>(BroadcastDaemonMessage::FinishBroadcastWithError));
    EXPECT_EQ(error->arguments[0].asError()->code(), 7);
}

TEST_F(Samples, AnotherEndpointTakesThePlaceOfTheFirst) {
    ASSERT_NO_FATAL_FAILURE(host.connect());
    host.send(actionPayload(2));
    EXPECT_EQ(handler.next(), "paused");
    EXPECT_FALSE(handler.broadcast().hasEnded());
}

TEST_F(Samples, WhenTheDaemonHasGoneTheHandlerIsToldLastAndTheProcessMayEnd) {
    host.send(actionPayload(1));
    host.send(videoPayload(greyPlane(9), 1));
    auto started = handler.events.next();
    auto frame = handler.frames.next();
    ASSERT_TRUE(started && frame);
    host.hangUp();
    EXPECT_EQ(handler.next(), "ended");
    EXPECT_TRUE(handler.broadcast().hasEnded());
    EXPECT_EQ(host.status(), 0);
    EXPECT_TRUE(handler.events.isEmpty());
    // What is let go after that finds nobody, and nothing breaks. The picture is there until then.
    EXPECT_EQ(frame->plane->pixels()[0], 9);
    frame.reset();
    started.reset();
}

TEST(Extension, AProcessThatTheDaemonDidNotLaunchIsToldSo) {
    ListeningHandler handler;
    extension::Options options;
    options.requestsDescriptor = options.auxiliaryDescriptor = -1;
    EXPECT_EQ(extension::run(handler, options), 64);
    EXPECT_TRUE(handler.events.isEmpty());
}

}  // namespace
}  // namespace lumacast::test
