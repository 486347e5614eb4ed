// The sound server: what its clients say of themselves, its lists, and when it says that something was heard. First two
// bytes (1: PipeWire; our own client), then entries and pieces until the end, each a byte for its kind:
//
//   0 client: index · byte: number of properties (below 8), each a byte for its name (from 16 on: that many bytes less
//     16 of another one), a length byte (from 240 on: times 16) and its bytes
//   1 playback: index, client, sink · byte: channels of the map · byte: channels of the format · a byte for each position
//   2 sink: index, monitor source
//   3 recording: index, client, source
//   4 piece that was heard: u64 frames counted · u64 age · u32 latency · u32 delay · u16: frames in it, below 1024
//
// Numbers of the lists are a byte each, 255 for none.

#include <pulse/pulseaudio.h>

#include <array>
#include <cmath>

#include "fuzz/Input.h"
#include "fuzz/Property.h"
#include "linux/audio/MixDown.h"
#include "linux/audio/PulseHandles.h"
#include "linux/audio/ServerReader.h"
#include "linux/audio/StreamOrigin.h"
#include "linux/audio/StreamPosition.h"
#include "linux/audio/TapFormat.h"
#include "linux/audio/TapMix.h"
#include "linux/audio/TapSelection.h"

namespace lumacast::fuzz {

namespace {

using namespace sound;

constexpr std::array kNames{"application.process.id",     "application.process.binary", "application.process.machine_id",
                            "pipewire.sec.pid",           "native-protocol.peer",       "pulse.server.type",
                            "application.name",           "pipewire.sec.uid"};
constexpr std::size_t kMostEntries = 64, kMostPieces = 24, kMostFrames = 1024;
constexpr std::uint32_t kRate = 44100;

std::uint32_t indexIn(Input& in) {
    const std::uint8_t number = in.byte();
    return number == 255 ? kNoIndex : number;
}

ListedClient clientIn(Input& in) {
    const PropertyListHandle properties(pa_proplist_new());
    pa_client_info info{};
    info.index = indexIn(in);
    info.proplist = properties.get();
    const unsigned count = in.below(8);
    for (unsigned i = 0; i < count; ++i) {
        const std::uint8_t kind = in.byte();
        const std::string name =
            kind < 16 ? std::string(kNames[kind % kNames.size()]) : std::string(textOf(in.bytes(kind - 16u)));
        const std::uint8_t length = in.byte();
        const Bytes value = in.bytes(length < 240 ? length : length * 16u);
        // With a zero byte at the end it is a text, as far as it is one.
        pa_proplist_set(properties.get(), name.c_str(), value.data(), value.size());
        if (kind % 2 == 0) pa_proplist_sets(properties.get(), name.c_str(), std::string(textOf(value)).c_str());
    }
    ListedClient client = listedClient(info);
    require(client.index == info.index, "a client keeps its number");
    require(client.binary.size() <= kMostPropertyBytes && client.machine.size() <= kMostPropertyBytes, "names are short");
    require(!client.kernelPid || *client.kernelPid > 0, "a process has a number above 0");
    require(!client.claimedPid || *client.claimedPid > 0, "also one that is claimed");
    return client;
}

ListedPlayback playbackIn(Input& in) {
    pa_sink_input_info info{};
    info.index = indexIn(in);
    info.client = indexIn(in);
    info.sink = indexIn(in);
    info.channel_map.channels = in.byte();
    info.sample_spec.channels = in.byte();
    for (unsigned i = 0; i < std::min<unsigned>(info.channel_map.channels, PA_CHANNELS_MAX); ++i)
        info.channel_map.map[i] = static_cast<pa_channel_position_t>(static_cast<std::int8_t>(in.byte()));
    ListedPlayback playback = listedPlayback(info);
    require(playback.positions.size() <= kMostChannels, "channels are limited");
    for (const std::int32_t position : playback.positions)
        require(position >= 0 && position < PA_CHANNEL_POSITION_MAX, "a channel is somewhere");
    return playback;
}

/// What is heard of one playback, as TappedStream does.
class Heard {
public:
    Heard(const ListedPlayback& playback, std::uint32_t channels)
        : inputs_(playback.positions.size()),
          channels_(channels),
          mix_(kRate, channels, HostTime{now_.nanoseconds}),
          mixDown_(sidesOf(playback.positions), channels),
          lane_(mix_.addLane()) {
        mix_.trust(*lane_);
    }

