#include "linux/display/CloneSelection.h"

namespace lumacast::x11 {

CloneSelection::Wanted CloneSelection::wanted() const {
    const std::lock_guard lock(mutex_);
    return wanted_;
}

std::uint64_t CloneSelection::version() const {
    const std::lock_guard lock(mutex_);
    return wanted_.version;
}

void CloneSelection::setMode(int mode) {
    const std::lock_guard lock(mutex_);
    if (wanted_.mode == mode) return;
    wanted_.mode = mode;
    changed();
}

void CloneSelection::setContexts(const std::set<ContextID>& contexts) {
    const std::lock_guard lock(mutex_);
    if (wanted_.contexts == contexts) return;
    wanted_.contexts = contexts;
    changed();
}

void CloneSelection::forget(ContextID context) {
    const std::lock_guard lock(mutex_);
    if (wanted_.contexts.erase(context) != 0) changed();
}

void CloneSelection::watch(std::weak_ptr<Wake> wake) {
    const std::lock_guard lock(mutex_);
    watchers_.push_back(std::move(wake));
}

void CloneSelection::changed() {
    ++wanted_.version;
    std::erase_if(watchers_, [](const auto& watcher) {
        const auto wake = watcher.lock();
        if (wake) wake->signal();
        return wake == nullptr;
    });
}

}  // namespace lumacast::x11
