// A movie that is opened, cut or encoded anew, and opened again. First byte: 1 encode, 2 give a mix, 4 only a part, 8 cancel at
// once; then two bytes each for the part's beginning and length, in hundredths of a second; then the file.

#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <future>
#include <set>
#include <stdexcept>

#include "fuzz/Input.h"
#include "fuzz/Property.h"
#include "linux/media/LinuxMovieExporters.h"

namespace lumacast::fuzz {

namespace {

namespace fs = std::filesystem;

/// A folder that goes with the process.
struct Folder {
    Folder() {
        std::string pattern = fs::temp_directory_path() / "lumacast-fuzz-XXXXXX";
        if (!::mkdtemp(pattern.data())) throw std::runtime_error("no folder can be made");
        path = pattern;
    }
    ~Folder() {
        std::error_code ignored;
        fs::remove_all(path, ignored);
    }
    fs::path path;
};

/// Hundredths of a second that are exported at most.
constexpr std::int64_t kLongest = 6000;

struct World {
    Folder folder;
    LinuxMovieExporters exporters{std::make_shared<media::PosixMovieFiles>(), media::EncodingPriority::AsUsual};
};

void requireSensible(const MovieAsset& movie) {
    const MediaTime duration = movie.duration();
    require(duration.isValid() && compare(duration, kZeroMediaTime) >= 0, "a movie is never shorter than nothing");
    const auto tracks = movie.audioTracks();
    require(std::set<std::int32_t>(tracks.begin(), tracks.end()).size() == tracks.size(), "sound tracks are told apart");
}

}  // namespace

void movies(Bytes input) {
    static World world;
    Input in(input);
    const std::uint8_t wish = in.byte();
    const auto start = static_cast<std::int64_t>(in.number(2)), length = static_cast<std::int64_t>(in.number(2));
    const fs::path file = world.folder.path / "movie.mp4", copy = world.folder.path / "copy.mp4";
    const auto text = textOf(in.rest());
    std::ofstream(file, std::ios::binary | std::ios::trunc).write(text.data(), static_cast<std::streamsize>(text.size()));

    const auto movie = world.exporters.openMovie(URL::file(file));
    requireSensible(*movie);
    const auto preset = (wish & 1) != 0 ? ExportPreset::HighestQuality : ExportPreset::PassThrough;
    const auto exporter = world.exporters.makeExporter(movie, preset, URL::file(copy));
    if ((wish & 2) != 0) {
        AudioMix mix;
        for (const std::int32_t track : movie->audioTracks()) mix.inputParameters.push_back({track});
        exporter->setAudioMix(std::move(mix));
    }
    // A movie may say that it lasts a day; its silence is encoded then. A minute of it shows as much.
    const bool isLong = compare(movie->duration(), MediaTime::make(kLongest, 100)) > 0;
    if ((wish & 4) != 0 || isLong)
        exporter->setTimeRange({MediaTime::make(start, 100), MediaTime::make(length % kLongest, 100)});
    std::promise<std::pair<ExportStatus, bool>> ended;
    exporter->exportAsynchronously([&ended](ExportStatus status, const std::optional<Error>& error) {
        ended.set_value({status, error.has_value()});  // throws, and ends everything, when called a second time
    });
    if ((wish & 8) != 0) exporter->cancel();
    const auto [status, hasError] = ended.get_future().get();
    require(hasError == (status != ExportStatus::Completed), "every end but completion comes with an error");
    require(fs::exists(copy) == (status == ExportStatus::Completed), "a file is left by completion alone");
    require(status != ExportStatus::Cancelled || (wish & 8) != 0, "nobody has cancelled");
    require(exporter->progress() >= 0 && exporter->progress() <= 1, "progress is a part of the whole");
    if (status != ExportStatus::Completed) return;
    require(exporter->progress() >= 1, "what is complete is done");
    const auto exported = world.exporters.openMovie(URL::file(copy));
    requireSensible(*exported);
    require(compare(exported->duration(), kZeroMediaTime) > 0, "what was exported can be opened");
    if (preset == ExportPreset::HighestQuality && (wish & 2) != 0)
        require(exported->audioTracks().size() <= 1, "a mix has one sound track");
    fs::remove(copy);
}

}  // namespace lumacast::fuzz
