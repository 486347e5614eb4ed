#include "linux/media/UnfinishedMovies.h"

#include <cerrno>

#include "linux/ipc/QuietThread.h"
#include "linux/media/mp4/MovieRecovery.h"
#include "linux/system/LowPriority.h"
#include "linux/system/SystemError.h"

namespace lumacast::media {

namespace {

bool isNoRoom(int error) { return error == ENOSPC || error == EDQUOT || error == EFBIG; }

}  // namespace

UnfinishedMovies::~UnfinishedMovies() {
    cancelled_.store(true, std::memory_order_relaxed);
    wait();
}

void UnfinishedMovies::remember() {
    if (const auto folder = MovieFolder::open(directory_)) files_ = folder->list(kMostFiles);
}

void UnfinishedMovies::begin(std::function<void()> afterwards) {
    // Without a thread the next start has another try.
    thread_ = quietThreadIfAny([this, afterwards = std::move(afterwards)] {
        runAtLowPriority();
        run();
        if (afterwards && !cancelled_.load(std::memory_order_relaxed)) afterwards();
    });
}

void UnfinishedMovies::wait() {
    if (thread_.joinable()) thread_.join();
}

void UnfinishedMovies::run() {
    if (files_.empty()) return;
    const auto folder = MovieFolder::open(directory_);
    if (!folder) return;
    for (const ListedFile& listed : files_) {
        if (cancelled_.load(std::memory_order_relaxed) || !handle(*folder, listed)) return;
    }
}

/// False when the others are not worth a try.
bool UnfinishedMovies::handle(const MovieFolder& folder, const ListedFile& listed) {
    const auto movie = folder.openToChange(listed, cancelled_);
    if (!movie) return true;
    const mp4::Recovery result = mp4::recoverMovie(*movie, *movie);
    switch (result) {
        case mp4::Recovery::recovered:
        case mp4::Recovery::completed:
            movie->restoreTimes();
            log_.line("an earlier run left %s unfinished: it has its index now", listed.name);
            return true;
        case mp4::Recovery::unfinishedCopy:
            if (folder.remove(listed) == 0) log_.line("an earlier run left the copy %s unfinished: removed", listed.name);
            return true;
        case mp4::Recovery::sinkFailed:
            movie->restoreTimes();
            log_.error("an earlier run left %s unfinished, and its index can't be written: %s", listed.name,
                       describe(systemError(movie->error())));
            return !isNoRoom(movie->error());
        case mp4::Recovery::damaged:
        case mp4::Recovery::tooLong:
            log_.error("an earlier run left %s unfinished, and it can't be read back: %s", listed.name,
                       mp4::nameOf(result));
            return true;
        case mp4::Recovery::finished:
        case mp4::Recovery::notOurs:
        case mp4::Recovery::nothingWhole:
        case mp4::Recovery::sourceFailed:
            return true;
    }
    return true;
}

}  // namespace lumacast::media
