#include "tests/checkers/BoxChecker.h"

#include <algorithm>
#include <cctype>
#include <set>

#include "tests/checkers/BoxFragments.h"
#include "tests/checkers/BoxMediaChecker.h"
#include "tests/checkers/BoxTrackChecker.h"
#include "tests/checkers/Boxes.h"

namespace lumacast::checkers {
namespace {

constexpr char kBoxes[] = "14496-12, 4.2", kFileType[] = "14496-12, 4.3", kMovie[] = "14496-12, 8.2.1",
               kMovieHeader[] = "14496-12, 8.2.2";

// One of them reachable in a finished file means that players see fragments.
const std::set<std::string>& fragmentBoxes() {
    static const std::set<std::string> types{"moof", "mfra", "sidx", "ssix", "styp", "prft"};
    return types;
}

class FileCheck final {
public:
    FileCheck(std::span<const std::uint8_t> file, BoxShape shape) : file_(file), shape_(shape) {}

    BoxReport run() {
        walk();
        checkOrder();
        if (!boxes_.empty() && boxes_.front().type == "ftyp") checkFileType(boxes_.front());
        const auto isMovie = [](const Box& box) { return box.type == "moov"; };
        const auto movie = std::find_if(boxes_.begin(), boxes_.end(), isMovie);
        if (movie != boxes_.end()) checkMovie(*movie);
        return std::move(report_);
    }

private:
    [[nodiscard]] bool isFinished() const { return shape_ == BoxShape::Finished; }
    void find(const char* clause, const std::string& text) const { complaints_.find(clause, text); }

    // Walks the boxes of the file itself.
    void walk() {
        for (std::uint64_t begin = 0; begin < file_.size();) {
            BoxReader header(file_.subspan(begin));
            std::uint64_t size = header.u32();
            const std::string type = header.fourCharacters();
            if (size == 1) size = header.u64();
            const std::uint64_t headerBytes = file_.size() - begin - header.left();
            const bool isType = std::all_of(type.begin(), type.end(),
                                            [](unsigned char byte) { return std::isprint(byte) != 0; });
            const bool isBox = header.good() && isType && size >= headerBytes;
            if (!isBox || size > file_.size() - begin) return endWalk(begin, type, isBox);
            report_.topLevel.push_back(type);
            boxes_.push_back({type, begin, begin + headerBytes, file_.subspan(begin + headerBytes, size - headerBytes)});
            if (type == "mdat") media_.push_back({begin + headerBytes, begin + size});
            if (isFinished() && fragmentBoxes().contains(type))
                find("14496-12, 8.8.4", "a " + type + " of a fragmented file at " + std::to_string(begin));
            begin += size;
        }
    }

    // A size of 0, "to the end of the file", is allowed by the standard and not here: no writer that is judged uses it.
    void endWalk(std::uint64_t begin, const std::string& type, bool isBox) {
        static const std::set<std::string> unfinished{"free", "mdat"};
        const std::uint64_t left = file_.size() - begin;
        // Of less than a header nothing is known.
        if (!isFinished() && (left < 8 || (isBox && unfinished.contains(type)))) report_.cutOff = left;
        else find(kBoxes, "the box at " + std::to_string(begin) + " doesn't fit into the file");
    }

    void checkOrder() {
        const auto& types = report_.topLevel;
        const auto count = [&types](const char* type) { return std::count(types.begin(), types.end(), type); };
        if (types.empty() || types.front() != "ftyp") find(kFileType, "ftyp isn't first");
        if (count("ftyp") > 1) find(kFileType, "there are several ftyp boxes");
        if (count("moov") != 1) find(kMovie, "there are " + std::to_string(count("moov")) + " moov boxes instead of one");
        // A reader of a growing file knows the tracks before it meets a fragment.
        if (!isFinished() && std::find(types.begin(), types.end(), "moof") < std::find(types.begin(), types.end(), "moov"))
            find("", "a fragment stands before moov");
    }

