// Recipes of movies that were cut off.

#include "fuzz/seeds/Seeds.h"

namespace lumacast::fuzz {

void writeRecoverySeeds(const std::filesystem::path& corpora) {
    const auto recipe = [](std::uint8_t wish, std::uint8_t pictures, const Data& end) {
        Data bytes{wish, pictures};
        for (unsigned i = 0; i <= pictures; ++i) {
            bytes.push_back(static_cast<std::uint8_t>(40 + 7 * i));
            bytes.push_back(8);
        }
        bytes.insert(bytes.end(), end.begin(), end.end());
        return bytes;
    };
    writeSeed(corpora, "recoveries", "whole", recipe(0, 20, {0, 0, 255, 255}));
    writeSeed(corpora, "recoveries", "cut", recipe(12, 39, {77, 60, 100, 0}));
    writeSeed(corpora, "recoveries", "finish", recipe(6, 30, {9, 1, 3, 0}));
    writeSeed(corpora, "recoveries", "switch", recipe(2, 30, {9, 0, 255, 255}));
    writeSeed(corpora, "recoveries", "copy", recipe(20, 12, {0, 0, 255, 255}));
    writeSeed(corpora, "recoveries", "changed", recipe(4, 12, {0, 0, 255, 255, 200, 100, 7, 10, 240, 0}));
    writeSeed(corpora, "recoveries", "file", {1, 0, 0, 0, 32, 'f', 't', 'y', 'p', 'm', 'p', '4', '2'});
}

}  // namespace lumacast::fuzz
