#include "linux/extensions/OutputLines.h"

#include <algorithm>

namespace lumacast {

void OutputLines::refill(Instant now) {
    if (refilled_ != Instant{}) {
        const double seconds = std::chrono::duration<double>(now - refilled_).count();
        allowance_ = std::min<double>(kLinesAtOnce, allowance_ + seconds * kLinesPerSecond);
    }
    refilled_ = now;
}

void OutputLines::endLine() {
    if (isCut_) begun_ += " [...]";
    if (!begun_.empty()) {
        if (allowance_ < 1) {
            ++leftOut_;
        } else {
            allowance_ -= 1;
            if (leftOut_ > 0) line_("[" + std::to_string(leftOut_) + " lines left out]");
            leftOut_ = 0;
            line_(begun_);
        }
    }
    begun_.clear();
    isCut_ = false;
}

void OutputLines::add(std::string_view text, Instant now) {
    refill(now);
    for (const char c : text) {
        if (c == '\n') {
            endLine();
        } else if (begun_.size() >= kLongestLine) {
            isCut_ = true;
        } else {
            const auto byte = static_cast<unsigned char>(c);
            begun_ += byte < 0x20 || byte == 0x7f ? ' ' : c;
        }
    }
}

void OutputLines::end() {
    endLine();
    if (leftOut_ > 0) line_("[" + std::to_string(leftOut_) + " lines left out]");
    leftOut_ = 0;
}

}  // namespace lumacast
