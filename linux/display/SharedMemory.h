#pragma once
#include <xcb/shm.h>

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>

#include "linux/display/X11Connection.h"

namespace lumacast::x11 {

/// Zeroed memory that the display server writes into. Its size is sealed, and so is its writability: whoever else gets
/// the descriptor can only read. The mapping and the server's own mapping stay writable. Owns descriptor and mapping;
/// the server's segment ends with the connection or with detach().
class SharedMemory final {
public:
    /// None when there is no memory or the server refuses. Waits for the server.
    static std::optional<SharedMemory> make(X11Connection& connection, std::size_t size);
    SharedMemory(SharedMemory&& other) noexcept;
    SharedMemory& operator=(SharedMemory&& other) noexcept;
    ~SharedMemory();

    std::span<std::uint8_t> bytes() { return {memory_, size_}; }
    std::span<const std::uint8_t> bytes() const { return {memory_, size_}; }
    int descriptor() const { return descriptor_.get(); }
    xcb_shm_seg_t segment() const { return segment_; }
    /// The server forgets the memory. Only on the connection it was made with.
    void detach(X11Connection& connection);

private:
    SharedMemory(Fd descriptor, std::uint8_t* memory, std::size_t size)
        : descriptor_(std::move(descriptor)), memory_(memory), size_(size) {}

    Fd descriptor_;
    std::uint8_t* memory_ = nullptr;
    std::size_t size_ = 0;
    xcb_shm_seg_t segment_ = 0;
};

}  // namespace lumacast::x11
