#include "tests/checkers/BoxFragments.h"

#include <algorithm>
#include <map>
#include <optional>

namespace lumacast::checkers {
namespace {

constexpr char kExtends[] = "14496-12, 8.8.3", kNumber[] = "14496-12, 8.8.5", kTrack[] = "14496-12, 8.8.6",
               kHeader[] = "14496-12, 8.8.7", kRun[] = "14496-12, 8.8.8", kTime[] = "14496-12, 8.8.12";

struct Defaults {
    std::uint32_t duration = 0, size = 0, flags = 0;
};

/// A track while its fragments are gone through.
struct Progress {
    CheckedTrack* track = nullptr;
    Defaults defaults;
    std::optional<std::uint64_t> end;  // of what has been decoded, ticks
};

/// What `tfhd` says.
struct Header {
    Progress* progress = nullptr;
    Defaults defaults;
    std::uint64_t base = 0;  // that the data offsets count from
};

class FragmentCheck final {
public:
    FragmentCheck(std::uint64_t fileBytes, std::vector<CheckedTrack>& tracks, Findings& findings)
        : fileBytes_(fileBytes), complaints_(findings, "fragments") {
        for (CheckedTrack& track : tracks) progress_[track.track.identifier] = {&track, {}, std::nullopt};
    }

    void readExtends(const std::vector<Box>& moov) {
        const Box* extends = onlyBox(moov, "mvex", "14496-12, 8.8.1", complaints_.about("movie"));
        if (extends == nullptr) return;
        std::map<std::uint32_t, int> seen;
        for (const Box& box : childrenOf(*extends, complaints_.about("movie"))) {
            if (box.type != "trex") continue;
            FullBox fields(box, 0, complaints_);
            const std::uint32_t identifier = fields.fields.u32(), entry = fields.fields.u32();
            Defaults defaults;
            defaults.duration = fields.fields.u32();
            defaults.size = fields.fields.u32();
            defaults.flags = fields.fields.u32();
            requireEnd(fields.fields, "trex", kExtends, complaints_);
            require(entry == 1, kExtends, "trex names a sample entry that isn't there");
            ++seen[identifier];
            if (const auto found = progress_.find(identifier); found != progress_.end()) found->second.defaults = defaults;
            else complaints_.find(kExtends, "trex names a track that isn't there");
        }
        for (const auto& [identifier, progress] : progress_)
            require(seen[identifier] == 1, kExtends,
                    "there are " + std::to_string(seen[identifier]) + " trex for track " + std::to_string(identifier));
    }

    std::size_t run(const std::vector<Box>& file) {
        for (std::size_t place = 0; place < file.size(); ++place) {
            if (file[place].type != "moof") continue;
            ++count_;
            checkFragment(file[place], place + 1 < file.size() ? &file[place + 1] : nullptr);
        }
        for (const auto& [identifier, progress] : progress_) {
            const auto& samples = progress.track->samples;
            require(samples.empty() || samples.front().isSync, "",
                    "the first sample of track " + std::to_string(identifier) + " isn't a sync sample");
        }
        return count_;
    }

private:
    void require(bool isSo, const char* clause, const std::string& otherwise) const {
        complaints_.require(isSo, clause, otherwise);
    }
    [[nodiscard]] std::string name() const { return "fragment " + std::to_string(count_); }

    void checkFragment(const Box& moof, const Box* next) {
        const auto boxes = childrenOf(moof, complaints_);
        if (const Box* header = onlyBox(boxes, "mfhd", kNumber, complaints_)) checkNumber(*header);
        bytes_ = 0;
        for (const Box& box : boxes)
            if (box.type == "traf") checkTrackFragment(moof, box);
        if (next == nullptr || next->type != "mdat")
            return complaints_.find("", "the media of " + name() + " don't follow it");
        // The writers judged here put nothing else there: what is left over was counted wrong.
        require(bytes_ == next->content.size(), "",
                name() + " has samples of " + std::to_string(bytes_) + " bytes, the mdat behind it " +
                    std::to_string(next->content.size()));
    }

    void checkNumber(const Box& box) {
        FullBox header(box, 0, complaints_);
        const std::uint32_t number = header.fields.u32();
        requireEnd(header.fields, "mfhd", kNumber, complaints_);
        require(count_ == 1 || number > number_, kNumber,
                name() + " has the number " + std::to_string(number) + " after " + std::to_string(number_));
        number_ = number;
    }

    void checkTrackFragment(const Box& moof, const Box& traf) {
        const auto boxes = childrenOf(traf, complaints_);
        const Box* box = onlyBox(boxes, "tfhd", kHeader, complaints_);
        const auto header = box != nullptr ? readHeader(moof, *box) : std::nullopt;
        if (!header) return;
        if (const Box* time = onlyBox(boxes, "tfdt", kTime, complaints_)) checkTime(*time, *header->progress);
        std::uint64_t offset = header->base;
        bool any = false;
        for (const Box& run : boxes) {
            if (run.type != "trun") continue;
            readRun(run, *header, offset);
            any = true;
        }
        require(any, kTrack, name() + " has a track without samples");
    }

