#include "linux/media/MoviesCommand.h"

#include <utility>

#include "linux/media/StoredMovie.h"
#include "linux/media/mp4/MovieLook.h"

namespace lumacast::media {

namespace {

constexpr std::size_t kMostFiles = 10'000;  // more than a person reads

std::string_view wordFor(mp4::MovieState state) {
    switch (state) {
        case mp4::MovieState::unfinished: return "unfinished";
        case mp4::MovieState::unfinishedCopy: return "unfinishedCopy";
        case mp4::MovieState::finished: return "finished";
        case mp4::MovieState::recovered: return "recovered";
        case mp4::MovieState::other: break;
    }
    return "other";
}

Dictionary report(const std::string& directory) {
    Array movies;
    const auto folder = MovieFolder::open(directory);
    for (const ListedFile& file : folder ? folder->list(kMostFiles) : std::vector<ListedFile>()) {
        const auto movie = folder->openToLook(file.name);
        if (!movie) continue;
        const mp4::MovieLook look = mp4::lookAtMovie(*movie);
        Dictionary entry{{"name", file.name}, {"state", wordFor(look.state)}, {"beingWritten", movie->isBeingWritten()}};
        if (look.nanoseconds) entry.set("seconds", static_cast<double>(*look.nanoseconds) / 1e9);
        movies.emplace_back(std::move(entry));
    }
    return {{"movies", std::move(movies)}};
}

}  // namespace

AdminCommand moviesCommand(Scheduler& scheduler, std::string directory) {
    return [&scheduler, directory = std::move(directory)](const std::vector<std::string>& arguments,
                                                          const AdminAnswer& answer) {
        if (!arguments.empty()) return answer({{"error", "movies takes no arguments"}});
        scheduler.globalQueue(QueuePriority::Background).async([directory, answer] { answer(report(directory)); });
    };
}

}  // namespace lumacast::media
