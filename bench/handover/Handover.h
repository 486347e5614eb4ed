#pragma once
// What all ways of handing a frame to another process are measured with.

#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <thread>
#include <vector>

namespace lumacast::bench {

inline constexpr std::int32_t kWidth = 1920, kHeight = 1080;
inline constexpr std::size_t kStride = std::size_t{kWidth} * 4;
inline constexpr std::size_t kFrameBytes = kStride * kHeight;

/// Nanoseconds of a clock that both processes share.
inline std::int64_t now() {
    return std::chrono::steady_clock::now().time_since_epoch().count();
}

/// A child process that runs `body`; ended by its number.
class Child {
public:
    explicit Child(const std::function<void()>& body) : pid_(::fork()) {
        if (pid_ != 0) return;
        ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        body();
        ::_exit(0);
    }
    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;
    ~Child() {
        ::kill(pid_, SIGKILL);
        ::waitpid(pid_, nullptr, 0);
    }

private:
    const pid_t pid_;
};

/// Calls `send` with 0, 1, 2 and so on at the pace of a recording.
inline void atPace(int frames, int rate, const std::function<void(std::size_t)>& send) {
    auto next = std::chrono::steady_clock::now();
    for (int i = 0; i < frames; ++i) {
        next += std::chrono::nanoseconds(1'000'000'000 / rate);
        std::this_thread::sleep_until(next);
        send(static_cast<std::size_t>(i));
    }
}

/// Memory that this process and its children see, zeros at first.
inline void* sharedWithChildren(std::size_t bytes) {
    void* const memory = ::mmap(nullptr, bytes, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    if (memory == MAP_FAILED) std::exit(1);
    return memory;
}

/// What the other process measured.
class Results final {
public:
    explicit Results(int frames)
        : frames_(static_cast<std::size_t>(frames)), shared_(static_cast<Shared*>(sharedWithChildren(bytes()))) {}
    Results(const Results&) = delete;
    Results& operator=(const Results&) = delete;
    ~Results() { ::munmap(shared_, bytes()); }

    void add(std::int64_t sent, std::int64_t arrived) {
        const std::size_t index = shared_->count.load(std::memory_order_relaxed);
        if (index == frames_) return;
        shared_->microseconds[index] = static_cast<double>(arrived - sent) / 1e3;
        shared_->count.store(index + 1, std::memory_order_release);
    }
    /// Those of all frames, or of what has come when the last is a second late.
    std::vector<double> take() const {
        for (int patience = 0; patience < 100 && shared_->count.load(std::memory_order_acquire) < frames_; ++patience)
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        return {shared_->microseconds, shared_->microseconds + shared_->count.load(std::memory_order_acquire)};
    }

private:
    struct Shared {
        std::atomic<std::size_t> count;
        double microseconds[1];  // as many as there are frames
    };
    std::size_t bytes() const { return sizeof(Shared) + frames_ * sizeof(double); }

    const std::size_t frames_;
    Shared* const shared_;
};

/// One line for each frame that came, with a column for each way of counting. Answers the exit status: 1 when none did.
inline int print(const std::vector<std::vector<double>>& columns) {
    for (std::size_t i = 0; i < columns[0].size(); ++i) {
        for (const auto& column : columns) std::printf("%.1f ", column[i]);
        std::printf("\n");
    }
    return columns[0].empty() ? 1 : 0;
}

}  // namespace lumacast::bench
