#pragma once

namespace lumacast {

/// Keeps the memory of a process that runs for weeks as large as what it uses. Each recording has threads of its own,
/// and the C library's allocator gives new threads pools of their own, sixteen of them on two processors: buffers of a
/// recording stay, freed and cut up, in a pool that the next one does not get. Two pools are enough for what is
/// allocated here, and a large block goes back to the system when it is freed. Call it before any other thread is
/// started.
void keepMemoryFlat();

}  // namespace lumacast
