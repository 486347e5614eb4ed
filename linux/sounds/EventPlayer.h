#pragma once
#include <memory>
#include <vector>

#include "linux/audio/PulseConnection.h"
#include "linux/sounds/EventSound.h"

namespace lumacast::sound {

/// Plays short sounds over one another, each as a stream of its own with the role "event". Sounds given before the
/// server is there wait for it; those that play when it goes end. Belongs to the sound thread.
class EventPlayer final : public PulseUser {
public:
    EventPlayer();
    ~EventPlayer() override;

    void add(EventSound sound);

    void serverCame(const PulseServer& server) override;
    void serverWent() override;

private:
    class Stream;
    void start(EventSound sound);

    std::vector<EventSound> waiting_;
    std::vector<std::unique_ptr<Stream>> playing_;
    pa_context* context_ = nullptr;
    /// Takes away what has ended, outside the library's calls.
    std::unique_ptr<PulseTimer> sweep_;
};

}  // namespace lumacast::sound
