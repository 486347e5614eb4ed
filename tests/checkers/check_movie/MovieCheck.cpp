#include "tests/checkers/check_movie/MovieCheck.h"

#include <algorithm>

#include "tests/checkers/BoxChecker.h"
#include "tests/checkers/ContactSheet.h"
#include "tests/checkers/MovieReader.h"
#include "tests/checkers/ToneChecker.h"

namespace lumacast::checkers {
namespace {

using nlohmann::json;

double milliseconds(nanoseconds time) {
    return static_cast<double>(time.count()) / 1e6;
}
double seconds(nanoseconds time) {
    return static_cast<double>(time.count()) / 1e9;
}

class Run final {
public:
    explicit Run(const MovieCheckOptions& options) : options_(options), reader_(options.movie) {}

    MovieCheckResult go() {
        result_.readable = reader_.error().empty();
        if (!result_.readable) {
            find("movie", reader_.error());
        } else {
            describe();
            if (options_.readNumbers) judgeFrames();
            judgeSound();
            if (!options_.contactSheet.empty()) drawContactSheet();
        }
        if (!options_.unfinished) judgeBoxes();
        result_.report["movie"] = options_.movie;
        result_.report["findings"] = result_.findings;
        result_.report["ok"] = result_.findings.empty();
        return std::move(result_);
    }

private:
    void find(const std::string& about, const std::string& text) { result_.findings.push_back(about + ": " + text); }

    void describe() {
        json& report = result_.report;
        const double length = seconds(reader_.duration());
        report["duration_s"] = length;
        report["video"] = json::array();
        for (const VideoTrack& track : reader_.videoTracks())
            report["video"].push_back({{"codec", track.codec},
                                       {"profile", track.profile},
                                       {"pixel_format", track.pixelFormat},
                                       {"width", track.width},
                                       {"height", track.height},
                                       {"rotation", track.rotation},
                                       {"duration_s", seconds(track.duration)}});
        report["audio"] = json::array();
        for (const AudioTrack& track : reader_.audioTracks())
            report["audio"].push_back({{"codec", track.codec},
                                       {"sample_rate", track.sampleRate},
                                       {"channels", track.channels},
                                       {"duration_s", seconds(track.duration)}});
        const auto count = [this](const char* kind, std::size_t tracks, std::optional<std::size_t> wanted) {
            if (wanted && tracks != *wanted)
                find("tracks", std::to_string(tracks) + " of " + kind + ", " + std::to_string(*wanted) + " wanted");
        };
        count("video", reader_.videoTracks().size(), options_.videoTracks);
        count("sound", reader_.audioTracks().size(), options_.audioTracks);
        if (options_.leastSeconds && length < *options_.leastSeconds)
            find("duration",
                 std::to_string(length) + " s, at least " + std::to_string(*options_.leastSeconds) + " wanted");
        if (options_.mostSeconds && length > *options_.mostSeconds)
            find("duration",
                 std::to_string(length) + " s, at most " + std::to_string(*options_.mostSeconds) + " wanted");
    }

    void judgeFrames() {
        std::vector<NumberedPicture>& pictures = pictures_;
        if (!readFrameNumbers(reader_, pictures, options_.turnedDegrees / 90)) find("pictures", reader_.error());
        const FrameReport frames = checkFrameNumbers(pictures, options_.frames);
        for (const FrameFinding& finding : frames.findings) find("frames", finding.text);
        json& report = result_.report["frames"];
        report = {{"count", frames.pictures},
                  {"unreadable", frames.unreadable},
                  {"repeats", frames.repeats},
                  {"order_ok", frames.orderOk},
                  {"missing", frames.missing},
                  {"forbidden", frames.forbidden},
                  {"largest_hole_ms", milliseconds(frames.largestHole)}};
        report["first"] = frames.first ? json(*frames.first) : json();
        report["last"] = frames.last ? json(*frames.last) : json();
        report["largest_lateness_ms"] = frames.largestLateness ? json(milliseconds(*frames.largestLateness)) : json();
    }

