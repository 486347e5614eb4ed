#include "linux/audio/TapSelection.h"

#include <algorithm>
#include <charconv>
#include <system_error>

namespace lumacast::sound {

namespace {

template <class Number>
std::optional<Number> readNumber(std::optional<std::string_view> text) {
    if (!text || text->empty()) return std::nullopt;
    Number number{};
    const auto [end, error] = std::from_chars(text->data(), text->data() + text->size(), number);
    if (error != std::errc{} || end != text->data() + text->size()) return std::nullopt;
    return number;
}

std::optional<std::int32_t> readPid(std::optional<std::string_view> text) {
    const auto pid = readNumber<std::int32_t>(text);
    return pid && *pid > 0 ? pid : std::nullopt;
}

template <class Listed>
const Listed* find(const std::vector<Listed>& list, std::uint32_t index) {
    if (index == kNoIndex) return nullptr;
    const auto found = std::find_if(list.begin(), list.end(), [index](const Listed& one) { return one.index == index; });
    return found == list.end() ? nullptr : &*found;
}

/// The pid that the kernel gave PipeWire for our own connection: its PulseAudio service.
std::optional<std::int32_t> pidOfService(const ServerListing& listing) {
    const ListedClient* const own = find(listing.clients, listing.ownClient);
    return own ? own->kernelPid : std::nullopt;
}

}  // namespace

ListedClient readClient(std::uint32_t index,
                        const std::function<std::optional<std::string_view>(std::string_view name)>& property) {
    const auto limited = [&property](std::string_view name) {
        const auto text = property(name);
        return text && text->size() <= kMostPropertyBytes ? text : std::nullopt;
    };
    ListedClient client;
    client.index = index;
    client.kernelPid = readPid(limited("pipewire.sec.pid"));
    client.claimedPid = readPid(limited("application.process.id"));
    client.binary = limited("application.process.binary").value_or("");
    client.machine = limited("application.process.machine_id").value_or("");
    // PulseAudio names the peer, PipeWire the kind of socket. Where neither is said it is not a protocol of theirs.
    const auto peer = property("native-protocol.peer"), kind = property("pulse.server.type");
    client.isRemote = (peer && !peer->starts_with("UNIX socket")) || (kind && *kind != "unix");
    return client;
}

std::optional<ClientIdentity> identityOf(const ServerListing& listing, const ListedClient& client) {
    ClientIdentity identity;
    if (listing.isPipeWire) {
        const auto service = pidOfService(listing);
        if (!service || !client.kernelPid) return std::nullopt;
        if (*client.kernelPid != *service) {
            identity.pid = ProcessID{*client.kernelPid};
            identity.isKernelChecked = true;
            return identity;
        }
    } else if (client.kernelPid) {
        // No PulseAudio says this; a client that does pretends.
        return std::nullopt;
    }
    if (!client.claimedPid || client.isRemote || client.binary.empty()) return std::nullopt;
    identity.pid = ProcessID{*client.claimedPid};
    identity.binary = client.binary;
    identity.machine = client.machine;
    return identity;
}

std::vector<ListedPlayback> selectPlaybacks(
    const ServerListing& listing, const std::function<bool(const ListedClient&, const ClientIdentity&)>& belongs) {
    std::vector<ListedPlayback> selected;
    for (const ListedPlayback& playback : listing.playbacks) {
        if (playback.index == kNoIndex || playback.positions.empty() || playback.positions.size() > kMostChannels) continue;
        const ListedClient* const client = find(listing.clients, playback.client);
        const auto identity = client ? identityOf(listing, *client) : std::nullopt;
        if (identity && belongs(*client, *identity)) selected.push_back(playback);
    }
    std::sort(selected.begin(), selected.end(), [](const auto& a, const auto& b) { return a.index < b.index; });
    if (selected.size() > kMostTapped) selected.resize(kMostTapped);
    // PipeWire gives a stream of one channel two, as its output has, and would add them up for us.
    if (listing.isPipeWire)
        for (ListedPlayback& playback : selected)
            if (playback.positions.size() == 1) playback.positions = {kFrontLeft, kFrontRight};
    return selected;
}

bool isConnected(const ServerListing& listing, const ListedPlayback& playback, std::uint32_t recording) {
    const ListedRecording* const ours = find(listing.recordings, recording);
    if (!ours) return false;
    // PipeWire connects stream to stream and then names no source. One that it names is a device, or all that an output
    // plays.
    if (listing.isPipeWire) return ours->source == kNoIndex;
    // PulseAudio hangs the tap onto the monitor of the output that the stream plays to, and ends it when that changes.
    const ListedSink* const sink = find(listing.sinks, playback.sink);
    return sink && sink->monitorSource != kNoIndex && ours->source == sink->monitorSource;
}

}  // namespace lumacast::sound
