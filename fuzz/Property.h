#pragma once
#include <stdexcept>
#include <string>
#include <string_view>

namespace lumacast::fuzz {

/// Something that must hold for every input did not hold for this one.
struct BrokenProperty : std::logic_error {
    using std::logic_error::logic_error;
};

/// `what` says in words what must hold.
inline void require(bool holds, std::string_view what) {
    if (!holds) throw BrokenProperty(std::string(what));
}

}  // namespace lumacast::fuzz