    void judgeSound() {
        if (options_.tones.empty() && options_.noTones.empty() && !options_.beeps && !options_.beepsAtMarks) return;
        const auto sound = reader_.readSound(options_.audioTrack);
        if (!sound) return find("sound", reader_.error());
        const nanoseconds margin(static_cast<std::int64_t>(options_.marginSeconds * 1e9));
        const Stretch stretch{margin, wholeOf(*sound).to - margin};
        const auto addAll = [this](const Findings& findings) {
            for (const std::string& text : findings) find("sound", text);
        };
        for (const double tone : options_.tones) addAll(checkTonePresent(*sound, tone, options_.leastLevel, stretch));
        for (const double tone : options_.noTones) addAll(checkToneAbsent(*sound, tone, options_.mostLevel, stretch));
        json& report = result_.report["sound"];
        report["duration_s"] = seconds(wholeOf(*sound).to);
        if (options_.beepsAtMarks) judgeSync(*sound);
        if (!options_.beeps) return;
        report["beeps_ms"] = json::array();
        for (const nanoseconds onset : beepOnsets(*sound, *options_.beeps, options_.leastLevel))
            report["beeps_ms"].push_back(milliseconds(onset));
    }

    void judgeSync(const Sound& sound) {
        SyncExpectation expectation = options_.sync;
        expectation.forbidden = options_.frames.forbidden;
        const SyncReport sync = checkBeepsAtMarks(
            pictures_, beepOnsets(sound, *options_.beepsAtMarks, options_.leastLevel), expectation);
        for (const std::string& text : sync.findings) find("sync", text);
        json& report = result_.report["sync"];
        report = {{"pairs", sync.pairs.size()}, {"worst_ms", milliseconds(sync.worst)}};
        report["drift_ms"] = sync.drift ? json(milliseconds(*sync.drift)) : json();
        for (const char* list : {"mark_ms", "mark_number", "late_ms"}) report[list] = json::array();
        for (const SyncPair& pair : sync.pairs) {
            const auto picture = std::find_if(pictures_.begin(), pictures_.end(),
                                              [&pair](const auto& one) { return one.time == pair.mark; });
            const bool isNumbered = picture != pictures_.end() && picture->number;
            report["mark_ms"].push_back(milliseconds(pair.mark));
            report["mark_number"].push_back(isNumbered ? json(*picture->number) : json());
            report["late_ms"].push_back(milliseconds(pair.late));
        }
    }

    void judgeBoxes() {
        const BoxReport boxes = checkBoxes(options_.movie, options_.fragmented ? BoxShape::Fragmented : BoxShape::Finished);
        for (const std::string& text : boxes.findings) find("boxes", text);
        json& report = result_.report["boxes"];
        report = {{"top_level", boxes.topLevel}, {"timescale", boxes.timescale}, {"duration", boxes.duration}};
        if (options_.fragmented) {
            report["fragments"] = boxes.fragments;
            report["cut_off"] = boxes.cutOff;
        }
        report["tracks"] = json::array();
        for (const BoxTrack& track : boxes.tracks)
            report["tracks"].push_back({{"id", track.identifier},
                                        {"handler", track.handler},
                                        {"codec", track.codec},
                                        {"timescale", track.timescale},
                                        {"media_duration", track.mediaDuration},
                                        {"duration", track.duration},
                                        {"samples", track.samples},
                                        {"sync_samples", track.syncSamples},
                                        {"chunks", track.chunks},
                                        {"bytes", track.bytes}});
    }

    void drawContactSheet() {
        const std::string problem = writeContactSheet(reader_, options_.contactSheet);
        if (!problem.empty()) find("contact sheet", problem);
    }

    const MovieCheckOptions& options_;
    MovieReader reader_;
    std::vector<NumberedPicture> pictures_;
    MovieCheckResult result_;
};

}  // namespace

MovieCheckResult checkMovie(const MovieCheckOptions& options) {
    return Run(options).go();
}

}  // namespace lumacast::checkers
