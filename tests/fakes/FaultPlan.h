#pragma once
#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tests/fakes/SimRandom.h"

namespace lumacast {

/// Decides which calls of the fakes fail. A fake asks fails("Role.operation") once per call; nothing fails until the
/// test says so. The calls are numbered over all roles, so that a test can let every single one fail in turn.
/// Thread-safe.
class FaultPlan {
public:
    /// Whether this call fails now. Counts the call.
    bool fails(std::string_view call);

    /// From now on each call fails with the probability `numerator` / `denominator`, decided by the seed.
    void failAtRandom(std::uint64_t seed, std::uint64_t numerator, std::uint64_t denominator);
    /// The next `times` calls of this operation fail.
    void failNext(std::string_view call, std::uint64_t times = 1);
    /// The call with this number fails, the first call of all being 1.
    void failCallNumber(std::uint64_t number);
    /// Nothing fails any more.
    void clear();

    /// How many calls there were so far.
    std::uint64_t callCount() const;
    /// The calls that failed, in order.
    std::vector<std::string> failures() const;

private:
    mutable std::mutex mutex_;
    std::uint64_t calls_ = 0;
    std::uint64_t failingNumber_ = 0;
    std::map<std::string, std::uint64_t, std::less<>> next_;
    std::optional<SimRandom> random_;
    std::uint64_t numerator_ = 0, denominator_ = 1;
    std::vector<std::string> failures_;
};

}  // namespace lumacast
