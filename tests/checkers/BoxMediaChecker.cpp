#include "tests/checkers/BoxMediaChecker.h"

#include <algorithm>

namespace lumacast::checkers {
namespace {

constexpr int kSlice = 1, kIdrSlice = 5, kSequenceSet = 7, kPictureSet = 8;

struct Units {
    bool fit = false;  // their lengths fill the sample
    bool hasSlice = false, hasIdr = false, hasParameters = false;
};

Units unitsIn(std::span<const std::uint8_t> sample, std::size_t lengthBytes) {
    Units units;
    BoxReader fields(sample);
    while (fields.left() > 0) {
        const auto nal = fields.take(static_cast<std::size_t>(fields.unsignedOf(lengthBytes)));
        // The first bit of a NAL unit must be 0 (14496-10, 7.4.1).
        if (!fields.good() || nal.empty() || (nal[0] & 0x80) != 0) return {};
        const int type = nal[0] & 0x1F;
        units.hasSlice = units.hasSlice || type == kSlice || type == kIdrSlice;
        units.hasIdr = units.hasIdr || type == kIdrSlice;
        units.hasParameters = units.hasParameters || type == kSequenceSet || type == kPictureSet;
    }
    units.fit = true;
    return units;
}

// The first sample that breaks a rule is told of each: one broken table breaks a thousand.
void checkPictures(std::span<const std::uint8_t> file, const CheckedTrack& track, const Complaints& complaints) {
    bool unfit = false, withoutSlice = false, sync = false, parameters = false;
    const auto once = [&complaints](bool& told, bool isWrong, const char* clause, std::size_t sample, const char* what) {
        if (isWrong && !told) complaints.find(clause, "sample " + std::to_string(sample + 1) + what);
        told = told || isWrong;
    };
    for (std::size_t place = 0; place < track.samples.size(); ++place) {
        const MediaSample& sample = track.samples[place];
        if (sample.offset > file.size() || sample.size > file.size() - sample.offset) continue;
        const Units units = unitsIn(file.subspan(sample.offset, sample.size), track.nalLengthBytes);
        once(unfit, !units.fit, "14496-15, 5.3.2", place, " is not filled by its NAL units");
        if (!units.fit) continue;
        once(withoutSlice, !units.hasSlice, "14496-15, 5.3.2", place, " has no slice of a picture");
        once(sync, units.hasIdr != sample.isSync, "14496-12, 8.6.2", place,
             sample.isSync ? " is called a sync sample and is none" : " is a sync sample and is not called one");
        once(parameters, units.hasParameters, "14496-15, 5.3.2", place,
             " has parameter sets, which belong in the sample entry");
    }
}

}  // namespace

void checkMedia(std::span<const std::uint8_t> file, const std::vector<Extent>& media,
                const std::vector<CheckedTrack>& tracks, Findings& findings) {
    const Complaints complaints(findings, "movie");
    std::vector<Extent> placed;
    for (const CheckedTrack& track : tracks) {
        const Complaints about = complaints.about("track " + std::to_string(track.track.identifier));
        bool told = false;
        for (std::size_t place = 0; place < track.samples.size(); ++place) {
            const MediaSample& sample = track.samples[place];
            const Extent extent{sample.offset, sample.offset + sample.size};
            const bool inside = isWithin(media, extent);
            if (!inside && !told)
                about.find("14496-12, 8.1.1", "sample " + std::to_string(place + 1) + " isn't within the media data");
            told = told || !inside;
            placed.push_back(extent);
        }
        if (track.nalLengthBytes != 0) checkPictures(file, track, about);
    }
    std::sort(placed.begin(), placed.end(), [](const Extent& a, const Extent& b) { return a.begin < b.begin; });
    for (std::size_t place = 1; place < placed.size(); ++place)
        if (placed[place].begin < placed[place - 1].end)
            return complaints.find("", "two samples overlap at " + std::to_string(placed[place].begin));
}

}  // namespace lumacast::checkers
