#include "tests/checkers/BoxChecker.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <fstream>
#include <set>

#include "tests/checkers/BoxReader.h"
#include "tests/checkers/BoxTrackChecker.h"

namespace lumacast::checkers {
namespace {

constexpr std::uint64_t kLargestIndex = 512ULL << 20;

// Boxes of a file in fragments; one of them reachable in a finished file means that players see fragments.
const std::set<std::string>& fragmentBoxes() {
    static const std::set<std::string> types{"moof", "mfra", "sidx", "ssix", "styp", "prft"};
    return types;
}

struct FileWalk {
    std::vector<Extent> media;
    std::vector<std::uint8_t> index;  // the content of moov
    std::uint64_t indexOffset = 0;
};

std::string at(std::uint64_t offset) {
    return " at " + std::to_string(offset);
}

bool isType(const std::string& type) {
    return std::all_of(type.begin(), type.end(), [](unsigned char byte) { return std::isprint(byte) != 0; });
}

// Walks the boxes of the file itself, without reading the media.
FileWalk walkFile(std::ifstream& file, std::uint64_t length, BoxReport& report) {
    FileWalk walk;
    const auto find = [&report](const std::string& text) { report.findings.push_back("file: " + text); };
    for (std::uint64_t offset = 0; offset < length;) {
        std::array<char, 16> bytes{};
        file.clear();
        file.seekg(static_cast<std::streamoff>(offset));
        file.read(bytes.data(), bytes.size());
        const auto* first = reinterpret_cast<const std::uint8_t*>(bytes.data());
        BoxReader header({first, static_cast<std::size_t>(file.gcount())});
        std::uint64_t size = header.u32();
        const std::string type = header.fourCharacters();
        std::uint64_t headerBytes = 8;
        if (size == 1) {
            size = header.u64();
            headerBytes = 16;
        }
        // A size of 0, "to the end of the file", is for files still being written: not allowed here.
        if (!header.good() || !isType(type) || size < headerBytes || size > length - offset) {
            find("the box" + at(offset) + " doesn't fit into the file");
            return walk;
        }
        report.topLevel.push_back(type);
        if (fragmentBoxes().contains(type)) find("a " + type + " of a fragmented file" + at(offset));
        if (type == "mdat") walk.media.push_back({offset + headerBytes, offset + size});
        if (type == "moov" && walk.index.empty() && size <= kLargestIndex) {
            walk.indexOffset = offset + headerBytes;
            walk.index.resize(size - headerBytes);
            file.clear();
            file.seekg(static_cast<std::streamoff>(walk.indexOffset));
            file.read(reinterpret_cast<char*>(walk.index.data()), static_cast<std::streamsize>(walk.index.size()));
        }
        offset += size;
    }
    return walk;
}

void checkOrder(BoxReport& report) {
    const auto count = [&report](const char* type) {
        return std::count(report.topLevel.begin(), report.topLevel.end(), type);
    };
    if (report.topLevel.empty() || report.topLevel.front() != "ftyp")
        report.findings.push_back("file: ftyp isn't first");
    if (count("ftyp") > 1) report.findings.push_back("file: there are several ftyp boxes");
    if (count("moov") != 1)
        report.findings.push_back("file: there are " + std::to_string(count("moov")) + " moov boxes instead of one");
}

void checkMovieHeader(const Box& box, BoxReport& report) {
    BoxReader fields(box.content);
    const std::uint8_t version = fields.u8();
    fields.skip(version == 0 ? 11 : 19);
    report.timescale = fields.u32();
    report.duration = fields.byVersion(version);
    fields.skip(80);
    if (!fields.good() || fields.left() != 0) report.findings.push_back("movie: mvhd has a wrong size");
    if (report.timescale == 0) report.findings.push_back("movie: the time scale is 0");
}

void checkOverlaps(std::vector<Extent>& chunks, Findings& findings) {
    std::sort(chunks.begin(), chunks.end(), [](const Extent& a, const Extent& b) { return a.begin < b.begin; });
    for (std::size_t place = 1; place < chunks.size(); ++place)
        if (chunks[place].begin < chunks[place - 1].end)
            return findings.push_back("movie: two chunks overlap" + at(chunks[place].begin));
}

void checkMovie(const FileWalk& walk, BoxReport& report) {
    Findings& findings = report.findings;
    const auto boxes = boxesIn(walk.index, walk.indexOffset, "movie", findings);
    if (const Box* header = onlyBox(boxes, "mvhd", "movie", findings)) checkMovieHeader(*header, report);
    std::vector<Extent> chunks;
    std::set<std::uint32_t> identifiers;
    std::uint64_t longest = 0;
    for (const Box& box : boxes) {
        if (box.type == "mvex") findings.push_back("movie: there is an mvex box of a fragmented file");
        if (box.type != "trak") continue;
        report.tracks.push_back(checkTrack(box, report.timescale, walk.media, chunks, findings));
        longest = std::max(longest, report.tracks.back().duration);
        if (!identifiers.insert(report.tracks.back().identifier).second)
            findings.push_back("movie: two tracks have the same identifier");
    }
    if (report.tracks.empty()) findings.push_back("movie: there are no tracks");
    if (longest != report.duration)
        findings.push_back("movie: mvhd says it lasts " + std::to_string(report.duration) + ", its longest track " +
                           std::to_string(longest));
    checkOverlaps(chunks, findings);
}

}  // namespace

BoxReport checkBoxes(const std::string& path) {
    BoxReport report;
    std::ifstream file(path, std::ios::binary | std::ios::ate);
    if (!file) {
        report.findings.push_back("file: can't read " + path);
        return report;
    }
    const FileWalk walk = walkFile(file, static_cast<std::uint64_t>(file.tellg()), report);
    checkOrder(report);
    if (!walk.index.empty()) checkMovie(walk, report);
    return report;
}

}  // namespace lumacast::checkers
