#include <cstring>
#include <stdexcept>

#include "base/Wire.h"
#include "broadcast/ConfigurationArchive.h"
#include "broadcast/PayloadKeys.h"
#include "fuzz/seeds/Seeds.h"
#include "linux/ipc/ExtensionRequests.h"
#include "linux/ipc/LinuxKeyedArchive.h"
#include "writer/media/AudioFormat.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast::fuzz {

namespace {

void append(Data& to, const Data& bytes) {
    to.insert(to.end(), bytes.begin(), bytes.end());
}

/// See the targets: what the rest is, the kinds of its handles and how many, its bytes.
Data message(std::uint8_t what, const Value& value, std::uint8_t kinds = 0, std::uint8_t handles = 0) {
    WireBody body;
    if (!encode(value, body)) throw std::logic_error("a seed is over a limit");
    Data bytes{what, kinds, handles};
    append(bytes, body.bytes);
    return bytes;
}

ExtensionItem item(std::string_view title, Value value) {
    return {std::string(title), {{std::string(kGenericDataType), std::move(value), std::nullopt}}};
}

template <class Record>
Data bytesOf(const Record& record) {
    Data bytes(sizeof record);
    std::memcpy(bytes.data(), &record, sizeof record);
    return bytes;
}

SampleTiming timing() {
    return {kInvalidMediaTime, MediaTime::make(1'500'000'000, 1'000'000'000), kInvalidMediaTime};
}

AudioFormat format() {
    AudioFormat format;
    format.sampleRate = 48'000;
    format.formatID = kAudioFormatLinearPCM;
    format.formatFlags = AudioFormat::kFlagFloat | AudioFormat::kFlagPacked;
    format.framesPerPacket = 1;
    format.channelsPerFrame = 2;
    format.bitsPerChannel = 32;
    format.bytesPerFrame = format.bytesPerPacket = 8;
    return format;
}

}  // namespace

