#include "client/lumacastctl/Text.h"

#include <array>
#include <cmath>
#include <cstdio>
#include <ctime>

namespace lumacast::ctl {

namespace {

constexpr std::array kUnits{"kB", "MB", "GB", "TB", "PB", "EB"};
constexpr double kStep = 1000;
constexpr double kRoundsUpToNext = 999.95;      // what would be written as 1000.0
constexpr double kLongest = 1'000'000'000'000;  // seconds; keeps the arithmetic below in range

}  // namespace

std::string bytesText(std::uint64_t bytes) {
    if (bytes < 1000) return std::to_string(bytes) + (bytes == 1 ? " byte" : " bytes");
    double amount = static_cast<double>(bytes) / kStep;
    std::size_t unit = 0;
    for (; amount >= kRoundsUpToNext && unit + 1 < kUnits.size(); ++unit) amount /= kStep;
    std::array<char, 32> text{};
    std::snprintf(text.data(), text.size(), "%.1f %s", amount, kUnits[unit]);
    return text.data();
}

std::string durationText(double seconds) {
    if (!(seconds > 0)) seconds = 0;
    // A tenth that binary numbers can only come close to must not be cut down to the one before it.
    const auto tenths = static_cast<long long>(std::floor(std::fmin(seconds, kLongest) * 10 + 1e-6));
    const long long whole = tenths / 10, minutes = whole / 60, hours = minutes / 60;
    std::array<char, 64> text{};
    if (hours > 0)
        std::snprintf(text.data(), text.size(), "%lld:%02lld:%02lld.%lld", hours, minutes % 60, whole % 60,
                      tenths % 10);
    else
        std::snprintf(text.data(), text.size(), "%lld:%02lld.%lld", minutes, whole % 60, tenths % 10);
    return text.data();
}

std::string momentText(double secondsSince1970) {
    constexpr double kFarthest = 1e11;  // beyond it a year has more than four digits
    std::tm fields{};
    std::array<char, 32> text{};
    if (!(std::abs(secondsSince1970) < kFarthest)) return "unknown";
    const auto time = static_cast<std::time_t>(std::floor(secondsSince1970));
    if (!::localtime_r(&time, &fields)) return "unknown";
    return std::strftime(text.data(), text.size(), "%Y-%m-%d %H:%M:%S", &fields) > 0 ? text.data() : "unknown";
}

std::string settingText(const Value& value) {
    if (const bool* flag = value.as<bool>()) return *flag ? "true" : "false";
    return describe(value);
}

std::string printable(std::string_view text) {
    std::string result(text);
    for (std::size_t at = 0; at < result.size(); ++at) {
        const auto byte = static_cast<unsigned char>(result[at]);
        if (byte < 0x20 || byte == 0x7F) result[at] = '?';
        // The second set of control characters, U+0080 to U+009F, as UTF-8 has them.
        if (byte == 0xC2 && at + 1 < result.size() && static_cast<unsigned char>(result[at + 1]) < 0xA0) {
            result[at] = '?';
            result.erase(at + 1, 1);
        }
    }
    return result;
}

}  // namespace lumacast::ctl
