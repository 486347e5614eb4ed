#pragma once
// Which windows there are: every process has four, from its beginning to its end, without doing anything for them.

#include <cstdint>
#include <optional>

#include "base/Identifiers.h"

namespace lumacast::headless {

inline constexpr std::uint32_t kWindowsOfAProcess = 4;
inline constexpr std::uint32_t kIdentifiersOfAProcess = 8;

/// The windows of a process: its id times eight, and the three numbers after that. `index` is below kWindowsOfAProcess.
constexpr ContextID windowOf(ProcessID pid, std::uint32_t index = 0) {
    return ContextID{static_cast<std::uint32_t>(number(pid)) * kIdentifiersOfAProcess + index};
}

/// The process whose window this would be, whether it runs or not; none for what is no window's identifier.
constexpr std::optional<ProcessID> ownerOf(ContextID window) {
    if (number(window) < kIdentifiersOfAProcess || number(window) % kIdentifiersOfAProcess >= kWindowsOfAProcess)
        return std::nullopt;
    return ProcessID{static_cast<std::int32_t>(number(window) / kIdentifiersOfAProcess)};
}

}  // namespace lumacast::headless
