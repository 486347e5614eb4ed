#include "linux/media/mp4/MovieLook.h"

#include <algorithm>
#include <array>

#include "linux/media/mp4/BoxReader.h"
#include "linux/media/mp4/FileHead.h"
#include "linux/media/mp4/UnfinishedMovie.h"

namespace lumacast::mp4 {
namespace {

MovieLook lookAtFinished(BoxSource& source, std::uint64_t movieOffset) {
    constexpr std::uint64_t kMovieAndLongestHeader = 8 + 8 + 112;
    std::array<std::uint8_t, kMovieAndLongestHeader> bytes;
    const std::uint64_t left = source.size() - movieOffset;
    const std::span start = std::span(bytes).first(static_cast<std::size_t>(std::min(left, kMovieAndLongestHeader)));
    if (start.size() < bytes.size() || !source.read(movieOffset, start)) {
        return {};
    }
    BoxReader in(start);
    const std::uint32_t size = in.u32();
    if (in.u32() != FourCC("moov").value || size > left || size < kMovieAndLongestHeader) {
        return {};
    }
    MovieLook look{MovieState::finished, movieDuration(findBox(in.take(in.left()), "mvhd"))};
    std::array<std::uint8_t, kShortNoteBytes> last;
    if (source.read(movieOffset + size - last.size(), last)) {
        const auto note = readNote(findBox(last, "uuid"));
        if (note && note->kind == NoteKind::recovered) {
            look.state = MovieState::recovered;
        }
    }
    return look;
}

}  // namespace

std::string_view nameOf(MovieState state) {
    switch (state) {
        case MovieState::other:
            return "other";
        case MovieState::unfinished:
            return "unfinished";
        case MovieState::unfinishedCopy:
            return "unfinished copy";
        case MovieState::finished:
            return "finished";
        case MovieState::recovered:
            return "recovered";
    }
    return "other";
}

MovieLook lookAtMovie(BoxSource& source) {
    const HeadView view = readFileHead(source);
    if (view.head == FileHead::finished || view.head == FileHead::halfSwitched) {
        return lookAtFinished(source, view.mediaEnd);
    }
    if (view.head != FileHead::unfinished) {
        return {};
    }
    const auto initial = readInitialMovie(source);
    if (const auto* movie = std::get_if<InitialMovie>(&initial)) {
        return {movie->note.kind == NoteKind::copy ? MovieState::unfinishedCopy : MovieState::unfinished, std::nullopt};
    }
    // The movie box comes with the first fragment.
    return {std::get<UnreadableMovie>(initial) == UnreadableMovie::nothingWhole ? MovieState::unfinished
                                                                                : MovieState::other,
            std::nullopt};
}

}  // namespace lumacast::mp4
