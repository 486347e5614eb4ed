#pragma once
// Removing files in the background: in order for each path, and never a later writer's file.

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>

#include "base/Log.h"
#include "base/Value.h"
#include "platform/FileSystem.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// The removals that are asked for, and who writes which path. Removals of one path run in the order asked, each with
/// its completion before the next; different paths don't wait for each other, up to eight at a time, so that a disk
/// that stands still can't take all the threads of the background queue. Callable from any lane. Held by shared_ptr: it
/// lives as long as a removal is under way or a claim is held.
class FileRemovals final : public std::enable_shared_from_this<FileRemovals> {
public:
    using Completion = std::function<void(std::optional<Error>)>;
    static constexpr std::size_t kMaximumAtATime = 8;

    FileRemovals(Log& log, FileSystem& fileSystem, GlobalQueue& background)
        : log_(log), fileSystem_(fileSystem), background_(background) {}

    /// Whether both name the same place: files are addressed with a doubled slash here and a single one there.
    static bool isSamePath(const std::string& path, const std::string& other);

    /// Removes what is at `path`, on the background queue, and completes there: with none when nothing was there, or
    /// when a claim later than `claim` is on the path at that moment or was when it was asked for.
    /// With `user` given the file may be anywhere, and is removed with that user's rights.
    void remove(std::string path, std::optional<std::uint64_t> claim, Completion completion,
                std::optional<UserID> user = {});
    /// Whether a claim later than `claim` is on the path.
    bool isClaimedAfter(const std::string& path, std::uint64_t claim) const;

    /// A number for who is about to write `path`; later ones are larger.
    std::uint64_t claim(const std::string& path);
    /// The last number that was given out; 0 for none.
    std::uint64_t lastClaim() const;
    /// Keeps a claim until it is released: the path is forgotten when its last claim is.
    std::shared_ptr<void> holdClaim(const std::string& path, std::uint64_t claim);
    /// Keeps the path's claims from being forgotten until it is released, so that isClaimedAfter still knows of those
    /// whose writers have gone.
    std::shared_ptr<void> rememberClaims(const std::string& path);
    /// How many paths are claimed now, for tests.
    std::size_t claimedPathCount() const;

    /// The path's turn, for who removes it on a lane of its own: what is asked for meanwhile waits until it is
    /// released, what is under way is not waited for. Null when a claim later than `lastClaim` is on the path: then it
    /// must not be removed.
    std::shared_ptr<void> takeTurn(const std::string& path, std::uint64_t lastClaim);

private:
    struct Removal {
        std::string path;
        std::optional<std::uint64_t> claim;
        Completion completion;
        std::optional<UserID> user;
    };
    struct Claims {
        std::uint64_t latest = 0;
        std::set<std::uint64_t> held;
        std::size_t remembered = 0;  ///< how often
    };

    void forgetIfUnused(const std::string& key);
    bool isClaimedAfterLocked(const std::string& key, std::uint64_t claim) const;
    std::optional<Error> perform(const std::string& key, const Removal& removal);
    /// Under the lock: the path's removals may go on. Whether a task has to be submitted for that.
    [[nodiscard]] bool makeReady(const std::string& key);
    void submitTask();
    void work();
    void endTurn(const std::string& key);

    Log& log_;
    FileSystem& fileSystem_;
    GlobalQueue& background_;

    mutable std::mutex mutex_;
    std::map<std::string, std::deque<Removal>> waiting_;  ///< an entry for each path that has its turn or waits for it
    std::deque<std::string> ready_;                       ///< paths with a removal that may begin
    std::size_t tasks_ = 0;
    std::uint64_t lastClaim_ = 0;
    std::map<std::string, Claims> claims_;
};

}  // namespace lumacast
