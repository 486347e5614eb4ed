#pragma once
#include <chrono>
#include <functional>
#include <memory>
#include <mutex>
#include <string_view>

#include "linux/storage/BeneathDirectory.h"
#include "linux/system/DiskLane.h"
#include "linux/system/UserRights.h"
#include "platform/FileSystem.h"

namespace lumacast {

/// The device's fixed temporary directory, below the root directory.
inline constexpr std::string_view kDeviceTemporaryDirectory = "/private/var/mobile/Library/Lumacast";

/// How many bytes a container writer has written to the file at a path, or none when no writer is writing it. Called
/// with single slashes, from any lane; must not wait.
using BytesBeingWritten = std::function<std::optional<std::uint64_t>(const std::string& path)>;

/// The file system role on the disk of this machine. Only the temporary directory and what is beneath it can be
/// reached, but by the two operations of users' files; links in it are never followed: they answer with their own attributes, and removing one removes the link.
/// What the disk has not answered in time is ETIMEDOUT. Everything is made for this user alone, whatever the process's
/// umask. The temporary directory that was there and is gone is made again when its free size is asked for, which every
/// recording begins with.
class LinuxFileSystem final : public FileSystem {
public:
    struct Options {
        std::string root;  ///< in front of every fixed path; empty for none
        BytesBeingWritten bytesBeingWritten;
        std::chrono::milliseconds patience{40};
        /// For how long a free size stands in for one that the disk doesn't tell in time: a disk that is busy for a
        /// moment isn't a full one.
        std::chrono::milliseconds freeSizeStands{30'000};
        std::optional<Resolution> resolution;  ///< as the kernel offers when not given
        AccountLookup accounts = systemAccount;    ///< of the users whose files are asked for
        std::function<void()> beforeEachQuestion;  ///< tests put a slow disk here; runs on the disk's thread
    };
    explicit LinuxFileSystem(Options options);

    /// Makes the folders that hold the temporary directory (not the directory itself), each for this user alone. Once,
    /// at the start; blocks as long as the disk does. The error when one could not be made, or when the directory or a
    /// link on the way to it is somebody else's (EACCES).
    [[nodiscard]] std::optional<Error> prepare();

    std::string root() const override;
    bool exists(const std::string& path) override;
    std::optional<Error> createDirectory(const std::string& path) override;
    Result<FileAttributes> attributes(const std::string& path) override;
    Result<std::vector<std::string>> list(const std::string& directory) override;
    std::optional<Error> remove(const std::string& path) override;
    std::optional<Error> move(const std::string& from, const std::string& to) override;
    UserID user() const override;
    bool userMayReadAndRemove(UserID user, const std::string& path) override;
    std::optional<Error> removeForUser(UserID user, const std::string& path) override;
    Result<std::uint64_t> freeSize(const std::string& path) override;

    /// How many threads wait for the disk now, for tests.
    std::size_t diskThreadCount() const { return disk_.threadCount(); }

private:
    struct Place;
    template <class T>
    std::variant<T, int> ask(std::function<std::variant<T, int>(const Place&)> question);
    std::variant<std::uint64_t, int> freeSizeNowOrBefore(const std::string& path,
                                                         const std::variant<std::uint64_t, int>& now);

    struct FreeSize {
        std::string path;
        std::uint64_t bytes = 0;
        std::chrono::steady_clock::time_point told;
    };
    const std::shared_ptr<const Place> place_;
    const BytesBeingWritten bytesBeingWritten_;
    const std::chrono::milliseconds patience_;
    const std::chrono::milliseconds freeSizeStands_;
    const AccountLookup accounts_;
    std::mutex mutex_;  // guards the next
    std::optional<FreeSize> lastFreeSize_;
    DiskLane disk_;
};

}  // namespace lumacast
