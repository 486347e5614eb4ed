#include "examples/self_recorder/MarkPlan.h"

namespace lumacast::example {

std::optional<std::int64_t> MarkPlan::tick(std::int64_t time, std::uint32_t number) {
    if (every_ == 0) return std::nullopt;
    if (planned_ && time >= *planned_ + kLength) planned_.reset();
    if (planned_) return std::nullopt;
    const std::int64_t lead = (kLead + interval_ - 1) / interval_;  // in frames
    // What is too near already is for the multiple after it.
    while (static_cast<std::int64_t>(target_) - number < lead) target_ += every_;
    if (static_cast<std::int64_t>(target_) - number > lead) return std::nullopt;
    planned_ = time + lead * interval_;
    target_ += every_;
    return planned_;
}

bool MarkPlan::isMarked(std::int64_t time) const {
    // Nominal times of the same tick may differ by a rounding.
    return planned_ && time >= *planned_ - interval_ / 2 && time < *planned_ + kLength - interval_ / 2;
}

}  // namespace lumacast::example