void writeItemSeeds(const std::filesystem::path& corpora) {
    const auto write = [&](const char* name, const Data& bytes) { writeSeed(corpora, "extension_items", name, bytes); };
    const auto complete = [](const std::vector<ExtensionItem>& items) {
        return message(0, Array{std::int64_t{1}, encodeItems(items)});
    };
    LinuxKeyedArchive archives;
    const auto archive = archiveOf(archives, {2, Dictionary{{"AverageBitRate", 800'000}}});
    const ExtensionItem info = item(kItemServiceInfo, Dictionary{{"state", "live"}, {"viewers", 12}});
    write("nothing", complete({}));
    write("both", complete({item(kItemBroadcastConfiguration, *archive), info}));
    write("no-attachment", complete({{std::string(kItemServiceInfo), {}}}));
    write("many", complete(std::vector<ExtensionItem>(20, info)));
    write("ill-formed", message(0, Array{std::int64_t{1}, Array{1, Dictionary{{"title", 5}}, encodeItems({info})[0]}}));
    write("no-type",
          message(0, Array{std::int64_t{1},
                           Array{Dictionary{{"title", "x"}, {"attachments", Array{Dictionary{{"item", 1}}}}}}}));
    write("given-up", message(1, Array{std::int64_t{1}, Error("org.example", 7, {{"LocalizedDescription", "no"}})}));
    write("given-up-silently", message(1, Array{std::int64_t{1}, Value()}));
    // A plane where an item should be: tag 13, the first handle.
    Data plane = message(0, Array{std::int64_t{1}, encodeItems({item(kItemServiceInfo, true)})}, 1, 1);
    plane[plane.size() - 2] = 13;
    plane[plane.size() - 1] = 0;
    write("plane", plane);
    write("recipe", Data{2, 3, 0, 1, 1, 1, 1, 5, 4, 1, 2, 3, 4, 0, 0, 1, 1, 2, 0, 0, 1, 1, 10, 1, 1, 'k', 0, 1, 0});
}

void writeSettingsSeeds(const std::filesystem::path& corpora) {
    const auto write = [&](const char* name, const Dictionary& info) {
        WireBody body;
        if (!encode(info, body)) throw std::logic_error("a seed is over a limit");
        Data bytes{0};
        append(bytes, body.bytes);
        writeSeed(corpora, "broadcast_settings", name, bytes);
    };
    write("folder", {{"directory", "/srv/hls"}, {"keep", 6}, {"clipDuration", 2.5}});
    write("upload", {{"url", "https://example.org/live/"},
                     {"viewURL", URL("https://example.org/watch")},
                     {"keep", "12"},
                     {"compression", Dictionary{{"AverageBitRate", 800'000}}}});
    write("push", {{"url", "rtmp://example.org/live"},
                   {"width", 1280},
                   {"height", "720"},
                   {"bitRate", 2.5e6},
                   {"giveUpAfter", std::uint64_t{30}}});
    write("srt", {{"url", URL("srt://example.org:9000")}});
    write("odd",
          {{"directory", ""}, {"url", 7}, {"keep", -1}, {"clipDuration", "1e999"}, {"width", 65}, {"compression", 1}});
    const auto recipe = [&](const char* name, const Data& bytes) {
        writeSeed(corpora, "broadcast_settings", name, bytes);
    };
    recipe("recipe-folder", Data{1, 1, 0, 3, '/', 'a', 'b', 0, 0, 0, 0, 1, 1, 9, 0, 1, 1, 40, 2, 0, 0, 0, 0, 0});
    recipe("recipe-push",
           Data{1, 0, 1, 2, 3, 'a', '/', 'b', 0, 0, 0, 0, 0, 1, 1, 99, 0, 1, 1, 88, 3, 0, 1, 1, 5, 2, 0});
}

void writePayloadSeeds(const std::filesystem::path& corpora) {
    const auto write = [&](const char* name, const Data& bytes) { writeSeed(corpora, "payloads", name, bytes); };
    const std::string type(kPayloadSampleType), time(kPayloadTimingInfo);
    write("start",
          message(0, Dictionary{{std::string(kPayloadActionType), 1},
                                {std::string(kPayloadUserInfo), Dictionary{{"url", "rtmp://localhost/live"}}}}));
    write("finish", message(0, Dictionary{{std::string(kPayloadActionType), 4}}));
    write("frontmost", message(0, Dictionary{{std::string(kPayloadFrontmostApp), "org.example.Player"}}));
    Data frame = message(0,
                         Dictionary{{type, 1},
                                    {time, bytesOf(timing())},
                                    {std::string(kPayloadVideoOrientation), std::uint64_t{1}},
                                    {std::string(kPayloadSharedPlane), true}},
                         1, 1);
    frame[frame.size() - 2] = 13;
    frame[frame.size() - 1] = 0;
    write("frame", frame);
    write("frame-without-picture", message(0, Dictionary{{type, 1},
                                                         {time, bytesOf(timing())},
                                                         {std::string(kPayloadVideoOrientation), std::uint64_t{1}}}));
    for (const std::int64_t source : {2, 3})
        write(source == 2 ? "sound" : "microphone",
              message(0, Dictionary{{type, source},
                                    {time, bytesOf(timing())},
                                    {std::string(kPayloadAudioFormat), bytesOf(format())},
                                    {std::string(kPayloadNumSamples), std::int64_t{16}},
                                    {std::string(kPayloadAudioBufferList), Data(128, 60)}}));
    AudioFormat odd = format();
    const auto writeOdd = [&](const char* name, const Data& bytes) {
        odd.bytesPerFrame = odd.bitsPerChannel / 8;
        odd.channelsPerFrame = 1;
        write(name, message(0, Dictionary{{type, 2},
                                          {time, bytesOf(timing())},
                                          {std::string(kPayloadAudioFormat), bytesOf(odd)},
                                          {std::string(kPayloadNumSamples),
                                           static_cast<std::int64_t>(bytes.size() / odd.bytesPerFrame)},
                                          {std::string(kPayloadAudioBufferList), bytes}}));
    };
    odd.bitsPerChannel = 64;
    writeOdd("sound-beyond-float", bytesOf(-1e300));
    odd.bitsPerChannel = 8;
    odd.formatFlags = AudioFormat::kFlagSignedInteger;
    odd.sampleRate = 1;
    writeOdd("sound-of-an-hour", Data(3600, 9));
    write("unknown", message(0, Dictionary{{"later", 1}}));
    // Recipes: an action, a frame, sounds of several formats, a clip's items.
    write("recipe-action", Data{1, 0, 2, 0, 1, 1, 0, 0});
    write("recipe-frame", Data{1, 2, 12, 8, 1, 32, 0, 1, 0, 0, 1, 0, 1, 0, 0, 0, 0, 0, 0});
    // Rows so long that their number of bytes is 0 once more.
    write("recipe-frame-turned-in-a-ninth-way", Data{1, 2, 12, 8, 1, 32, 0, 1, 0, 0, 9, 0, 1, 0, 0, 0, 0, 0, 0});
    write("recipe-frame-beyond-memory",
          Data{1, 2, 8, 8, 0, 0, 0, 0, 0, 0, 0, 0, 0x40, 0, 0, 0, 0, 1, 0, 1, 0, 0, 0, 0, 0});
    Data sound{1, 3, 2, 0, 1, 2, 3, 4, 0, 0};
    append(sound, {0, 0, 1, 0, 2, 0, 0, 0, 1, 2, 0});
    append(sound, Data(64, 60));
    write("recipe-sound", sound);
    sound = {1, 3, 3, 0, 1, 2, 3, 4, 0, 0, 2, 0, 4, 0, 1, 1, 0, 0, 1, 9, 0};
    append(sound, Data(64, 200));
    write("recipe-microphone", sound);
    Data clip{2, 0, 1, 0, 1, 8, '0', '1', '2', '3', '4', '5', '6', '7', 0};
    append(clip, {2, 4, 3, '/', 'a', 'b', 0, 3, 5, 'f', 'i', 'l', 'e', ':', 0});
    write("recipe-clip", clip);
}

}  // namespace lumacast::fuzz
