#include "base/Log.h"

#include <cstdio>

namespace lumacast {

namespace {

void appendArgument(std::string& text, const LogArgument& argument) {
    struct Visitor {
        std::string& text;
        void operator()(std::int64_t value) const { text += std::to_string(value); }
        void operator()(std::uint64_t value) const { text += std::to_string(value); }
        void operator()(double value) const {
            char buffer[352];  // the longest finite double in %f: 309 digits, point, 6 decimals, sign
            text.append(buffer, static_cast<std::size_t>(std::snprintf(buffer, sizeof buffer, "%f", value)));
        }
        void operator()(const std::string& value) const { text += value; }
    };
    std::visit(Visitor{text}, argument);
}

}  // namespace

std::string LogLine::text() const {
    const std::string_view source(format);
    std::string result;
    std::size_t used = 0;
    for (std::size_t at = 0; at < source.size();) {
        const char c = source[at++];
        if (c != '%') {
            result += c;
        } else if (at < source.size() && source[at] == '%') {
            result += '%';
            ++at;
        } else {
            detail::LogConversion conversion{};
            if (!detail::readLogConversion(source, at, conversion) || used >= argumentCount) break;
            appendArgument(result, arguments[used++]);
            at = conversion.end;
        }
    }
    return result;
}

Log::Log(LogOutput output, std::size_t capacity) : output_(std::move(output)), ring_(capacity) {}

void Log::append(LogLine entry) {
    std::string text;
    bool wanted = entry.level != LogLevel::Sample && entry.level != LogLevel::Debug;
    {
        const std::lock_guard lock(mutex_);
        wanted = output_ && (wanted || verbose_);
        if (!wanted) {
            ring_[next_] = std::move(entry);
        } else {
            ring_[next_] = entry;
        }
        next_ = (next_ + 1) % ring_.size();
        full_ = full_ || next_ == 0;
    }
    if (wanted) output_(entry.level, entry.text());
}

void Log::setVerbose(bool verbose) {
    const std::lock_guard lock(mutex_);
    verbose_ = verbose;
}

std::vector<std::string> Log::recentLines() const {
    const std::lock_guard lock(mutex_);
    std::vector<std::string> lines;
    const std::size_t count = full_ ? ring_.size() : next_;
    lines.reserve(count);
    for (std::size_t i = 0; i < count; ++i) lines.push_back(ring_[(full_ ? next_ + i : i) % ring_.size()].text());
    return lines;
}

}  // namespace lumacast
