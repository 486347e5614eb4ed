#include "linux/audio/PulseTaps.h"

#include <utility>

#include "linux/audio/Microphone.h"
#include "linux/audio/ProcessTap.h"

namespace lumacast::sound {

namespace {

/// A user of the connection, attached until this ends.
class Attachment final : public Listening {
public:
    /// Null when the system has no thread left.
    static std::unique_ptr<Listening> make(std::shared_ptr<PulseConnection> connection,
                                           std::shared_ptr<PulseUser> user) {
        if (!connection->attach(user)) return nullptr;
        return std::unique_ptr<Listening>(new Attachment(std::move(connection), std::move(user)));
    }
    ~Attachment() override { connection_->detach(user_); }

private:
    Attachment(std::shared_ptr<PulseConnection> connection, std::shared_ptr<PulseUser> user)
        : connection_(std::move(connection)), user_(std::move(user)) {}

    const std::shared_ptr<PulseConnection> connection_;
    const std::shared_ptr<PulseUser> user_;
};

class PulseProcess final : public TappedProcess {
public:
    PulseProcess(std::shared_ptr<PulseConnection> connection, std::shared_ptr<TapOwner> owner)
        : connection_(std::move(connection)), owner_(std::move(owner)) {}

    std::unique_ptr<Listening> listen(std::shared_ptr<TapMix> mix) override {
        return Attachment::make(connection_, std::make_shared<ProcessTap>(owner_, std::move(mix)));
    }

private:
    const std::shared_ptr<PulseConnection> connection_;
    const std::shared_ptr<TapOwner> owner_;
};

}  // namespace

std::shared_ptr<TappedProcess> PulseTaps::hold(ProcessID pid) {
    auto owner = TapOwner::hold(pid, applicationOf_);
    return owner ? std::make_shared<PulseProcess>(connection_, std::move(owner)) : nullptr;
}

OpenMicrophone pulseMicrophone(std::shared_ptr<PulseConnection> connection) {
    return [connection = std::move(connection)](MicrophoneListener listener) {
        return Attachment::make(connection, std::make_shared<Microphone>(std::move(listener)));
    };
}

}  // namespace lumacast::sound
