#pragma once

#include <cstdint>
#include <optional>

namespace lumacast::example {

/// Decides when frames are marked: about every `every` frames, each at a moment that is known `kLead` before it comes,
/// so that a sound can be made ready for it. The marked frame has a number that is a multiple of `every`, unless frames
/// were left out between the planning and the moment: the moment is kept, not the number. Times are host times in ns.
/// A value; pure.
class MarkPlan final {
public:
    /// How long before a mark it is planned.
    static constexpr std::int64_t kLead = 200'000'000;
    /// How long a mark stays: a recorder that takes fewer frames than are drawn must see it too.
    static constexpr std::int64_t kLength = 100'000'000;

    /// `interval` is what passes from one frame to the next. None are marked with `every` 0.
    MarkPlan(std::uint32_t every, std::int64_t interval) : every_(every), interval_(interval), target_(every) {}

    /// To be called at each tick, at its nominal time, with the number of the frame that it will draw. Answers the moment
    /// of a mark when one is planned by this tick.
    std::optional<std::int64_t> tick(std::int64_t time, std::uint32_t number);
    /// Whether what is drawn at this tick has the mark.
    [[nodiscard]] bool isMarked(std::int64_t time) const;

private:
    std::uint32_t every_;
    std::int64_t interval_;
    std::uint32_t target_;  ///< the number that the next planned mark is for
    std::optional<std::int64_t> planned_;
};

}  // namespace lumacast::example
