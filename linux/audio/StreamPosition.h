#pragma once
// Where in time the pieces of a stream lie.

#include <cstdint>

namespace lumacast::sound {

/// Lays the pieces of one stream one behind the other, and keeps them where the server says they were heard: a stream
/// that was interrupted goes on where it is heard again, and the slow drift of its clock is taken up a frame at a time.
/// In frames. Not thread-safe.
class StreamPosition final {
public:
    explicit StreamPosition(double rate) : rate_(rate) {}

    struct Piece {
        std::int64_t frame;    ///< where its first frame belongs
        std::int64_t frames;   ///< how long it is to be made: as long as it is, or one frame more or less
    };
    /// For a piece of `frames` frames, the first of which was heard about at `estimate`, by the server's account.
    Piece place(std::int64_t estimate, std::int64_t frames);

private:
    /// Beyond so many seconds it is an interruption, within it jitter.
    static constexpr double kInterruption = 0.08;
    /// The first accounts of a stream are rough: so many pieces are laid where they are said to belong.
    static constexpr int kSettling = 10;
    /// In seconds: a drift is corrected from here on, until it is small again.
    static constexpr double kTolerance = 0.005, kGoodEnough = 0.001;

    const double rate_;
    int placed_ = 0;  ///< pieces, up to kSettling
    bool isCorrecting_ = false;
    std::int64_t next_ = 0;
    double smoothedError_ = 0;
    int strayed_ = 0;
};

}  // namespace lumacast::sound
