#pragma once

namespace lumacast::media {

/// How encoding exports stand back behind everything else. AsUsual is for tests, which have no time when the machine is
/// busy with others.
enum class EncodingPriority { Idle, AsUsual };

/// Makes the calling thread run when nobody else wants to, on the processor (SCHED_IDLE, or else the highest nice
/// value) and on the disk. Threads that it makes inherit it. It can't be taken back: for threads with nothing else to
/// do. Where the system refuses all of it the thread runs on as it was.
void runAtIdlePriority();

}  // namespace lumacast::media