    std::optional<Header> readHeader(const Box& moof, const Box& box) {
        constexpr std::uint32_t kBase = 1, kEntry = 2, kDuration = 8, kSize = 16, kFlags = 32, kBaseIsMoof = 0x20000;
        FullBox header(box, 0, complaints_);
        const std::uint32_t identifier = header.fields.u32();
        const auto found = progress_.find(identifier);
        if (found == progress_.end()) {
            complaints_.find(kHeader, name() + " names track " + std::to_string(identifier) + ", which isn't there");
            return std::nullopt;
        }
        Header read{&found->second, found->second.defaults, moof.begin};
        const auto has = [&](std::uint32_t flag) { return (header.flags & flag) != 0; };
        require(has(kBase) || has(kBaseIsMoof), kHeader, name() + " doesn't count its data offsets from itself");
        if (has(kBase)) read.base = header.fields.u64();
        if (has(kEntry)) require(header.fields.u32() == 1, kHeader, "tfhd names a sample entry that isn't there");
        if (has(kDuration)) read.defaults.duration = header.fields.u32();
        if (has(kSize)) read.defaults.size = header.fields.u32();
        if (has(kFlags)) read.defaults.flags = header.fields.u32();
        requireEnd(header.fields, "tfhd", kHeader, complaints_);
        return read;
    }

    void checkTime(const Box& box, Progress& progress) {
        FullBox time(box, 1, complaints_);
        const std::uint64_t begin = time.fields.byVersion(time.version);
        requireEnd(time.fields, "tfdt", kTime, complaints_);
        const BoxTrack& track = progress.track->track;
        const std::string what = name() + " decodes track " + std::to_string(track.identifier) + " from " +
                                 std::to_string(begin) + " on, the one before ended at " +
                                 std::to_string(progress.end.value_or(0));
        require(!progress.end || begin >= *progress.end, kTime, what);
        // It lengthens the last sample, which a picture may be; sound must not have a hole.
        require(!progress.end || begin <= *progress.end || track.handler == "vide", "", what);
        progress.end = begin;
    }

    void readRun(const Box& box, const Header& header, std::uint64_t& offset) {
        constexpr std::uint32_t kOffset = 1, kFirstFlags = 4, kDuration = 0x100, kSize = 0x200, kFlags = 0x400,
                                kComposition = 0x800;
        FullBox run(box, 1, complaints_);
        const auto has = [&](std::uint32_t flag) { return (run.flags & flag) != 0; };
        std::uint64_t count = run.fields.u32();
        if (has(kOffset)) offset = header.base + run.fields.u32();
        std::optional<std::uint32_t> first;
        if (has(kFirstFlags)) first = run.fields.u32();
        const std::size_t entry = 4 * static_cast<std::size_t>(has(kDuration) + has(kSize) + has(kFlags) + has(kComposition));
        require(run.fields.good() && count * entry == run.fields.left(), kRun, "trun has another size than its entries");
        require(count != 0, kRun, name() + " has a run without samples");
        count = std::min(count, entry != 0 ? run.fields.left() / entry : fileBytes_ / std::max(1U, header.defaults.size));
        header.progress->track->track.chunks += 1;
        for (std::uint64_t place = 0; place < count; ++place) {
            Defaults sample = header.defaults;
            if (has(kDuration)) sample.duration = run.fields.u32();
            if (has(kSize)) sample.size = run.fields.u32();
            if (has(kFlags)) sample.flags = run.fields.u32();
            if (has(kComposition)) run.fields.skip(4);
            if (place == 0 && first) sample.flags = *first;
            addSample(*header.progress, sample, offset);
        }
    }

    void addSample(Progress& progress, const Defaults& sample, std::uint64_t& offset) {
        constexpr std::uint32_t kIsNoSync = 0x10000;
        BoxTrack& track = progress.track->track;
        const bool isSync = (sample.flags & kIsNoSync) == 0;
        const std::uint32_t dependsOn = sample.flags >> 24 & 3;
        const std::string what = "sample " + std::to_string(track.samples + 1) + " of track " + std::to_string(track.identifier);
        require(!isSync || dependsOn != 1, kExtends, what + " is a sync sample that depends on others");
        require(sample.duration != 0, kRun, what + " has no duration");
        require(sample.size != 0, kRun, what + " is empty");
        progress.track->samples.push_back({offset, sample.size, isSync});
        progress.end = progress.end.value_or(0) + sample.duration;
        track.mediaDuration = *progress.end;
        track.samples += 1;
        track.syncSamples += isSync ? 1 : 0;
        track.bytes += sample.size;
        bytes_ += sample.size;
        offset += sample.size;
    }

    std::uint64_t fileBytes_;
    Complaints complaints_;
    std::map<std::uint32_t, Progress> progress_;
    std::size_t count_ = 0;     // of fragments so far
    std::uint32_t number_ = 0;  // of the last
    std::uint64_t bytes_ = 0;   // of this one's samples
};

}  // namespace

std::size_t checkFragments(const std::vector<Box>& moov, const std::vector<Box>& file, std::uint64_t fileBytes,
                           std::vector<CheckedTrack>& tracks, Findings& findings) {
    FragmentCheck check(fileBytes, tracks, findings);
    check.readExtends(moov);
    return check.run(file);
}

}  // namespace lumacast::checkers
