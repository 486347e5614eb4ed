#pragma once
#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "platform/TelemetryReporter.h"

namespace lumacast {

/// What the files tell of the events, the oldest first.
struct TelemetryHistory {
    Array events;                    ///< each as it stands in its line
    std::uint64_t damagedLines = 0;  ///< not JSON, no object, or longer than a line may be; left out
    std::uint64_t unreadableFiles = 0;
    std::uint64_t lostEvents = 0;  ///< since the daemon was started: what the disk refused
};

/// Writes each event as one line of JSON to a file on this device; nothing leaves it. When the file would grow beyond
/// its limit it becomes `<file>.1` (the one before is gone) and a new one begins, so that a file has whole lines only.
/// A line that the disk refuses is lost, and nothing else. A thread of its own writes, so a caller never waits for the
/// disk; at most 64 events wait for it, further ones are refused.
class LinuxTelemetry final : public TelemetryReporter {
public:
    static constexpr std::uint64_t kDefaultLimit = 1024 * 1024;

    /// `path` is the file, usually telemetry.jsonl in the state directory, whose folder is made when it is missing.
    /// `beforeEachWrite` is where tests put a slow disk; it runs on the writing thread.
    explicit LinuxTelemetry(std::string path, std::uint64_t maximumBytes = kDefaultLimit,
                            std::function<void()> beforeEachWrite = {});
    /// Waits at most 2 s until what was handed over is written.
    ~LinuxTelemetry() override;

    std::optional<Error> send(const TelemetrySession& session, const TelemetryUser& user, std::int64_t category,
                              std::int64_t type, const Dictionary& payload) override;

    using HistoryHandler = std::function<void(TelemetryHistory)>;
    /// Reads both files on the writing thread, behind all events that were handed over before, and gives what they
    /// tell to `handler` there, once; it must not wait. False, and the handler is never called, when too much waits
    /// for the disk already.
    bool readHistory(HistoryHandler handler);

    /// Waits until everything handed over was written or refused by the disk; false when `limit` passed first.
    bool flush(std::chrono::milliseconds limit);
    /// Events that the disk refused.
    std::uint64_t lostEvents() const;

private:
    struct State;
    bool startLocked();
    static void work(const std::shared_ptr<State>& state);

    const std::shared_ptr<State> state_;
};

}  // namespace lumacast
