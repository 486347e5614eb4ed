#include "extensions/live-push/LivePush.h"

#include <string_view>
#include <utility>

namespace lumacast::extensions {

namespace {

constexpr std::string_view kErrorDomain = "org.lumacast.live-push";
enum ErrorCode : std::int64_t { kNoDestination = 1, kNotEncoded = 2, kServerAway = 3 };

const char* nameOf(SenderState state) {
    switch (state) {
        case SenderState::Connecting: return "connecting";
        case SenderState::Live: return "live";
        case SenderState::Reconnecting: return "reconnecting";
        case SenderState::GivenUp: return "given up";
        case SenderState::Ended: return "ended";
    }
    return "";
}

}  // namespace

void LivePush::started(std::optional<Dictionary> userInfo, extension::Completion) {
    end();
    const auto settings = PushSettings::from(userInfo.value_or(Dictionary()));
    if (!settings) return fail(kNoDestination, "The broadcast has no media server to go to.");
    sender_ = std::make_unique<Sender>(
        *settings, timing_, [this, settings = *settings](const Sender::Report& now) { report(settings, now); },
        [this] {
            if (EncoderLane* encoder = wantsKeyFrames_.load()) encoder->wantKeyFrame();
        });
    EncoderLane::Outlet outlet;
    outlet.begin = [this](StreamTracks tracks) { sender_->setTracks(std::move(tracks)); };
    outlet.packet = [this](OutgoingPacket packet) { sender_->send(std::move(packet)); };
    outlet.leftOut = [this](std::uint64_t frames) { sender_->countLeftOut(frames); };
    outlet.failed = [this](const std::string& reason) { fail(kNotEncoded, reason); };
    encoder_ = std::make_unique<EncoderLane>(*settings, std::move(outlet));
    wantsKeyFrames_ = encoder_.get();
}

void LivePush::frame(extension::Frame frame) {
    if (encoder_) encoder_->frame(std::move(frame));
}

void LivePush::sound(extension::Sound sound) {
    if (encoder_) encoder_->sound(std::move(sound));
}

void LivePush::finished(extension::Completion) {
    end();
}

void LivePush::end() {
    if (encoder_) encoder_->finish();
    if (sender_) sender_->finish(kEndLimit);
    sender_ = nullptr;  // while its encoder can still be asked for a key frame
    wantsKeyFrames_ = nullptr;
    encoder_ = nullptr;
}

/// On the sender's thread.
void LivePush::report(const PushSettings& settings, const Sender::Report& now) {
    if (now.state == SenderState::Live && now.pictures == 0 && settings.viewURL)
        broadcast_->updateBroadcastURL(URL(*settings.viewURL));
    broadcast_->updateServiceInfo({{"state", nameOf(now.state)},
                                   {"sentFrames", now.pictures},
                                   {"droppedFrames", now.leftOut},
                                   {"reconnects", now.reconnects},
                                   {"bitRate", now.bitRate},
                                   {"lastFailure", now.lastFailure}});
    if (now.state == SenderState::GivenUp) fail(kServerAway, "The media server can't be reached: " + now.lastFailure);
}

void LivePush::fail(std::int64_t code, const std::string& text) {
    broadcast_->finishWithError(
        Error(std::string(kErrorDomain), code, {{std::string(kLocalizedDescriptionKey), text}}));
}

}  // namespace lumacast::extensions
