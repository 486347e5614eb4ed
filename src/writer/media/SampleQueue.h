#pragma once
#include <deque>

#include "writer/media/SampleBuffer.h"

namespace lumacast {

/// An unsorted, unbounded first-in-first-out queue of samples. It holds a reference to each. Not thread-safe: it
/// belongs to its owner's lane.
class SampleQueue {
public:
    /// Takes a reference. 0 on success, a non-zero status for a missing buffer (nothing is queued then).
    int enqueue(SampleRef sample) {
        if (!sample) return kMissingSample;
        samples_.push_back(std::move(sample));
        return 0;
    }

    /// The oldest sample, its reference handed to the caller, or none when empty.
    SampleRef dequeueAndRetain() {
        if (samples_.empty()) return nullptr;
        SampleRef oldest = std::move(samples_.front());
        samples_.pop_front();
        return oldest;
    }

    bool isEmpty() const { return samples_.empty(); }

    /// Drops every sample and its reference.
    void reset() { samples_.clear(); }

    static constexpr int kMissingSample = -1;

private:
    std::deque<SampleRef> samples_;
};

}  // namespace lumacast