    void take(Input& in) {
        now_.nanoseconds += 20'000'000;
        StreamAccount account;
        account.now = now_;
        account.frames = static_cast<std::int64_t>(in.number(8));
        account.age = in.number(8);
        account.latency = in.number(4);
        account.delay = in.number(4);
        origin_.take(now_, originBy(account, kRate));
        const auto frames = static_cast<std::int64_t>(in.number(2) % kMostFrames);
        const HostTime heard = momentOf(*origin_.origin(), account.frames, kRate);
        const StreamPosition::Piece piece = position_.place(mix_.frameAt(heard), frames);
        require(std::abs(piece.frames - frames) <= 1, "a piece is stretched by a frame at most");

        std::vector<float> sound(static_cast<std::size_t>(frames) * inputs_, 0.5f), mixed;
        mixDown_.mix(sound, piece.frames, mixed);
        require(mixed.size() == static_cast<std::size_t>(piece.frames) * channels_, "a piece is as long as it is to be");
        for (const float sample : mixed) require(std::abs(sample) <= 0.5001f, "nothing becomes louder");
        mix_.write(*lane_, piece.frame, mixed);
        read();
    }

private:
    void read() {
        const std::int64_t before = mix_.position(), ready = mix_.readable(now_);
        require(ready >= 0 && ready <= kRate, "what can be read is no more than what has passed");
        require(mix_.readableFrom(0).nanoseconds <= now_.nanoseconds + TapMix::kLongestDelay + 1'000'000'000,
                "the delay is limited");
        std::vector<float> samples(static_cast<std::size_t>(ready) * channels_);
        mix_.read(samples);
        require(mix_.position() == before + ready, "time goes on");
        for (const float sample : samples) require(std::abs(sample) <= 0.5001f, "one stream is no louder than itself");
        AudioFormat format;
        format.sampleRate = kRate;
        format.formatID = kAudioFormatLinearPCM;
        format.formatFlags = AudioFormat::kFlagSignedInteger | AudioFormat::kFlagPacked;
        format.channelsPerFrame = channels_;
        format.bitsPerChannel = 16;
        const auto whole = completed(format);
        std::vector<std::uint8_t> bytes(samples.size() * 2);
        writePcm(*whole, samples, bytes.data());
    }

    const std::size_t inputs_;
    const std::uint32_t channels_;
    HostTime now_{std::int64_t{1} << 40};
    TapMix mix_;
    const MixDown mixDown_;
    const std::shared_ptr<SoundLane> lane_;
    StreamOrigin origin_;
    StreamPosition position_{kRate};
};

void checkSelection(const ServerListing& listing, const std::vector<ListedPlayback>& selected,
                    const std::function<bool(const ListedClient&, const ClientIdentity&)>& belongs) {
    require(selected.size() <= kMostTapped, "not more streams than can be tapped");
    for (std::size_t i = 0; i < selected.size(); ++i) {
        const ListedPlayback& one = selected[i];
        require(i == 0 || selected[i - 1].index <= one.index, "the oldest streams first");
        require(!one.positions.empty() && one.positions.size() <= kMostChannels, "channels that can be recorded");
        bool isWanted = false;
        for (const ListedClient& client : listing.clients) {
            const auto identity = client.index == one.client ? identityOf(listing, client) : std::nullopt;
            if (identity && belongs(client, *identity)) isWanted = true;
        }
        require(isWanted, "a stream whose client doesn't belong is not tapped");
        for (const ListedRecording& recording : listing.recordings) {
            if (!isConnected(listing, one, recording.index)) continue;
            require(recording.index != kNoIndex, "a recording without a number is none");
            bool isPlain = false;
            for (const ListedRecording& same : listing.recordings)
                if (same.index == recording.index && (same.source == kNoIndex) == listing.isPipeWire) isPlain = true;
            require(isPlain, "no device, and none but an output's monitor");
        }
    }
}

}  // namespace

void soundServer(Bytes input) {
    Input in(input);
    ServerListing listing;
    listing.isPipeWire = in.flag();
    listing.ownClient = indexIn(in);
    std::vector<Input> pieces;
    while (!in.isAtEnd()) {
        const unsigned kind = in.below(5);
        if (kind == 4) {
            if (pieces.size() < kMostPieces) pieces.emplace_back(in.bytes(26));
            continue;
        }
        if (listing.clients.size() + listing.playbacks.size() + listing.sinks.size() + listing.recordings.size() >=
            kMostEntries)
            break;
        if (kind == 0) listing.clients.push_back(clientIn(in));
        if (kind == 1) listing.playbacks.push_back(playbackIn(in));
        if (kind == 2) {
            const std::uint32_t index = indexIn(in);
            listing.sinks.push_back({index, indexIn(in)});
        }
        if (kind == 3) {
            const std::uint32_t index = indexIn(in), client = indexIn(in);
            listing.recordings.push_back({index, client, indexIn(in)});
        }
    }

    for (const ListedClient& client : listing.clients) {
        const auto identity = identityOf(listing, client);
        if (!identity) continue;
        require(number(identity->pid) > 0, "an identity is a process");
        require(!identity->isKernelChecked || (listing.isPipeWire && client.kernelPid == number(identity->pid)),
                "only the kernel's word is the kernel's");
        require(identity->isKernelChecked || (!client.isRemote && !identity->binary.empty()),
                "a claim names a program of this machine");
    }
    const auto belongs = [](const ListedClient&, const ClientIdentity& identity) { return number(identity.pid) % 2 != 0; };
    const auto selected = selectPlaybacks(listing, belongs);
    checkSelection(listing, selected, belongs);

    // What is heard depends on the channels only.
    ListedPlayback heard{0, 0, 0, {kFrontLeft, kFrontRight}};
    if (!selected.empty()) heard = selected.front();
    Heard mono(heard, 1), stereo(heard, 2);
    for (const Input& piece : pieces) {
        Input one = piece, other = piece;
        mono.take(one);
        stereo.take(other);
    }
}

}  // namespace lumacast::fuzz
