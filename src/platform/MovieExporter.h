#pragma once
#include <functional>
#include <memory>
#include <optional>

#include "base/Value.h"
#include "writer/media/MediaTime.h"

namespace lumacast {

enum class ExportPreset { PassThrough };
enum class ExportStatus : std::int32_t { Completed, Failed, Cancelled };

/// A movie that is opened for reading.
class MovieAsset {
public:
    virtual ~MovieAsset() = default;
    /// Zero when the movie could not be opened.
    virtual MediaTime duration() const = 0;
};

/// Copies a time range of a movie into a new file. One export per object; destroying it cancels a running export.
class MovieExporter {
public:
    using Completion = std::function<void(ExportStatus status, std::optional<Error> error)>;

    virtual ~MovieExporter() = default;
    virtual URL outputURL() const = 0;
    /// The part to copy; the whole movie when never set. The new movie starts with a picture at zero.
    virtual void setTimeRange(MediaTimeRange range) = 0;
    /// Exports on a lane of the platform and calls `completion` there once. A range that is empty, negative or outside
    /// the movie fails; so does a destination that exists. A failed export leaves no file.
    virtual void exportAsynchronously(Completion completion) = 0;
};

/// Opens movies and makes exporters. Opening reads the file: called on background lanes only.
class MovieExporters {
public:
    virtual ~MovieExporters() = default;
    /// Never null; see MovieAsset::duration for a movie that can't be read.
    virtual std::shared_ptr<MovieAsset> openMovie(const URL& url) = 0;
    virtual std::shared_ptr<MovieExporter> makeExporter(std::shared_ptr<MovieAsset> movie, ExportPreset preset,
                                                        const URL& outputURL) = 0;
};

}  // namespace lumacast
