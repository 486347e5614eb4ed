#pragma once
// Memory for shared objects that come and go all the time.

#include <cstddef>
#include <memory>
#include <mutex>
#include <new>
#include <utility>

namespace lumacast {

/// Makes shared objects of one type in memory that is used again: once as many were made as live at a time, another one
/// takes nothing from the heap. The memory goes with the maker or the last of its objects, whichever goes later.
/// Thread-safe: objects may end on any lane.
template <class T>
class Recycler {
public:
    template <class... Arguments>
    std::shared_ptr<T> make(Arguments&&... arguments) const {
        return std::allocate_shared<T>(Allocator<T>(blocks_), std::forward<Arguments>(arguments)...);
    }

private:
    /// Blocks of one size: the object together with the count of its holders.
    class Blocks {
    public:
        Blocks() = default;
        Blocks(const Blocks&) = delete;
        Blocks& operator=(const Blocks&) = delete;
        ~Blocks() {
            while (free_) ::operator delete(std::exchange(free_, free_->next));
        }

        void* take(std::size_t bytes) {
            {
                const std::lock_guard lock(mutex_);
                if (free_) return std::exchange(free_, free_->next);
            }
            return ::operator new(bytes);
        }
        void giveBack(void* block) {
            const std::lock_guard lock(mutex_);
            free_ = ::new (block) Free{free_};
        }

    private:
        struct Free {
            Free* next;
        };
        std::mutex mutex_;
        Free* free_ = nullptr;
    };

    /// Each object keeps a copy, and so the blocks, until its own block was given back.
    template <class Part>
    struct Allocator {
        using value_type = Part;
        explicit Allocator(std::shared_ptr<Blocks> from) : blocks(std::move(from)) {}
        template <class Other>
        Allocator(const Allocator<Other>& other) : blocks(other.blocks) {}
        bool operator==(const Allocator&) const = default;

        // One block for all there is: it's what allocate_shared asks for.
        Part* allocate(std::size_t) {
            static_assert(alignof(Part) <= __STDCPP_DEFAULT_NEW_ALIGNMENT__);
            return static_cast<Part*>(blocks->take(sizeof(Part)));
        }
        void deallocate(Part* part, std::size_t) { blocks->giveBack(part); }

        std::shared_ptr<Blocks> blocks;
    };

    std::shared_ptr<Blocks> blocks_ = std::make_shared<Blocks>();
};

}  // namespace lumacast
