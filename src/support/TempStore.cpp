#include "support/TempStore.h"

#include <utility>

namespace lumacast {

namespace {

constexpr std::string_view kDirectory = "/private/var/mobile/Library/Lumacast/";
constexpr std::uint64_t kNeededFreeSpace = 100'000'000;  // bytes; more than this must be free

}  // namespace

struct TempStore::Removals {
    Log& log;
    FileSystem& fileSystem;
    std::mutex mutex;
    std::deque<Removal> waiting;
    bool draining = false;
    std::uint64_t lastClaim = 0;
    std::map<std::string, std::uint64_t> claims;

    Removals(Log& theLog, FileSystem& theFileSystem) : log(theLog), fileSystem(theFileSystem) {}

    bool belongsToALaterWriter(const Removal& removal) {
        if (!removal.claim) return false;
        const std::lock_guard lock(mutex);
        const auto found = claims.find(removal.url.path());
        return found != claims.end() && found->second > *removal.claim;
    }

    std::optional<Error> perform(const Removal& removal) {
        const std::string path = removal.url.path();
        if (belongsToALaterWriter(removal) || !fileSystem.exists(path)) return std::nullopt;
        auto error = fileSystem.remove(path);
        if (error) log.line("_lxRemoveFile error: %i", error->code());
        return error;
    }

    void drain() {
        for (;;) {
            Removal next;
            {
                const std::lock_guard lock(mutex);
                if (waiting.empty()) {
                    draining = false;
                    return;
                }
                next = std::move(waiting.front());
                waiting.pop_front();
            }
            auto error = perform(next);
            if (next.completion) next.completion(std::move(error));
        }
    }
};

TempStore::TempStore(const Platform& platform)
    : log_(platform.log),
      fileSystem_(platform.fileSystem),
      background_(platform.scheduler.globalQueue(QueuePriority::Background)),
      removals_(std::make_shared<Removals>(platform.log, platform.fileSystem)) {}

std::string TempStore::_srTempPath() const { return fileSystem_.root() + std::string(kDirectory); }

void TempStore::_srSetupTempDirectory() {
    log_.line("_srSetupTempDirectory");
    if (fileSystem_.exists(_srTempPath())) return;
    if (const auto error = fileSystem_.createDirectory(_srTempPath())) {
        log_.print("error: %@", describe(*error));
        log_.line("error creating temp directory");
    }
}

void TempStore::_srRemoveFile(const URL& url, Completion completion) {
    enqueue({url, std::nullopt, std::move(completion)});
}

void TempStore::removeFileOfClaim(const URL& url, std::uint64_t claim, Completion completion) {
    enqueue({url, claim, std::move(completion)});
}

void TempStore::enqueue(Removal removal) {
    {
        const std::lock_guard lock(removals_->mutex);
        removals_->waiting.push_back(std::move(removal));
        if (std::exchange(removals_->draining, true)) return;
    }
    background_.async([removals = removals_] { removals->drain(); });
}

std::uint64_t TempStore::claimPath(const std::string& path) {
    const std::lock_guard lock(removals_->mutex);
    return removals_->claims[path] = ++removals_->lastClaim;
}

std::uint64_t TempStore::lastClaim() const {
    const std::lock_guard lock(removals_->mutex);
    return removals_->lastClaim;
}

std::uint64_t TempStore::_srDeviceFreeDiskSpace() const {
    const auto answer = fileSystem_.freeSize(_srTempPath());
    const auto* bytes = std::get_if<std::uint64_t>(&answer);
    return bytes ? *bytes : 0;
}

bool TempStore::_srDeviceHasSufficientFreeSpaceForRecording() const {
    return _srDeviceFreeDiskSpace() > kNeededFreeSpace;
}

}  // namespace lumacast
