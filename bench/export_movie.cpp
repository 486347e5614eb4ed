// Runs one export of a movie by itself, for compare_mixing and compare_trim.
//
//     export_movie mix SOURCE DESTINATION           encodes it anew with its sound mixed, as saving it does
//     export_movie trim SOURCE DESTINATION SECONDS  copies what comes after so many seconds, as a stop with a trim does
//
// Exit status: 0 it is there, 1 it failed, which is said, 2 the arguments make no sense.

#include <cstdio>
#include <cstdlib>
#include <future>
#include <memory>
#include <string_view>

#include "linux/media/LinuxMovieExporters.h"

namespace {

using namespace lumacast;

int run(MovieExporter& exporter) {
    std::promise<std::optional<Error>> ended;
    exporter.exportAsynchronously([&](ExportStatus, std::optional<Error> error) { ended.set_value(std::move(error)); });
    const auto error = ended.get_future().get();
    if (error) std::fprintf(stderr, "export_movie: error %d\n", static_cast<int>(error->code()));
    return error ? 1 : 0;
}

}  // namespace

int main(int count, char** arguments) {
    const std::string_view what = count > 1 ? arguments[1] : "";
    const bool mixes = what == "mix" && count == 4;
    if (!mixes && !(what == "trim" && count == 5)) {
        std::fputs("usage: export_movie mix SOURCE DESTINATION | trim SOURCE DESTINATION SECONDS\n", stderr);
        return 2;
    }
    // The priority of whoever calls: a comparison is to measure the work, not the waiting.
    LinuxMovieExporters exporters(std::make_shared<media::PosixMovieFiles>(), media::EncodingPriority::AsUsual);
    const auto movie = exporters.openMovie(URL::file(arguments[2]));
    const auto preset = mixes ? ExportPreset::HighestQuality : ExportPreset::PassThrough;
    const auto exporter = exporters.makeExporter(movie, preset, URL::file(arguments[3]));
    if (mixes) {
        AudioMix mix;
        for (const auto track : movie->audioTracks()) mix.inputParameters.push_back({track});
        exporter->setAudioMix(std::move(mix));
    } else {
        const MediaTime begin = MediaTime::fromSeconds(std::atof(arguments[4]), 1'000'000);
        exporter->setTimeRange({begin, subtract(movie->duration(), begin)});
    }
    return run(*exporter);
}
