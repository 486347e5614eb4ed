// Judges a recorded movie by its content. The report goes to standard output as JSON, what is wrong to standard error.
// Exit status: 0 passed, 1 something is wrong with the movie, 2 the check couldn't be made as asked.

#include <CLI/CLI.hpp>
#include <cstdio>
#include <string>
#include <vector>

#include "tests/checkers/LibAv.h"
#include "tests/checkers/check_movie/MovieCheck.h"

namespace {

using namespace lumacast::checkers;

std::string rangeProblem(const std::string& text) {
    NumberRange range;
    int used = 0;
    const bool valid = std::sscanf(text.c_str(), "%u-%u%n", &range.first, &range.last, &used) == 2 &&
                       used == static_cast<int>(text.size()) && range.first <= range.last;
    return valid ? "" : "'" + text + "' is not a range A-B";
}

NumberRange rangeOf(const std::string& text) {
    NumberRange range;
    std::sscanf(text.c_str(), "%u-%u", &range.first, &range.last);
    return range;
}

std::chrono::nanoseconds fromMilliseconds(double value) {
    return std::chrono::nanoseconds(static_cast<std::int64_t>(value * 1e6));
}

}  // namespace

int main(int argc, char** argv) {
    MovieCheckOptions options;
    FrameExpectation& frames = options.frames;
    std::string framesLog;
    std::vector<std::string> forbidden, expected;
    double largestHole = 0, lateness = 25;
    bool noNumbers = false;

    CLI::App app("Judges a movie of the recorded scene by its content.");
    const CLI::Validator isRange(rangeProblem, "A-B");
    app.add_option("movie", options.movie, "the movie file")->required();
    app.add_option("--frames-log", framesLog, "the application's log of the frames it drew: judges the time line");
    app.add_option("--forbid", forbidden, "numbers drawn during a pause; may be given several times")->check(isRange);
    app.add_option("--expect", expected, "numbers that must all be there")->check(isRange);
    app.add_flag("--expect-all", frames.withoutGaps, "no number between the movie's lowest and highest is missing");
    app.add_option("--allow-missing", frames.allowedMissing, "how many numbers may be missing, no two in a row");
    app.add_option("--allow-repeats", frames.allowedRepeats, "how often numbers may be repeated");
    app.add_option("--allow-unreadable", frames.allowedUnreadable, "how many pictures may have no readable number");
    auto* hole = app.add_option("--max-hole-ms", largestHole, "the largest step from one picture to the next");
    app.add_option("--max-late-ms", lateness, "how far a picture may be from its place on the time line");
    app.add_option("--turned", options.turnedDegrees, "degrees clockwise the pictures were turned by")
        ->check(CLI::IsMember({0, 90, 180, 270}));
    app.add_flag("--no-numbers", noNumbers, "the movie shows something else: don't read frame numbers");
    app.add_flag("--unfinished", options.unfinished, "the recording was cut off: don't judge the box structure");
    app.add_flag("--fragmented", options.fragmented,
                 "a recording under way, or left by a crash: judge its boxes as those of a file in fragments");
    app.add_option("--min-seconds", options.leastSeconds, "shortest duration");
    app.add_option("--max-seconds", options.mostSeconds, "longest duration");
    app.add_option("--video-tracks", options.videoTracks, "how many video tracks there are");
    app.add_option("--audio-tracks", options.audioTracks, "how many sound tracks there are");
    app.add_option("--audio-track", options.audioTrack, "which audio track the following look at, 0 is the first");
    app.add_option("--tone", options.tones, "frequency heard from beginning to end");
    app.add_option("--no-tone", options.noTones, "frequency heard nowhere");
    app.add_option("--beeps", options.beeps, "report when beeps of this frequency begin");
    auto* sync = app.add_option("--beeps-at-marked-frames", options.beepsAtMarks,
                                "beeps of this frequency begin when marked frames are shown");
    double mostSync = 20;
    app.add_option("--max-sync-ms", mostSync, "how far a beep may be from its marked frame")->needs(sync);
    app.add_option("--min-sync-pairs", options.sync.leastPairs, "how many marked frames with a beep there must be")
        ->needs(sync);
    std::vector<double> cuts;
    app.add_option("--cut-at", cuts, "seconds at which clips meet: a mark or beep there may lack the other")->needs(sync);
    app.add_option("--tone-level", options.leastLevel, "a tone or beep is at least this loud, dB");
    app.add_option("--no-tone-level", options.mostLevel, "an absent tone is at most this loud, dB");
    app.add_option("--tone-margin", options.marginSeconds, "seconds at either end in which tones aren't judged");
    app.add_option("--contact-sheet", options.contactSheet, "write pictures of the movie to this PNG file");
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return app.exit(error) == 0 ? 0 : 2;
    }

    for (const std::string& text : forbidden) frames.forbidden.push_back(rangeOf(text));
    for (const std::string& text : expected) {
        const NumberRange range = rangeOf(text);
        for (std::uint64_t number = range.first; number <= range.last; ++number)
            frames.expected.insert(static_cast<std::uint32_t>(number));
    }
    if (hole->count() > 0) frames.largestHole = fromMilliseconds(largestHole);
    for (const double seconds : cuts) options.sync.cuts.push_back(fromMilliseconds(seconds * 1000));
    options.sync.tolerance = fromMilliseconds(mostSync);
    frames.lateness = fromMilliseconds(lateness);
    options.readNumbers = !noNumbers;
    if (noNumbers && options.beepsAtMarks) {
        std::fprintf(stderr, "check_movie: the marks are on the frames with numbers\n");
        return 2;
    }
    if (!framesLog.empty()) {
        std::string error;
        frames.drawn = readFramesLog(framesLog, error);
        if (!frames.drawn) {
            std::fprintf(stderr, "check_movie: %s\n", error.c_str());
            return 2;
        }
    }

    av_log_set_level(AV_LOG_QUIET);
    const MovieCheckResult result = checkMovie(options);
    std::printf("%s\n", result.report.dump(2).c_str());
    for (const std::string& finding : result.findings) std::fprintf(stderr, "check_movie: %s\n", finding.c_str());
    return result.findings.empty() ? 0 : 1;
}
