#pragma once
#include <memory>
#include <mutex>

#include "linux/ipc/Fd.h"
#include "linux/ipc/Frames.h"
#include "linux/ipc/PlaneMappings.h"
#include "writer/media/PixelBuffer.h"

namespace lumacast {

/// Whoever wants to know that a plane it lent is no longer used.
class PlaneLender {
public:
    virtual ~PlaneLender() = default;
    /// Callable from any lane.
    virtual void giveBack(std::uint64_t lease) = 0;
    PlaneMappings& mappings() { return mappings_; }

private:
    PlaneMappings mappings_;
};

/// A plane that another process lent: its memory, mapped read-only when somebody first looks. Given back to the lender
/// when the last holder lets go of it.
class ReceivedPlane final : public SharedPlane {
public:
    /// Null when the memory is too small for the picture, or could shrink under the reader.
    static std::shared_ptr<ReceivedPlane> make(Fd memory, PlaneRecord record, std::weak_ptr<PlaneLender> lender);

    ReceivedPlane(Fd memory, PlaneMappings::Identity identity, PlaneRecord record, std::weak_ptr<PlaneLender> lender);
    ReceivedPlane(const ReceivedPlane&) = delete;
    ReceivedPlane& operator=(const ReceivedPlane&) = delete;
    ~ReceivedPlane() override;

    std::int32_t width() const override { return record_.width; }
    std::int32_t height() const override { return record_.height; }
    std::size_t stride() const override { return record_.stride; }
    /// Empty when the memory can't be mapped.
    std::span<const std::uint8_t> pixels() const override;
    std::span<const PixelRect> damage() const override { return record_.damage; }
    std::uint64_t pictureNumber() const override { return record_.pictureNumber; }
    int descriptor() const override { return memory_.get(); }

private:
    std::size_t bytes() const { return record_.stride * static_cast<std::size_t>(record_.height); }

    const Fd memory_;
    const PlaneMappings::Identity identity_;
    const PlaneRecord record_;
    const std::weak_ptr<PlaneLender> lender_;
    mutable std::mutex mutex_;
    mutable std::shared_ptr<const PlaneMapping> mapping_;
};

}  // namespace lumacast
