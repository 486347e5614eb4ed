#pragma once

#include <xcb/shm.h>
#include <xcb/xcb.h>

#include <cstddef>
#include <string>

#include "examples/scene/Picture.h"

namespace lumacast::example {

/// Picture memory that the application and the display server share by descriptor. Freeing it while the server still
/// reads is harmless: the server has a mapping of its own.
class SharedImage final {
public:
    /// Borrows the connection. On failure `error()` says why and there are no pixels.
    SharedImage(xcb_connection_t* connection, int width, int height);
    ~SharedImage();
    SharedImage(const SharedImage&) = delete;
    SharedImage& operator=(const SharedImage&) = delete;

    [[nodiscard]] const std::string& error() const { return error_; }
    [[nodiscard]] scene::Picture picture() const { return picture_; }
    [[nodiscard]] xcb_shm_seg_t segment() const { return segment_; }

private:
    xcb_connection_t* connection_;
    xcb_shm_seg_t segment_ = 0;
    void* memory_ = nullptr;
    std::size_t bytes_ = 0;
    scene::Picture picture_;
    std::string error_;
};

}  // namespace lumacast::example
