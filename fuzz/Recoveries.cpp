// A movie that was cut off and is recovered. First byte: 1 the rest is a file; else a recipe of one, with 2 one that was
// finished up to some step, 4 sound too, 8 a second sound, 16 a copy. Then the recipe: how many samples there are, their
// sizes and distances, where the file is cut, how far the recovery gets before the disk is full; what is left are changes
// of three bytes each, a place (in 65536ths of the file) and a value.

#include <algorithm>
#include <vector>

#include "fuzz/Input.h"
#include "fuzz/Property.h"
#include "linux/media/mp4/BoxReader.h"
#include "linux/media/mp4/FileHead.h"
#include "linux/media/mp4/MovieBoxWriter.h"
#include "linux/media/mp4/MovieLook.h"
#include "linux/media/mp4/MovieRecovery.h"

namespace lumacast::fuzz {

namespace {

using Text = std::vector<std::uint8_t>;

/// A file in memory; full after so many more bytes.
class File final : public mp4::BoxSource, public mp4::BoxSink {
public:
    explicit File(Text text = {}) : text(std::move(text)) {}
    std::uint64_t size() const override { return text.size(); }
    bool read(std::uint64_t offset, std::span<std::uint8_t> out) override {
        if (offset > text.size() || out.size() > text.size() - offset) return false;
        std::copy_n(text.begin() + static_cast<std::ptrdiff_t>(offset), out.size(), out.begin());
        return true;
    }
    bool append(std::span<const std::uint8_t> bytes) override {
        const std::size_t count = std::min(bytes.size(), room);
        room -= count;
        text.insert(text.end(), bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(count));
        wrote = true;
        return count == bytes.size();
    }
    bool overwrite(std::uint64_t offset, std::span<const std::uint8_t> bytes) override {
        require(offset <= text.size() && bytes.size() <= text.size() - offset, "nothing is overwritten that isn't there");
        if (room == 0) return false;
        std::copy(bytes.begin(), bytes.end(), text.begin() + static_cast<std::ptrdiff_t>(offset));
        wrote = true;
        return true;
    }
    bool sync() override {
        steps.push_back(text);
        return true;
    }

