#pragma once
#include <cstdint>
#include <cstdlib>
#include <fstream>

namespace lumacast {

/// The seeds of one run: LC_SEED=n means that one, LC_SEEDS=n so many, and LC_FIRST_SEED=n says where they begin. A test
/// that goes through seeds has a name that ends in "InAnyOfManySeeds": by that scripts/simulate finds it.
class Seeds {
public:
    explicit Seeds(std::uint64_t ordinary) : ordinary_(ordinary) {
        if (const std::uint64_t from = fromEnvironment("LC_FIRST_SEED")) first = from;
        if (const std::uint64_t one = fromEnvironment("LC_SEED")) first = last = one;
        else if (const std::uint64_t many = fromEnvironment("LC_SEEDS")) last = first + many - 1;
        else last = first + ordinary - 1;
    }
    bool isOne() const { return first == last; }
    /// All the ordinary ones are among them, so that what they did all together can be judged.
    bool areAllOrdinary() const { return first == 1 && last >= ordinary_; }

    /// Called before each seed: the file that LC_SEED_MARK names holds its number, so that whoever ran this knows which
    /// one did not come to its end.
    static void begin(std::uint64_t seed) {
        if (const char* const mark = std::getenv("LC_SEED_MARK")) std::ofstream(mark) << seed << '\n';
    }

    std::uint64_t first = 1, last = 1;

private:
    static std::uint64_t fromEnvironment(const char* name) {
        const char* const text = std::getenv(name);
        return text && *text ? std::strtoull(text, nullptr, 10) : 0;
    }

    std::uint64_t ordinary_;
};

}  // namespace lumacast
