#pragma once
#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "linux/ipc/Fd.h"
#include "linux/system/LineQuota.h"
#include "linux/system/RepeatedLines.h"
#include "platform/LogSink.h"

namespace lumacast {

/// Where a sink writes. The defaults are those of a daemon; a test names its own.
struct LogSinkTargets {
    int standardError = 2;
    int standardOutput = 1;
    std::string journalStream;  ///< $JOURNAL_STREAM: "device:inode" of the standard error that leads to the journal
    std::string journalSocket = "/run/systemd/journal/socket";
    std::function<std::chrono::steady_clock::time_point()> now = std::chrono::steady_clock::now;
};

/// Log lines to standard error as `level text`, or, when standard error leads to the journal, as datagrams of its
/// native protocol with PRIORITY and MESSAGE; `Print` lines to standard output. Never waits: a line the reader has no
/// room for is dropped, and the next one that gets through is preceded by how many were. Lines are cut at 4000 bytes;
/// control characters become blanks, so that no text can pretend to be a line of its own. A line that comes again and
/// again is written once; how often it came is told when another comes, and every ten seconds while it goes on
/// ("repeated 500 times: the line"). Beyond 2,000 lines at once, and 50 a second after them, lines are dropped as well
/// (`LineQuota`), but for those that come with each frame, which somebody asked for. `Print` lines are neither folded nor
/// counted. Callable from any lane.
class LinuxLogSink final : public LogSink {
public:
    explicit LinuxLogSink(const LogSinkTargets& targets);

    void write(LogLevel level, std::string_view text) override;
    /// Tells what is still to be told of a line that was repeated: at the end of the process.
    void flush();

    /// Lines dropped since the start.
    std::uint64_t droppedLines() const { return dropped_; }

private:
    /// One of the two streams, written to without waiting, whatever it is.
    class Stream {
    public:
        explicit Stream(int number);
        bool write(std::string_view bytes) const;

    private:
        enum class Kind { Ordinary, Pollable, Reopened, Socket };
        int number_;
        Kind kind_ = Kind::Ordinary;
        Fd reopened_;
    };

    bool mayBeWritten(LogLevel level);
    void writeToLog(LogLevel level, const std::string& line);
    /// `missed` lines were dropped before this one. False when it was dropped too.
    bool writeToError(LogLevel level, const std::string& text, std::uint64_t missed) const;
    bool sendToJournal(LogLevel level, const std::string& text, std::uint64_t missed) const;

    const Stream error_;
    const Stream output_;
    Fd journal_;
    const std::function<std::chrono::steady_clock::time_point()> now_;
    RepeatedLines repeated_;
    LineQuota quota_;
    std::atomic<std::uint64_t> dropped_{0};
    std::atomic<std::uint64_t> unreported_{0};  ///< those of the log that no note has told of
};

}  // namespace lumacast
