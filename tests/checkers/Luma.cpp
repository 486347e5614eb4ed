#include "tests/checkers/Luma.h"

#include <algorithm>

#include "examples/scene/FramePattern.h"
#include "examples/scene/Mark.h"

namespace lumacast::checkers {

LumaPlane copyOf(const LumaView& view) {
    return turned(view, 0);
}

LumaPlane turned(const LumaView& view, int quarterTurns) {
    const int turns = (quarterTurns % 4 + 4) % 4;
    const bool upright = turns % 2 == 0;
    LumaPlane plane{upright ? view.width : view.height, upright ? view.height : view.width, {}};
    plane.samples.resize(static_cast<std::size_t>(view.width) * static_cast<std::size_t>(view.height));
    auto out = plane.samples.begin();
    for (int y = 0; y < plane.height; ++y) {
        for (int x = 0; x < plane.width; ++x) {
            int fromX = x, fromY = y;
            if (turns == 1) fromX = y, fromY = view.height - 1 - x;
            if (turns == 2) fromX = view.width - 1 - x, fromY = view.height - 1 - y;
            if (turns == 3) fromX = view.width - 1 - y, fromY = x;
            *out++ = view.samples[static_cast<std::size_t>(fromY) * view.stride + static_cast<std::size_t>(fromX)];
        }
    }
    return plane;
}

std::optional<std::uint32_t> frameNumberIn(const LumaView& view, int quarterTurns) {
    if (quarterTurns % 4 == 0) return scene::readFrameNumber(view.samples, view.width, view.height, view.stride);
    const LumaPlane upright = turned(view, -quarterTurns);
    return scene::readFrameNumber(upright.samples.data(), upright.width, upright.height,
                                  static_cast<std::size_t>(upright.width));
}

bool isMarked(const LumaView& view, int quarterTurns) {
    if (quarterTurns % 4 == 0) return scene::hasMark(view.samples, view.width, view.height, view.stride);
    const LumaPlane upright = turned(view, -quarterTurns);
    return scene::hasMark(upright.samples.data(), upright.width, upright.height,
                          static_cast<std::size_t>(upright.width));
}

}  // namespace lumacast::checkers
