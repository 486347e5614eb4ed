#pragma once
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/Clock.h"
#include "platform/FileSystem.h"
#include "tests/fakes/FakeMovie.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {

/// One file or directory in memory. A writer that holds a file keeps writing to it after it was moved or removed.
struct FakeFile {
    std::uint64_t size = 0;
    Date modified, created;
    bool isDirectory = false;
    bool isLink = false;
    std::uint64_t order = 0;                 ///< names are listed in the order in which they were made
    std::shared_ptr<const FakeMovie> movie;  ///< what it holds, where it is a movie
};

/// The temporary directory's file system in memory. The parents of the temporary directory exist; it itself does not
/// until it is made. Refuses what leaves the temporary directory. A failing call (FaultPlan "FileSystem.<operation>")
/// is answered like a disk that does not answer. Thread-safe; never waits.
class FakeFileSystem final : public FileSystem {
public:
    FakeFileSystem(const Clock& clock, FaultPlan& faults, std::string root = {});

    std::string root() const override { return root_; }
    bool exists(const std::string& path) override;
    std::optional<Error> createDirectory(const std::string& path) override;
    Result<FileAttributes> attributes(const std::string& path) override;
    Result<std::vector<std::string>> list(const std::string& directory) override;
    std::optional<Error> remove(const std::string& path) override;
    std::optional<Error> move(const std::string& from, const std::string& to) override;
    UserID user() const override { return UserID{1000}; }
    bool userMayReadAndRemove(UserID user, const std::string& path) override;
    std::optional<Error> removeForUser(UserID user, const std::string& path) override;
    Result<std::uint64_t> freeSize(const std::string& path) override;

    /// A movie outside of the temporary directory that only this user can read and remove.
    void addUsersFile(UserID user, const std::string& path, std::uint64_t size,
                      std::shared_ptr<const FakeMovie> movie = nullptr);
    /// Whether a file stands at a path, a user's or a temporary one.
    bool isThere(const std::string& path) const;
    /// Whether what stands there is a directory.
    bool isFolder(const std::string& path) const;

    /// The temporary directory, without a slash at its end.
    const std::string& temporaryDirectory() const { return base_; }
    /// What is free with the files there are now. 1 GB at first. Writing takes from it, removing gives back.
    void setFreeSize(std::uint64_t bytes);
    /// Makes a file, replacing one that is there; its folder must exist.
    void addFile(const std::string& path, std::uint64_t size, std::optional<Date> modified = {});
    /// Makes a link. Nothing is ever found through it.
    void addLink(const std::string& path);
    /// `before` is called by what waits for the disk (listing, removing, moving), on the lane that waits, before
    /// anything is done: a disk that stands still for as long as it takes. Set before the lanes run.
    void setDisk(std::function<void(const std::string& path)> before) { disk_ = std::move(before); }
    /// The paths of all files, sorted.
    std::vector<std::string> files() const;
    /// Whether the plan has ever let a removal of that path fail.
    bool removalHasFailed(const std::string& path) const;

    // For the writers of files.

    /// Makes an empty file; an error when it exists already or can't be made.
    Result<std::shared_ptr<FakeFile>> create(const std::string& path);
    /// Adds bytes to a file; false when the disk is full.
    bool append(FakeFile& file, std::uint64_t bytes);
    void setMovie(FakeFile& file, std::shared_ptr<const FakeMovie> movie);
    /// The movie in the file at a path, or null.
    std::shared_ptr<const FakeMovie> movie(const std::string& path) const;

private:
    /// The path with single slashes, or why it is refused. Under the lock.
    std::variant<std::string, int> resolve(const std::string& path) const;
    std::variant<std::shared_ptr<FakeFile>, int> find(const std::string& path) const;
    std::variant<std::shared_ptr<FakeFile>, int> make(const std::string& path, bool isDirectory);
    std::uint64_t used() const;

    const Clock& clock_;
    FaultPlan& faults_;
    const std::string root_;
    const std::string base_;
    std::function<void(const std::string& path)> disk_;
    mutable std::mutex mutex_;
    std::map<std::string, std::shared_ptr<FakeFile>> nodes_;
    std::map<std::string, std::pair<UserID, std::shared_ptr<FakeFile>>> usersFiles_;
    std::set<std::string> notRemoved_;
    std::uint64_t capacity_ = 1'000'000'000;
    std::uint64_t made_ = 0;
};

}  // namespace lumacast
