#include "linux/media/MovieExport.h"

#include <utility>

#include "linux/media/EncodingExport.h"
#include "linux/media/PassThroughExport.h"

namespace lumacast::media {

ExportResult exportMovie(const ExportPlan& plan, MovieFiles& files, ExportState& state) {
    if (state.isCancelled()) return {ExportStatus::Cancelled, systemError(ECANCELED)};
    auto opened = MovieSource::open(plan.source);
    if (auto* const error = std::get_if<Error>(&opened)) return {ExportStatus::Failed, *error};
    MovieSource& source = *std::get<0>(opened);
    const auto span = spanOf(plan, source.duration());
    if (auto* const error = std::get_if<Error>(&span)) return {ExportStatus::Failed, *error};

    auto made = files.create(plan.destination);
    if (auto* const error = std::get_if<int>(&made)) return {ExportStatus::Failed, systemError(*error)};
    MovieFile& file = *std::get<0>(made);
    state.beginFile(file);
    ExportSink sink(file);
    ExportResult result = plan.preset == ExportPreset::PassThrough
                              ? exportPassThrough(source, sink, std::get<0>(span), state)
                              : exportEncoded(source, plan, sink, std::get<0>(span), state);
    // The disk knows best what was wrong with it.
    if (result.status == ExportStatus::Failed && sink.error() != 0) result.error = systemError(sink.error());
    if (result.status != ExportStatus::Completed) {
        file.removeName(plan.destination);
    } else {
        state.advance(1);
    }
    state.endFile();
    return result;
}

}  // namespace lumacast::media
