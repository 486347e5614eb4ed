// What the extension library reads: payloads of samples, and requests of clips. The first byte says what the rest is: 0
// a payload's bytes (kinds of the handles beside them, how many, the bytes), 1 the recipe of a payload, 2 the recipe of
// a request's items (modulo 3). What is read goes on to the reader of sounds that live-push and hls-clips share.

#include "client/extension/Payloads.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstring>
#include <memory>

#include "base/Wire.h"
#include "broadcast/PayloadKeys.h"
#include "client/extension/HostLink.h"
#include "extensions/media/PcmReader.h"
#include "fuzz/Input.h"
#include "fuzz/Property.h"
#include "fuzz/ValueRecipe.h"

namespace lumacast::fuzz {

namespace {

using namespace extension;

/// A plane that may lie: its memory need not be as large as it says.
class OddPlane final : public SharedPlane {
public:
    OddPlane(std::int32_t width, std::int32_t height, std::size_t stride, std::size_t bytes)
        : width_(width), height_(height), stride_(stride), pixels_(bytes) {}
    std::int32_t width() const override { return width_; }
    std::int32_t height() const override { return height_; }
    std::size_t stride() const override { return stride_; }
    std::span<const std::uint8_t> pixels() const override { return pixels_; }
    std::span<const PixelRect> damage() const override { return {}; }
    std::uint64_t pictureNumber() const override { return 1; }
    int descriptor() const override { return -1; }

private:
    const std::int32_t width_, height_;
    const std::size_t stride_;
    const Data pixels_;
};

template <class Record>
Data bytesOf(const Record& record) {
    Data bytes(sizeof record);
    std::memcpy(bytes.data(), &record, sizeof record);
    return bytes;
}

bool isSame(const SampleTiming& a, const SampleTiming& b) {
    return std::memcmp(&a, &b, sizeof a) == 0;
}

void requireTime(const SampleTiming& timing) {
    require(timing.presentation.isValid() && timing.presentation.timescale > 0, "a sample has a time");
    (void)add(timing.presentation, timing.presentation);
    require(compare(timing.presentation, timing.presentation) == 0, "a time is its own");
    require(!std::isnan(timing.presentation.seconds()), "a time is a number of seconds");
}

void check(const Frame& frame) {
    requireTime(frame.timing);
    require(frame.plane != nullptr, "a frame has a picture");
    const auto pixels = frame.plane->pixels();
    const auto width = static_cast<std::size_t>(frame.plane->width());
    const auto height = static_cast<std::size_t>(frame.plane->height());
    require(width > 0 && height > 0 && frame.plane->stride() >= 4 * width, "a picture has rows of its pixels");
    require(pixels.size() / frame.plane->stride() >= height, "a picture's pixels are all there");
    require(frame.orientation >= 1 && frame.orientation <= 8, "a picture is turned in one of eight ways");
}

void check(const Sound& sound) {
    requireTime(sound.timing);
    const AudioFormat& format = sound.format;
    require(std::isfinite(format.sampleRate) && format.sampleRate >= 1, "a sound has a rate");
    require(format.channelsPerFrame > 0 && format.bytesPerFrame >= format.channelsPerFrame, "a sound has channels");
    require(sound.frames >= 0 && static_cast<std::uint64_t>(sound.frames) <= sound.bytes.size() / format.bytesPerFrame,
            "a sound's frames are all there");
    require(static_cast<double>(sound.frames) <= 60 * format.sampleRate, "a sound lasts for a moment");
    constexpr int kRate = 48'000;
    extensions::PcmReader reader(kRate);
    for (int times = 0; times < 2; ++times) {
        const extensions::StereoSound read = reader.read(sound);
        require(read.channels[0].size() == read.channels[1].size(), "both sides are as long");
        const double expected = static_cast<double>(sound.frames) / format.sampleRate * kRate;
        require(static_cast<double>(read.size()) <= expected * 1.01 + kRate, "a sound does not become longer");
        for (const auto& channel : read.channels)
            require(std::all_of(channel.begin(), channel.end(), [](float sample) { return std::isfinite(sample); }),
                    "every sample is a number");
    }
}

Dictionary payloadOf(const ActionPayload& action) {
    Dictionary payload{{std::string(kPayloadActionType), static_cast<std::int64_t>(action.action)}};
    if (action.userInfo) payload.set(std::string(kPayloadUserInfo), *action.userInfo);
    return payload;
}

Dictionary payloadOf(const Frame& frame) {
    return {{std::string(kPayloadSampleType), std::int64_t{1}},
            {std::string(kPayloadVideoOrientation), std::uint64_t{frame.orientation}},
            {std::string(kPayloadSharedPlane), Value(std::const_pointer_cast<SharedPlane>(frame.plane))},
            {std::string(kPayloadTimingInfo), bytesOf(frame.timing)}};
}

Dictionary payloadOf(const Sound& sound) {
    return {{std::string(kPayloadSampleType), std::int64_t{sound.source == Sound::Source::Application ? 2 : 3}},
            {std::string(kPayloadTimingInfo), bytesOf(sound.timing)},
            {std::string(kPayloadAudioFormat), bytesOf(sound.format)},
            {std::string(kPayloadAudioBufferList), sound.bytes},
            {std::string(kPayloadNumSamples), sound.frames}};
}

template <class T>
T againOf(const T& payload) {
    const auto again = payloadIn(payloadOf(payload));
    require(again && std::holds_alternative<T>(*again), "a payload that was read and sent again is of the same kind");
    return std::get<T>(*again);
}

void checkPayload(const Dictionary& payload) {
    const auto read = payloadIn(payload);
    if (!read) return;
    if (const auto* action = std::get_if<ActionPayload>(&*read)) {
        require(action->action >= Action::Start && action->action <= Action::Finish, "an action is one of four");
        const ActionPayload again = againOf(*action);
        require(again.action == action->action && again.userInfo.has_value() == action->userInfo.has_value(),
                "an action is read as it was sent");
    } else if (const auto* frame = std::get_if<Frame>(&*read)) {
        check(*frame);
        const Frame again = againOf(*frame);
        require(again.plane == frame->plane && again.orientation == frame->orientation &&
                    isSame(again.timing, frame->timing) && !frame->completion,
                "a frame is read as it was sent");
    } else if (const auto* sound = std::get_if<Sound>(&*read)) {
        check(*sound);
        const Sound again = againOf(*sound);
        require(again.source == sound->source && again.bytes == sound->bytes && again.frames == sound->frames &&
                    again.format == sound->format && isSame(again.timing, sound->timing),
                "a sound is read as it was sent");
    }
}

std::vector<Value> handlesOf(Input& in) {
    std::vector<Value> handles;
    const unsigned kinds = in.byte(), count = in.below(4);
    for (unsigned i = 0; i < count; ++i) {
        if ((kinds >> i & 1) == 0)
            handles.push_back(makeHandle(false));
        else
            handles.emplace_back(Value::PlaneRef(std::make_shared<OddPlane>(4, 2, 16 + i, 32)));
    }
    return handles;
}

void checkBytes(Input& in) {
    const auto handles = handlesOf(in);
    const auto value = decode(in.rest(), handles);
    if (value && matches({*value}, broadcastExtensionProtocol().messages[0].arguments))
        checkPayload(*value->as<Dictionary>());
}

SampleTiming timingOf(Input& in) {
    SampleTiming timing{kInvalidMediaTime, MediaTime::make(static_cast<std::int64_t>(in.number(4)), 1'000'000'000),
                        kInvalidMediaTime};
    const unsigned odd = in.below(8);
    if (odd == 5) timing.presentation.timescale = static_cast<std::int32_t>(in.number(4));
    if (odd == 6) timing.presentation.flags = in.byte();
    if (odd == 7) timing.presentation.value = static_cast<std::int64_t>(in.number(8));
    return timing;
}

AudioFormat formatOf(Input& in) {
    constexpr std::array kRates{48'000.0, 44'100.0, 16'000.0, 1.0, 768'000.0, 0.0, 1e300, 7'999.5};
    constexpr std::array kBits{32u, 16u, 8u, 24u, 64u, 0u, 33u, 4'294'967'288u};
    AudioFormat format;
    format.sampleRate = kRates[in.below(kRates.size())];
    format.formatID = in.below(8) == 7 ? kAudioFormatAAC : kAudioFormatLinearPCM;
    format.formatFlags = in.below(16);
    format.channelsPerFrame = in.below(9) == 8 ? static_cast<std::uint32_t>(in.number(4)) : in.below(4);
    format.bitsPerChannel = kBits[in.below(kBits.size())];
    format.bytesPerFrame = format.bitsPerChannel / 8 * format.channelsPerFrame + (in.below(8) == 7 ? 1 : 0);
    return format;
}

/// One member as it should be, of another kind, or not there.
void setMember(Dictionary& payload, std::string_view key, Value value, Input& in) {
    const unsigned odd = in.below(32);
    if (odd == 30) value = valueOf(in);
    if (odd != 31) payload.set(std::string(key), std::move(value));
}

Dictionary payloadFrom(Input& in) {
    Dictionary payload;
    const unsigned kind = in.below(6);
    if (kind == 0) {
        setMember(payload, kPayloadActionType, static_cast<std::int64_t>(static_cast<std::int8_t>(in.byte())), in);
        if (in.flag()) setMember(payload, kPayloadUserInfo, Dictionary{{"url", valueOf(in)}}, in);
    } else if (kind == 1) {
        setMember(payload, kPayloadFrontmostApp, std::string(textOf(in.bytes(in.below(32)))), in);
    } else if (kind == 2) {
        const auto width = static_cast<std::int32_t>(in.below(40)) - 4,
                   height = static_cast<std::int32_t>(in.below(40)) - 4;
        const std::size_t stride = in.number(in.flag() ? 1 : 8);
        const std::size_t bytes = in.number(2);
        setMember(payload, kPayloadSharedPlane,
                  Value(Value::PlaneRef(std::make_shared<OddPlane>(width, height, stride, bytes))), in);
        setMember(payload, kPayloadSampleType, std::int64_t{1}, in);
        setMember(payload, kPayloadVideoOrientation, std::uint64_t{in.below(10)}, in);
        setMember(payload, kPayloadTimingInfo, bytesOf(timingOf(in)), in);
    } else {
        setMember(payload, kPayloadSampleType, std::int64_t{in.below(5)}, in);
        setMember(payload, kPayloadTimingInfo, bytesOf(timingOf(in)), in);
        setMember(payload, kPayloadAudioFormat, bytesOf(formatOf(in)), in);
        setMember(payload, kPayloadNumSamples,
                  in.flag() ? std::int64_t{in.byte()} : static_cast<std::int64_t>(in.number(8)), in);
        const Bytes sound = in.rest();
        setMember(payload, kPayloadAudioBufferList, Data(sound.begin(), sound.end()), in);
    }
    return payload;
}

ExtensionItem itemOf(std::string_view title, Value value, Input& in) {
    const unsigned odd = in.below(32);
    if (odd == 29) value = valueOf(in);
    ExtensionItem item{std::string(title), {{std::string(kGenericDataType), std::move(value), std::nullopt}}};
    if (odd == 30) item.attachments.front().typeIdentifier = "public.text";
    if (odd == 31) item.attachments.clear();
    return item;
}

std::vector<ExtensionItem> itemsOf(const ClipRequest& clip) {
    const auto item = [](std::string_view title, Value value) {
        return ExtensionItem{std::string(title), {{std::string(kGenericDataType), std::move(value), std::nullopt}}};
    };
    return {item(kItemRequestedFinish, clip.isLast ? "1" : "0"), item(kItemSandboxToken, clip.token),
            item(kItemUserInfo, clip.userInfo ? Value(*clip.userInfo) : Value()), item(kItemMovieClipURL, clip.url)};
}

void checkClip(Input& in) {
    constexpr std::array kFinish{"0", "1", "", "2"};
    std::vector<ExtensionItem> items;
    while (!in.isAtEnd() && items.size() < 16) {
        const unsigned kind = in.below(5);
        if (kind == 0) items.push_back(itemOf(kItemRequestedFinish, kFinish[in.below(kFinish.size())], in));
        const Bytes bytes = in.bytes(kind == 1 || kind == 3 ? in.below(80) : 0);
        if (kind == 1) items.push_back(itemOf(kItemSandboxToken, Data(bytes.begin(), bytes.end()), in));
        if (kind == 2) items.push_back(itemOf(kItemUserInfo, Dictionary{{"directory", valueOf(in)}}, in));
        if (kind == 3) items.push_back(itemOf(kItemMovieClipURL, std::string(textOf(bytes)), in));
        if (kind == 4) items.push_back(itemOf("", Value(), in));
    }
    const auto clip = clipRequestIn(items);
    if (!clip) return;
    const auto again = clipRequestIn(itemsOf(*clip));
    require(again && again->token == clip->token && again->url == clip->url && again->userInfo == clip->userInfo &&
                again->isLast == clip->isLast,
            "a clip is read as it was sent");
    // The first item of each title counts.
    const auto first = [&items](std::string_view title) {
        const auto found =
            std::find_if(items.begin(), items.end(), [&](const auto& i) { return i.attributedTitle == title; });
        require(found != items.end() && !found->attachments.empty(), "a clip is whole");
        return found->attachments.front().item;
    };
    require(first(kItemRequestedFinish) == Value(clip->isLast ? "1" : "0"), "the last clip is told from the others");
    require(first(kItemSandboxToken) == Value(clip->token) && first(kItemMovieClipURL) == Value(clip->url),
            "a clip has its own token and place");
}

}  // namespace

void payloads(Bytes input) {
    Input in(input);
    switch (in.below(3)) {
        case 0: return checkBytes(in);
        case 1: return checkPayload(payloadFrom(in));
        default: return checkClip(in);
    }
}

}  // namespace lumacast::fuzz
