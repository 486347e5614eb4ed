#pragma once
// Values made from a fuzzer's bytes, and what the limits say of a value.

#include <cstdint>

#include "base/Value.h"
#include "fuzz/Input.h"

namespace lumacast::fuzz {

/// A plane of one pixel, or an endpoint of nowhere.
Value makeHandle(bool isPlane);

/// What the limits count, found by walking the value; the sums stop growing far beyond every limit.
struct Measure {
    std::uint64_t bytes = 0, values = 0, depth = 0, handles = 0, mostEntries = 0;
    bool isUtf8 = true;
};

Measure measureOf(const Value& value);

/// Whether the transport can carry a value.
bool isWithinLimits(const Measure& measure);

/// Makes a value from a recipe, which may be longer and deeper than anything that fits into an input: parts of it can
/// be asked for many times. What it may be is bounded: a few times the limits.
Value valueOf(Input& in);

}  // namespace lumacast::fuzz
