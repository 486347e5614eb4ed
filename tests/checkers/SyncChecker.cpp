#include "tests/checkers/SyncChecker.h"

#include <algorithm>
#include <cstdio>
#include <span>

namespace lumacast::checkers {
namespace {

using std::chrono::nanoseconds;

/// What may be severed by a cut: the mark's length and half a beep more.
constexpr nanoseconds kSevered = std::chrono::milliseconds(150);
/// A beep further away than that belongs to another mark, or to none.
constexpr nanoseconds kBelongs = std::chrono::milliseconds(250);

std::string inWords(nanoseconds time, const char* form) {
    char text[120];
    std::snprintf(text, sizeof text, form, static_cast<double>(time.count()) / 1e6);
    return text;
}

bool isIn(const NumberRange& range, std::uint32_t first, std::uint32_t second) {
    return first <= range.first && range.last <= second;
}

/// Where the movie was cut: its ends, and the step over each forbidden range.
std::vector<nanoseconds> cutsOf(const std::vector<NumberedPicture>& pictures, const std::vector<NumberRange>& ranges) {
    std::vector<nanoseconds> cuts{pictures.front().time, pictures.back().time};
    std::optional<NumberedPicture> last;
    for (const NumberedPicture& picture : pictures) {
        if (!picture.number) continue;
        for (const NumberRange& range : ranges)
            if (last && isIn(range, *last->number, *picture.number)) cuts.insert(cuts.end(), {last->time, picture.time});
        last = picture;
    }
    return cuts;
}

nanoseconds medianOf(std::span<const SyncPair> pairs) {
    std::vector<nanoseconds> distances;
    for (const SyncPair& pair : pairs) distances.push_back(pair.late);
    const auto middle = distances.begin() + static_cast<std::ptrdiff_t>(distances.size() / 2);
    std::nth_element(distances.begin(), middle, distances.end());
    return *middle;
}

}  // namespace

std::vector<nanoseconds> markTimes(const std::vector<NumberedPicture>& pictures) {
    std::vector<nanoseconds> times;
    for (std::size_t place = 1; place < pictures.size(); ++place)
        if (pictures[place].isMarked && !pictures[place - 1].isMarked) times.push_back(pictures[place].time);
    return times;
}

SyncReport checkBeepsAtMarks(const std::vector<NumberedPicture>& pictures, const std::vector<nanoseconds>& onsets,
                             const SyncExpectation& expectation) {
    SyncReport report;
    if (pictures.empty()) {
        report.findings.push_back("there are no pictures");
        return report;
    }
    std::vector<nanoseconds> cuts = cutsOf(pictures, expectation.forbidden);
    cuts.insert(cuts.end(), expectation.cuts.begin(), expectation.cuts.end());
    const auto mayBeSevered = [&cuts](nanoseconds time) {
        return std::any_of(cuts.begin(), cuts.end(),
                           [time](nanoseconds cut) { return std::chrono::abs(time - cut) <= kSevered; });
    };
    std::vector<nanoseconds> left = onsets;
    for (const nanoseconds mark : markTimes(pictures)) {
        const auto nearest = std::min_element(left.begin(), left.end(), [mark](nanoseconds a, nanoseconds b) {
            return std::chrono::abs(a - mark) < std::chrono::abs(b - mark);
        });
        if (nearest == left.end() || std::chrono::abs(*nearest - mark) > kBelongs) {
            if (!mayBeSevered(mark)) report.findings.push_back(inWords(mark, "no beep for the mark at %.1f ms"));
            continue;
        }
        const nanoseconds late = *nearest - mark;
        left.erase(nearest);
        // Only what is left of the one or the other may be there.
        if (std::chrono::abs(late) > expectation.tolerance && mayBeSevered(mark)) continue;
        report.pairs.push_back({mark, late});
        if (std::chrono::abs(late) > std::chrono::abs(report.worst)) report.worst = late;
        if (std::chrono::abs(late) > expectation.tolerance)
            report.findings.push_back(inWords(mark, "the beep for the mark at %.1f ms comes ") +
                                      inWords(std::chrono::abs(late), "%.1f ms ") +
                                      (late > nanoseconds::zero() ? "late" : "early"));
    }
    for (const nanoseconds onset : left)
        if (!mayBeSevered(onset)) report.findings.push_back(inWords(onset, "no mark for the beep at %.1f ms"));
    if (report.pairs.size() < expectation.leastPairs)
        report.findings.push_back(std::to_string(report.pairs.size()) + " marks with a beep, at least " +
                                  std::to_string(expectation.leastPairs) + " wanted");
    if (report.pairs.size() >= 6) {
        const std::size_t part = std::max<std::size_t>(3, report.pairs.size() / 5);
        const std::span<const SyncPair> pairs(report.pairs);
        report.drift = medianOf(pairs.last(part)) - medianOf(pairs.first(part));
    }
    return report;
}

}  // namespace lumacast::checkers
