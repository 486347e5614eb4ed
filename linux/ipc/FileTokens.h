#pragma once
// Tokens exchanged for files: what the transport offers to a host and to the process of its extension.

#include <functional>
#include <memory>
#include <optional>
#include <string_view>

#include "base/Value.h"
#include "linux/ipc/Fd.h"
#include "linux/ipc/Frames.h"
#include "platform/IpcConnection.h"

namespace lumacast {

/// What the holder of files says to one token.
struct TokenAnswer {
    Fd file;                     ///< to be read only; goes to the peer
    int error = 0;               ///< without a file: the system's error number that the peer is told
    bool isPeerRefused = false;  ///< the peer has guessed often enough: it is dropped
};

/// Answers one exchange. Called on the reactor; must not block.
using TokenKeeper = std::function<TokenAnswer(Bytes token)>;

/// Lets the peer of this connection exchange tokens. Without it a peer that tries is dropped. A connection of this
/// transport only; nothing on another. Callable from any lane.
void keepFileTokens(const std::shared_ptr<IpcConnection>& connection, TokenKeeper keeper);

/// Called once, on the reactor, with the file or the error.
using FileHandler = std::function<void(Fd file, std::optional<Error> error)>;

/// Exchanges a token that the peer has issued for a descriptor to read its file. The error is the system's: EACCES for
/// a token that is not (or no longer) good, EMSGSIZE for one that can be none, EAGAIN when too many exchanges are under
/// way, EPIPE when the connection is or gets lost. Callable from any lane, never blocks.
void exchangeFileToken(const std::shared_ptr<IpcConnection>& connection, Bytes token, FileHandler handler);

}  // namespace lumacast
