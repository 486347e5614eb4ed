#pragma once
// The private temporary directory in which all movies live first.

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "base/Date.h"
#include "base/Value.h"
#include "platform/Platform.h"
#include "support/FileRemovals.h"

namespace lumacast {

/// Paths of, and operations on, the temporary directory. Callable from any lane but where an operation says otherwise;
/// what runs on a global queue completes there.
class TempStore {
public:
    using Completion = FileRemovals::Completion;

    /// A day in seconds: what ages out when the storage is not short.
    static constexpr double kOneDay = 86400;

    explicit TempStore(const Platform& platform);

    /// `_srTempPath` — the directory's path, with its trailing slash: the configured root and the device's fixed path.
    std::string _srTempPath() const;
    /// The file URL path of `name` in the directory: deliberately joined with a second slash after the trailing one.
    std::string pathFor(const std::string& name) const { return _srTempPath() + "/" + name; }

    /// `_srSetupTempDirectory` — creates the directory, not its parents, when nothing is there.
    void _srSetupTempDirectory();

    /// `_srSizeOfTempDir:` — bytes of the directory's own entry, deliberately not of its files; 0, and the reason in
    /// `error` where one is given, when they can't be read.
    std::int64_t _srSizeOfTempDir(std::optional<Error>* error = nullptr) const;

    /// `_srDeleteAllTempFiles` — deletes every file, whatever its age, and answers the bytes freed. A path that a
    /// writer has claimed after `lastClaim` (by default: after the call began) is that writer's, and its file is
    /// spared. Waits for the disk: not on the request lane.
    std::uint64_t _srDeleteAllTempFiles(std::optional<std::uint64_t> lastClaim = {});
    /// `_srDeleteFilesOlderThanTimeToLiveInSeconds:` — the same for files that were last modified strictly longer ago;
    /// 0 for all. Goes on after a failure, but from the first one on deliberately counts nothing any more.
    std::uint64_t _srDeleteFilesOlderThanTimeToLiveInSeconds(double timeToLive,
                                                             std::optional<std::uint64_t> lastClaim = {});

    /// `_srRemoveFile:completion:` — removes a file on the background queue, in the order asked for its path. Completes
    /// there, with none when the file did not exist.
    void _srRemoveFile(const URL& url, Completion completion);
    /// The same for a file anywhere, with its user's rights.
    void removeFileOfUser(const URL& url, UserID user, Completion completion);
    /// Whether the URL is that of a file directly in the temporary directory, by its name alone.
    bool isTemporaryFile(const URL& url) const;
    /// Whether a writer has claimed the path later than that.
    bool isClaimedAfter(const std::string& path, std::uint64_t claim) const {
        return removals_->isClaimedAfter(path, claim);
    }
    /// `_srMoveFileFromURL:toURL:completion:` — moves a file on the default queue, over one that is there. Nothing
    /// uses it.
    void _srMoveFileFromURL(const URL& from, const URL& to, Completion completion);
    /// `_srDeleteFilesWithPrefix:` — deletes, on the default queue, all files whose names begin with it, case and
    /// diacritics aside. Nothing uses it.
    void _srDeleteFilesWithPrefix(const std::string& prefix);
    /// `_srGetCreationDateForFile:` — none when it can't be read.
    std::optional<Date> _srGetCreationDateForFile(const URL& url) const;

    /// `_srDeviceFreeDiskSpace` — bytes free where the directory is; 0 when unreadable.
    std::uint64_t _srDeviceFreeDiskSpace() const;
    /// `_srDeviceHasSufficientFreeSpaceForRecording` — whether strictly more than 100 MB are free.
    bool _srDeviceHasSufficientFreeSpaceForRecording() const;

    /// A number for a writer that is about to write `path`; later writers of the same path get larger ones.
    std::uint64_t claimPath(const std::string& path) { return removals_->claim(path); }
    /// The last claim that was given out: who has not written yet removes as its holder, and so spares what is begun
    /// from now on.
    std::uint64_t lastClaim() const { return removals_->lastClaim(); }
    /// Keeps a claim for as long as its writer lives; may be released after the store is gone.
    std::shared_ptr<void> holdClaim(const std::string& path, std::uint64_t claim) {
        return removals_->holdClaim(path, claim);
    }
    /// Keeps isClaimedAfter right about the path, also for writers that have gone by then, until it is released.
    std::shared_ptr<void> rememberClaims(const std::string& path) { return removals_->rememberClaims(path); }
    /// How many paths are claimed now, for tests.
    std::size_t claimedPathCount() const { return removals_->claimedPathCount(); }
    /// The same removal for the file that the writer with this claim has left: when it is its turn and a later writer
    /// has claimed the path, the file is that writer's and stays; completes with none then.
    void removeFileOfClaim(const URL& url, std::uint64_t claim, Completion completion);

private:
    Log& log_;
    FileSystem& fileSystem_;
    const Clock& clock_;
    GlobalQueue& default_;
    const std::shared_ptr<FileRemovals> removals_;
};

}  // namespace lumacast
