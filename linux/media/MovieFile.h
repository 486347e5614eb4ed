#pragma once
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <utility>
#include <variant>

namespace lumacast::media {

/// The file of one movie, known by its descriptor alone. Every call may wait for the disk; used on one thread at a
/// time. Answers are error numbers of the system, 0 for success. Destroying it closes the file as it is.
class MovieFile {
public:
    virtual ~MovieFile() = default;
    [[nodiscard]] virtual int write(std::uint64_t offset, std::span<const std::uint8_t> bytes) = 0;
    /// What was written is on the disk when this returns.
    [[nodiscard]] virtual int sync() = 0;
    /// Takes the name `path` away if it still is this file's.
    virtual void removeName(const std::string& path) = 0;
};

/// Creates movie files; the seam at which tests put disks that are full, slow or broken.
class MovieFiles {
public:
    virtual ~MovieFiles() = default;
    /// A new file that only this user can read, or the error's number. One that exists is an error, as is a path with
    /// a ".." in it. Callable from any thread.
    virtual std::variant<std::unique_ptr<MovieFile>, int> create(const std::string& path) = 0;
};

/// Files of the system.
class PosixMovieFiles final : public MovieFiles {
public:
    /// Anywhere: for tools and tests.
    PosixMovieFiles() = default;
    /// Only directly in `directory`, which is reached as the file system role reaches it: a path to anywhere else, such
    /// as by a name with a slash, is EACCES, and so is a directory that somebody else has put there.
    explicit PosixMovieFiles(std::string directory) : directory_(std::move(directory)) {}

    std::variant<std::unique_ptr<MovieFile>, int> create(const std::string& path) override;

private:
    const std::optional<std::string> directory_;
};

}  // namespace lumacast::media
