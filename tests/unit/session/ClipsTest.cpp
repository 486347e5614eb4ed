// A broadcast in movie clips: when the movie is cut, what goes where, and what the extension returns.

#include "broadcast/ConfigurationArchive.h"
#include "broadcast/LCExtensionHostContext.h"
#include "tests/fakes/FakeUploader.h"
#include "tests/unit/session/SessionWorld.h"

namespace lumacast {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

/// A session whose sound the test gives it.
class ClipSession final : public LCRecordingSession {
public:
    using LCRecordingSession::_processAudioSampleBufferForMP4ClipHandler;
    using LCRecordingSession::LCRecordingSession;
};

class Clips : public SessionWorld {
protected:
    static constexpr std::int32_t kScale = 44100;

    Clips() {
        fakes_.appExtensions.setContextClass(LCExtensionHostContext::contextClass(fakes_.log));
        fakes_.appExtensions.install(uploadExtension(plan_, false));
        fakes_.appExtensions.extensionsWithMatchingPoint(
            "com.orvane.broadcast-services-upload",
            [this](const auto& found, const auto&) { extension_ = std::static_pointer_cast<FakeAppExtension>(found.at(0)); });
        settle();
        clips_ = std::make_shared<ClipSession>(services_, id_);
        session_ = clips_;
        session_->setDelegate(delegate_);
        session_->setContextIDs({kWindow});
        session_->setWindowSize({641, 360});
        session_->enableBroadcastWithExtension(extension_, 0, Dictionary{{"title", "x"}}, nullptr);
        fakes_.log.setVerbose(false);
        fakes_.logSink.clear();
    }
    /// Sound at this tick of 44100 in a second.
    void hear(std::int64_t tick) {
        const AudioFormat format{44100, kAudioFormatLinearPCM, 0, 2, 1, 2, 1, 16, 0};
        clips_->_processAudioSampleBufferForMP4ClipHandler(SampleBuffer::makeAudio(
            format, Data(2), 1, {MediaTime::make(1, kScale), MediaTime::make(tick, kScale), kInvalidMediaTime}));
        settle();
    }
    void show(std::int64_t value) {
        deliver(value);
        settle();
    }
    std::vector<std::string> flags() const {
        std::vector<std::string> all;
        for (const auto& items : plan_->requests) all.push_back(*items.at(0).attachments.at(0).item.as<std::string>());
        return all;
    }
    std::vector<std::string> clipFiles() {
        auto all = fakes_.fileSystem.files();
        std::erase_if(all, [](const std::string& path) { return path.find("LCMovie_") == std::string::npos; });
        return all;
    }
    using Flags = std::vector<std::string>;

