#include "tests/checkers/FrameNumberChecker.h"

#include <algorithm>
#include <cstdio>
#include <map>

#include "tests/checkers/MovieReader.h"

namespace lumacast::checkers {
namespace {

using Kind = FrameFinding::Kind;
using std::chrono::nanoseconds;

// Of each kind so many findings are told one by one; the rest are counted.
constexpr std::size_t kToldOfAKind = 10;

std::string milliseconds(nanoseconds time) {
    char text[40];
    std::snprintf(text, sizeof text, "%.1f ms", static_cast<double>(time.count()) / 1e6);
    return text;
}

class Check final {
public:
    Check(const std::vector<NumberedPicture>& pictures, const FrameExpectation& expectation)
        : pictures_(pictures), expectation_(expectation) {
        report_.pictures = pictures.size();
    }

    FrameReport run() {
        if (pictures_.empty()) add(Kind::NoPictures, "there are no pictures");
        checkTimes();
        checkSequence();
        checkSets();
        if (expectation_.drawn) checkTimeLine(*expectation_.drawn);
        for (const auto& [kind, count] : counts_)
            if (count > kToldOfAKind)
                report_.findings.push_back({kind, "and " + std::to_string(count - kToldOfAKind) + " more like it"});
        return std::move(report_);
    }

private:
    void add(Kind kind, const std::string& text) {
        if (++counts_[kind] <= kToldOfAKind) report_.findings.push_back({kind, text});
    }

    [[nodiscard]] bool isForbidden(std::uint32_t number) const {
        return std::any_of(
            expectation_.forbidden.begin(), expectation_.forbidden.end(),
            [number](const NumberRange& range) { return number >= range.first && number <= range.last; });
    }

    void checkTimes() {
        for (std::size_t place = 1; place < pictures_.size(); ++place) {
            const nanoseconds step = pictures_[place].time - pictures_[place - 1].time;
            const std::string where = " at " + milliseconds(pictures_[place - 1].time);
            report_.largestHole = std::max(report_.largestHole, step);
            if (step <= nanoseconds::zero()) add(Kind::TimesNotRising, "two pictures have the same time" + where);
            if (expectation_.largestHole && step > *expectation_.largestHole)
                add(Kind::Hole, "a hole of " + milliseconds(step) + where);
        }
    }

    void checkSequence() {
        std::optional<std::uint32_t> previous;
        for (const NumberedPicture& picture : pictures_) {
            const std::string where = " at " + milliseconds(picture.time);
            if (!picture.number) {
                if (++report_.unreadable > expectation_.allowedUnreadable)
                    add(Kind::Unreadable, "no readable number in the picture" + where);
                continue;
            }
            const std::uint32_t number = *picture.number;
            if (!report_.first) report_.first = number;
            report_.last = number;
            if (previous && number < *previous) {
                report_.orderOk = false;
                add(Kind::OutOfOrder, std::to_string(number) + " follows " + std::to_string(*previous) + where);
            }
            if (!seen_.insert(number).second && ++report_.repeats > expectation_.allowedRepeats)
                add(Kind::Doubled, "number " + std::to_string(number) + " again" + where);
            previous = number;
        }
    }

    void checkSets() {
        std::set<std::uint32_t> wanted = expectation_.expected;
        if (expectation_.withoutGaps && !seen_.empty()) {
            for (std::uint32_t number = *seen_.begin(); number < *seen_.rbegin(); ++number)
                if (!isForbidden(number) && (!expectation_.drawn || expectation_.drawn->contains(number)))
                    wanted.insert(number);
        }
        for (const std::uint32_t number : wanted) {
            if (seen_.contains(number)) continue;
            report_.missing.push_back(number);
            // One by itself may be allowed for, two in a row never are.
            const bool isAlone = seen_.contains(number - 1) && seen_.contains(number + 1);
            if (!isAlone || report_.missing.size() > expectation_.allowedMissing)
                add(Kind::Missing, "number " + std::to_string(number) + " is missing");
        }
        for (const std::uint32_t number : seen_) {
            if (!isForbidden(number)) continue;
            report_.forbidden.push_back(number);
            add(Kind::Forbidden, "number " + std::to_string(number) + " was drawn during a pause");
        }
    }

    // Which stretch between two pauses a number belongs to.
    [[nodiscard]] std::ptrdiff_t stretchOf(std::uint32_t number) const {
        return std::count_if(expectation_.forbidden.begin(), expectation_.forbidden.end(),
                             [number](const NumberRange& range) { return range.last < number; });
    }

    struct Placed {
        std::uint32_t number;
        nanoseconds time;
        nanoseconds early, late;  // movie time minus the two host times
    };

    void checkTimeLine(const FramesLog& drawn) {
        std::map<std::ptrdiff_t, std::vector<Placed>> stretches;
        std::set<std::uint32_t> judged;
        for (const NumberedPicture& picture : pictures_) {
            if (!picture.number || isForbidden(*picture.number) || !judged.insert(*picture.number).second) continue;
            const auto stamp = drawn.find(*picture.number);
            if (stamp == drawn.end()) {
                add(Kind::Unlogged, "number " + std::to_string(*picture.number) + " was never drawn");
                continue;
            }
            stretches[stretchOf(*picture.number)].push_back(
                {*picture.number, picture.time, picture.time - stamp->second.shown, picture.time - stamp->second.sent});
        }
        report_.largestLateness = nanoseconds::zero();
        for (auto& [place, stretch] : stretches) judgeStretch(stretch);
    }

    void judgeStretch(std::vector<Placed>& stretch) {
        std::vector<nanoseconds> differences;
        for (const Placed& placed : stretch) differences.push_back((placed.early + placed.late) / 2);
        const auto middle = differences.begin() + static_cast<std::ptrdiff_t>(differences.size() / 2);
        std::nth_element(differences.begin(), middle, differences.end());
        for (const Placed& placed : stretch) {
            // On time anywhere between being sent and being known to be shown.
            const nanoseconds late = std::max(nanoseconds::zero(), placed.early - *middle);
            const nanoseconds early = std::max(nanoseconds::zero(), *middle - placed.late);
            const nanoseconds off = std::max(late, early);
            report_.largestLateness = std::max(*report_.largestLateness, off);
            if (off > expectation_.lateness)
                add(Kind::Late, "number " + std::to_string(placed.number) + " at " + milliseconds(placed.time) +
                                    " comes " + milliseconds(off) + (late > early ? " late" : " early"));
        }
    }

    const std::vector<NumberedPicture>& pictures_;
    const FrameExpectation& expectation_;
    FrameReport report_;
    std::set<std::uint32_t> seen_;
    std::map<Kind, std::size_t> counts_;
};

}  // namespace

bool FrameReport::has(FrameFinding::Kind kind) const {
    return std::any_of(findings.begin(), findings.end(), [kind](const auto& finding) { return finding.kind == kind; });
}

FrameReport checkFrameNumbers(const std::vector<NumberedPicture>& pictures, const FrameExpectation& expectation) {
    return Check(pictures, expectation).run();
}

bool readFrameNumbers(MovieReader& reader, std::vector<NumberedPicture>& pictures, int quarterTurns) {
    return reader.readPictures([&](const DecodedPicture& picture) {
        pictures.push_back(
            {picture.time, frameNumberIn(picture.luma, quarterTurns), isMarked(picture.luma, quarterTurns)});
    });
}

}  // namespace lumacast::checkers
