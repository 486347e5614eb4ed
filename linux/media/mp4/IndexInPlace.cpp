#include "linux/media/mp4/IndexInPlace.h"

#include "linux/media/mp4/BoxBuffer.h"

namespace lumacast::mp4 {

bool writeHiddenIndex(BoxBuffer& out, const FinalMovie& movie) {
    out.reserve(out.size() + finalTableBytes(movie.tracks));
    const Box hidden(out, "free");  // ISO/IEC 14496-12 clause 8.1.2
    return writeFinalMovie(out, movie);
}

bool switchToIndex(BoxSink& sink, std::uint64_t offset) {
    BoxBuffer size;
    size.u64(offset + kHiddenMovieOffset - kReserveOffset);
    return sink.overwrite(kReserveSizeOffset, size.view()) && sink.sync() && writeSwitchedHeader(sink);
}

bool writeSwitchedHeader(BoxSink& sink) {
    BoxBuffer header;  // ISO/IEC 14496-12 clause 8.1.1; size 1: the 64-bit size follows, clause 4.2
    header.u32(1);
    header.code("mdat");
    return sink.overwrite(kReserveOffset, header.view()) && sink.sync();
}

}  // namespace lumacast::mp4
