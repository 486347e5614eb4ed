#include "support/TempStore.h"

#include <algorithm>
#include <cmath>
#include <utility>

#include "support/NamePrefix.h"

namespace lumacast {

namespace {

constexpr std::string_view kDirectory = "/private/var/mobile/Library/Lumacast/";
constexpr std::uint64_t kNeededFreeSpace = 100'000'000;  // bytes; more than this must be free

std::int64_t wholeSeconds(double seconds) {
    constexpr double kLongest = 2'147'483'647;
    return std::isnan(seconds) ? 0 : static_cast<std::int64_t>(std::clamp(seconds, -kLongest, kLongest));
}

/// The one error of a whole run of deletions. It is deliberately never cleared, and reported again for every later
/// file.
class StickyError {
public:
    explicit StickyError(Log& log) : log_(log) {}

    void set(Error error) { error_ = std::move(error); }
    bool isSet() const { return error_.has_value(); }
    void report() const {
        if (!error_) return;
        // Deliberately another prefix than the operation's.
        log_.error("error in _lxRemoveFile_srDeleteFilesOlderThanTimeToLiveInSeconds, error code: %i", error_->code());
        log_.print("error = %@", describe(*error_));
    }

private:
    Log& log_;
    std::optional<Error> error_;
};

}  // namespace

TempStore::TempStore(const Platform& platform)
    : log_(platform.log),
      fileSystem_(platform.fileSystem),
      clock_(platform.clock),
      default_(platform.scheduler.globalQueue(QueuePriority::Default)),
      removals_(std::make_shared<FileRemovals>(platform.log, platform.fileSystem,
                                               platform.scheduler.globalQueue(QueuePriority::Background))) {}

std::string TempStore::_srTempPath() const {
    return fileSystem_.root() + std::string(kDirectory);
}

void TempStore::_srSetupTempDirectory() {
    log_.line("_srSetupTempDirectory");
    if (fileSystem_.exists(_srTempPath())) return;
    if (const auto error = fileSystem_.createDirectory(_srTempPath())) {
        log_.print("error: %@", describe(*error));
        log_.line("error creating temp directory");
    }
}

std::int64_t TempStore::_srSizeOfTempDir(std::optional<Error>* error) const {
    const auto answer = fileSystem_.attributes(_srTempPath());
    if (const auto* attributes = std::get_if<FileAttributes>(&answer))
        return static_cast<std::int64_t>(attributes->size);
    if (error) *error = std::get<Error>(answer);
    return 0;
}

std::uint64_t TempStore::_srDeleteAllTempFiles(std::optional<std::uint64_t> lastClaim) {
    return _srDeleteFilesOlderThanTimeToLiveInSeconds(0, lastClaim);
}

std::uint64_t TempStore::_srDeleteFilesOlderThanTimeToLiveInSeconds(double timeToLive,
                                                                    std::optional<std::uint64_t> lastClaim) {
    log_.line("_srDeleteFilesOlderThanTimeToLiveInSeconds: %i", wholeSeconds(timeToLive));
    const std::uint64_t mark = lastClaim.value_or(removals_->lastClaim());
    StickyError error(log_);
    const auto listed = fileSystem_.list(_srTempPath());
    if (const auto* failure = std::get_if<Error>(&listed)) error.set(*failure);
    error.report();
    std::uint64_t freed = 0;
    const auto* names = std::get_if<std::vector<std::string>>(&listed);
    for (const std::string& name : names ? *names : std::vector<std::string>()) {
        const std::string path = pathFor(name);
        const auto read = fileSystem_.attributes(path);
        if (const auto* failure = std::get_if<Error>(&read)) error.set(*failure);
        error.report();
        const auto* attributes = std::get_if<FileAttributes>(&read);
        // Without attributes a file has no age, and goes only when all do.
        const bool isOld = attributes && timeToLive < secondsBetween(attributes->modified, clock_.now());
        if (timeToLive != 0 && !isOld) continue;
        const auto turn = removals_->takeTurn(path, mark);
        if (!turn) continue;
        log_.line("deleting old file");
        if (auto failure = fileSystem_.remove(path)) error.set(std::move(*failure));
        error.report();
        if (attributes && !error.isSet()) freed += attributes->size;
    }
    return freed;
}

void TempStore::_srRemoveFile(const URL& url, Completion completion) {
    removals_->remove(url.path(), std::nullopt, std::move(completion));
}

void TempStore::removeFileOfClaim(const URL& url, std::uint64_t claim, Completion completion) {
    removals_->remove(url.path(), claim, std::move(completion));
}

void TempStore::removeFileOfUser(const URL& url, UserID user, Completion completion) {
    removals_->remove(url.path(), std::nullopt, std::move(completion), user);
}

bool TempStore::isTemporaryFile(const URL& url) const {
    const std::string path = url.path(), directory = _srTempPath();
    if (!path.starts_with(directory)) return false;
    const std::size_t name = path.find_first_not_of('/', directory.size());
    if (name == std::string::npos || path.find('/', name) != std::string::npos) return false;
    const std::string file = path.substr(name);
    return file != "." && file != ".." && file.find('\0') == std::string::npos;
}

void TempStore::_srMoveFileFromURL(const URL& from, const URL& to, Completion completion) {
    default_.async([&log = log_, &fileSystem = fileSystem_, from, to, completion = std::move(completion)] {
        (void)fileSystem.remove(to.path());  // deliberately ignored: the move tells
        auto error = fileSystem.move(from.path(), to.path());
        // Deliberately another prefix than the operation's.
        if (error) log.error("_lxMoveFileFromURL error: %i", error->code());
        if (completion) completion(std::move(error));
    });
}

void TempStore::_srDeleteFilesWithPrefix(const std::string& prefix) {
    default_.async([&log = log_, &fileSystem = fileSystem_, directory = _srTempPath(), prefix] {
        const auto listed = fileSystem.list(directory);
        const auto* names = std::get_if<std::vector<std::string>>(&listed);
        for (const std::string& name : names ? *names : std::vector<std::string>()) {
            if (!beginsWithCaseAndDiacriticInsensitive(name, prefix)) continue;
            // Deliberately another prefix than the operation's.
            if (const auto error = fileSystem.remove(directory + "/" + name))
                log.line("_lxDeleteFilesWithPrefix error: %i", error->code());
        }
    });
}

std::optional<Date> TempStore::_srGetCreationDateForFile(const URL& url) const {
    const auto answer = fileSystem_.attributes(url.path());
    const auto* attributes = std::get_if<FileAttributes>(&answer);
    return attributes ? attributes->created : std::nullopt;
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
