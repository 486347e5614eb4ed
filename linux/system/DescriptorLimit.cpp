#include "linux/system/DescriptorLimit.h"

#include <sys/resource.h>

#include <algorithm>

namespace lumacast {

void allowDescriptors(std::uint64_t wanted) {
    rlimit limit{};
    if (::getrlimit(RLIMIT_NOFILE, &limit) != 0 || limit.rlim_cur >= wanted) return;
    limit.rlim_cur = std::min<rlim_t>(wanted, limit.rlim_max);
    (void)::setrlimit(RLIMIT_NOFILE, &limit);  // else connections are refused earlier, with a line
}

}  // namespace lumacast
