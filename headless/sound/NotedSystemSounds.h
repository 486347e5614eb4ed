#pragma once
#include <cstdint>
#include <functional>
#include <utility>

#include "platform/SystemSounds.h"

namespace lumacast::headless {

/// Sounds that nobody hears: each is noted instead.
class NotedSystemSounds final : public SystemSounds {
public:
    /// Called on the lane that plays, for each sound there is.
    using Note = std::function<void(std::uint32_t sound)>;

    explicit NotedSystemSounds(Note note) : note_(std::move(note)) {}
    void play(std::uint32_t sound) override {
        if (sound == kBeginRecording || sound == kEndRecording) note_(sound);
    }

private:
    const Note note_;
};

}  // namespace lumacast::headless
