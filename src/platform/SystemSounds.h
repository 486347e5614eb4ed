#pragma once
#include <cstdint>

namespace lumacast {

/// The device's own short sounds.
class SystemSounds {
public:
    static constexpr std::uint32_t kBeginRecording = 1117;
    static constexpr std::uint32_t kEndRecording = 1118;

    virtual ~SystemSounds() = default;
    /// Plays one, if the device has it, and returns at once. Callable from any lane.
    virtual void play(std::uint32_t sound) = 0;
};

}  // namespace lumacast