    const std::shared_ptr<UploaderPlan> plan_ = std::make_shared<UploaderPlan>();
    std::shared_ptr<FakeAppExtension> extension_;
    std::shared_ptr<ClipSession> clips_;
};

TEST_F(Clips, ACutComesOnlyWhenTheTimeStrictlyExceedsTheLimit) {
    start();
    show(10);
    hear(1000);
    EXPECT_EQ(clips_->broadcastFragmentStartTime().value, 1000);
    hear(1000 + 5 * kScale);
    EXPECT_TRUE(plan_->requests.empty());
    hear(1000 + 5 * kScale + 1);
    EXPECT_EQ(flags(), Flags{"0"});
    EXPECT_EQ(clips_->broadcastFragmentStartTime().value, 1000 + 5 * kScale + 1);
    EXPECT_EQ(clips_->broadcastFragmentIndex(), 2);
    EXPECT_EQ(logged("LCRecordingSession: processSampleBufferForStreaming: fragment exceeded time limit, calling out to "
                     "extension"),
              1u);
    EXPECT_EQ(logged("setting up new movie writer"), 1u);
}

TEST_F(Clips, TheFirstSoundIsTheStartInWholeSecondsOfTheLog) {
    start();
    hear(3 * kScale - 1);
    EXPECT_EQ(logged("setting sample time = 2"), 1u);
    hear(3 * kScale + 5);
    EXPECT_EQ(logged("setting sample time = 3"), 0u);
}

TEST_F(Clips, TheLimitIsTheConfigurationsWhenItIsAboveZero) {
    for (const double length : {0.0, -2.0}) {
        session_->setBroadcastConfiguration(LCBroadcastConfiguration{length, {}});
        start();
        show(10);
        hear(0);
        hear(4 * kScale);
        EXPECT_EQ(clips_->broadcastFragmentIndex(), 1) << length;
        cleanUp();
        session_->enableBroadcastWithExtension(extension_, 0, {}, nullptr);
    }
    session_->setBroadcastConfiguration(LCBroadcastConfiguration{0.5, {}});
    start();
    show(10);
    hear(0);
    hear(kScale / 2);
    EXPECT_EQ(clips_->broadcastFragmentIndex(), 1);
    hear(kScale / 2 + 1);
    EXPECT_EQ(clips_->broadcastFragmentIndex(), 2);
}

TEST_F(Clips, OutsideOfClipModeNothingIsCut) {
    start();
    show(10);
    session_->setBroadcastProcessMode(2);
    hear(0);
    hear(20 * kScale);
    EXPECT_EQ(clips_->broadcastFragmentIndex(), 1);
}

TEST_F(Clips, AnotherBroadcastBeginsToCountAnewAndDisablingLeavesTheCount) {
    start();
    show(10);
    hear(0);
    hear(5 * kScale + 1);
    EXPECT_EQ(clips_->broadcastFragmentIndex(), 2);
    session_->disableBroadcast();
    EXPECT_EQ(clips_->broadcastFragmentIndex(), 2);
    EXPECT_EQ(session_->enableBroadcastWithExtension(extension_, 0, {}, nullptr), 0);
    EXPECT_EQ(clips_->broadcastFragmentIndex(), 1);
    // Its first clip's length runs from its first sound.
    hear(30 * kScale);
    hear(35 * kScale);
    EXPECT_EQ(clips_->broadcastFragmentIndex(), 1);
    hear(35 * kScale + 1);
    EXPECT_EQ(clips_->broadcastFragmentIndex(), 2);
}

TEST_F(Clips, AReturnedConfigurationThatDoesNotDecodeIsNone) {
    session_->setBroadcastConfiguration(LCBroadcastConfiguration{2.0, {}});
    plan_->returned = {ExtensionItem{"LCBroadcastExtensionKeyBroadcastConfiguration",
                                     {ItemProvider{std::string(kGenericDataType), Data{1, 2}, {}}}}};
    start();
    show(10);
    hear(0);
    hear(2 * kScale + 1);
    EXPECT_EQ(logged("received updated broadcast configuration from extension"), 1u);
    EXPECT_FALSE(session_->broadcastConfiguration());
}

TEST_F(Clips, TheBufferThatIsOverTheLimitIsStillTheOldClips) {
    start();
    show(10);
    auto& first = recording();
    hear(10);
    hear(20 + 5 * kScale);
    EXPECT_EQ(first.movie().tracks.at(1).samples.size(), 2u);
    show(4000);
    hear(30 + 5 * kScale);
    EXPECT_EQ(first.movie().tracks.at(1).samples.size(), 2u);
    EXPECT_EQ(recording().movie().tracks.at(1).samples.size(), 1u);
    EXPECT_EQ(ticks().back(), 4000);
    EXPECT_LT(first.movie().tracks.at(0).samples.back()->presentationTime().value, 4000);
}

TEST_F(Clips, ANewClipsPathHasItsNumberAndTheTimeOfTheCut) {
    plan_->completesRequests = false;
    start();
    show(10);
    advance(milliseconds(6250));
    hear(0);
    hear(6 * kScale);
    const std::string folder = "/private/var/mobile/Library/Lumacast/LCMovie_org.example.Player_";
    EXPECT_EQ(clipFiles(), (Flags{folder + "1768478400.000000_1.mp4", folder + "1768478406.250000_2.mp4"}));
    EXPECT_EQ(session_->movieWriter()->windowSize(), (Size{641, 360}));  // as it was captured, not as it was coded
    EXPECT_FALSE(session_->movieWriter()->systemRecording());
}

TEST_F(Clips, WithoutSoundTheWholeBroadcastIsOneClip) {
    start();
    for (int i = 1; i < 20; ++i) show(600 * i);
    EXPECT_TRUE(plan_->requests.empty());
    EXPECT_EQ(finish().count, 1);
    EXPECT_EQ(flags(), Flags{"1"});
}

TEST_F(Clips, EachClipIsRemovedWhenItsRequestIsCompleteAndTheLastOneIsMarked) {
    start();
    show(10);
    hear(0);
    hear(6 * kScale);
    show(5000);
    hear(12 * kScale + 1);
    show(9000);
    EXPECT_EQ(clipFiles().size(), 1u);
    finish();
    EXPECT_EQ(flags(), (Flags{"0", "0", "1"}));
    EXPECT_EQ(clipFiles(), Flags{});
}

TEST_F(Clips, TheFileGoesAlsoWhenTheSessionIsGone) {
    plan_->completesRequests = false;
    start();
    show(10);
    finish();
    const auto kept = extension_;
    clips_.reset();
    session_.reset();
    const auto& [weak, request] = plan_->uncompletedRequests.at(0);
    weak.lock()->complete(request, {});
    settle();
    EXPECT_EQ(clipFiles(), Flags{});
    EXPECT_EQ(logged("extension finished, clean up movie clip"), 1u);
}

TEST_F(Clips, OfTwoRequestsUnderWayOnlyTheNewersHandlerIsThere) {
    plan_->completesRequests = false;
    start();
    show(10);
    hear(0);
    hear(6 * kScale);
    show(5000);
    hear(12 * kScale + 1);
    for (const auto& [weak, request] : plan_->uncompletedRequests) weak.lock()->complete(request, {});
    settle();
    // The first clip stays for the purge.
    ASSERT_EQ(clipFiles().size(), 2u);
    EXPECT_TRUE(clipFiles()[0].ends_with("_1.mp4"));
    EXPECT_TRUE(clipFiles()[1].ends_with("_3.mp4"));
}

TEST_F(Clips, AReturnedConfigurationGovernsTheNextCutAndRebuildsNothing) {
    plan_->returned = {ExtensionItem{"LCBroadcastExtensionKeyBroadcastConfiguration",
                                     {ItemProvider{std::string(kGenericDataType),
                                                   *archiveOf(fakes_.keyedArchive, {1.0, Dictionary{{"a", 1}}}), {}}}}};
    start();
    show(10);
    hear(0);
    hear(5 * kScale + 1);
    const auto writer = session_->movieWriter();
    EXPECT_EQ(logged("received updated broadcast configuration from extension"), 1u);
    EXPECT_EQ(session_->broadcastConfiguration()->clipDuration, 1.0);
    show(5000);
    hear(6 * kScale + 1);
    EXPECT_EQ(session_->movieWriter(), writer);
    hear(6 * kScale + 2);
    EXPECT_NE(session_->movieWriter(), writer);
    // The clip that begins with the cut is compressed as it says.
    show(6000);
    const Dictionary settings = recording().movie().tracks.at(0).settings;
    const Value* const compression = settings.find(VideoSettings::kCompressionProperties);
    ASSERT_TRUE(compression && compression->as<Dictionary>());
    EXPECT_TRUE(compression->as<Dictionary>()->find("a"));
}

TEST_F(Clips, OnlyItemsWhoseFirstAttachmentIsGenericDataAreLoaded) {
    const ItemProvider info{std::string(kGenericDataType), Dictionary{{"viewers", 2}}, {}};
    const ItemProvider other{"public.image", Data{1}, {}};
    ItemProvider broken = info;
    broken.loadError = Error("x", 1);
    const std::string title = "LCBroadcastExtensionKeyExtensionServiceInfo";
    plan_->returned = {{title, {other, info}}, {title, {}}, {title, {broken}}, {"else", {info}}, {title, {info, other}}};
    start();
    show(10);
    finish();
    EXPECT_EQ(logged("Error loading input item for type"), 1u);
    EXPECT_EQ(logged("received service info from broadcast service"), 0u);  // at debug level
    EXPECT_EQ(delegate_->infos, std::vector<Value>{Dictionary({{"viewers", 2}})});
}

TEST_F(Clips, ABroadcastsCutAfterItsEndWasAskedForIsNone) {
    start();
    show(10);
    hear(0);
    onRequestLane([&] { session_->finishSessionWithHandler([](auto, auto) {}); });
    const auto writer = session_->movieWriter();
    hear(9 * kScale);
    EXPECT_EQ(session_->movieWriter(), writer);
    EXPECT_EQ(flags(), Flags{"1"});
}

TEST_F(Clips, ARequestThatCannotBeBegunIsLoggedWithItsCodeAndTheRecordingGoesOn) {
    fakes_.faults.failNext("AppExtension.begin");
    start();
    show(10);
    hear(0);
    hear(6 * kScale);
    EXPECT_EQ(logged("finished extension request with items with error code: 2)"), 1u);
    EXPECT_TRUE(session_->isRecording());
    EXPECT_TRUE(delegate_->stops.empty());
}

TEST_F(Clips, WithoutAnExtensionAClipIsNobodys) {
    session_->disableBroadcast();
    session_->_notifyBroadcastExtensionOfCompletedMovieWithURL(URL::file("/x.mp4"), true);
    EXPECT_EQ(logged("no broadcast extension found!"), 1u);
}

}  // namespace
}  // namespace lumacast
