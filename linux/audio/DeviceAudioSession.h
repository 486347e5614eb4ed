#pragma once
#include <deque>
#include <memory>
#include <mutex>
#include <vector>

#include "platform/DeviceCapture.h"

namespace lumacast::sound {

/// The audio session of this process. It is interrupted while anything of the process's that records is; began and
/// ended are told in turns, on a queue of its own. Thread-safe.
class DeviceAudioSession final : public AudioSession {
    class State;

public:
    /// One thing that records. Not interrupted at first; closed when it is let go of.
    class Part final {
    public:
        explicit Part(std::shared_ptr<State> state) : state_(std::move(state)) {}
        ~Part() { close(); }
        Part(const Part&) = delete;
        Part& operator=(const Part&) = delete;

        /// Nothing once it has been closed.
        void setInterrupted(bool isInterrupted);
        /// It records no more, so it isn't interrupted either.
        void close();

    private:
        friend class State;
        const std::shared_ptr<State> state_;
        bool isInterrupted_ = false, isClosed_ = false;  ///< the state's
    };

    explicit DeviceAudioSession(Scheduler& scheduler);

    /// What is known is accepted, and nothing comes of it: here nobody is silenced by a recording, and which device
    /// counts is the user's choice.
    bool setCategory(std::string_view category, std::uint32_t options) override;
    [[nodiscard]] std::unique_ptr<Registration> observeInterruptions(InterruptionHandler handler) override;

    std::shared_ptr<Part> makePart() { return std::make_shared<Part>(state_); }

private:
    const std::shared_ptr<State> state_;
};

}  // namespace lumacast::sound
