#pragma once
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "fuzz/Targets.h"

namespace lumacast::fuzz {

/// The fuzzer's bytes, taken one after the other from the front. At the end every number is 0 and every text empty, so
/// that a short input is a short story, not a refused one.
class Input {
public:
    explicit Input(Bytes bytes) : rest_(bytes) {}

    bool isAtEnd() const { return rest_.empty(); }
    std::size_t size() const { return rest_.size(); }

    std::uint8_t byte() {
        if (rest_.empty()) return 0;
        const std::uint8_t first = rest_.front();
        rest_ = rest_.subspan(1);
        return first;
    }
    /// From 0 to `bound` - 1; `bound` is 1 to 256.
    unsigned below(unsigned bound) { return byte() % bound; }
    bool flag() { return (byte() & 1) != 0; }
    /// Little-endian, of `size` bytes.
    std::uint64_t number(unsigned size) {
        std::uint64_t result = 0;
        for (unsigned i = 0; i < size; ++i) result |= std::uint64_t{byte()} << (8 * i);
        return result;
    }
    Bytes bytes(std::size_t count) {
        const Bytes taken = rest_.first(std::min(count, rest_.size()));
        rest_ = rest_.subspan(taken.size());
        return taken;
    }
    Bytes rest() { return bytes(rest_.size()); }

private:
    Bytes rest_;
};

inline std::string_view textOf(Bytes bytes) {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

}  // namespace lumacast::fuzz
