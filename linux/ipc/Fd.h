#pragma once
#include <unistd.h>

#include <utility>

namespace lumacast {

/// Owns one file descriptor, or none (-1), and closes it when it goes. A resource: moved, never copied. Not
/// thread-safe.
class Fd final {
public:
    Fd() = default;
    explicit Fd(int descriptor) : descriptor_(descriptor) {}
    Fd(Fd&& other) noexcept : descriptor_(std::exchange(other.descriptor_, -1)) {}
    Fd& operator=(Fd&& other) noexcept {
        if (this != &other) reset(std::exchange(other.descriptor_, -1));
        return *this;
    }
    Fd(const Fd&) = delete;
    Fd& operator=(const Fd&) = delete;
    ~Fd() { reset(); }

    /// The descriptor, still owned here; -1 when there is none.
    int get() const { return descriptor_; }
    explicit operator bool() const { return descriptor_ >= 0; }
    /// Gives the descriptor away; the caller closes it.
    [[nodiscard]] int release() { return std::exchange(descriptor_, -1); }
    void reset(int descriptor = -1) {
        if (descriptor_ >= 0) ::close(descriptor_);
        descriptor_ = descriptor;
    }

private:
    int descriptor_ = -1;
};

}  // namespace lumacast
