#pragma once

#include <optional>

#include "linux/media/mp4/MovieRecovery.h"
#include "tests/unit/linux_mp4/BoxParser.h"
#include "tests/unit/linux_mp4/Media.h"

namespace lumacast::mp4::test {

// A file that is read and written in memory. Keeps every operation, can fail in the middle of one, and counts what was
// read of it.
class MemoryFile final : public BoxSource, public BoxSink {
public:
    explicit MemoryFile(Bytes bytes) : before(bytes), bytes_(std::move(bytes)) {}

    const Bytes before;
    std::size_t bytesUntilFull = SIZE_MAX;  // of what is appended
    bool isUnreadable = false;

    [[nodiscard]] std::uint64_t size() const override { return bytes_.size(); }
    [[nodiscard]] bool read(std::uint64_t offset, std::span<std::uint8_t> out) override {
        if (isUnreadable || offset > bytes_.size() || out.size() > bytes_.size() - offset) {
            return false;
        }
        std::copy_n(bytes_.begin() + static_cast<std::ptrdiff_t>(offset), out.size(), out.begin());
        bytesRead_ += out.size();
        return true;
    }
    [[nodiscard]] bool append(std::span<const std::uint8_t> bytes) override {
        const std::size_t count = std::min(bytes.size(), bytesUntilFull);
        bytesUntilFull -= bytesUntilFull == SIZE_MAX ? 0 : count;
        record({MemorySink::Kind::append, bytes_.size(), Bytes(bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(count))});
        return count == bytes.size();
    }
    [[nodiscard]] bool overwrite(std::uint64_t offset, std::span<const std::uint8_t> bytes) override {
        if (bytesUntilFull == 0 || offset + bytes.size() > bytes_.size()) {
            return false;
        }
        record({MemorySink::Kind::overwrite, offset, Bytes(bytes.begin(), bytes.end())});
        return true;
    }
    [[nodiscard]] bool sync() override {
        record({MemorySink::Kind::sync, 0, {}});
        return true;
    }

    [[nodiscard]] const Bytes& bytes() const { return bytes_; }
    [[nodiscard]] const std::vector<MemorySink::Operation>& operations() const { return operations_; }
    [[nodiscard]] std::uint64_t bytesRead() const { return bytesRead_; }
    // As it was after the first operations.
    [[nodiscard]] Bytes after(std::size_t count) const {
        Bytes file = before;
        for (std::size_t i = 0; i < count; ++i) {
            MemorySink::apply(operations_[i], file);
        }
        return file;
    }

private:
    void record(MemorySink::Operation operation) {
        MemorySink::apply(operation, bytes_);
        operations_.push_back(std::move(operation));
    }

    Bytes bytes_;
    std::vector<MemorySink::Operation> operations_;
    std::uint64_t bytesRead_ = 0;
};

// What a movie was made of, in the order of its tracks.
struct Material {
    EncodedVideo video;
    std::vector<EncodedAudio> sounds;
    [[nodiscard]] const std::vector<MediaSample>& samples(std::size_t track) const {
        return track == 0 ? video.samples : sounds[track - 1].samples;
    }
};

// What of it is in a file in fragments: the samples of each track that lie wholly in it, those of fragments that are
// still hidden included; and how long the last picture lasts by its fragment.
struct Whole {
    std::vector<std::size_t> samples;
    std::size_t shownPictures = 0;  // only those of fragments that players see
    std::uint32_t lastPictureDuration = 0;
};
[[nodiscard]] Whole wholeIn(const Bytes& file, std::size_t tracks);

// The movie that `finish` makes of so many samples of each track, whose last picture lasts until the sound ends, or as
// long as it states.
[[nodiscard]] Bytes finishedOf(const Material& material, const Whole& whole);

// Fails the test where the two finished movies differ in anything but where their samples lie: tracks, edit lists,
// durations, each sample's time, size, kind and bytes.
void expectSameMovie(const Bytes& movie, const Bytes& expected, const std::string& state);

// Boxes that nest and agree, as the checkers see them.
void expectSoundBoxes(const std::string& path, const std::string& state);

}  // namespace lumacast::mp4::test
