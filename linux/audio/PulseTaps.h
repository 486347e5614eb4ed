#pragma once
#include <memory>

#include "linux/audio/PulseConnection.h"
#include "linux/audio/TapOwner.h"
#include "linux/audio/TapSource.h"

namespace lumacast::sound {

/// What processes play at the user's sound server, PulseAudio or PipeWire.
class PulseTaps final : public TapSource {
public:
    /// `applicationOf` is asked on the sound thread whether a descendant of a tapped process counts as it; empty: none
    /// does.
    PulseTaps(std::shared_ptr<PulseConnection> connection, ApplicationOf applicationOf)
        : connection_(std::move(connection)), applicationOf_(std::move(applicationOf)) {}

    std::shared_ptr<TappedProcess> hold(ProcessID pid) override;
    /// Ends the connection, for whoever else uses it too.
    void end() override { connection_->end(); }

private:
    const std::shared_ptr<PulseConnection> connection_;
    const ApplicationOf applicationOf_;
};

/// The default microphone of the user's sound server, whichever it is at the time.
OpenMicrophone pulseMicrophone(std::shared_ptr<PulseConnection> connection);

}  // namespace lumacast::sound
