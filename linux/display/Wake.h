#pragma once
#include <sys/eventfd.h>
#include <unistd.h>

#include <cstdint>

#include "linux/ipc/Fd.h"

namespace lumacast::x11 {

/// Wakes a thread that polls the descriptor. Thread-safe; several calls may count as one.
class Wake final {
public:
    Wake() : event_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

    void signal() const {
        const std::uint64_t one = 1;
        [[maybe_unused]] const auto written = ::write(event_.get(), &one, sizeof one);  // full means: signalled already
    }
    void clear() const {
        std::uint64_t count = 0;
        [[maybe_unused]] const auto got = ::read(event_.get(), &count, sizeof count);  // empty is fine
    }
    int descriptor() const { return event_.get(); }

private:
    const Fd event_;
};

}  // namespace lumacast::x11
