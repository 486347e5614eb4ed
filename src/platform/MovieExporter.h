#pragma once
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <vector>

#include "base/Value.h"
#include "writer/media/MediaTime.h"

namespace lumacast {

/// PassThrough copies the samples as they are. HighestQuality encodes the picture anew, hardly to be told from
/// what it was, at the size it has, and mixes the sound into one track.
enum class ExportPreset { PassThrough, HighestQuality };
enum class ExportStatus : std::int32_t { Completed, Failed, Cancelled };

/// A movie that is opened for reading.
class MovieAsset {
public:
    virtual ~MovieAsset() = default;
    /// Zero when the movie could not be opened.
    virtual MediaTime duration() const = 0;
    /// The identifiers of its sound tracks, in the order of the tracks. None when it could not be opened.
    virtual std::vector<std::int32_t> audioTracks() const = 0;
};

/// How one sound track goes into a mix.
struct AudioMixInputParameters {
    std::int32_t trackID = 0;  ///< see MovieAsset::audioTracks; one the movie does not have is left out
    float volume = 1;          ///< the default leaves it as it is
    bool operator==(const AudioMixInputParameters&) const = default;
};

/// Which sound tracks are mixed, and how.
struct AudioMix {
    std::vector<AudioMixInputParameters> inputParameters;
    bool operator==(const AudioMix&) const = default;
};

/// Exports a time range of a movie into a new file. One export per object; destroying it cancels a running export.
class MovieExporter {
public:
    using Completion = std::function<void(ExportStatus status, std::optional<Error> error)>;

    virtual ~MovieExporter() = default;
    virtual URL outputURL() const = 0;
    /// The part to copy; the whole movie when never set. The new movie starts with a picture at zero.
    virtual void setTimeRange(MediaTimeRange range) = 0;
    /// For HighestQuality: the sound of the new movie, mixed without clipping into one track; a mix of no track gives a
    /// movie without sound. A track named twice counts once, as named first; one alone keeps its level. Never set:
    /// every track as it is. PassThrough copies the tracks, whatever is set.
    virtual void setAudioMix(AudioMix mix) = 0;
    /// Exports on a lane of the platform and calls `completion` there once. A range that is empty, negative or outside
    /// the movie fails; so do a destination that exists and, for HighestQuality, a movie that can't be decoded whole.
    /// Every end but Completed comes with an error. A failed or cancelled export leaves no file. Encoding
    /// exports run one at a time, at the lowest priority: a recording that goes on meanwhile loses nothing by them.
    virtual void exportAsynchronously(Completion completion) = 0;
    /// Ends the export, soon, as Cancelled, unless it ends by itself before. Nothing happens before it has begun and
    /// after it has ended. Callable from any lane.
    virtual void cancel() = 0;
    /// How much of the export is done, 0 to 1, and 1 once it is Completed; never goes back. Callable from any lane.
    virtual double progress() const = 0;
};

/// Opens movies and makes exporters. Opening reads the file: called on background lanes only.
class MovieExporters {
public:
    virtual ~MovieExporters() = default;
    /// Never null; see MovieAsset::duration for a movie that can't be read. What stands at the path now is the movie,
    /// whatever stands there later.
    virtual std::shared_ptr<MovieAsset> openMovie(const URL& url) = 0;
    virtual std::shared_ptr<MovieExporter> makeExporter(std::shared_ptr<MovieAsset> movie, ExportPreset preset,
                                                        const URL& outputURL) = 0;
};

}  // namespace lumacast
