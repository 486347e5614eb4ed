#include "linux/system/RepeatedLines.h"

#include <utility>

namespace lumacast {

RepeatedLines::Folded RepeatedLines::take(LogLevel level, std::string_view text, Moment now) {
    const std::lock_guard lock(mutex_);
    Folded folded;
    if (line_ && line_->level == level && line_->text == text) {
        ++repeats_;
        folded.isWritten = false;
        if (now - told_ < kTellEvery) return folded;
        folded.before = tellLocked();
    } else {
        folded.before = tellLocked();
        line_ = Line{level, std::string(text)};
    }
    told_ = now;
    return folded;
}

std::optional<RepeatedLines::Line> RepeatedLines::end() {
    const std::lock_guard lock(mutex_);
    auto last = tellLocked();
    line_.reset();
    return last;
}

std::optional<RepeatedLines::Line> RepeatedLines::tellLocked() {
    const std::uint64_t repeats = std::exchange(repeats_, 0);
    if (repeats == 0) return std::nullopt;
    if (repeats == 1) return line_;  // no longer than a note, and plainer
    return Line{line_->level, "repeated " + std::to_string(repeats) + " times: " + line_->text};
}

}  // namespace lumacast
