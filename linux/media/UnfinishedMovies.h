#pragma once
#include <atomic>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "base/Log.h"
#include "linux/media/StoredMovie.h"

namespace lumacast::media {

/// What an earlier run of the daemon left in the temporary directory: recordings that it could not finish are given
/// their index and are ordinary movies then, to the last sample that is surely there; copies of movies that it could
/// not finish are removed, as they can be made again and must not be taken for the movie. Everything else stays as it
/// is. A movie keeps its modification date, so that it ages from the crash on.
///
/// One line of the log for each; nothing where there is nothing. On a full disk the movies stay as they are, which is
/// said once, and the next start tries again. So it does with one whose place on the disk takes nothing; the others have
/// their turn.
class UnfinishedMovies final {
public:
    /// Files that are looked at, at most: the last ones changed, among which is what a crash has left.
    static constexpr std::size_t kMostFiles = 4096;

    /// `log` must outlive it.
    UnfinishedMovies(std::string directory, Log& log) : directory_(std::move(directory)), log_(log) {}
    UnfinishedMovies(const UnfinishedMovies&) = delete;
    UnfinishedMovies& operator=(const UnfinishedMovies&) = delete;
    /// Ends the work at the file it is at, and waits for that. The end of the process needs neither: the files are
    /// whole at any moment.
    ~UnfinishedMovies();

    /// Notes which files are there: once, before anything can be recorded. Waits for the disk; it takes one look at
    /// each name.
    void remember();

    /// Begins the work, on a thread of its own at low priority, and then calls `afterwards` there. Once; returns at
    /// once. Without a thread nothing is done.
    void begin(std::function<void()> afterwards = {});

    /// Waits for its end. For tests.
    void wait();

private:
    void run();
    bool handle(const MovieFolder& folder, const ListedFile& listed);

    const std::string directory_;
    Log& log_;
    std::vector<ListedFile> files_;
    std::atomic<bool> cancelled_ = false;
    std::thread thread_;
};

}  // namespace lumacast::media
