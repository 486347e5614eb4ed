#pragma once
#include <cstdint>

namespace lumacast {

/// Raises this process's own limit of open descriptors to at least `wanted`, as far as the administrator's limit lets
/// it: what a session starts with (often 1024) is fewer than one user's connections need, at two each. Never lowers it.
void allowDescriptors(std::uint64_t wanted);

}  // namespace lumacast
