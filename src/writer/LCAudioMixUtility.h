#pragma once
#include <functional>
#include <memory>
#include <optional>

#include "base/Value.h"
#include "platform/Platform.h"
#include "support/RecordingErrors.h"
#include "support/TempStore.h"

namespace lumacast {

/// Mixes a movie's sound into one track. Keeps no state of its own: what it uses is borrowed and outlives its exports.
class LCAudioMixUtility {
public:
    using CompletionHandler = std::function<void(std::optional<URL> mixed, std::optional<Error> error)>;

    LCAudioMixUtility(const Platform& platform, const TempStore& tempStore, const RecordingErrors& errors)
        : platform_(platform), tempStore_(tempStore), errors_(errors) {}

    /// `mixAudioForMovie:withCompletionHandler:` — exports the movie anew, in the highest quality and with every sound
    /// track of it in one, to a temporary file. The movie itself is left alone, and so is what a failed export leaves.
    /// Opens the movie, so it waits for the disk: on a background lane. The handler is called once, on the exporter's
    /// lane; at once, with an error, where there is no movie. Answers the export, for who wants to see how far it is;
    /// null where there is none.
    std::shared_ptr<MovieExporter> mixAudioForMovie(const std::optional<URL>& movie, CompletionHandler handler) const;

    /// `tempFileURL` — a new file's, named for the current second, deliberately behind a doubled slash. Two calls within
    /// a second answer the same, and the later export fails.
    URL tempFileURL() const;

private:
    const Platform& platform_;
    const TempStore& tempStore_;
    const RecordingErrors& errors_;
};

}  // namespace lumacast
