// Saving a finished movie to the user's library: mixed, added, and its files removed.

#include <algorithm>
#include <utility>

#include "daemon/LCRecordingManager.h"
#include "writer/LCAudioMixUtility.h"

namespace lumacast {

namespace {

/// Finished saves that the administrator still sees.
constexpr std::size_t kFinishedSavesKept = 16;

/// A URL's text with its %XX sequences replaced; none for one that is no sequence.
std::optional<std::string> percentDecoded(const std::string& text) {
    const auto digit = [](char c) {
        if (c >= '0' && c <= '9') return c - '0';
        if (c >= 'a' && c <= 'f') return c - 'a' + 10;
        if (c >= 'A' && c <= 'F') return c - 'A' + 10;
        return -1;
    };
    std::string result;
    for (std::size_t i = 0; i < text.size(); ++i) {
        if (text[i] != '%') {
            result += text[i];
            continue;
        }
        if (i + 2 >= text.size()) return std::nullopt;
        const int high = digit(text[i + 1]), low = digit(text[i + 2]);
        if (high < 0 || low < 0) return std::nullopt;
        result += static_cast<char>(high * 16 + low);
        i += 2;
    }
    return result;
}

std::string_view nameOf(MovieSave::State state) {
    switch (state) {
        case MovieSave::State::Mixing: return "mixing";
        case MovieSave::State::Adding: return "adding";
        case MovieSave::State::Saved: return "saved";
        case MovieSave::State::Failed: return "failed";
    }
    return "failed";
}

}  // namespace

void LCRecordingManager::saveVideoToCameraRoll(const std::optional<URL>& movie, UserID user, SaveHandler handler) {
    const bool isTemporary = movie && services_.tempStore.isTemporaryFile(*movie);
    if (movie && !isTemporary && !platform_.fileSystem.userMayReadAndRemove(user, movie->path())) {
        log_.line("a movie is not saved: user %u may not read and remove it", number(user));
        if (handler) handler(services_.errors._lcUserErrorForCode(RecordingErrorCode::FailedToSave));
        return;
    }
    if (movie && isBeingRecorded(*movie)) {
        log_.line("a movie is not saved: it is being recorded");
        if (handler) handler(services_.errors._lcUserErrorForCode(RecordingErrorCode::FailedToSave));
        return;
    }
    const auto save = std::make_shared<MovieSave>();
    save->number = ++lastSave_;
    save->movie = movie;
    save->user = user;
    save->removesAsUser = !isTemporary;
    save->claim = services_.tempStore.lastClaim();
    if (isTemporary) save->claims = services_.tempStore.rememberClaims(movie->path());
    save->handler = std::move(handler);
    saves_.push_back(save);
    // Mixing reads with this process's rights. Another user could put a link to what is not theirs in the movie's place
    // meanwhile; the library reads with that user's.
    if (!isTemporary && movie && user != platform_.fileSystem.user()) {
        log_.line("a movie of user %u is saved without mixing", number(user));
        platform_.scheduler.globalQueue(QueuePriority::Default).async([self = shared_from_this(), save] {
            self->addToLibrary(save, std::nullopt, false);
        });
        return;
    }
    // Opening the movie waits for the disk.
    platform_.scheduler.globalQueue(QueuePriority::Default).async([self = shared_from_this(), save] {
        LCAudioMixUtility mixer(self->platform_, self->services_.tempStore, self->services_.errors);
        auto exporter = mixer.mixAudioForMovie(
            save->movie, [self, save](std::optional<URL> mixed, const std::optional<Error>& error) {
                // The library is waited for: not on the exporter's lane.
                self->platform_.scheduler.globalQueue(QueuePriority::Default)
                    .async([self, save, mixed = std::move(mixed), failed = error.has_value()] {
                        self->addToLibrary(save, mixed, failed);
                    });
            });
        // One that has ended already is let go of again by the save's end.
        self->onRequestLane([save, exporter = std::move(exporter)] {
            if (save->state == MovieSave::State::Mixing) save->exporter = exporter;
        });
    });
}

bool LCRecordingManager::isBeingRecorded(const URL& movie) const {
    for (const auto& [id, session] : bundleIDToRecordingSessionLookup_) {
        const auto writer = session->isRecording() ? session->movieWriter() : nullptr;
        if (writer && FileRemovals::isSamePath(writer->outputPath(), movie.path())) return true;
    }
    return false;
}

void LCRecordingManager::addToLibrary(const std::shared_ptr<MovieSave>& save, const std::optional<URL>& mixed,
                                      bool mixingFailed) {
    onRequestLane([save] {
        save->state = MovieSave::State::Adding;
        save->exporter = nullptr;
    });
    if (mixingFailed) log_.line("Error Mixing video Audio tracks");
    log_.line("LCRecordingManager: saveVideoToCameraRoll:");
    // A later recording may have taken the movie's name: what stands there then is not the movie.
    const bool isOther = save->movie && services_.tempStore.isClaimedAfter(save->movie->path(), save->claim);
    const std::optional<URL>& added = mixed ? mixed : isOther ? mixed : save->movie;
    std::optional<URL> savedAs;
    std::string problem = "there is no movie";
    if (added) {
        auto result = platform_.photoLibrary.addVideo(*added, save->user);
        if (auto* const url = std::get_if<URL>(&result))
            savedAs = std::move(*url);
        else
            problem = describe(std::get<Error>(result));
    }
    if (savedAs)
        log_.line("LCRecordingManager:saveVideoToCameraRoll: Video saved to camera roll successful");
    else
        log_.line("LCRecordingManager:saveVideoToCameraRoll: Video saved to camera roll failed");
    // Deliberately also after a failure.
    if (mixed) services_.tempStore._srRemoveFile(*mixed, {});
    if (save->movie) {
        if (save->removesAsUser)
            services_.tempStore.removeFileOfUser(*save->movie, save->user, {});
        else
            services_.tempStore.removeFileOfClaim(*save->movie, save->claim, {});
    }
    onRequestLane([self = shared_from_this(), save, savedAs = std::move(savedAs), problem = std::move(problem)] {
        self->endSave(save, savedAs, problem);
    });
}

void LCRecordingManager::endSave(const std::shared_ptr<MovieSave>& save, const std::optional<URL>& savedAs,
                                 const std::string& problem) {
    save->state = savedAs ? MovieSave::State::Saved : MovieSave::State::Failed;
    save->savedAs = savedAs;
    save->claims = nullptr;
    save->exporter = nullptr;
    if (!savedAs) save->problem = problem;
    const auto isOver = [](const auto& other) {
        return other->state == MovieSave::State::Saved || other->state == MovieSave::State::Failed;
    };
    if (static_cast<std::size_t>(std::count_if(saves_.begin(), saves_.end(), isOver)) > kFinishedSavesKept)
        saves_.erase(std::find_if(saves_.begin(), saves_.end(), isOver));
    if (const auto handler = std::exchange(save->handler, nullptr))
        handler(savedAs ? std::nullopt
                        : std::optional(services_.errors._lcUserErrorForCode(RecordingErrorCode::FailedToSave)));
}

Array LCRecordingManager::describeSaves() const {
    Array saves;
    for (const auto& save : saves_) {
        const bool isMixed = save->state == MovieSave::State::Adding || save->state == MovieSave::State::Saved;
        Dictionary entry{{"number", save->number},
                         {"movie", save->movie ? Value(save->movie->path()) : Value()},
                         {"state", nameOf(save->state)},
                         {"progress", isMixed ? 1.0 : save->exporter ? save->exporter->progress() : 0.0}};
        if (save->savedAs) entry.set("savedAs", save->savedAs->path());
        if (save->state == MovieSave::State::Failed) entry.set("error", save->problem);
        saves.emplace_back(std::move(entry));
    }
    return saves;
}

void LCRecordingManager::serveSaveCommand() {
    platform_.admin.addCommand(
        "save", [weak = weak_from_this()](const std::vector<std::string>& arguments, const AdminAnswer& answer) {
            const auto self = weak.lock();
            if (!self) return;
            const auto text = arguments.size() == 1 ? percentDecoded(arguments.front()) : std::nullopt;
            const URL movie(text.value_or(""));
            if (!movie.path().starts_with("/"))
                return answer({{"error", "a save takes one movie, a file URL with its special characters encoded"}});
            const std::uint64_t before = self->lastSave_;
            self->saveVideoToCameraRoll(movie, self->platform_.fileSystem.user(), {});
            if (self->lastSave_ == before)
                return answer({{"error", "the movie can't be read and removed, or it is being recorded"}});
            answer({{"save", self->lastSave_}});
        });
}

}  // namespace lumacast
