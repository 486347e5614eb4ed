// Encodes a movie anew with its sound mixed, as saving it does, for compare_mixing.
//
//     mix_movie SOURCE DESTINATION
//
// Exit status: 0 it is there, 1 it failed, which is said, 2 the arguments make no sense.

#include <cstdio>
#include <future>
#include <memory>

#include "linux/media/LinuxMovieExporters.h"

int main(int count, char** arguments) {
    using namespace lumacast;
    if (count != 3) {
        std::fputs("usage: mix_movie SOURCE DESTINATION\n", stderr);
        return 2;
    }
    // The priority of whoever calls: a comparison is to measure the work, not the waiting.
    LinuxMovieExporters exporters(std::make_shared<media::PosixMovieFiles>(), media::EncodingPriority::AsUsual);
    const auto movie = exporters.openMovie(URL::file(arguments[1]));
    const auto exporter = exporters.makeExporter(movie, ExportPreset::HighestQuality, URL::file(arguments[2]));
    AudioMix mix;
    for (const auto track : movie->audioTracks()) mix.inputParameters.push_back({track});
    exporter->setAudioMix(std::move(mix));
    std::promise<std::optional<Error>> ended;
    exporter->exportAsynchronously(
        [&](ExportStatus, std::optional<Error> error) { ended.set_value(std::move(error)); });
    const auto error = ended.get_future().get();
    if (error) std::fprintf(stderr, "mix_movie: error %d\n", static_cast<int>(error->code()));
    return error ? 1 : 0;
}
