#pragma once
#include <mutex>
#include <utility>

namespace lumacast {

/// A value that crosses lanes, behind a leaf lock: copied out and in, never held across a call out.
template <class T>
class Guarded {
public:
    Guarded() = default;
    explicit Guarded(T value) : value_(std::move(value)) {}
    Guarded(const Guarded&) = delete;
    Guarded& operator=(const Guarded&) = delete;

    T get() const {
        const std::lock_guard lock(mutex_);
        return value_;
    }

    /// The old value is released outside the lock.
    void set(T value) {
        // The parameter dies after the lock: it is declared before.
        const std::lock_guard lock(mutex_);
        std::swap(value_, value);
    }

    /// Changes the value in place; `change` must not call out.
    template <class Change>
    void update(Change change) {
        const std::lock_guard lock(mutex_);
        change(value_);
    }

private:
    mutable std::mutex mutex_;
    T value_{};
};

}  // namespace lumacast
