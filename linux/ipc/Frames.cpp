#include "linux/ipc/Frames.h"

#include <algorithm>
#include <cstring>

#include "base/Limits.h"

namespace lumacast {

namespace {

constexpr std::string_view kMagic = "LCASTIPC";
constexpr std::size_t kMaximumDamage = 16;
constexpr std::int32_t kMaximumSide = 32'768;
constexpr std::uint64_t kMaximumStride = 4ULL * kMaximumSide + 4096;

enum RecordKind : std::uint8_t { kEndpointRecord = 1, kPlaneRecord = 2 };

template <class Number>
void store(std::uint8_t* at, Number number) {
    for (std::size_t i = 0; i < sizeof number; ++i)
        at[i] = static_cast<std::uint8_t>(static_cast<std::uint64_t>(number) >> (8 * i));
}

template <class Number>
Number load(const std::uint8_t* at) {
    std::uint64_t bits = 0;
    for (std::size_t i = 0; i < sizeof(Number); ++i) bits |= std::uint64_t{at[i]} << (8 * i);
    return static_cast<Number>(bits);
}

template <class Number>
void append(Data& bytes, Number number) {
    bytes.resize(bytes.size() + sizeof number);
    store(bytes.data() + bytes.size() - sizeof number, number);
}

class Cursor {
public:
    explicit Cursor(Bytes rest) : rest_(rest) {}
    bool done() const { return rest_.empty(); }
    template <class Number>
    bool read(Number& out) {
        if (rest_.size() < sizeof out) return false;
        out = load<Number>(rest_.data());
        rest_ = rest_.subspan(sizeof out);
        return true;
    }

private:
    Bytes rest_;
};

PixelRect boundingBox(const std::vector<PixelRect>& rects) {
    std::int32_t left = kMaximumSide, top = kMaximumSide, right = 0, bottom = 0;
    for (const PixelRect& r : rects) {
        left = std::min(left, r.x);
        top = std::min(top, r.y);
        right = std::max(right, r.x + r.width);
        bottom = std::max(bottom, r.y + r.height);
    }
    return {left, top, right - left, bottom - top};
}

bool isWithin(const PixelRect& r, std::int32_t width, std::int32_t height) {
    return r.x >= 0 && r.y >= 0 && r.width >= 0 && r.height >= 0 && r.x <= width && r.y <= height &&
           r.width <= width - r.x && r.height <= height - r.y;
}

bool readPlane(Cursor& cursor, PlaneRecord& plane) {
    std::uint8_t count = 0;
    if (!cursor.read(plane.lease) || !cursor.read(plane.width) || !cursor.read(plane.height) ||
        !cursor.read(plane.stride) || !cursor.read(plane.pictureNumber) || !cursor.read(count))
        return false;
    if (plane.width <= 0 || plane.width > kMaximumSide || plane.height <= 0 || plane.height > kMaximumSide)
        return false;
    if (plane.stride < 4 * static_cast<std::uint64_t>(plane.width) || plane.stride > kMaximumStride) return false;
    if (count > kMaximumDamage) return false;
    for (std::uint8_t i = 0; i < count; ++i) {
        PixelRect r;
        if (!cursor.read(r.x) || !cursor.read(r.y) || !cursor.read(r.width) || !cursor.read(r.height)) return false;
        if (!isWithin(r, plane.width, plane.height)) return false;
        plane.damage.push_back(r);
    }
    return true;
}

}  // namespace

Data makeHello() {
    Data hello(kMagic.begin(), kMagic.end());
    append(hello, kWireVersion);
    append(hello, static_cast<std::uint32_t>(kHelloBytes));
    return hello;
}

HelloCheck checkHello(Bytes received) {
    HelloCheck check;
    if (received.empty()) return check;
    const std::size_t magicBytes = std::min(received.size(), kMagic.size());
    if (std::memcmp(received.data(), kMagic.data(), magicBytes) != 0) {
        check.state = HelloState::WrongMagic;
        return check;
    }
    if (received.size() < kHelloBytes) return check;
    check.version = load<std::uint32_t>(received.data() + 8);
    const auto size = load<std::uint32_t>(received.data() + 12);
    if (check.version != kWireVersion) {
        check.state = HelloState::WrongVersion;
    } else if (size < kHelloBytes || size > limitOf(Limit::HelloBytes)) {
        check.state = HelloState::TooLong;
    } else {
        check.size = size;
        if (received.size() >= size) check.state = HelloState::Good;
    }
    return check;
}

std::size_t FrameHeader::frameBytes() const { return kFrameHeaderBytes + valueBytes + recordBytes; }

void writeFrameHeader(const FrameHeader& header, std::span<std::uint8_t> frame) {
    std::uint8_t* at = frame.data();
    store(at, header.valueBytes);
    store(at + 4, header.recordBytes);
    at[8] = static_cast<std::uint8_t>(header.kind);
    at[9] = header.handles;
    store(at + 10, header.message);
    store(at + 12, std::uint32_t{0});
    store(at + 16, header.sequence);
}

const char* readFrameHeader(Bytes bytes, FrameHeader& header) {
    const std::uint8_t* at = bytes.data();
    header.valueBytes = load<std::uint32_t>(at);
    header.recordBytes = load<std::uint32_t>(at + 4);
    header.kind = static_cast<FrameKind>(at[8]);
    header.handles = at[9];
    header.message = load<std::uint16_t>(at + 10);
    header.sequence = load<std::uint64_t>(at + 16);
    if (at[8] < 1 || at[8] > static_cast<std::uint8_t>(FrameKind::TokenExchanged)) return "a frame of an unknown kind";
    if (load<std::uint32_t>(at + 12) != 0) return "a frame with reserved bits";
    if (std::uint64_t{header.valueBytes} + header.recordBytes + kFrameHeaderBytes > limitOf(Limit::MessageBytes))
        return "a message over the size limit";
    if (header.handles > limitOf(Limit::HandlesPerMessage)) return "a message with too many descriptors";
    if ((header.handles == 0) != (header.recordBytes == 0)) return "descriptors and their records differ";
    const bool isTransport = header.kind == FrameKind::PlaneReturned || header.kind == FrameKind::NoReply;
    if (isTransport && (header.valueBytes != 0 || header.handles != 0)) return "a transport frame with contents";
    if (header.kind == FrameKind::ExchangeToken &&
        (header.valueBytes == 0 || header.valueBytes > kMaximumTokenBytes || header.handles != 0 || header.message != 0))
        return "a token that can be none";
    if (header.kind == FrameKind::TokenExchanged &&
        (header.valueBytes != 0 || header.handles > 1 || header.recordBytes > 1 ||
         (header.handles == 1) != (header.message == 0)))
        return "a token frame with other contents";
    const bool isReply = header.kind == FrameKind::Reply || header.kind == FrameKind::PlaneReturned;
    if (isReply && header.message != 0) return "a reply with a message number";
    return nullptr;
}

void appendRecord(Data& bytes, const HandleRecord& record) {
    const auto* plane = std::get_if<PlaneRecord>(&record);
    if (!plane) return bytes.push_back(kEndpointRecord);
    bytes.push_back(kPlaneRecord);
    append(bytes, plane->lease);
    append(bytes, plane->width);
    append(bytes, plane->height);
    append(bytes, plane->stride);
    append(bytes, plane->pictureNumber);
    std::span<const PixelRect> damage = plane->damage;
    PixelRect box;
    if (damage.size() > kMaximumDamage) {
        box = boundingBox(plane->damage);
        damage = {&box, 1};
    }
    bytes.push_back(static_cast<std::uint8_t>(damage.size()));
    for (const PixelRect& r : damage) {
        append(bytes, r.x);
        append(bytes, r.y);
        append(bytes, r.width);
        append(bytes, r.height);
    }
}

std::optional<std::vector<HandleRecord>> readRecords(Bytes bytes, std::size_t count) {
    Cursor cursor(bytes);
    std::vector<HandleRecord> records;
    for (std::size_t i = 0; i < count; ++i) {
        std::uint8_t kind = 0;
        PlaneRecord plane;
        if (!cursor.read(kind)) return std::nullopt;
        if (kind == kEndpointRecord) {
            records.emplace_back(EndpointRecord{});
        } else if (kind == kPlaneRecord && readPlane(cursor, plane)) {
            records.emplace_back(std::move(plane));
        } else {
            return std::nullopt;
        }
    }
    if (!cursor.done()) return std::nullopt;
    return records;
}

}  // namespace lumacast
