// A broadcast in movie clips: where the movie is cut, and how a clip gets to the extension. The cut runs on the audio
// capture queue; what the extension returns comes on the extension's lane.

#include <utility>

#include "broadcast/ConfigurationArchive.h"
#include "broadcast/ExtensionDiscovery.h"
#include "broadcast/PayloadKeys.h"
#include "session/LCRecordingSession.h"

namespace lumacast {

namespace {

constexpr double kDefaultClipDuration = 5.0;
constexpr std::string_view kTokenClass = "com.orvane.lumacastd.read-only";

}  // namespace

void LCRecordingSession::_processAudioSampleBufferForMP4ClipHandler(const SampleRef& sample) {
    // Deliberately first: the buffer that is over the limit is still the old clip's.
    appendAudio(sample, SampleType::AppAudio);
    const MediaTime time = sample->presentationTime();
    if (compare(broadcastFragmentStartTime_.get(), kInvalidMediaTime) == 0) {
        broadcastFragmentStartTime_.set(time);
        log_.line("setting sample time = %i", static_cast<std::int32_t>(time.seconds()));
    }
    const auto configuration = broadcastConfiguration_.get();
    const double limit =
        configuration && configuration->clipDuration > 0 ? configuration->clipDuration : kDefaultClipDuration;
    if (broadcastProcessMode_ != static_cast<std::int64_t>(BroadcastProcessMode::MovieClips)) return;
    if (subtract(time, broadcastFragmentStartTime_.get()).seconds() > limit) cutClip(time);
}

// The next writer takes the place of the last one before that one is finished: the end of the broadcast, on another lane, finds
// either, never one that is being finished. Pictures between the two are nobody's.
void LCRecordingSession::cutClip(MediaTime time) {
    broadcastFragmentStartTime_.set(time);
    ++broadcastFragmentIndex_;
    // Deliberately the capture size as it is, without the system recording's flag, and nothing removed from its path.
    const auto next =
        std::make_shared<LCMovieWriter>(services_.platform, services_.tempStore, windowSize_.get(), outputPath());
    next->setBroadcastConfig(broadcastConfiguration_.get());
    std::shared_ptr<LCMovieWriter> last;
    movieWriter_.update([&](std::shared_ptr<LCMovieWriter>& current) {
        // The end of the broadcast may have come meanwhile: it has this clip, then.
        if (!movieIsFinishing_) last = std::exchange(current, next);
    });
    if (!last) return;
    log_.line(
        "LCRecordingSession: processSampleBufferForStreaming: fragment exceeded time limit, calling out to extension");
    last->finishWritingWithHandler([weak = weak_from_this()](const std::optional<URL>& clip) {
        const auto self = weak.lock();
        if (self && clip) self->_notifyBroadcastExtensionOfCompletedMovieWithURL(*clip, false);
    });
    log_.line("setting up new movie writer");
    next->setupAssetWriter();
}

void LCRecordingSession::_notifyBroadcastExtensionOfCompletedMovieWithURL(const URL& clip, bool finished) {
    log_.line("LCRecordingSession: notifyBroadcastExtensionOfCompletedMovieWithURL:");
    const auto extension = broadcastExtension();
    if (!extension) {
        log_.line("no broadcast extension found!");
        return;
    }
    const auto token = extension->issueReadOnlyFileToken(kTokenClass, clip.path());
    if (!token) {
        log_.line("sb token is null!");
        return;
    }
    const auto info = broadcastUserInfo_.get();
    std::vector<ExtensionItem> items{
        ExtensionDiscovery::itemWithTitle(kItemRequestedFinish, finished ? "1" : "0"),
        ExtensionDiscovery::itemWithTitle(kItemSandboxToken, Data(token->begin(), token->end())),
        ExtensionDiscovery::itemWithTitle(kItemUserInfo, info ? Value(*info) : Value()),
        ExtensionDiscovery::itemWithTitle(kItemMovieClipURL, clip.text()),
    };
    // One slot: an older clip's completion that is still to come finds the newer one's handler.
    extension->setRequestCompletionHandler(
        [weak = weak_from_this(), clip, &log = log_, &store = services_.tempStore](
            ExtensionRequestID, const std::vector<ExtensionItem>& returned) {
            store._srRemoveFile(clip, [&log](const std::optional<Error>&) {
                log.line("extension finished, clean up movie clip");
            });
            if (const auto self = weak.lock()) self->takeReturnedItems(returned);
        });
    log_.line("begining extension request");
    extension->beginExtensionRequestWithInputItems(
        std::move(items), [&log = log_](std::optional<ExtensionRequestID>, const std::optional<Error>& error) {
            log.line("finished extension request with items with error code: %i)",
                     error ? error->code() : std::int64_t{0});
        });
}

void LCRecordingSession::takeReturnedItems(const std::vector<ExtensionItem>& items) {
    for (const ExtensionItem& item : items) {
        if (item.attachments.empty() || !item.attachments.front().hasItemConformingTo(kGenericDataType)) continue;
        item.attachments.front().loadItem([&](const Value& loaded, const std::optional<Error>& error) {
            if (error)
                log_.line("Error loading input item for type");
            else
                takeReturnedItem(item.attributedTitle, loaded);
        });
    }
}

void LCRecordingSession::takeReturnedItem(const std::string& title, const Value& item) {
    if (title == kItemBroadcastConfiguration) {
        log_.line("received updated broadcast configuration from extension");
        const Data* archive = item.as<Data>();
        // It governs the next cut.
        broadcastConfiguration_.set(
            archive ? configurationIn(services_.platform.keyedArchive, *archive) : std::nullopt);
    } else if (title == kItemServiceInfo) {
        log_.debug("received service info from broadcast service");
        if (const auto delegate = delegate_.get().lock())
            delegate->broadcastSessionDidUpdateServiceInfo(shared_from_this(), item);
    }
}

}  // namespace lumacast
