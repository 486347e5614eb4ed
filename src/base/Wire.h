#pragma once
// The wire's encoding of values: one tag byte, then the contents, little-endian. Endpoints and planes are not in the
// bytes: they are numbered handles that travel beside them.
//
//   0 null · 1 bool (1 byte) · 2 int64 · 3 uint64 · 4 double · 5 text (u32 length, bytes) · 6 bytes (u32 length, bytes)
//   7 date (double) · 8 URL (u32 length, bytes) · 9 array (u32 count, values) · 10 dictionary (u32 count, then per
//   entry u32 key length, key, value) · 11 error (text domain, int64 code, dictionary) · 12 endpoint (u8 handle) · 13
//   shared plane (u8 handle)

#include <optional>
#include <span>
#include <vector>

#include "base/Value.h"

namespace lumacast {

/// An encoded message body: its bytes and the endpoint and plane values that its handle numbers name, in order.
struct WireBody {
    Data bytes;
    std::vector<Value> handles;
};

/// Appends `value` to `body`. Answers false, leaving `body` unusable, when decode would refuse it: when it is too deep,
/// too long, has too many values or names too many handles for the limits table, or has text that is not valid UTF-8.
[[nodiscard]] bool encode(const Value& value, WireBody& body);
/// The same for an array that is no value yet.
[[nodiscard]] bool encodeArray(const Array& items, WireBody& body);

/// Reads exactly one value from all of `bytes`. `handles` are what travelled beside them. Answers none for anything
/// malformed: truncated, trailing bytes, unknown tag, too deep, too many values, a handle out of range or of the wrong
/// kind, a count that the remaining bytes can't hold, text that is not valid UTF-8, a key given twice. Never allocates
/// more than a small multiple of the input's size.
[[nodiscard]] std::optional<Value> decode(std::span<const std::uint8_t> bytes, std::span<const Value> handles);
/// The same for a value that must be an array.
[[nodiscard]] std::optional<Array> decodeArray(std::span<const std::uint8_t> bytes, std::span<const Value> handles);

}  // namespace lumacast
