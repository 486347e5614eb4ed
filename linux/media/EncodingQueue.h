#pragma once
#include <condition_variable>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <thread>

#include "linux/media/EncodingPriority.h"
#include "linux/media/LinuxMovieExport.h"

namespace lumacast::media {

/// The thread on which encoding exports run one after the other, at low priority, which their encoder's threads
/// inherit. It sleeps nearly always. Every call from any thread; none waits but the end.
class EncodingQueue final {
public:
    /// Throws std::system_error when the system has no thread: at the start of the process, where that is the end.
    EncodingQueue(std::shared_ptr<MovieFiles> files, EncodingPriority priority);
    EncodingQueue(const EncodingQueue&) = delete;
    EncodingQueue& operator=(const EncodingQueue&) = delete;
    /// Cancels all of them, and waits until each has been told.
    ~EncodingQueue();

    void add(std::shared_ptr<LinuxMovieExport> job);
    /// Takes a job out that has not begun; whether it was there.
    bool remove(const std::shared_ptr<LinuxMovieExport>& job);
    /// Forgets those that wait, untold, and answers the one that runs, or null.
    std::shared_ptr<LinuxMovieExport> forgetAll();

private:
    void run();

    const std::shared_ptr<MovieFiles> files_;
    const EncodingPriority priority_;
    std::mutex mutex_;
    std::condition_variable changed_;
    std::deque<std::shared_ptr<LinuxMovieExport>> waiting_;
    std::shared_ptr<LinuxMovieExport> running_;
    bool stopping_ = false;

    std::thread thread_;  ///< last: it uses the rest
};

}  // namespace lumacast::media
