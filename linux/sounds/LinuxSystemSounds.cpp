#include "linux/sounds/LinuxSystemSounds.h"

#include <algorithm>
#include <array>
#include <condition_variable>
#include <deque>
#include <mutex>
#include <string>
#include <vector>

#include "linux/sounds/EventPlayer.h"
#include "linux/system/Threads.h"

namespace lumacast {

namespace {

using std::chrono::steady_clock;

constexpr std::size_t kMostInFlight = 4;
constexpr std::chrono::seconds kPatience{2};
constexpr std::chrono::seconds kFarewell{2};

struct SoundChoice {
    std::uint32_t number;
    std::array<const char*, 4> names;  ///< the best first
    double first, last;                ///< of the tone where no theme has any of the names, Hz
};

constexpr std::array kChoices{
    SoundChoice{
        SystemSounds::kBeginRecording, {"camera-shutter", "screen-capture", "device-added", "message"}, 660, 990},
    SoundChoice{SystemSounds::kEndRecording, {"complete", "device-removed", "message", "bell"}, 990, 660}};

const SoundChoice* choiceFor(std::uint32_t number) {
    const auto found = std::find_if(kChoices.begin(), kChoices.end(),
                                    [&](const SoundChoice& choice) { return choice.number == number; });
    return found == kChoices.end() ? nullptr : &*found;
}

/// "camera-shutter" of ".../stereo/camera-shutter.oga".
std::string nameOf(const std::string& path) {
    const std::string file = path.substr(path.rfind('/') + 1);
    return file.substr(0, file.rfind('.'));
}

sound::EventSound load(const SoundChoice& choice, const sound::SoundThemes& themes) {
    for (const std::string& path : themes.files({choice.names.begin(), choice.names.end()}))
        if (auto samples = sound::readSoundFile(path)) return {nameOf(path), std::move(*samples), nullptr};
    return {choice.names.front(), sound::glidingTone(choice.first, choice.last), nullptr};
}

}  // namespace

/// What the lane and its owner share.
struct LinuxSystemSounds::State final : std::enable_shared_from_this<State> {
    State(std::shared_ptr<sound::PulseConnection> soundServer, sound::SoundThemes soundThemes)
        : server(std::move(soundServer)), themes(std::move(soundThemes)) {}

    /// Counts a sound until the last copy has gone; not to be let go of under the lock.
    std::shared_ptr<void> ticketLocked() {
        ++inFlight;
        return {this, [self = shared_from_this()](void*) {
                    const std::lock_guard lock(self->mutex);
                    --self->inFlight;
                    self->changed.notify_all();
                }};
    }

    const std::shared_ptr<sound::PulseConnection> server;
    const sound::SoundThemes themes;
    std::mutex mutex;
    std::condition_variable changed;
    std::deque<const SoundChoice*> wanted;
    std::size_t inFlight = 0;
    bool running = false, stopping = false;
};

LinuxSystemSounds::LinuxSystemSounds(std::shared_ptr<sound::PulseConnection> server, sound::SoundThemes themes)
    : state_(std::make_shared<State>(std::move(server), std::move(themes))) {}

LinuxSystemSounds::~LinuxSystemSounds() {
    std::unique_lock lock(state_->mutex);
    state_->stopping = true;
    state_->changed.notify_all();
    state_->changed.wait_for(lock, kFarewell, [this] { return !state_->running; });
}

void LinuxSystemSounds::play(std::uint32_t sound) {
    const SoundChoice* const choice = choiceFor(sound);
    if (!choice) return;
    const std::lock_guard lock(state_->mutex);
    if (state_->wanted.size() + state_->inFlight >= kMostInFlight) return;
    if (!state_->running) state_->running = startDetachedThread([state = state_] { run(state); });
    if (!state_->running) return;
    state_->wanted.push_back(choice);
    state_->changed.notify_all();
}

std::size_t LinuxSystemSounds::soundsInFlight() const {
    const std::lock_guard lock(state_->mutex);
    return state_->wanted.size() + state_->inFlight;
}

void LinuxSystemSounds::run(const std::shared_ptr<State>& state) {
    std::shared_ptr<sound::EventPlayer> player;
    auto deadline = steady_clock::now();
    std::unique_lock lock(state->mutex);
    while (true) {
        state->changed.wait_until(lock, deadline, [&] {
            return state->stopping || !state->wanted.empty() || (player && state->inFlight == 0);
        });
        if (state->stopping || state->wanted.empty()) break;
        const SoundChoice* const choice = state->wanted.front();
        state->wanted.pop_front();
        auto ticket = state->ticketLocked();
        lock.unlock();
        {
            sound::EventSound sound = load(*choice, state->themes);
            sound.inFlight = std::move(ticket);
            deadline = std::max(deadline, steady_clock::now() + sound.length() + kPatience);
            if (!player) {
                player = std::make_shared<sound::EventPlayer>();
                if (!state->server->attach(player)) player = nullptr;
            }
            if (player)
                state->server->post([player, sound = std::move(sound)]() mutable { player->add(std::move(sound)); });
        }
        lock.lock();
    }
    // Under the lock: whoever wants a sound from now on starts another thread, and attaches another player.
    if (player) state->server->detach(player);
    state->running = false;
    state->changed.notify_all();
}

}  // namespace lumacast
