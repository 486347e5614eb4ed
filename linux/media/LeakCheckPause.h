#pragma once
// Memory that a library keeps for itself is no leak of ours.

#if defined(__SANITIZE_ADDRESS__)
#define LC_LEAK_CHECK 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
#define LC_LEAK_CHECK 1
#endif
#endif

#ifdef LC_LEAK_CHECK
#include <sanitizer/lsan_interface.h>
#endif

namespace lumacast::media {

/// While this lives, what the thread allocates is not looked at by the leak checker; nothing at all without one.
class LeakCheckPause {
public:
    LeakCheckPause() {
#ifdef LC_LEAK_CHECK
        __lsan_disable();
#endif
    }
    ~LeakCheckPause() {
#ifdef LC_LEAK_CHECK
        __lsan_enable();
#endif
    }
    LeakCheckPause(const LeakCheckPause&) = delete;
    LeakCheckPause& operator=(const LeakCheckPause&) = delete;
};

}  // namespace lumacast::media
