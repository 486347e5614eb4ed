#pragma once
#include <cstdint>
#include <cstdlib>

namespace lumacast {

/// The seeds of one run: LC_SEED=n means that one, LC_SEEDS=n so many.
struct Seeds {
    explicit Seeds(std::uint64_t ordinary) : last(ordinary) {
        if (const std::uint64_t one = fromEnvironment("LC_SEED")) first = last = one;
        else if (const std::uint64_t many = fromEnvironment("LC_SEEDS")) last = many;
    }
    bool isOne() const { return first == last; }

    std::uint64_t first = 1, last;

private:
    static std::uint64_t fromEnvironment(const char* name) {
        const char* const text = std::getenv(name);
        return text && *text ? std::strtoull(text, nullptr, 10) : 0;
    }
};

}  // namespace lumacast
