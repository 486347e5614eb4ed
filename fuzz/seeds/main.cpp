// Writes the seeds of the targets whose inputs nobody wants to write by hand:
//   fuzz_seeds tests/corpus
// Seeds only give a fuzzer something to begin with; what it makes of them is what the corpus keeps.

#include <cstdio>
#include <exception>

#include "fuzz/seeds/Seeds.h"

int main(int argc, char** argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: fuzz_seeds <folder of the corpora>\n");
        return 2;
    }
    try {
        lumacast::fuzz::writeArchiveSeeds(argv[1]);
        lumacast::fuzz::writeConversationSeeds(argv[1]);
        lumacast::fuzz::writeFrameSeeds(argv[1]);
        lumacast::fuzz::writeItemSeeds(argv[1]);
        lumacast::fuzz::writeMessageSeeds(argv[1]);
        lumacast::fuzz::writePayloadSeeds(argv[1]);
        lumacast::fuzz::writeRecoverySeeds(argv[1]);
        lumacast::fuzz::writeSettingsSeeds(argv[1]);
        lumacast::fuzz::writeSoundServerSeeds(argv[1]);
        lumacast::fuzz::writeValueSeeds(argv[1]);
    } catch (const std::exception& error) {
        std::fprintf(stderr, "fuzz_seeds: %s\n", error.what());
        return 1;
    }
    return 0;
}
