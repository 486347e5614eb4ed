#pragma once

namespace lumacast::media {

/// How encoding exports stand with everything else. AsUsual is for tests, which have no time when the machine is busy
/// with others.
enum class EncodingPriority { Low, AsUsual };

}  // namespace lumacast::media
