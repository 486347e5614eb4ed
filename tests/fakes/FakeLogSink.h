#pragma once
#include <algorithm>
#include <mutex>
#include <string>
#include <vector>

#include "platform/LogSink.h"

namespace lumacast {

/// Keeps the lines. Thread-safe.
class FakeLogSink final : public LogSink {
public:
    struct Line {
        LogLevel level;
        std::string text;
        bool operator==(const Line&) const = default;
    };

    void write(LogLevel level, std::string_view text) override {
        const std::lock_guard lock(mutex_);
        lines_.push_back({level, std::string(text)});
    }

    std::vector<Line> lines() const {
        const std::lock_guard lock(mutex_);
        return lines_;
    }
    /// The texts that went to the platform log, oldest first.
    std::vector<std::string> logged() const { return texts(false); }
    /// The texts that went to standard output.
    std::vector<std::string> printed() const { return texts(true); }
    /// How often a line with exactly this text was written.
    std::size_t count(std::string_view text) const {
        const std::lock_guard lock(mutex_);
        return static_cast<std::size_t>(
            std::count_if(lines_.begin(), lines_.end(), [&](const Line& line) { return line.text == text; }));
    }
    void clear() {
        const std::lock_guard lock(mutex_);
        lines_.clear();
    }

private:
    std::vector<std::string> texts(bool printed) const {
        const std::lock_guard lock(mutex_);
        std::vector<std::string> result;
        for (const Line& line : lines_)
            if ((line.level == LogLevel::Print) == printed) result.push_back(line.text);
        return result;
    }

    mutable std::mutex mutex_;
    std::vector<Line> lines_;
};

}  // namespace lumacast
