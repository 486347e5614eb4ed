#pragma once
// Movies written in memory.

#include <functional>
#include <memory>
#include <mutex>
#include <vector>

#include "platform/Clock.h"
#include "platform/ContainerWriter.h"
#include "platform/Scheduler.h"
#include "tests/fakes/FakeFileSystem.h"
#include "tests/fakes/FakeMovie.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {

/// What a writer, its inputs and the test share: the movie on its way. Thread-safe.
class FakeRecording : public std::enable_shared_from_this<FakeRecording> {
public:
    FakeRecording(FakeFileSystem& files, FaultPlan& faults, std::shared_ptr<SerialQueue> queue,
                  std::shared_ptr<CaptureClock> clock, URL outputURL, std::shared_ptr<FakeFile> file);

    std::optional<std::size_t> addTrack(MediaType type, const Dictionary& settings);
    void setTransform(std::size_t track, const AffineTransform& transform);
    bool isReady(std::size_t track) const;
    bool append(std::size_t track, const SampleRef& sample);
    bool startWriting();
    void startSession(MediaTime time);
    void endSession(MediaTime time);
    void finish(std::function<void()> completion);
    void abandon();
    ContainerStatus status() const;
    std::optional<Error> error() const;
    std::uint64_t bytesWritten() const;
    std::uint64_t picturesTaken() const;
    const URL& outputURL() const { return outputURL_; }

    // For tests.

    /// The movie as it is now.
    FakeMovie movie() const;
    std::optional<AffineTransform> transform(std::size_t track) const;
    /// Pictures that came again, or late, when more than one was there already: the writer lets none through.
    std::uint64_t repeats() const {
        const std::lock_guard lock(mutex_);
        return repeats_;
    }
    /// Whether the track's buffer has room, once it has had its first sample.
    void setReady(std::size_t track, bool ready);
    /// Writing fails from outside: the disk has gone, an encoder has died.
    void fail(Error error);
    /// While held, finishes don't end.
    void holdFinish(bool hold);

private:
    struct Input {
        bool ready = true;
        std::optional<AffineTransform> transform;
    };

    void failLocked(Error error);
    void completeLocked();
    void finishOnQueue();

    FakeFileSystem& files_;
    FaultPlan& faults_;
    const std::shared_ptr<SerialQueue> queue_;
    const std::shared_ptr<CaptureClock> clock_;
    const URL outputURL_;
    const std::shared_ptr<FakeFile> file_;

    mutable std::mutex mutex_;
    ContainerStatus status_ = ContainerStatus::Unknown;
    std::optional<Error> error_;
    FakeMovie movie_;
    std::vector<Input> inputs_;
    std::optional<MediaTime> sessionEnd_;
    std::optional<MediaTime> clockAtFinish_;
    std::vector<std::function<void()>> completions_;
    std::uint64_t bytes_ = 0;
    std::uint64_t pictures_ = 0, repeats_ = 0;
    bool finishing_ = false;
    bool abandoned_ = false;
    bool held_ = false;
};

/// Makes writers whose movies are in the files of the FakeFileSystem (FakeFile::movie, once they are finished). Failing
/// calls: "ContainerWriters.make", "ContainerWriter.startWriting", "ContainerWriter.append", "ContainerWriter.finish".
class FakeContainerWriters final : public ContainerWriters {
public:
    FakeContainerWriters(Scheduler& scheduler, Clock& clock, FakeFileSystem& files, FaultPlan& faults)
        : scheduler_(scheduler), clock_(clock), files_(files), faults_(faults) {}

    std::variant<std::unique_ptr<ContainerWriter>, Error> make(const URL& outputURL, ContainerType type) override;

    /// Every recording there has been, oldest first; they outlive their writers here.
    std::vector<std::shared_ptr<FakeRecording>> recordings() const;
    std::shared_ptr<FakeRecording> lastRecording() const;
    /// Called on the lane that makes a writer, after it was made.
    void setWhenMade(std::function<void()> whenMade);

private:
    Scheduler& scheduler_;
    Clock& clock_;
    FakeFileSystem& files_;
    FaultPlan& faults_;
    mutable std::mutex mutex_;
    std::vector<std::shared_ptr<FakeRecording>> recordings_;
    std::function<void()> whenMade_;
};

}  // namespace lumacast
