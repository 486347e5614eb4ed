#pragma once

#include <vector>

namespace lumacast::checkers {

/// Mono sound, full scale is 1; sample n is heard n / rate seconds after the start of the movie.
struct Sound {
    int rate = 0;
    std::vector<float> samples;
};

}  // namespace lumacast::checkers
