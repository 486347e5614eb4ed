#pragma once
#include <cstdint>
#include <memory>
#include <vector>

namespace lumacast {

class DisplayLayoutMonitor;

/// One element of what the display shows.
struct DisplayLayoutElement {
    std::int64_t level = 0;
};

/// Told of new layouts, on the main queue.
class DisplayLayoutObserver {
public:
    virtual ~DisplayLayoutObserver() = default;
    virtual void layoutMonitorDidUpdateDisplayLayout(DisplayLayoutMonitor* monitor,
                                                     const std::vector<DisplayLayoutElement>& layout) = 0;
};

/// Watches how applications share the display. Not every platform has one.
class DisplayLayoutMonitor {
public:
    virtual ~DisplayLayoutMonitor() = default;
    virtual void addObserver(std::weak_ptr<DisplayLayoutObserver> observer) = 0;
    /// Nothing happens when it observes nothing.
    virtual void removeObserver(DisplayLayoutObserver& observer) = 0;
    /// Ends it: nobody is told anything any more.
    virtual void invalidate() = 0;
};

}  // namespace lumacast
