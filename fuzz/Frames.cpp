// The frame layer: what a peer sends over a connection's socket, in pieces, with descriptors. The input is a script of
// pieces (see Pieces.h); each is sent and read in one go. So that reading does not depend on how a kernel cuts a
// stream, the same script is read a second time in crumbs.

#include "linux/ipc/Frames.h"

#include <fcntl.h>
#include <sys/socket.h>

#include <array>
#include <cstring>
#include <memory>

#include "base/Limits.h"
#include "fuzz/Pieces.h"
#include "fuzz/Property.h"
#include "linux/ipc/Handles.h"
#include "linux/ipc/IncomingFrames.h"

namespace lumacast::fuzz {

namespace {

class Lender final : public PlaneLender {
public:
    void giveBack(std::uint64_t) override { ++given; }
    int given = 0;
};

/// What came out of one reading.
struct Reading {
    struct Frame {
        FrameHeader header;
        Data value, records;
        bool isDecoded = false;
    };
    std::vector<Frame> frames;
    bool isRefused = false;
};

bool isSame(const Reading::Frame& a, const Reading::Frame& b) {
    return a.header.kind == b.header.kind && a.header.handles == b.header.handles &&
           a.header.message == b.header.message && a.header.sequence == b.header.sequence && a.value == b.value &&
           a.records == b.records && a.isDecoded == b.isDecoded;
}

/// A frame that was read is written again, and that is read as the same values.
void checkWritten(FrameKind kind, std::uint16_t message, const Array& values) {
    std::uint64_t lease = 0;
    EncodedFrame encoded;
    const int error = encodeFrame(
        kind, message, values, [&] { return ++lease; }, encoded);
    // One descriptor named by several values counts as several on the way out.
    if (error != 0) return;
    require(encoded.frame.bytes.size() <= limitOf(Limit::MessageBytes), "a frame is no longer than the limit");
    require(encoded.frame.descriptors.size() == encoded.header.handles, "every descriptor has its record");
    require(encoded.frame.bytes.size() == encoded.header.frameBytes(), "a frame is as long as its header says");
    IncomingFrames::Frame back;
    writeFrameHeader(encoded.header, encoded.frame.bytes);
    require(readFrameHeader(encoded.frame.bytes, back.header) == nullptr, "a header that was written can be read");
    const Bytes bytes = encoded.frame.bytes;
    back.value = bytes.subspan(kFrameHeaderBytes, back.header.valueBytes);
    back.records = bytes.subspan(kFrameHeaderBytes + back.header.valueBytes);
    for (const int descriptor : encoded.frame.descriptors)
        back.descriptors.emplace_back(::fcntl(descriptor, F_DUPFD_CLOEXEC, 0));
    Array again;
    require(decodeFrame(back, {}, again) == nullptr, "a frame that was written can be read");
    WireBody before, after;
    require(encodeArray(values, before) && encodeArray(again, after) && before.bytes == after.bytes,
            "a frame that was written reads as the same values");
}

void take(IncomingFrames::Frame& frame, const std::shared_ptr<Lender>& lender, Reading& reading) {
    require(frame.header.frameBytes() <= limitOf(Limit::MessageBytes), "a frame is no longer than the limit");
    require(frame.header.handles <= limitOf(Limit::HandlesPerMessage),
            "a frame has no more descriptors than the limit");
    require(frame.descriptors.size() == frame.header.handles, "a frame has the descriptors it declares");
    require(frame.value.size() == frame.header.valueBytes && frame.records.size() == frame.header.recordBytes,
            "a frame is as long as its header says");
    Reading::Frame& kept = reading.frames.emplace_back();
    kept.header = frame.header;
    kept.value.assign(frame.value.begin(), frame.value.end());
    kept.records.assign(frame.records.begin(), frame.records.end());
    Array values;
    kept.isDecoded = decodeFrame(frame, lender, values) == nullptr;
    if (!kept.isDecoded) return;
    for (const Value& value : values) {
        const auto* plane = value.as<Value::PlaneRef>();
        if (!plane) continue;
        const auto pixels = (*plane)->pixels();
        require(pixels.size() >= (*plane)->stride() * static_cast<std::size_t>((*plane)->height()),
                "a plane's pixels are all there");
        volatile std::uint8_t last = pixels.back();  // and can be read
        (void)last;
        for (const PixelRect& r : (*plane)->damage())
            require(r.x >= 0 && r.y >= 0 && r.width >= 0 && r.height >= 0 && r.x + r.width <= (*plane)->width() &&
                        r.y + r.height <= (*plane)->height(),
                    "damage lies within its picture");
    }
    checkWritten(frame.header.kind, frame.header.message, values);
}

enum class Cut { InPieces, InCrumbs };

Reading readAll(const std::vector<Piece>& pieces, Cut cut) {
    std::array<int, 2> pair{};
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, pair.data()) != 0)
        throw std::runtime_error("no sockets can be made");
    const Fd ours(pair[0]), theirs(pair[1]);
    const auto lender = std::make_shared<Lender>();
    Reading reading;
    IncomingFrames incoming;
    std::array<std::uint8_t, 65'536> scratch;
    std::size_t sent = 0, consumed = 0, total = 0;
    for (const Piece& piece : pieces) total += piece.bytes.size();
    const std::size_t crumb = 1 + total / 128;  // single bytes of a short script, and never many system calls
    const auto turn = [&](Bytes bytes, const std::vector<int>& descriptors) {
        if (!sendTo(theirs.get(), bytes, descriptors)) throw std::runtime_error("a piece can't be sent");
        sent += bytes.size();
        const auto received = incoming.receive(ours.get(), scratch);
        if (received != IncomingFrames::Received::Bytes) return false;
        const char* reason = nullptr;
        for (;;) {
            IncomingFrames::Frame frame;
            const auto next = incoming.next(frame, reason);
            require(next != IncomingFrames::Next::Malformed || reason, "a refusal has a reason");
            if (next == IncomingFrames::Next::Malformed) return false;
            if (next == IncomingFrames::Next::Incomplete) break;
            consumed += frame.header.frameBytes();
            take(frame, lender, reading);
        }
        require(incoming.endTurn() == sent - consumed, "what is kept is what was not consumed");
        require(incoming.isMidFrame() == (sent != consumed), "a frame has begun when bytes are left");
        return true;
    };
    for (const Piece& piece : pieces) {
        if (cut == Cut::InPieces) {
            reading.isRefused = !turn(piece.bytes, piece.descriptors);
        } else {
            const Bytes bytes = piece.bytes;
            for (std::size_t at = 0; at < bytes.size() && !reading.isRefused; at += crumb)
                reading.isRefused = !turn(bytes.subspan(at, std::min(crumb, bytes.size() - at)),
                                          at == 0 ? piece.descriptors : std::vector<int>());
        }
        if (reading.isRefused) break;
    }
    return reading;
}

