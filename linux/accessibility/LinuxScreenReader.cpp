#include "linux/accessibility/LinuxScreenReader.h"

#include <poll.h>
#include <sys/eventfd.h>

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <future>

#include "linux/accessibility/ScreenReaderBus.h"
#include "linux/ipc/Fd.h"
#include "linux/system/Threads.h"

namespace lumacast {

namespace {

constexpr std::chrono::seconds kFarewell{2};

}  // namespace

/// What the thread and its owner share.
struct LinuxScreenReader::State {
    explicit State(Options given) : options(std::move(given)) {}

    void run() {
        auto delay = options.firstRetry;
        while (!stopping) {
            ScreenReaderBus bus([this, &delay](bool value) {
                running = value;
                delay = options.firstRetry;  // this bus answers
            });
            if (bus.open(options.address))
                while (!stopping && bus.dispatch()) bus.wait(wake.get());
            running = false;
            pollfd polled{wake.get(), POLLIN, 0};
            ::poll(&polled, 1, static_cast<int>(delay.count()));
            delay = std::min(delay * 2, options.slowestRetry);
        }
        ended.set_value();
    }

    const Options options;
    const Fd wake{::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)};
    std::atomic<bool> running{false}, stopping{false};
    std::promise<void> ended;
    std::future<void> end;  ///< of the thread, if there is one
};

std::string LinuxScreenReader::sessionBus(const std::string& address, const std::string& runtimeDirectory) {
    if (!address.empty() || runtimeDirectory.empty()) return address;
    return "unix:path=" + runtimeDirectory + "/bus";
}

LinuxScreenReader::LinuxScreenReader(Options options) : state_(std::make_shared<State>(std::move(options))) {
    if (state_->options.address.empty() || !state_->wake) return;
    auto end = state_->ended.get_future();
    if (startDetachedThread([state = state_] { state->run(); })) state_->end = std::move(end);
}

LinuxScreenReader::~LinuxScreenReader() {
    state_->stopping = true;
    const std::uint64_t one = 1;
    [[maybe_unused]] const ssize_t ignored = ::write(state_->wake.get(), &one, sizeof one);
    if (state_->end.valid()) state_->end.wait_for(kFarewell);
}

bool LinuxScreenReader::isRunning() const {
    return state_->running;
}

}  // namespace lumacast
