#pragma once

#include <optional>

#include "tests/checkers/Luma.h"

namespace lumacast::checkers {

/// Mean structural similarity of two luma planes: 1 when equal, about 0 when unrelated. Windows of 8 x 8 samples, 4
/// apart, without weights; constants (0.01 * 255)^2 and (0.03 * 255)^2 (Wang, Bovik, Sheikh, Simoncelli 2004). None
/// when the sizes differ or are below 8 x 8.
[[nodiscard]] std::optional<double> meanSsim(const LumaView& one, const LumaView& other);

}  // namespace lumacast::checkers
