// One connection of the transport, whole: what its peer may send at any time, above all the frames of planes that were
// lent and of tokens for files. The input is a script of steps of both ends, 48 at most; see Conversation::step.

#include <sys/socket.h>

#include <memory>

#include "fuzz/Conversation.h"
#include "fuzz/Property.h"

namespace lumacast::fuzz {

void connections(Bytes input) {
    static const Wares wares;
    static const TokenFiles files;
    const int before = nextDescriptor();
    { Conversation(Input(input), wares, files).run(); }
    require(nextDescriptor() <= before, "every descriptor is closed in the end");
}

}  // namespace lumacast::fuzz
