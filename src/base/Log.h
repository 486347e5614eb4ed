#pragma once
// The system's log: printf-style lines, checked at compile time, kept in a ring in memory and handed to the platform.

#include <array>
#include <cstdint>
#include <functional>
#include <mutex>
#include <string>
#include <string_view>
#include <type_traits>
#include <variant>
#include <vector>

namespace lumacast {

/// Where a line belongs. `Sample` lines are ordinary lines that come once per frame or audio buffer: they stay in the
/// ring and reach the platform only when they were asked for. `Print` lines go to standard output, not to the log.
enum class LogLevel : std::uint8_t { Default, Error, Debug, Sample, Print };

namespace detail {

enum class LogArgumentKind : std::uint8_t { Integer, Floating, Text };

template <class T>
consteval LogArgumentKind kindOf() {
    using U = std::decay_t<T>;
    if constexpr (std::is_integral_v<U> || std::is_enum_v<U>)
        return LogArgumentKind::Integer;
    else if constexpr (std::is_floating_point_v<U>)
        return LogArgumentKind::Floating;
    else {
        static_assert(std::is_convertible_v<U, std::string_view>, "a log argument is a number or a text");
        return LogArgumentKind::Text;
    }
}

/// One conversion of a format text: its kind and where it ends. `end` is one past its letter.
struct LogConversion {
    LogArgumentKind kind;
    std::size_t end;
};

/// Reads the conversion whose '%' stands before `at`. Knows d i u (with l, ll, z), f, s and @ (an object's text).
constexpr bool readLogConversion(std::string_view format, std::size_t at, LogConversion& out) {
    while (at < format.size() && (format[at] == 'l' || format[at] == 'z')) ++at;
    if (at >= format.size()) return false;
    switch (format[at]) {
        case 'd': case 'i': case 'u': out = {LogArgumentKind::Integer, at + 1}; return true;
        case 'f': out = {LogArgumentKind::Floating, at + 1}; return true;
        case 's': case '@': out = {LogArgumentKind::Text, at + 1}; return true;
        default: return false;
    }
}

}  // namespace detail

/// A format text whose conversions were checked against the argument types while compiling.
template <class... Args>
class LogFormat {
public:
    template <std::size_t N>
    consteval LogFormat(const char (&text)[N]) : text_(text) {
        constexpr std::array<detail::LogArgumentKind, sizeof...(Args) + 1> kinds{detail::kindOf<Args>()...};
        const std::string_view format(text, N - 1);
        std::size_t used = 0;
        for (std::size_t at = 0; at < format.size();) {
            if (format[at++] != '%') continue;
            if (at < format.size() && format[at] == '%') { ++at; continue; }
            detail::LogConversion conversion{};
            if (!detail::readLogConversion(format, at, conversion)) throw "unknown conversion in a log format";
            if (used >= sizeof...(Args)) throw "a log format has more conversions than arguments";
            if (kinds[used] != conversion.kind) throw "a log argument does not fit its conversion";
            ++used;
            at = conversion.end;
        }
        if (used != sizeof...(Args)) throw "a log format has fewer conversions than arguments";
    }
    const char* text() const { return text_; }

private:
    const char* text_;
};

using LogArgument = std::variant<std::int64_t, std::uint64_t, double, std::string>;

/// One line as it is kept: format and arguments, formatted only when somebody reads it.
struct LogLine {
    static constexpr std::size_t kMaximumArguments = 4;
    const char* format = "";
    LogLevel level = LogLevel::Default;
    std::uint8_t argumentCount = 0;
    std::array<LogArgument, kMaximumArguments> arguments;

    std::string text() const;
};

/// Takes a line's finished text. Called on the lane that logs, outside the log's own lock; must not block for long.
using LogOutput = std::function<void(LogLevel, std::string_view)>;

/// The log of one process. Thread-safe; a line costs a short leaf lock and, for `Sample` lines, no allocation.
class Log {
public:
    /// `capacity` lines are kept; older ones are overwritten.
    explicit Log(LogOutput output = {}, std::size_t capacity = 4096);

    template <class... Args>
    void line(std::type_identity_t<LogFormat<Args...>> format, const Args&... args) {
        add(LogLevel::Default, format.text(), args...);
    }
    template <class... Args>
    void error(std::type_identity_t<LogFormat<Args...>> format, const Args&... args) {
        add(LogLevel::Error, format.text(), args...);
    }
    template <class... Args>
    void debug(std::type_identity_t<LogFormat<Args...>> format, const Args&... args) {
        add(LogLevel::Debug, format.text(), args...);
    }
    /// A line that comes once per frame or audio buffer.
    template <class... Args>
    void sample(std::type_identity_t<LogFormat<Args...>> format, const Args&... args) {
        add(LogLevel::Sample, format.text(), args...);
    }
    /// A line for standard output.
    template <class... Args>
    void print(std::type_identity_t<LogFormat<Args...>> format, const Args&... args) {
        add(LogLevel::Print, format.text(), args...);
    }

    /// Whether `Sample` and `Debug` lines reach the platform too. Off at first.
    void setVerbose(bool verbose);

    /// The texts of the lines in the ring, oldest first.
    std::vector<std::string> recentLines() const;

private:
    template <class... Args>
    void add(LogLevel level, const char* format, const Args&... args) {
        static_assert(sizeof...(Args) <= LogLine::kMaximumArguments);
        LogLine entry;
        entry.format = format;
        entry.level = level;
        (store(entry, args), ...);
        append(std::move(entry));
    }
    template <class T>
    static void store(LogLine& entry, const T& argument) {
        LogArgument& slot = entry.arguments[entry.argumentCount++];
        if constexpr (std::is_enum_v<T>)
            slot = static_cast<std::int64_t>(argument);
        else if constexpr (std::is_floating_point_v<T>)
            slot = static_cast<double>(argument);
        else if constexpr (std::is_unsigned_v<T> && !std::is_same_v<T, bool>)
            slot = static_cast<std::uint64_t>(argument);
        else if constexpr (std::is_integral_v<T>)
            slot = static_cast<std::int64_t>(argument);
        else
            slot = std::string(std::string_view(argument));
    }
    void append(LogLine entry);

    const LogOutput output_;
    mutable std::mutex mutex_;
    std::vector<LogLine> ring_;
    std::size_t next_ = 0;
    bool full_ = false;
    bool verbose_ = false;
};

}  // namespace lumacast
