#pragma once
#include <chrono>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "linux/media/CompletionLane.h"
#include "linux/media/MovieFile.h"
#include "linux/media/MovieRecording.h"
#include "platform/Clock.h"
#include "platform/ContainerWriter.h"

namespace lumacast {

/// Makes writers of MP4 files: H.264 by libavcodec (hardware that works, else software), AAC, and a file that can be
/// played while it grows. Callable from any lane. To be destroyed after its writers; that waits for their threads.
class LinuxContainerWriters final : public ContainerWriters {
public:
    /// How long making a writer waits for the disk; a file that can't be made after that fails the writer later.
    static constexpr std::chrono::milliseconds kCreationLimit{40};
    /// How long closeOpenMovies waits for encoders and disks that do nothing, and for those that work.
    static constexpr std::chrono::seconds kClosingStall{5};
    static constexpr std::chrono::seconds kClosingLimit{60};

    /// `clock` must outlive it.
    explicit LinuxContainerWriters(const Clock& clock);
    /// With files from elsewhere.
    LinuxContainerWriters(const Clock& clock, std::shared_ptr<media::MovieFiles> files);
    LinuxContainerWriters(const LinuxContainerWriters&) = delete;
    LinuxContainerWriters& operator=(const LinuxContainerWriters&) = delete;
    ~LinuxContainerWriters() override;

    std::variant<std::unique_ptr<ContainerWriter>, Error> make(const URL& outputURL, ContainerType type) override;

    /// How many bytes were written to the file at `path` (single slashes) by a recording that still writes it; none
    /// when nothing does. Callable from any lane; does not wait.
    std::optional<std::uint64_t> bytesBeingWritten(const std::string& path);

    /// For the end of the process: finishes every movie that is being written, each up to its own clock's time, and
    /// waits for that: as long as something is done, at most kClosingLimit in all, and kClosingStall for one that does
    /// nothing. Needs no lane of the daemon; to be called on a thread that may wait. The writers take no samples any
    /// more. Answers those that were being recorded, the ones whose end was asked for before left out.
    std::vector<media::ClosedMovie> closeOpenMovies();

    /// Brings everything that was appended until now onto the disk for good, waiting for that at most `limit`; the
    /// recordings go on. Whether it is there. For a device that is about to sleep; needs no lane either.
    bool secureOpenMovies(std::chrono::milliseconds limit);

private:
    struct Open {
        std::string path;  ///< single slashes
        std::shared_ptr<media::MovieRecording> recording;
    };
    using Recordings = std::vector<Open>;
    Recordings openMovies();
    void forgetEnded();

    const Clock& clock_;
    const std::shared_ptr<media::MovieFiles> files_;
    const std::shared_ptr<media::EncoderChoice> choice_;
    media::CompletionLane lane_;
    std::mutex mutex_;
    Recordings recordings_;  ///< whose threads have not all ended
};

}  // namespace lumacast
