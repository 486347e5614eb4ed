#pragma once
// The private temporary directory in which all movies live first.

#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "base/Value.h"
#include "platform/Platform.h"

namespace lumacast {

/// Paths of, and operations on, the temporary directory. Callable from any lane; removals run on the background queue.
class TempStore {
public:
    using Completion = std::function<void(std::optional<Error>)>;

    explicit TempStore(const Platform& platform);

    /// `_srTempPath` — the directory's path, with its trailing slash: the configured root and the device's fixed path.
    std::string _srTempPath() const;
    /// The file URL path of `name` in the directory: deliberately joined with a second slash after the trailing one.
    std::string pathFor(const std::string& name) const { return _srTempPath() + "/" + name; }

    /// `_srSetupTempDirectory` — creates the directory, not its parents, when nothing is there.
    void _srSetupTempDirectory();

    /// `_srRemoveFile:completion:` — removes a file on the background queue, in the order asked. Completes there, with
    /// none when the file did not exist.
    void _srRemoveFile(const URL& url, Completion completion);

    /// `_srDeviceFreeDiskSpace` — bytes free where the directory is; 0 when unreadable.
    std::uint64_t _srDeviceFreeDiskSpace() const;
    /// `_srDeviceHasSufficientFreeSpaceForRecording` — whether strictly more than 100 MB are free.
    bool _srDeviceHasSufficientFreeSpaceForRecording() const;

    /// A number for a writer that is about to write `path`; later writers of the same path get larger ones.
    std::uint64_t claimPath(const std::string& path);
    /// The last claim that was given out: who has not written yet removes as its holder, and so spares what is begun
    /// from now on.
    std::uint64_t lastClaim() const;
    /// The same removal for the file that the writer with this claim has left: when it is its turn and a later writer
    /// has claimed the path, the file is that writer's and stays; completes with none then.
    void removeFileOfClaim(const URL& url, std::uint64_t claim, Completion completion);

private:
    struct Removal {
        URL url;
        std::optional<std::uint64_t> claim;
        Completion completion;
    };
    /// What the background task needs, alive as long as a removal is under way.
    struct Removals;

    void enqueue(Removal removal);

    Log& log_;
    FileSystem& fileSystem_;
    GlobalQueue& background_;
    std::shared_ptr<Removals> removals_;
};

}  // namespace lumacast
