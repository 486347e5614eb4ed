// Counts what a process takes from the heap, by thread and place: preloaded into the daemon by count_allocations. The
// counts are in the file $LC_ALLOCATIONS, which must not be there before; whoever reads it sees them as they are,
// without asking the process. The layout is Table's; comparing/allocations.py reads it.
//
// An allocation is one call of malloc, calloc, realloc, aligned_alloc, memalign or posix_memalign, and whatever comes
// down to those, as `new` does. A realloc counts also where the block stays where it is.

#include <execinfo.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>

extern "C" {
// The C library's own, under the names that it keeps for those who replace the others.
void* __libc_malloc(std::size_t bytes);
void* __libc_calloc(std::size_t count, std::size_t bytes);
void* __libc_realloc(void* block, std::size_t bytes);
void* __libc_memalign(std::size_t alignment, std::size_t bytes);
}

namespace {

constexpr std::size_t kSites = 1 << 14;
constexpr int kDepth = 28;
constexpr int kOwnFrames = 2;  ///< count and what replaces the C library's function

/// One place that one thread allocated at. Free as long as `key` is 0.
struct Site {
    std::atomic<std::uint64_t> key, count;
    std::uint64_t thread;
    std::uint64_t frames[kDepth];  ///< return addresses, the innermost first, then zeros
};

struct Table {
    std::atomic<std::uint64_t> lost;  ///< what was not counted as there are too many places
    Site sites[kSites];
};

std::atomic<Table*> table{nullptr};
thread_local bool isCounting [[gnu::tls_model("initial-exec")]] = false;

std::uint64_t hashOf(std::uint64_t thread, void* const* frames, int depth) {
    std::uint64_t hash = 1469598103934665603U ^ thread;
    for (int i = 0; i < depth; ++i) hash = (hash ^ reinterpret_cast<std::uint64_t>(frames[i])) * 1099511628211U;
    return hash == 0 ? 1 : hash;
}

void add(Table& to, std::uint64_t thread, void* const* frames, int depth) {
    const std::uint64_t key = hashOf(thread, frames, depth);
    for (std::size_t step = 0; step < kSites; ++step) {
        // The upper bits: those of a product are the better ones.
        Site& site = to.sites[((key >> 32) + step) % kSites];
        std::uint64_t found = site.key;
        if (found == 0 && site.key.compare_exchange_strong(found, key)) {
            site.thread = thread;
            std::memcpy(site.frames, frames, static_cast<std::size_t>(depth) * sizeof frames[0]);
            found = key;
        }
        if (found != key) continue;
        ++site.count;
        return;
    }
    ++to.lost;
}

[[gnu::noinline]] void count() {
    Table* const to = table;
    if (!to || isCounting) return;
    isCounting = true;  // what finds the callers may allocate too
    const int error = errno;
    void* frames[kDepth + kOwnFrames];
    const int depth = ::backtrace(frames, kDepth + kOwnFrames);
    if (depth > kOwnFrames)
        add(*to, static_cast<std::uint64_t>(::syscall(SYS_gettid)), frames + kOwnFrames, depth - kOwnFrames);
    errno = error;
    isCounting = false;
}

[[gnu::constructor]] void begin() {
    void* frame = nullptr;
    (void)::backtrace(&frame, 1);  // loads a library at its first call
    const char* const path = ::getenv("LC_ALLOCATIONS");
    // Programs that the daemon starts find the file there, and are not counted.
    const int file = path ? ::open(path, O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0600) : -1;
    if (file < 0) return;
    void* memory = MAP_FAILED;
    if (::ftruncate(file, sizeof(Table)) == 0)
        memory = ::mmap(nullptr, sizeof(Table), PROT_READ | PROT_WRITE, MAP_SHARED, file, 0);
    ::close(file);
    if (memory == MAP_FAILED) std::abort();
    table = static_cast<Table*>(memory);
}

}  // namespace

extern "C" {

void* malloc(std::size_t bytes) {
    count();
    return __libc_malloc(bytes);
}

void* calloc(std::size_t number, std::size_t bytes) {
    count();
    return __libc_calloc(number, bytes);
}

void* realloc(void* block, std::size_t bytes) {
    count();
    return __libc_realloc(block, bytes);
}

void* memalign(std::size_t alignment, std::size_t bytes) {
    count();
    return __libc_memalign(alignment, bytes);
}

void* aligned_alloc(std::size_t alignment, std::size_t bytes) {
    count();
    return __libc_memalign(alignment, bytes);
}

int posix_memalign(void** block, std::size_t alignment, std::size_t bytes) {
    count();
    if (alignment < sizeof(void*) || (alignment & (alignment - 1)) != 0) return EINVAL;
    const int error = errno;
    void* const made = __libc_memalign(alignment, bytes);
    errno = error;
    if (!made) return ENOMEM;
    *block = made;
    return 0;
}

}  // extern "C"
