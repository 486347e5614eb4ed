#include "tests/fakes/FaultPlan.h"

namespace lumacast {

bool FaultPlan::fails(std::string_view call) {
    const std::lock_guard lock(mutex_);
    bool failing = ++calls_ == failingNumber_;
    if (const auto found = next_.find(call); found != next_.end()) {
        failing = true;
        if (--found->second == 0) next_.erase(found);
    }
    if (random_ && random_->chance(numerator_, denominator_)) failing = true;
    if (failing) failures_.emplace_back(call);
    return failing;
}

void FaultPlan::failAtRandom(std::uint64_t seed, std::uint64_t numerator, std::uint64_t denominator) {
    const std::lock_guard lock(mutex_);
    random_.emplace(seed);
    numerator_ = numerator;
    denominator_ = denominator;
}

void FaultPlan::failNext(std::string_view call, std::uint64_t times) {
    const std::lock_guard lock(mutex_);
    if (times > 0) next_[std::string(call)] += times;
}

void FaultPlan::failCallNumber(std::uint64_t number) {
    const std::lock_guard lock(mutex_);
    failingNumber_ = number;
}

void FaultPlan::clear() {
    const std::lock_guard lock(mutex_);
    failingNumber_ = 0;
    next_.clear();
    random_.reset();
}

std::uint64_t FaultPlan::callCount() const {
    const std::lock_guard lock(mutex_);
    return calls_;
}

std::vector<std::string> FaultPlan::failures() const {
    const std::lock_guard lock(mutex_);
    return failures_;
}

}  // namespace lumacast
