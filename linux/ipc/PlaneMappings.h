#pragma once
// Memory of lent planes, mapped once for as long as they come again.

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <span>
#include <vector>

namespace lumacast {

/// Read-only memory; unmapped with its last holder.
class PlaneMapping final {
public:
    /// Null when it can't be mapped. Keeps the memory, not the descriptor.
    static std::shared_ptr<const PlaneMapping> make(int descriptor, std::size_t bytes);
    ~PlaneMapping();
    PlaneMapping(const PlaneMapping&) = delete;
    PlaneMapping& operator=(const PlaneMapping&) = delete;

    std::span<const std::uint8_t> bytes() const { return {static_cast<const std::uint8_t*>(memory_), size_}; }

private:
    PlaneMapping(void* memory, std::size_t size) : memory_(memory), size_(size) {}

    void* const memory_;
    const std::size_t size_;
};

/// The mappings of one connection's planes. A capture's few planes take turns, so each comes again after a few pictures,
/// by another descriptor: mapping it anew each time would cost the reader a fault for each of its pages. Thread-safe.
class PlaneMappings final {
public:
    /// What memory it is, whatever the descriptor. Nothing else can have the same while a mapping keeps it.
    struct Identity {
        dev_t device = 0;
        ino_t inode = 0;
        friend bool operator==(const Identity&, const Identity&) = default;
    };
    /// As many planes as may be lent at a time. What is not among the last of these is mapped again.
    static constexpr std::size_t kKept = 4;

    /// Null when the memory can't be mapped.
    std::shared_ptr<const PlaneMapping> of(const Identity& identity, int descriptor, std::size_t bytes);

private:
    struct Known {
        Identity identity;
        std::shared_ptr<const PlaneMapping> mapping;
    };
    std::mutex mutex_;
    std::vector<Known> known_;  ///< the one that was asked for last is the last
};

}  // namespace lumacast
