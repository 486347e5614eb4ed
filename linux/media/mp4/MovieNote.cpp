#include "linux/media/mp4/MovieNote.h"

#include <algorithm>
#include <array>

#include "linux/media/mp4/BoxBuffer.h"
#include "linux/media/mp4/BoxReader.h"

namespace lumacast::mp4 {
namespace {

constexpr std::array<std::uint8_t, 16> kType{0x5b, 0x3e, 0x91, 0xc4, 0x27, 0xd8, 0x4f, 0x60,
                                             0xa3, 0x19, 0xe6, 0x0b, 0x72, 0x8d, 0x54, 0xfa};
constexpr std::uint8_t kVersion = 1;
constexpr std::uint16_t kHasOwnStart = 1;

}  // namespace

void writeNote(BoxBuffer& out, const MovieNote& note) {
    const Box box(out, "uuid");
    out.raw(kType);
    out.u8(kVersion);
    out.u8(static_cast<std::uint8_t>(note.kind));
    out.u16(note.hasOwnStart ? kHasOwnStart : 0);
    for (const std::uint32_t priming : note.primings) {
        out.u32(priming);
    }
}

MovieNote noteOf(NoteKind kind, bool hasOwnStart, std::span<const MovieTrack> tracks) {
    MovieNote note{kind, hasOwnStart, {}};
    for (const MovieTrack& track : tracks) {
        note.primings.push_back(static_cast<std::uint32_t>(track.priming));  // it was given as one
    }
    return note;
}

std::optional<MovieNote> readNote(std::span<const std::uint8_t> payload) {
    BoxReader in(payload);
    if (!std::ranges::equal(in.take(kType.size()), kType) || in.u8() != kVersion) {
        return std::nullopt;
    }
    MovieNote note;
    const std::uint8_t kind = in.u8();
    note.kind = static_cast<NoteKind>(kind);
    note.hasOwnStart = (in.u16() & kHasOwnStart) != 0;
    while (in.left() >= 4) {
        note.primings.push_back(in.u32());
    }
    const bool isKnown = kind >= static_cast<std::uint8_t>(NoteKind::recording) &&
                         kind <= static_cast<std::uint8_t>(NoteKind::recovered);
    return !isKnown || in.failed() || in.left() != 0 ? std::nullopt : std::optional(note);
}

}  // namespace lumacast::mp4
