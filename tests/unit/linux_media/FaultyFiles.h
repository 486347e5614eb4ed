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
    int syncs() {
        const std::lock_guard lock(mutex_);
        return syncs_;
    }

private:
    class File;

    std::mutex mutex_;
    std::condition_variable changed_;
    bool frozen_ = false;
    std::uint64_t bytesLeft_ = UINT64_MAX;
    int error_ = 0, syncError_ = 0, creationError_ = 0, syncs_ = 0;
};

class FaultyFiles::File final : public media::MovieFile {
public:
    File(FaultyFiles& disk, std::unique_ptr<media::MovieFile> real) : disk_(disk), real_(std::move(real)) {}
    int write(std::uint64_t offset, std::span<const std::uint8_t> bytes) override {
        {
            std::unique_lock lock(disk_.mutex_);
            disk_.changed_.wait(lock, [this] { return !disk_.frozen_; });
            if (bytes.size() > disk_.bytesLeft_) return disk_.error_;
            disk_.bytesLeft_ -= bytes.size();
        }
        return real_->write(offset, bytes);
    }
    int sync() override {
        std::unique_lock lock(disk_.mutex_);
        disk_.changed_.wait(lock, [this] { return !disk_.frozen_; });
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
