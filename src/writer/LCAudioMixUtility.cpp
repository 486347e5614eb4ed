#include "writer/LCAudioMixUtility.h"

#include <string>
#include <utility>

namespace lumacast {

URL LCAudioMixUtility::tempFileURL() const {
    const auto seconds = static_cast<std::int64_t>(platform_.clock.now().secondsSince1970);
    return URL::file(tempStore_._srTempPath() + "/LCLuma_Final" + std::to_string(seconds) + ".mp4");
}

std::shared_ptr<MovieExporter> LCAudioMixUtility::mixAudioForMovie(const std::optional<URL>& movie,
                                                                   CompletionHandler handler) const {
    if (!movie) {
        handler(std::nullopt, errors_._lcUserErrorForCode(RecordingErrorCode::MixingFailure));
        return nullptr;
    }
    const auto asset = platform_.movieExporters.openMovie(*movie);
    auto exporter =
        platform_.movieExporters.makeExporter(asset, ExportPreset::HighestQuality, tempFileURL());
    AudioMix mix;
    for (const std::int32_t track : asset->audioTracks()) mix.inputParameters.push_back({.trackID = track});
    exporter->setAudioMix(std::move(mix));
    // The completion keeps the exporter: its end would cancel the export.
    exporter->exportAsynchronously([log = &platform_.log, errors = &errors_, exporter, handler = std::move(handler)](
                                       ExportStatus status, const std::optional<Error>&) {
        if (status == ExportStatus::Completed) return handler(exporter->outputURL(), std::nullopt);
        if (status == ExportStatus::Cancelled)
            log->print("LCAudioMixUtility: MovieExporterStatusCancelled");
        else
            log->print("LCAudioMixUtility: MovieExporterFailed");
        handler(std::nullopt, errors->_lcUserErrorForCode(RecordingErrorCode::FailedToSave));
    });
    return exporter;
}

}  // namespace lumacast
