#pragma once
// What an error says: where it comes from, which one it is, and a text for people.
//
// Its domain tells where an Error in an answer or event comes from: the daemon (kRecordingErrorDomain, the codes of
// RecordingErrorCode), this library (kConnectionErrorDomain, the codes of ConnectionError), a call of the
// daemon's that failed (kSystemErrorDomain, numbers of errno: setUpBroadcast and broadcastExtensions), or a broadcast's
// extension, which ends the broadcast with an error of any domain: it comes with `stopped`, or answers the start.

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/RecordingErrorCodes.h"
#include "base/Value.h"

namespace lumacast::client {

/// The domain of errors that come from the connection, not from the daemon; see ConnectionError.
inline constexpr std::string_view kConnectionErrorDomain = "com.orvane.Lumacast.client";

enum class ConnectionError : std::int64_t {
    /// The daemon isn't there, or it took the connection and ended it without ever having answered: it does not serve
    /// this program, say because it belongs to no application. Nothing was done.
    NotReached = 1,
    /// The connection ended before the answer came: the daemon died, mostly. Whether the request was carried out is
    /// unknown; a recording that was running has ended.
    Lost = 2,
    /// No answer within the limit of a call that waits; or the daemon has said that there will be none, and this was
    /// the oldest of more such questions than are kept. The request is not taken back.
    NoAnswer = 3,
    /// Too many requests are under way, or too many bytes for the daemon to read them. This one was not sent.
    Busy = 4,
    /// The request can't be sent: too many windows, a text that is not UTF-8. Nothing was done.
    Unsendable = 5,
    /// The answer was none that this request can have.
    BadAnswer = 6,
    /// The recorder was destroyed before the answer came.
    Closed = 7,
    /// A call that waits was made from a handler, where it could never end. The request was not sent.
    WouldBlock = 8,
};

/// "CONNECTION_ERROR_..." for a code of kConnectionErrorDomain; that of NotReached for any other number. Static.
std::string_view connectionErrorKey(std::int64_t code);

/// A connection error with its English description.
Error connectionError(ConnectionError code);

/// The code when the error's domain is kRecordingErrorDomain; else none. An error may be of neither kind.
std::optional<RecordingErrorCode> recordingCodeOf(const Error& error);
/// The code when the error's domain is kConnectionErrorDomain and the code is one of it; else none.
std::optional<ConnectionError> connectionCodeOf(const Error& error);

/// The error's key: "RECORDING_ERROR_..." (that of RECORDING_ERROR_UNKNOWN for a code outside the block) or
/// "CONNECTION_ERROR_...". Empty for an error of any other domain. Static.
std::string_view keyOf(const Error& error);

/// A text to show: the error's own description where it carries one (the daemon's are in the user's language; that of a
/// broadcast without a set-up has none), else its key, or its domain, and its code. Never empty.
std::string textOf(const Error& error);

}  // namespace lumacast::client