/// Whether each descriptor comes with the first byte of a frame that declares it, as a peer must do.
bool isWellBehaved(const std::vector<Piece>& pieces) {
    Data all;
    for (const Piece& piece : pieces) all.insert(all.end(), piece.bytes.begin(), piece.bytes.end());
    std::size_t begin = 0, at = 0;
    auto piece = pieces.begin();
    while (piece != pieces.end()) {
        FrameHeader header;
        if (all.size() - begin < kFrameHeaderBytes || readFrameHeader(Bytes(all).subspan(begin), header)) break;
        const std::size_t end = begin + header.frameBytes();
        std::size_t came = 0;
        for (; piece != pieces.end() && at < end; at += piece++->bytes.size()) {
            if (piece->descriptors.empty()) continue;
            if (at != begin) return false;
            came = piece->descriptors.size();
        }
        if (came != header.handles) return false;
        begin = end;
    }
    return std::all_of(piece, pieces.end(), [](const Piece& rest) { return rest.descriptors.empty(); });
}

void checkHellos(const std::vector<Piece>& pieces) {
    if (pieces.empty()) return;
    Bytes bytes = pieces.front().bytes;
    HelloState last = HelloState::Incomplete;
    for (std::size_t length = 0; length <= bytes.size(); ++length) {
        const HelloCheck check = checkHello(bytes.first(length));
        require(check.size >= kHelloBytes && check.size <= limitOf(Limit::HelloBytes), "a hello is within its limit");
        require(last == HelloState::Incomplete || check.state == last, "what is decided stays so");
        require(check.state != HelloState::Incomplete || length < check.size, "a whole hello is decided");
        last = check.state;
    }
}

}  // namespace

void frames(Bytes input) {
    static const Wares wares;
    const auto pieces = piecesOf(Input(input), wares);
    checkHellos(pieces);
    const int before = nextDescriptor();
    const Reading inPieces = readAll(pieces, Cut::InPieces);
    if (isWellBehaved(pieces)) {
        const Reading inCrumbs = readAll(pieces, Cut::InCrumbs);
        const std::size_t common = std::min(inPieces.frames.size(), inCrumbs.frames.size());
        for (std::size_t i = 0; i < common; ++i)
            require(isSame(inPieces.frames[i], inCrumbs.frames[i]), "frames don't depend on how they are cut");
        require(inPieces.frames.size() == inCrumbs.frames.size(), "nor does their number");
        require(inPieces.isRefused == inCrumbs.isRefused, "nor a refusal");
    }
    require(nextDescriptor() == before, "every descriptor is closed in the end");
}

}  // namespace lumacast::fuzz
