#pragma once

namespace lumacast {

/// Makes the calling thread stand back behind the rest of this process, on the processor (ten nice levels) and on the
/// disk (the last of the usual ones). Threads that it makes inherit it. It can't be taken back: for threads with
/// nothing else to do. Where the system refuses it the thread runs on as it was.
///
/// Deliberately not idle: somebody waits for what such threads do, and on a machine that is busy all the time idle ones
/// get next to nothing, neither to work nor to end. The end of a process waits for the end of each thread.
void runAtLowPriority();

}  // namespace lumacast
