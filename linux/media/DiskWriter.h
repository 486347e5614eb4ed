#pragma once
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "linux/media/MovieFile.h"
#include "linux/media/mp4/BoxSink.h"

namespace lumacast::media {

/// Writes one movie file on a thread of its own, behind a bounded buffer. What is appended from the movie's encoder
/// thread waits there for room; nothing else ever waits for the disk. The first failure closes the file as it is and
/// drops everything else. Whether closed or failed, the file and the thread go at once, whoever keeps the object.
/// The file is brought onto the disk for good whenever the box writer says so: with every fragment, and at the end.
class DiskWriter final : public mp4::BoxSink {
public:
    /// Bytes that may wait for the disk: more than ten seconds at the highest bit rate a window gets by itself.
    static constexpr std::size_t kBufferBytes = 16u << 20u;

    /// Bytes that wait until the whole fragment is there, so that the thread wakes once for it.
    static constexpr std::size_t kHeldBytes = 1u << 20u;

    /// Begins creating the file. `failed` is called once, on the disk's thread, when anything goes wrong. Where the
    /// system has no thread nothing is created, and waitForCreation answers EAGAIN.
    DiskWriter(std::shared_ptr<MovieFiles> files, std::string path, std::function<void(int error)> failed);
    DiskWriter(const DiskWriter&) = delete;
    DiskWriter& operator=(const DiskWriter&) = delete;
    /// Waits for the thread: close() and wait before on lanes that must not.
    ~DiskWriter() override;

    /// Waits for the creation, at most `limit`: its error's number, 0 for success, none when the disk has not answered.
    std::optional<int> waitForCreation(std::chrono::milliseconds limit);

    /// But for the file's beginning held for a while: until there is much of it, or the next overwrite, sync, drain or
    /// close.
    [[nodiscard]] bool append(std::span<const std::uint8_t> bytes) override;
    [[nodiscard]] bool overwrite(std::uint64_t offset, std::span<const std::uint8_t> bytes) override;
    [[nodiscard]] bool sync() override;

    /// Waits until all is done; the first error's number, 0 for none.
    int drain();
    /// Writes or drops what waits, closes the file and ends the thread, without waiting for any of it. Again: nothing.
    enum class Pending { Write, Drop };
    void close(Pending pending);

    /// Whether the file is closed and the thread has nothing left to do but end.
    bool hasEnded() const { return ended_.load(std::memory_order_acquire); }
    /// Bytes in the file so far. Any thread.
    std::uint64_t bytesWritten() const { return written_.load(std::memory_order_relaxed); }
    /// How often the disk has answered: goes on as long as it works. Any thread.
    std::uint64_t answers() const { return answers_.load(std::memory_order_relaxed); }

private:
    struct Operation {
        enum class Kind { Write, Sync } kind = Kind::Write;
        std::uint64_t offset = 0;
        std::vector<std::uint8_t> bytes;
    };

    enum class When { Now, WithTheNext };
    bool submit(Operation operation, When when);
    void work(MovieFile& file);
    void run(const std::shared_ptr<MovieFiles>& files, const std::string& path);
    int perform(MovieFile& file, const Operation& operation);
    void fail(int error);

    const std::function<void(int)> failed_;
    std::atomic<std::uint64_t> written_ = 0;
    std::atomic<std::uint64_t> answers_ = 0;
    std::atomic<bool> ended_ = false;
    std::uint64_t end_ = 0;  ///< where the next append goes; the encoder thread's

    std::mutex mutex_;
    std::condition_variable changed_;
    std::deque<Operation> waiting_;
    std::size_t waitingBytes_ = 0;
    bool busy_ = true;  ///< at first with the creation
    bool created_ = false;
    bool closing_ = false;
    bool isDue_ = false;  ///< what waits is to be done, not held
    int error_ = 0;

    std::thread thread_;  ///< last: it uses the rest
};

}  // namespace lumacast::media
