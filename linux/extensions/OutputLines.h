#pragma once
#include <chrono>
#include <functional>
#include <string>
#include <string_view>

namespace lumacast {

/// Makes lines for a log of what a program prints: cut, without control characters, and no more of them than a log can
/// bear. Not thread-safe.
class OutputLines final {
public:
    using Instant = std::chrono::steady_clock::time_point;
    static constexpr std::size_t kLongestLine = 512;
    static constexpr int kLinesAtOnce = 50, kLinesPerSecond = 10;

    explicit OutputLines(std::function<void(const std::string& line)> line) : line_(std::move(line)) {}

    /// What it has printed now.
    void add(std::string_view text, Instant now);
    /// It prints no more.
    void end();

private:
    void endLine();
    void refill(Instant now);

    const std::function<void(const std::string&)> line_;
    std::string begun_;
    bool isCut_ = false;
    double allowance_ = kLinesAtOnce;
    Instant refilled_{};
    long leftOut_ = 0;
};

}  // namespace lumacast
