#include "linux/audio/ProcessTap.h"

#include <algorithm>

namespace lumacast::sound {

namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

/// From one look at the server's lists to the next.
constexpr milliseconds kSpacing{50};
/// A stream that couldn't be tapped so often in a row is tried less often.
constexpr int kQuickTries = 3;
constexpr milliseconds kSlowly{1000};

}  // namespace

ProcessTap::Connected::Connected(ProcessTap& tap, const PulseServer& it)
    : server(it),
      reader(it.context, [&tap](const ServerListing* listing) { tap.took(listing); }),
      soon(it.loop, [&tap] { tap.look(); }),
      retry(it.loop, [&tap] { tap.lookSoon(); }) {}

pa_subscription_mask_t ProcessTap::interest() const {
    return static_cast<pa_subscription_mask_t>(PA_SUBSCRIPTION_MASK_SINK_INPUT | PA_SUBSCRIPTION_MASK_SOURCE_OUTPUT |
                                               PA_SUBSCRIPTION_MASK_CLIENT);
}

void ProcessTap::serverCame(const PulseServer& server) {
    connected_ = std::make_unique<Connected>(*this, server);
    look();
}

void ProcessTap::serverWent() { connected_.reset(); }

void ProcessTap::serverChanged(pa_subscription_event_type_t event, std::uint32_t index) {
    if (!connected_) return;
    const int facility = event & PA_SUBSCRIPTION_EVENT_FACILITY_MASK, kind = event & PA_SUBSCRIPTION_EVENT_TYPE_MASK;
    // A stream that has gone: nothing more is taken from it, whatever ours is connected to by now.
    if (facility == PA_SUBSCRIPTION_EVENT_SINK_INPUT && kind == PA_SUBSCRIPTION_EVENT_REMOVE)
        std::erase_if(connected_->streams, [index](const auto& stream) { return stream->playback().index == index; });
    // Of recordings only ours matter, and of clients only what they say of themselves.
    if (facility == PA_SUBSCRIPTION_EVENT_CLIENT && kind != PA_SUBSCRIPTION_EVENT_CHANGE) return;
    if (facility == PA_SUBSCRIPTION_EVENT_SOURCE_OUTPUT &&
        std::none_of(connected_->streams.begin(), connected_->streams.end(),
                     [index](const auto& stream) { return stream->recording() == index; }))
        return;
    lookSoon();
}

void ProcessTap::look() {
    connected_->soon.cancel();
    connected_->isStale = false;
    connected_->lastLook = steady_clock::now();
    connected_->reader.start();
}

void ProcessTap::lookSoon() {
    connected_->isStale = true;
    if (connected_->reader.isReading() || connected_->soon.isRunning()) return;
    const auto since = std::chrono::duration_cast<milliseconds>(steady_clock::now() - connected_->lastLook);
    connected_->soon.start(std::clamp(kSpacing - since, milliseconds(0), kSpacing));
}

void ProcessTap::took(const ServerListing* listing) {
    if (!listing) {
        // Nobody knows whose streams these are.
        for (const auto& stream : connected_->streams)
            if (!stream->hasEnded()) stream->distrust();
        connected_->streams.clear();
        connected_->retry.start(kSlowly);
        return;
    }
    const auto wanted = selectPlaybacks(*listing, [this](const ListedClient& client, const ClientIdentity& identity) {
        return owner_->owns(client, identity);
    });
    judge(*listing, wanted);
    open(listing->isPipeWire ? TappedStream::Account::AtEachPiece : TappedStream::Account::AtAnyTime, wanted);
    if (connected_->isStale) lookSoon();
}

void ProcessTap::judge(const ServerListing& listing, const std::vector<ListedPlayback>& wanted) {
    auto& streams = connected_->streams;
    for (const auto& stream : streams) {
        const auto found = std::find_if(wanted.begin(), wanted.end(), [&stream](const ListedPlayback& playback) {
            return playback.index == stream->playback().index;
        });
        if (stream->hasEnded()) {
            if (found != wanted.end()) {
                auto& failure = connected_->failures[found->index];
                failure.notBefore = steady_clock::now() + (++failure.count > kQuickTries ? kSlowly : milliseconds(0));
            }
            continue;
        }
        // Another client, other channels, or nobody's that we know.
        if (found == wanted.end() || found->client != stream->playback().client ||
            found->positions != stream->playback().positions) {
            stream->distrust();
            continue;
        }
        // Made after this reading began: the next one tells.
        if (!stream->isReady() || stream->isNewerThan(connected_->lastLook)) continue;
        if (!isConnected(listing, *found, stream->recording())) {
            stream->distrust();
            continue;
        }
        connected_->failures.erase(found->index);
        stream->trust();
    }
    std::erase_if(streams, [](const auto& stream) { return stream->hasEnded(); });
    std::erase_if(connected_->failures, [&wanted](const auto& failure) {
        return std::none_of(wanted.begin(), wanted.end(),
                            [&failure](const ListedPlayback& playback) { return playback.index == failure.first; });
    });
}

void ProcessTap::open(TappedStream::Account account, const std::vector<ListedPlayback>& wanted) {
    auto& streams = connected_->streams;
    const auto now = steady_clock::now();
    for (const ListedPlayback& playback : wanted) {
        if (std::any_of(streams.begin(), streams.end(),
                        [&playback](const auto& stream) { return stream->playback().index == playback.index; }))
            continue;
        const auto failure = connected_->failures.find(playback.index);
        if (failure != connected_->failures.end() && now < failure->second.notBefore) {
            connected_->retry.start(kSlowly);
            continue;
        }
        streams.push_back(std::make_unique<TappedStream>(connected_->server, playback, account, mix_, [this] { lookSoon(); }));
        if (streams.back()->hasEnded()) lookSoon();
    }
}

}  // namespace lumacast::sound
