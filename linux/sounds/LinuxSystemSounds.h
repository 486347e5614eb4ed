#pragma once
#include <chrono>
#include <memory>

#include "linux/audio/PulseConnection.h"
#include "linux/sounds/SoundThemes.h"
#include "platform/SystemSounds.h"

namespace lumacast {

/// The two sounds from the user's sound theme, played by the user's sound server:
///
///   1117, recording begins  camera-shutter, screen-capture, device-added, message; else a rising tone of its own
///   1118, recording ends    complete, device-removed, message, bell; else a falling one
///
/// Other numbers are silent. The theme is looked up anew for each. At most four sounds are waiting or playing, more are
/// dropped; one that the server has not begun after two seconds is given up. One thread of its own, from the first play
/// until nothing is left to be played, besides the sound thread; what hangs (disk, server) costs that thread alone. The
/// stream is this process's own: nobody else's tap hears it.
class LinuxSystemSounds final : public SystemSounds {
public:
    LinuxSystemSounds(std::shared_ptr<sound::PulseConnection> server, sound::SoundThemes themes);
    /// Ends what plays. Waits at most 2 s, for the disk alone.
    ~LinuxSystemSounds() override;

    void play(std::uint32_t sound) override;

    /// How many are waiting or playing now. For tests.
    std::size_t soundsInFlight() const;

private:
    struct State;
    static void run(const std::shared_ptr<State>& state);

    const std::shared_ptr<State> state_;
};

}  // namespace lumacast
