#include "linux/media/DiskWriter.h"

#include <pthread.h>

#include <algorithm>
#include <cerrno>
#include <system_error>
#include <utility>

namespace lumacast::media {

DiskWriter::DiskWriter(std::shared_ptr<MovieFiles> files, std::string path, std::function<void(int)> failed)
    : failed_(std::move(failed)) {
    try {
        thread_ = std::thread([this, files = std::move(files), path = std::move(path)] { run(files, path); });
    } catch (const std::system_error&) {
        error_ = EAGAIN;
        created_ = true;
        ended_.store(true, std::memory_order_release);
    }
}

DiskWriter::~DiskWriter() {
    close(Pending::Write);
    if (thread_.joinable()) thread_.join();
}

std::optional<int> DiskWriter::waitForCreation(std::chrono::milliseconds limit) {
    std::unique_lock lock(mutex_);
    if (!changed_.wait_for(lock, limit, [this] { return created_; })) return std::nullopt;
    return error_;
}

bool DiskWriter::append(std::span<const std::uint8_t> bytes) {
    Operation operation{Operation::Kind::Write, end_, {bytes.begin(), bytes.end()}};
    const When when = end_ == 0 ? When::Now : When::WithTheNext;  // by its beginning the file is known as a movie
    end_ += bytes.size();
    return submit(std::move(operation), when);
}

bool DiskWriter::overwrite(std::uint64_t offset, std::span<const std::uint8_t> bytes) {
    return submit({Operation::Kind::Write, offset, {bytes.begin(), bytes.end()}}, When::Now);
}

bool DiskWriter::sync() { return submit({Operation::Kind::Sync, 0, {}}, When::Now); }

bool DiskWriter::submit(Operation operation, When when) {
    std::unique_lock lock(mutex_);
    // One operation larger than the buffer passes when nothing else waits.
    changed_.wait(lock, [&] {
        return error_ != 0 || closing_ || waiting_.empty() || waitingBytes_ + operation.bytes.size() <= kBufferBytes;
    });
    if (error_ != 0 || closing_) return false;
    waitingBytes_ += operation.bytes.size();
    waiting_.push_back(std::move(operation));
    if (when == When::WithTheNext && waitingBytes_ < kHeldBytes) return true;
    isDue_ = true;
    changed_.notify_all();
    return true;
}

int DiskWriter::drain() {
    std::unique_lock lock(mutex_);
    isDue_ = true;
    changed_.notify_all();
    changed_.wait(lock, [this] { return error_ != 0 || (waiting_.empty() && !busy_); });
    return error_;
}

void DiskWriter::close(Pending pending) {
    const std::lock_guard lock(mutex_);
    closing_ = true;
    if (pending == Pending::Drop) {
        waiting_.clear();
        waitingBytes_ = 0;
    }
    changed_.notify_all();
}

void DiskWriter::run(const std::shared_ptr<MovieFiles>& files, const std::string& path) {
    pthread_setname_np(pthread_self(), "lc-disk");
    {
        auto made = files->create(path);
        auto* const file = std::get_if<0>(&made);
        if (!file) fail(std::get<int>(made));
        {
            const std::lock_guard lock(mutex_);
            created_ = true;
            changed_.notify_all();
        }
        if (file) work(**file);
    }
    ended_.store(true, std::memory_order_release);
}

/// Until the writer is closed and nothing waits, or something fails.
void DiskWriter::work(MovieFile& file) {
    std::unique_lock lock(mutex_);
    for (;;) {
        busy_ = false;
        if (waiting_.empty()) isDue_ = false;
        changed_.notify_all();
        changed_.wait(lock, [this] { return closing_ || (isDue_ && !waiting_.empty()); });
        if (waiting_.empty()) return;
        const Operation operation = std::move(waiting_.front());
        waiting_.pop_front();
        busy_ = true;
        lock.unlock();
        if (const int error = perform(file, operation); error != 0) return fail(error);
        answers_.fetch_add(1, std::memory_order_relaxed);
        lock.lock();
        waitingBytes_ -= std::min(waitingBytes_, operation.bytes.size());
    }
}

int DiskWriter::perform(MovieFile& file, const Operation& operation) {
    if (operation.kind == Operation::Kind::Sync) return file.sync();
    const int error = file.write(operation.offset, operation.bytes);
    if (error == 0) {
        const std::uint64_t end = operation.offset + operation.bytes.size();
        if (end > written_.load(std::memory_order_relaxed)) written_.store(end, std::memory_order_relaxed);
    }
    return error;
}

void DiskWriter::fail(int error) {
    {
        const std::lock_guard lock(mutex_);
        error_ = error;
        waiting_.clear();
        waitingBytes_ = 0;
        changed_.notify_all();
    }
    failed_(error);
}

}  // namespace lumacast::media
