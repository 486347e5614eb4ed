// One target as a fuzzer: the fuzzer's library calls this with every input it thinks of.

#include <cstddef>
#include <cstdint>

#include "fuzz/Targets.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const lumacast::fuzz::Target& target = lumacast::fuzz::targetNamed(LC_FUZZ_TARGET);
    target.run({data, size});  // a broken property is thrown and not caught: the fuzzer keeps the input
    return 0;
}