    Text text;
    std::vector<Text> steps;  ///< the file at each sync
    std::size_t room = std::size_t{1} << 30;
    bool wrote = false;
};

mp4::VideoTrackDescription picture() {
    mp4::VideoTrackDescription track;
    track.width = 320;
    track.height = 180;
    track.sequenceParameterSets = {{0x67, 0x42, 0xC0, 0x1E, 0xD9, 0x01, 0x40, 0x16, 0xEC}};
    track.pictureParameterSets = {{0x68, 0xCB, 0x83, 0xCB, 0x20}};
    return track;
}

mp4::AudioTrackDescription sound() {
    mp4::AudioTrackDescription track;
    track.sampleRate = 48000;
    track.channels = 2;
    track.audioSpecificConfig = {0x11, 0x90};
    track.primingFrames = 1024;
    return track;
}

/// One NAL unit with a slice.
Text sampleOf(std::size_t size) {
    Text bytes(5 + size, 0x5A);
    bytes[0] = bytes[1] = bytes[2] = 0;
    bytes[3] = static_cast<std::uint8_t>(size + 1);
    bytes[4] = 0x65;
    return bytes;
}

Text cutOff(Input& in, std::uint8_t wish) {
    File file;
    mp4::MovieOptions options;
    options.purpose = (wish & 16) != 0 ? mp4::MoviePurpose::copy : mp4::MoviePurpose::recording;
    mp4::MovieBoxWriter writer(file, options);
    const auto video = writer.addVideoTrack(picture());
    std::vector<mp4::TrackId> sounds;
    for (const int flag : {4, 8})
        if ((wish & flag) != 0) sounds.push_back(*writer.addAudioTrack(sound()));
    (void)writer.start();
    const unsigned pictures = 1 + in.below(40);
    std::int64_t stamp = 0;
    std::vector<std::int64_t> next(sounds.size(), -1024);
    for (unsigned i = 0; i < pictures; ++i) {
        const std::uint8_t kind = in.byte();
        (void)writer.addSample(*video, {stamp, 0, i == 0 || (kind & 1) != 0}, sampleOf(kind));
        stamp += std::int64_t{1} + std::int64_t{in.byte()} * 10'000;
        for (std::size_t track = 0; track < sounds.size(); ++track)
            for (; next[track] * 1000 < stamp * 48; next[track] += 1024)
                (void)writer.addSample(sounds[track], {next[track], 1024}, sampleOf(kind / 2));
        if ((kind & 2) != 0) (void)writer.flushFragment();
    }
    (void)writer.flushFragment();
    if ((wish & 2) != 0) {
        (void)writer.finish(stamp + in.byte() * 1000);
        return file.steps[file.steps.size() - 1 - std::min<std::size_t>(in.below(3), file.steps.size() - 1)];
    }
    Text text = file.text;
    text.resize(text.size() - text.size() * in.number(2) / 65536 / 2);
    return text;
}

void change(Text& file, Input& in) {
    while (in.size() >= 3 && !file.empty()) {
        const std::size_t place = static_cast<std::size_t>(in.number(2)) * file.size() / 65536;
        file[place] = in.byte();
    }
}

/// Every chunk of the index lies between the file's beginning and the index.
void requireChunksInside(const Text& file, std::uint64_t mediaEnd) {
    const std::span<const std::uint8_t> index(file.begin() + static_cast<std::ptrdiff_t>(mediaEnd), file.end());
    const auto movie = mp4::findBox(index, "moov");
    require(!movie.empty(), "a recovered movie has its index at its end");
    mp4::BoxReader boxes(movie);
    while (const auto track = mp4::nextBox(boxes)) {
        if (track->type != mp4::FourCC("trak").value) continue;
        const auto table = mp4::findBox(mp4::findBox(mp4::findBox(track->payload, "mdia"), "minf"), "stbl");
        mp4::BoxReader chunks(mp4::findBox(table, "stco"));
        chunks.skip(4);
        for (std::uint32_t left = chunks.u32(); left > 0; --left) {
            const std::uint32_t offset = chunks.u32();
            require(offset >= mp4::kFileStartBytes && offset < mediaEnd, "a chunk lies in the media");
        }
        require(!chunks.failed() && chunks.left() == 0, "a table is whole");
    }
}

void requireOrdinary(File& file, const Text& before) {
    const mp4::HeadView view = mp4::readFileHead(file);
    require(view.head == mp4::FileHead::finished, "a recovered movie begins as a finished one");
    require(view.mediaEnd <= file.text.size() && file.text.size() >= before.size(), "nothing is taken away");
    require(std::equal(before.begin() + mp4::kFileStartBytes, before.end(),
                       file.text.begin() + static_cast<std::ptrdiff_t>(mp4::kFileStartBytes)),
            "no byte of the media or of what else there is changes");
    const mp4::MovieState state = mp4::lookAtMovie(file).state;
    require(state == mp4::MovieState::finished || state == mp4::MovieState::recovered, "it is known as finished");
    require(mp4::recoverMovie(file, file) == mp4::Recovery::finished, "there is nothing left to recover");
}

}  // namespace

void recoveries(Bytes input) {
    Input in(input);
    const std::uint8_t wish = in.byte();
    Text before;
    std::size_t room = 0;
    if ((wish & 1) != 0) {
        const Bytes rest = in.rest();
        before.assign(rest.begin(), rest.end());
    } else {
        before = cutOff(in, wish);
        room = static_cast<std::size_t>(in.number(2));
        change(before, in);
    }
    File file(before);
    (void)mp4::lookAtMovie(file);
    const mp4::Recovery result = mp4::recoverMovie(file, file);
    const bool isDone = result == mp4::Recovery::recovered || result == mp4::Recovery::completed;
    require(result != mp4::Recovery::sinkFailed && result != mp4::Recovery::sourceFailed, "nothing failed");
    require(isDone == file.wrote, "only what is recovered is written to");
    if (!isDone) return;
    if (result == mp4::Recovery::recovered) requireChunksInside(file.text, mp4::readFileHead(file).mediaEnd);
    requireOrdinary(file, before);
    // The same on a disk that is full sooner or later, and once more with room.
    File full(before);
    full.room = room;
    const mp4::Recovery first = mp4::recoverMovie(full, full);
    require(first == result || first == mp4::Recovery::sinkFailed, "room is all that it can lack");
    require(std::equal(before.begin() + mp4::kFileStartBytes, before.end(),
                       full.text.begin() + static_cast<std::ptrdiff_t>(mp4::kFileStartBytes)),
            "a full disk changes nothing");
    full.room = std::size_t{1} << 30;
    (void)mp4::recoverMovie(full, full);
    requireOrdinary(full, before);
}

}  // namespace lumacast::fuzz
