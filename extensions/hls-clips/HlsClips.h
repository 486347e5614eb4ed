#pragma once
#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "client/extension/Extension.h"
#include "extensions/hls-clips/Publisher.h"
#include "extensions/hls-clips/Segmenter.h"

namespace lumacast::extensions {

/// What an application asks for in its user info; README.md has the keys.
struct HlsSettings {
    std::optional<std::string> url, viewURL;
    std::string directory;  ///< absolute; empty when it can't be told
    std::size_t keep = 0;
    double clipDuration = 0;  ///< seconds; 0: the daemon's own
    std::optional<Dictionary> compression;

    static HlsSettings from(const Dictionary& info);
    /// No segment gets longer than this.
    std::int64_t longestSeconds() const;
    /// Where the stream can be watched, as far as that is known.
    std::string whereToView() const;
};

/// The extension: makes one stream of each broadcast's clips.
class HlsClips final : public extension::Handler {
public:
    /// How long the end of a broadcast waits for the destination.
    explicit HlsClips(std::chrono::milliseconds patience = std::chrono::seconds(20)) : patience_(patience) {}

    void clip(extension::Clip clip) override;
    void clipMissed(bool isLast) override;
    void ended() override;

private:
    struct Stream {
        HlsSettings settings;
        Segmenter segmenter;
        Publisher publisher;
        bool wasStalled = false;
        bool isFirst = true;
    };

    bool begin(const Dictionary& info);
    void report(extension::ClipAnswer& answer, const char* state) const;
    void end();

    const std::chrono::milliseconds patience_;
    std::unique_ptr<Stream> stream_;
};

}  // namespace lumacast::extensions
