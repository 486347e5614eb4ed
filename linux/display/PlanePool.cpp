#include "linux/display/PlanePool.h"

namespace lumacast::x11 {
namespace {

constexpr std::size_t kStrideAlignment = 64;

std::size_t strideOf(std::int32_t width) {
    return (static_cast<std::size_t>(width) * 4 + kStrideAlignment - 1) / kStrideAlignment * kStrideAlignment;
}

}  // namespace

Picture::Picture(std::shared_ptr<Plane> plane, const DamageRegion& damage, std::uint64_t number)
    : plane_(std::move(plane)), damage_(damage), number_(number) {
    plane_->pictures_.fetch_add(1, std::memory_order_relaxed);
}

// Whatever the holder read, it read before the pool writes again.
Picture::~Picture() {
    plane_->pictures_.fetch_sub(1, std::memory_order_release);
}

PlanePool::PlanePool(std::int32_t width, std::int32_t height)
    : width_(width), height_(height), stride_(strideOf(width)) {}

std::optional<std::size_t> PlanePool::make(X11Connection& connection) {
    for (std::size_t i = 0; i < planes_.size(); ++i) {
        if (planes_[i]) continue;
        auto memory = SharedMemory::make(connection, stride_ * static_cast<std::size_t>(height_));
        if (!memory) return std::nullopt;
        planes_[i] = std::make_shared<Plane>(std::move(*memory), width_, height_, stride_);
        return i;
    }
    return std::nullopt;
}

void PlanePool::giveBack(std::size_t index, X11Connection& connection) {
    planes_[index]->memory().detach(connection);
    planes_[index].reset();
}

void PlanePool::detach(X11Connection& connection) {
    for (const auto& plane : planes_)
        if (plane) plane->memory().detach(connection);
}

}  // namespace lumacast::x11
