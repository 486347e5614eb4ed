#include "tests/fakes/FakeMovie.h"

namespace lumacast {

MediaTime FakeMovie::duration() const {
    MediaTime last = end;
    if (!last.isValid()) {
        for (const FakeTrack& track : tracks)
            if (!track.samples.empty() &&
                (!last.isValid() || compare(track.samples.back()->presentationTime(), last) > 0))
                last = track.samples.back()->presentationTime();
    }
    if (!last.isValid() || !start.isValid() || compare(last, start) <= 0) return kZeroMediaTime;
    return subtract(last, start);
}

}  // namespace lumacast
