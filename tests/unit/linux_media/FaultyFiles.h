#pragma once
// Disks that are full, slow or silent.

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <utility>
#include <variant>

#include "linux/media/MovieFile.h"

namespace lumacast::testing {

/// A disk that does what the test says.
class FaultyFiles final : public media::MovieFiles {
public:
    std::variant<std::unique_ptr<media::MovieFile>, int> create(const std::string& path) override;

    void failAfter(std::uint64_t bytes, int error) {
        const std::lock_guard lock(mutex_);
        bytesLeft_ = bytes;
        error_ = error;
    }
    void failSync(int error) {
        const std::lock_guard lock(mutex_);
        syncError_ = error;
    }
    void failCreation(int error) {
        const std::lock_guard lock(mutex_);
        creationError_ = error;
    }
    /// Everything waits until thaw.
    void freeze() {
        const std::lock_guard lock(mutex_);
        frozen_ = true;
    }
    void thaw() {
        const std::lock_guard lock(mutex_);
        frozen_ = false;
        changed_.notify_all();
    }
    /// Every answer takes so long.
    void slowDown(std::chrono::milliseconds delay) {
        const std::lock_guard lock(mutex_);
        delay_ = delay;
    }
    int answers() {
        const std::lock_guard lock(mutex_);
        return answers_;
    }
    int syncs() {
        const std::lock_guard lock(mutex_);
        return syncs_;
    }

private:
    class File;

    std::mutex mutex_;
    std::condition_variable changed_;
    /// Waits as the disk would; with the lock.
    void answer(std::unique_lock<std::mutex>& lock) {
        // A clock that nobody changes; nothing but the time ends it.
        const auto until = std::chrono::steady_clock::now() + delay_;
        while (std::chrono::steady_clock::now() < until) slow_.wait_until(lock, until);
        changed_.wait(lock, [this] { return !frozen_; });
        ++answers_;
    }

    bool frozen_ = false;
    std::chrono::milliseconds delay_{0};
    int answers_ = 0;
    std::condition_variable slow_;
    std::uint64_t bytesLeft_ = UINT64_MAX;
    int error_ = 0, syncError_ = 0, creationError_ = 0, syncs_ = 0;
};

class FaultyFiles::File final : public media::MovieFile {
public:
    File(FaultyFiles& disk, std::unique_ptr<media::MovieFile> real) : disk_(disk), real_(std::move(real)) {}
    int write(std::uint64_t offset, std::span<const std::uint8_t> bytes) override {
        {
            std::unique_lock lock(disk_.mutex_);
            disk_.answer(lock);
            if (bytes.size() > disk_.bytesLeft_) return disk_.error_;
            disk_.bytesLeft_ -= bytes.size();
        }
        return real_->write(offset, bytes);
    }
    int sync() override {
        std::unique_lock lock(disk_.mutex_);
        disk_.answer(lock);
        disk_.syncs_ += 1;
        return disk_.syncError_;
    }
    void removeName(const std::string& path) override { real_->removeName(path); }

private:
    FaultyFiles& disk_;
    std::unique_ptr<media::MovieFile> real_;
};

inline std::variant<std::unique_ptr<media::MovieFile>, int> FaultyFiles::create(const std::string& path) {
    {
        std::unique_lock lock(mutex_);
        changed_.wait(lock, [this] { return !frozen_; });
        if (creationError_ != 0) return creationError_;
    }
    auto made = media::PosixMovieFiles().create(path);
    if (auto* const error = std::get_if<int>(&made)) return *error;
    return std::make_unique<File>(*this, std::move(std::get<0>(made)));
}

inline double secondsTaken(const std::function<void()>& work) {
    const auto begin = std::chrono::steady_clock::now();
    work();
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - begin).count();
}

}  // namespace lumacast::testing
