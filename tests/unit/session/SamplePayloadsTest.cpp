// What a session packs for an extension that takes samples, and when it says so.

#include <cstring>

#include "tests/fakes/StubExtension.h"
#include "tests/unit/session/NotedLink.h"
#include "tests/unit/session/SessionWorld.h"

namespace lumacast {
namespace {

constexpr char kPrefix[] = "LCBroadcastProcessExtensionPayloadKey";

/// A session whose way out is open.
class OpenSession final : public LCRecordingSession {
public:
    using LCRecordingSession::_notifyExtensionOfAudioSampleBuffer;
    using LCRecordingSession::_notifyExtensionOfFrontmostProcessBundleID;
    using LCRecordingSession::_notifyExtensionOfVideoSampleBuffer;
    using LCRecordingSession::LCRecordingSession;
};

class SamplePayloads : public SessionWorld {
protected:
    SamplePayloads() {
        open_ = std::make_shared<OpenSession>(services_, id_);
        session_ = open_;
        session_->setDelegate(delegate_);
        session_->setContextIDs({kWindow});
        session_->setWindowSize({640, 360});
        session_->setBroadcastExtension(
            std::make_shared<StubExtension>(BundleIdentifier("org.example.Uploader.upload")));
        session_->setBroadcastUploadExtensionProxy(link_);
        session_->setBroadcastProcessMode(1);
        fakes_.displayCapture.setPlanes(0);  // the test's own pictures only
        fakes_.logSink.clear();
    }
    ~SamplePayloads() override { link_->pending.clear(); }

    const Value& at(const std::string& key) {
        static const Value none;
        const Value* value = link_->payloads.empty() ? nullptr : link_->payloads.back().find(key);
        return value ? *value : none;
    }
    SampleRef sound() const {
        const AudioFormat format{44100, kAudioFormatLinearPCM, 12, 4, 1, 4, 2, 16, 0};
        return SampleBuffer::makeAudio(format, Data{1, 2, 3, 4, 5, 6, 7, 8}, 2,
                                       {MediaTime::make(1, 44100), MediaTime::make(441, 44100), kInvalidMediaTime});
    }
    std::size_t logged(const std::string& line) const {
        const auto all = fakes_.logSink.logged();
        return static_cast<std::size_t>(std::count(all.begin(), all.end(), line));
    }

    std::shared_ptr<OpenSession> open_;
    const std::shared_ptr<NotedLink> link_ = std::make_shared<NotedLink>(services_);
};

TEST_F(SamplePayloads, AFrameGoesWithItsPlaneItsTimesAndHowItIsTurned) {
    start();
    const std::uint32_t orientations[] = {1, 4, 2, 3, 8, 5, 7, 6, 1};
    for (std::uint32_t flags = 0; flags < 9; ++flags) {
        deliver(100 + flags, flags);
        EXPECT_EQ(link_->payloads.back().entries().size(), 4u);
        EXPECT_EQ(at("LCSampleBufferVideoOrientation"), Value(orientations[flags])) << flags;
        EXPECT_EQ(at(std::string(kPrefix) + "SampleType"), Value(std::int64_t{1}));
        EXPECT_TRUE(at(std::string(kPrefix) + "SharedPlane").as<Value::PlaneRef>());
        const Data* times = at(std::string(kPrefix) + "TimingInfo").as<Data>();
        ASSERT_TRUE(times);
        ASSERT_EQ(times->size(), 72u);
        SampleTiming timing;
        std::memcpy(static_cast<void*>(&timing), times->data(), times->size());
        EXPECT_EQ(timing.presentation.value, 100 + flags);
        EXPECT_EQ(timing.presentation.timescale, 600);
    }
}

TEST_F(SamplePayloads, SoundGoesWithItsBytesItsFormatItsCountAndItsTimes) {
    open_->_notifyExtensionOfAudioSampleBuffer(sound(), SampleType::Microphone);
    ASSERT_EQ(link_->payloads.size(), 1u);
    EXPECT_EQ(link_->payloads[0].entries().size(), 5u);
    EXPECT_EQ(at(std::string(kPrefix) + "SampleType"), Value(std::int64_t{3}));
    EXPECT_EQ(at(std::string(kPrefix) + "AudioBufferList"), Value(Data{1, 2, 3, 4, 5, 6, 7, 8}));
    EXPECT_EQ(at(std::string(kPrefix) + "NumSamples"), Value(std::int64_t{2}));
    const Data* format = at(std::string(kPrefix) + "AudioFormatDescription").as<Data>();
    ASSERT_TRUE(format);
    ASSERT_EQ(format->size(), 40u);
    double rate = 0;
    std::memcpy(&rate, format->data(), sizeof rate);
    EXPECT_EQ(static_cast<int>(rate), 44100);
    open_->_notifyExtensionOfAudioSampleBuffer(sound(), SampleType::AppAudio);
    EXPECT_EQ(at(std::string(kPrefix) + "SampleType"), Value(std::int64_t{2}));
}

TEST_F(SamplePayloads, WhatWasSentIsSaidWhenItWasProcessedAndSoundIsKeptUntilThen) {
    fakes_.log.setVerbose(true);
    link_->answers = false;
    SampleRef heard = sound();
    const std::weak_ptr<const SampleBuffer> held = heard;
    open_->_notifyExtensionOfAudioSampleBuffer(heard, SampleType::AppAudio);
    heard.reset();
    EXPECT_FALSE(held.expired());
    open_->_notifyExtensionOfFrontmostProcessBundleID(BundleIdentifier("org.example.Front"));
    EXPECT_EQ(at(std::string(kPrefix) + "FrontmostAppBundleID"), Value("org.example.Front"));
    const std::string told = "lumacastd sending frontmost app bundleID to broadcast extension...";
    EXPECT_EQ(logged(told), 0u);
    for (const auto& complete : link_->pending) complete();
    link_->pending.clear();
    EXPECT_TRUE(held.expired());
    EXPECT_EQ(logged(told), 1u);
    EXPECT_EQ(logged("lumacastd sending audio payload to broadcast extension..."), 1u);
}

TEST_F(SamplePayloads, WithoutALinkOrAnExtensionTheyAreDropped) {
    session_->setBroadcastUploadExtensionProxy(nullptr);
    open_->_notifyExtensionOfAudioSampleBuffer(sound(), SampleType::AppAudio);
    EXPECT_EQ(logged("broadcast extension not ready"), 1u);
    // Who has neither is told of the extension.
    session_->setBroadcastExtension(nullptr);
    open_->_notifyExtensionOfAudioSampleBuffer(sound(), SampleType::AppAudio);
    EXPECT_EQ(logged("no broadcast extension found!"), 1u);
    EXPECT_EQ(logged("broadcast extension not ready"), 1u);
    // Nothing was queued.
    session_->setBroadcastUploadExtensionProxy(link_);
    settle();
    EXPECT_TRUE(link_->payloads.empty());
}

}  // namespace
}  // namespace lumacast