    void checkFileType(const Box& box) {
        BoxReader fields(box.content);
        const std::string major = fields.fourCharacters();
        fields.skip(4);
        if (!fields.good() || fields.left() % 4 != 0) return find(kFileType, "ftyp is not filled by its brands");
        std::set<std::string> brands;
        while (fields.left() > 0) brands.insert(fields.fourCharacters());
        if (!brands.contains(major)) find(kFileType, "the major brand " + major + " is none of the compatible ones");
        // Of a file in fragments `default-base-is-moof` asks for these.
        const bool knowsBase = std::any_of(brands.begin(), brands.end(), [](const std::string& brand) {
            return brand.starts_with("iso") && brand[3] >= '5' && brand[3] <= '9';
        });
        if (!isFinished() && !knowsBase) find("14496-12, 8.8.7", "there is no brand iso5 or later");
    }

    void checkMovieHeader(const Box& box) {
        const Complaints movie = complaints_.about("movie");
        FullBox header(box, 1, movie);
        header.fields.skip(header.version == 0 ? 8 : 16);
        report_.timescale = header.fields.u32();
        report_.duration = header.fields.byVersion(header.version);
        movie.require(header.fields.u32() == 0x00010000, kMovieHeader, "the movie is played at another speed");
        header.fields.skip(72);
        nextTrack_ = header.fields.u32();
        if (!header.fields.good() || header.fields.left() != 0) movie.find(kMovieHeader, "mvhd has a wrong size");
        movie.require(report_.timescale != 0, kMovieHeader, "the time scale is 0");
    }

    void checkMovie(const Box& moov) {
        const Complaints movie = complaints_.about("movie");
        const auto boxes = boxesIn(moov.content, moov.offset, movie);
        if (const Box* header = onlyBox(boxes, "mvhd", kMovieHeader, movie)) checkMovieHeader(*header);
        std::vector<CheckedTrack> tracks;
        for (const Box& box : boxes) {
            if (isFinished() && box.type == "mvex")
                movie.find("14496-12, 8.8.1", "there is an mvex box of a fragmented file");
            if (box.type == "trak")
                tracks.push_back(checkTrack(box, {shape_, report_.timescale, media_, file_.size()}, movie));
        }
        checkTracks(tracks, movie);
        if (!isFinished())
            report_.fragments = checkFragments(boxes, boxes_, file_.size(), tracks, report_.findings);
        checkMedia(file_, media_, tracks, report_.findings);
        for (const CheckedTrack& track : tracks) report_.tracks.push_back(track.track);
    }

    void checkTracks(const std::vector<CheckedTrack>& tracks, const Complaints& movie) {
        std::set<std::uint32_t> identifiers;
        std::uint64_t longest = 0;
        for (const CheckedTrack& checked : tracks) {
            longest = std::max(longest, checked.track.duration);
            if (!identifiers.insert(checked.track.identifier).second)
                movie.find("14496-12, 8.3.2", "two tracks have the same identifier");
        }
        if (tracks.empty()) return movie.find("14496-12, 8.3.1", "there are no tracks");
        movie.require(longest == report_.duration, kMovieHeader,
                      "mvhd says it lasts " + std::to_string(report_.duration) + ", its longest track " +
                          std::to_string(longest));
        movie.require(nextTrack_ > *identifiers.rbegin(), kMovieHeader, "the next track's identifier is in use");
    }

    std::span<const std::uint8_t> file_;
    BoxShape shape_;
    BoxReport report_;
    Complaints complaints_{report_.findings, "file"};
    std::vector<Box> boxes_;
    std::vector<Extent> media_;
    std::uint32_t nextTrack_ = 0;
};

}  // namespace

BoxReport checkBoxes(const std::string& path, BoxShape shape) {
    const MappedFile file(path);
    if (file.good()) return FileCheck(file.bytes(), shape).run();
    BoxReport report;
    report.findings.push_back("file: can't read " + path);
    return report;
}

}  // namespace lumacast::checkers
