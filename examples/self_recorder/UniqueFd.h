#pragma once

#include <unistd.h>

#include <utility>

namespace lumacast::example {

/// Owns a file descriptor; -1 is none.
class UniqueFd final {
public:
    UniqueFd() = default;
    explicit UniqueFd(int descriptor) : descriptor_(descriptor) {}
    UniqueFd(UniqueFd&& other) noexcept : descriptor_(std::exchange(other.descriptor_, -1)) {}
    UniqueFd& operator=(UniqueFd&& other) noexcept {
        std::swap(descriptor_, other.descriptor_);
        return *this;
    }
    ~UniqueFd() {
        if (descriptor_ >= 0) ::close(descriptor_);
    }

    [[nodiscard]] int get() const { return descriptor_; }
    [[nodiscard]] int release() { return std::exchange(descriptor_, -1); }
    [[nodiscard]] bool valid() const { return descriptor_ >= 0; }

private:
    int descriptor_ = -1;
};

}  // namespace lumacast::example
