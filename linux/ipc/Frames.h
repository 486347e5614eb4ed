#pragma once
// What goes over a connection's socket: a hello, then frames. Pure functions on bytes; README.md has the layouts as
// tables.
//
// Integers are little-endian. All functions that read foreign bytes answer none (or a reason) for anything malformed.

#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <variant>
#include <vector>

#include "base/Value.h"
#include "writer/media/PixelBuffer.h"

namespace lumacast {

using Bytes = std::span<const std::uint8_t>;

// --- hello: magic "LCASTIPC" (8 bytes) · version u32 · size u32, of the whole hello ---

inline constexpr std::uint32_t kWireVersion = 1;
inline constexpr std::size_t kHelloBytes = 16;

Data makeHello();

/// How far the first bytes of a peer make a good hello.
enum class HelloState { Incomplete, Good, WrongMagic, WrongVersion, TooLong };
struct HelloCheck {
    HelloState state = HelloState::Incomplete;
    std::size_t size = kHelloBytes;  ///< bytes that the hello has, as far as is known; never over Limit::HelloBytes
    std::uint32_t version = 0;
};
HelloCheck checkHello(Bytes received);

// --- frame: header · value (base/Wire.h) · one record per descriptor ---

enum class FrameKind : std::uint8_t {
    Message = 1,  ///< a message without a reply
    Request = 2,  ///< a message that wants a reply
    Reply = 3,  ///< `sequence` is the request's
    PlaneReturned = 4,  ///< transport: `sequence` is the lease that ends
    /// transport: the request `sequence` gets no reply; `message` is the system's error number, or 0 when the receiver
    /// deliberately gives none
    NoReply = 5,
    ExchangeToken = 6,  ///< transport: the value is the token's bytes, `sequence` counts the asker's exchanges
    /// transport: the exchange `sequence` is over; with one descriptor, the file's, or with `message`, the system's
    /// error number
    TokenExchanged = 7,
};

/// valueBytes u32 · recordBytes u32 · kind u8 · handles u8 · message u16 · zero u32 · sequence u64
struct FrameHeader {
    std::uint32_t valueBytes = 0;
    std::uint32_t recordBytes = 0;
    FrameKind kind = FrameKind::Message;
    std::uint8_t handles = 0;
    std::uint16_t message = 0;
    /// Message, Request: counts the messages of this direction, from 1. Else see FrameKind.
    std::uint64_t sequence = 0;

    std::size_t frameBytes() const;
};
inline constexpr std::size_t kFrameHeaderBytes = 24;

/// Writes the header over the first kFrameHeaderBytes of `frame`.
void writeFrameHeader(const FrameHeader& header, std::span<std::uint8_t> frame);

/// The longest token that can be exchanged, and the record of a file's descriptor (one byte, this one).
inline constexpr std::size_t kMaximumTokenBytes = 128;
inline constexpr std::uint8_t kFileRecord = 3;

/// Reads kFrameHeaderBytes. Answers null and sets `header`, or answers why the frame must be refused.
const char* readFrameHeader(Bytes bytes, FrameHeader& header);

// --- records: what a descriptor of the message is ---

/// The descriptor is an endpoint's doorbell. Record: kind u8 = 1.
struct EndpointRecord {};

/// The descriptor is a shared plane's memory. Record: kind u8 = 2 · lease u64 · width i32 · height i32 · stride u64 ·
/// pictureNumber u64 · damage count u8 · per rectangle x, y, width, height i32.
struct PlaneRecord {
    std::uint64_t lease = 0;
    std::int32_t width = 0;
    std::int32_t height = 0;
    std::uint64_t stride = 0;
    std::uint64_t pictureNumber = 0;
    std::vector<PixelRect> damage;
};

using HandleRecord = std::variant<EndpointRecord, PlaneRecord>;

/// Appends a record. More damage rectangles than a record holds become their bounding box.
void appendRecord(Data& bytes, const HandleRecord& record);

/// Reads exactly `count` records from all of `bytes`; planes have sane sizes and damage within the picture.
std::optional<std::vector<HandleRecord>> readRecords(Bytes bytes, std::size_t count);

}  // namespace lumacast
