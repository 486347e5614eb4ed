#pragma once
#include <unistd.h>

#include <utility>

namespace lumacast {

/// Owns one file descriptor and closes it. A resource: moved, never copied. Not thread-safe.
class FileDescriptor final {
public:
    FileDescriptor() = default;
    explicit FileDescriptor(int number) : number_(number) {}
    FileDescriptor(FileDescriptor&& other) noexcept : number_(std::exchange(other.number_, -1)) {}
    FileDescriptor& operator=(FileDescriptor&& other) noexcept {
        if (this != &other) reset(std::exchange(other.number_, -1));
        return *this;
    }
    ~FileDescriptor() { reset(); }

    /// The descriptor, still owned here; -1 when there is none.
    int get() const { return number_; }
    explicit operator bool() const { return number_ >= 0; }
    /// Gives the descriptor away; the caller closes it.
    [[nodiscard]] int release() { return std::exchange(number_, -1); }
    void reset(int number = -1) {
        if (number_ >= 0) ::close(number_);
        number_ = number;
    }

private:
    int number_ = -1;
};

}  // namespace lumacast
