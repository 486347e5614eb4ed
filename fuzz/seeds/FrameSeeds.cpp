#include <stdexcept>

#include "base/MessageTables.h"
#include "base/Wire.h"
#include "fuzz/seeds/Seeds.h"
#include "linux/ipc/Frames.h"

namespace lumacast::fuzz {

namespace {

constexpr std::uint8_t kPlane = 0, kUnsealed = 1, kDoorbell = 3;  // kinds of descriptors, see the target

void append(Data& to, const Data& bytes) {
    to.insert(to.end(), bytes.begin(), bytes.end());
}

Data encoded(const Array& values) {
    WireBody body;
    if (!encodeArray(values, body)) throw std::logic_error("a seed is over a limit");
    return body.bytes;
}

Data piece(const Data& kinds, const Data& bytes) {
    Data result{static_cast<std::uint8_t>(kinds.size())};
    append(result, kinds);
    append(result, {static_cast<std::uint8_t>(bytes.size()), static_cast<std::uint8_t>(bytes.size() >> 8)});
    append(result, bytes);
    return result;
}

/// A piece that the target puts a header before.
Data framed(FrameKind kind, std::uint8_t message, const Data& kinds, const Data& value, const Data& records) {
    Data result{static_cast<std::uint8_t>(kinds.size())};
    append(result, kinds);
    const std::size_t size = value.size() + records.size();
    append(result, {static_cast<std::uint8_t>(size), static_cast<std::uint8_t>(0x80 | size >> 8),
                    static_cast<std::uint8_t>(kind), static_cast<std::uint8_t>(kinds.size()),
                    static_cast<std::uint8_t>(records.size())});
    if (kind <= FrameKind::Request) result.push_back(message);
    append(result, value);
    append(result, records);
    return result;
}

Data planeRecord(std::int32_t width, std::int32_t height, const std::vector<PixelRect>& damage) {
    Data bytes;
    appendRecord(bytes, PlaneRecord{1, width, height, 4 * static_cast<std::uint64_t>(width), 9, damage});
    return bytes;
}

}  // namespace

void writeFrameSeeds(const std::filesystem::path& corpora) {
    const auto write = [&](const char* name, const Data& bytes) { writeSeed(corpora, "frames", name, bytes); };
    const Data start = encoded({Array{7u}, Array{640.0, 360.0}, false, false, false, false, false, Value()});
    const Data endpoint{1};

    Data two = framed(FrameKind::Request, 0, {}, start, {});
    append(two, framed(FrameKind::Message, 7, {}, encoded({}), {}));
    write("two-frames", two);
    write("hello", piece({}, makeHello()));
    write("plane", framed(FrameKind::Message, 4, {kPlane}, Data{9, 2, 0, 0, 0, 13, 0, 6, 0, 0, 0, 0},
                          planeRecord(16, 8, {{0, 0, 16, 8}, {1, 1, 2, 2}})));
    write("plane-unsealed",
          framed(FrameKind::Message, 4, {kUnsealed}, Data{9, 1, 0, 0, 0, 13, 0}, planeRecord(16, 8, {})));
    write("endpoint", framed(FrameKind::Request, 0, {kDoorbell}, Data{9, 1, 0, 0, 0, 12, 0}, endpoint));
    write("endpoint-twice", framed(FrameKind::Request, 0, {kDoorbell}, Data{9, 2, 0, 0, 0, 12, 0, 12, 0}, endpoint));
    Data transport = framed(FrameKind::PlaneReturned, 0, {}, {}, {});
    append(transport, framed(FrameKind::NoReply, 0, {}, {}, {}));
    append(transport, framed(FrameKind::Reply, 0, {}, encoded({Value(), true, false}), {}));
    write("transport", transport);

    // One frame cut within its header and within its value; a frame and the beginning of the next one in one piece.
    FrameHeader header;
    header.kind = FrameKind::Request;
    header.valueBytes = static_cast<std::uint32_t>(start.size());
    header.sequence = 1;
    Data frame(kFrameHeaderBytes);
    writeFrameHeader(header, frame);
    append(frame, start);
    Data cut = piece({}, {frame.begin(), frame.begin() + 10});
    append(cut, piece({}, {frame.begin() + 10, frame.begin() + 40}));
    append(cut, piece({}, {frame.begin() + 40, frame.end()}));
    write("cut", cut);
    Data joined = frame;
    joined.insert(joined.end(), frame.begin(), frame.begin() + 30);
    Data joinedPieces = piece({}, joined);
    append(joinedPieces, piece({}, {frame.begin() + 30, frame.end()}));
    write("joined", joinedPieces);
    write("stray-descriptor", piece({kPlane}, frame));
    write("too-many-descriptors", piece(Data(10, kPlane), frame));
}

}  // namespace lumacast::fuzz
