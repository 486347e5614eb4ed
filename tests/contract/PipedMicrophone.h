#pragma once
// A room in front of a microphone: what is played in it goes to the sound server through a pipe, when it is heard.

#include <fcntl.h>
#include <unistd.h>

#include <chrono>
#include <cmath>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <numbers>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "linux/ipc/Fd.h"
#include "linux/system/LinuxClock.h"

namespace lumacast::testing {

/// Writes stereo sound of 48 kHz into a named pipe, five milliseconds at a time, each when it is over. What nobody takes
/// is lost.
class PipedMicrophone final {
public:
    static constexpr int kRate = 48000, kChannels = 2;

    PipedMicrophone() : thread_([this] { run(); }) {}
    ~PipedMicrophone() {
        {
            const std::lock_guard lock(mutex_);
            isOver_ = true;
        }
        changed_.notify_all();
        thread_.join();
    }
    PipedMicrophone(const PipedMicrophone&) = delete;
    PipedMicrophone& operator=(const PipedMicrophone&) = delete;

    /// Goes on at this pipe, which the server has made.
    void connect(const std::string& path) {
        // For both, so that it neither waits for a reader nor loses its pipe with one.
        Fd pipe(::open(path.c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC));
        ::fcntl(pipe.get(), F_SETPIPE_SZ, 16384);
        const std::lock_guard lock(mutex_);
        pipe_ = std::move(pipe);
    }
    /// The tone that is heard from now on; on the left side only, perhaps.
    void play(double frequency, double amplitude = 0.5, bool onlyLeft = false) {
        const std::lock_guard lock(mutex_);
        frequency_ = frequency;
        amplitude_ = amplitude;
        onlyLeft_ = onlyLeft;
    }
    /// 50 ms of the tone at nearly full height; answers when they begin to be heard.
    HostTime beep() {
        std::unique_lock lock(mutex_);
        beepFrames_ = kRate / 20;
        beepsAt_ = HostTime{0};
        changed_.wait(lock, [this] { return beepsAt_.nanoseconds != 0; });
        return beepsAt_;
    }

private:
    static constexpr int kPiece = kRate / 200;

    void run() {
        auto next = std::chrono::steady_clock::now();
        std::vector<std::int16_t> samples(kPiece * kChannels);
        std::unique_lock lock(mutex_);
        for (std::uint64_t frame = 0; !isOver_; frame += kPiece) {
            // The piece that begins here is written when it is over.
            if (beepFrames_ > 0 && beepsAt_.nanoseconds == 0) {
                beepsAt_ = HostTime{std::chrono::nanoseconds(next.time_since_epoch()).count()};
                changed_.notify_all();
            }
            for (int at = 0; at < kPiece; ++at) {
                const double height = beepFrames_ > 0 ? 0.9 : amplitude_;
                if (beepFrames_ > 0) --beepFrames_;
                const double time = static_cast<double>(frame + static_cast<std::uint64_t>(at)) / kRate;
                const auto value = static_cast<std::int16_t>(
                    std::lround(32767 * height * std::sin(2 * std::numbers::pi * frequency_ * time)));
                samples[static_cast<std::size_t>(at) * kChannels] = value;
                samples[static_cast<std::size_t>(at) * kChannels + 1] = onlyLeft_ ? std::int16_t{0} : value;
            }
            next += std::chrono::milliseconds(5);
            changed_.wait_until(lock, next, [this] { return isOver_; });
            // As long as a whole piece finds room; the pipe takes it whole or not at all.
            [[maybe_unused]] const ssize_t ignored =
                ::write(pipe_.get(), samples.data(), samples.size() * sizeof samples[0]);
        }
    }

    Fd pipe_;
    std::mutex mutex_;
    std::condition_variable changed_;
    bool isOver_ = false, onlyLeft_ = false;
    double frequency_ = 440, amplitude_ = 0;
    int beepFrames_ = 0;
    HostTime beepsAt_;
    std::thread thread_;
};

}  // namespace lumacast::testing
