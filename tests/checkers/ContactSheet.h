#pragma once

#include <string>
#include <vector>

#include "tests/checkers/MovieReader.h"

namespace lumacast::checkers {

/// Writes a PNG with up to `count` pictures spread evenly over the movie, four in a row. The reason when that fails,
/// else empty.
[[nodiscard]] std::string writeContactSheet(MovieReader& reader, const std::string& path, int count = 12);

/// Writes one picture. The reason when that fails, else empty.
[[nodiscard]] std::string writePng(const RgbPicture& picture, const std::string& path);

}  // namespace lumacast::checkers
