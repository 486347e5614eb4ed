#include "linux/display/Arrangement.h"

namespace lumacast::x11 {

void Arrangement::enclose(const PixelRect& screen) {
    box = {};
    for (const Part& part : parts) box = bounds(box, intersection(part.place, screen));
}

bool Arrangement::isCovered(std::size_t part, const PixelRect& rect) const {
    for (std::size_t above = part + 1; above < parts.size(); ++above)
        if (parts[above].visible && contains(parts[above].place, rect)) return true;
    return false;
}

std::size_t Arrangement::floorOf(const PixelRect& rect) const {
    for (std::size_t i = parts.size(); i-- > 0;)
        if (parts[i].visible && contains(parts[i].place, rect)) return i;
    return parts.size();
}

}  // namespace lumacast::x11
