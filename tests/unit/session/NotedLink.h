#pragma once
#include <functional>
#include <utility>
#include <vector>

#include "session/LCRecordingSession.h"

namespace lumacast {

/// A link to an extension that answers when the test says so.
class NotedLink final : public LCBroadcastExtensionProxy {
public:
    explicit NotedLink(const SessionServices& services)
        : LCBroadcastExtensionProxy(services.platform, services.errors) {}
    void processPayload(Dictionary payload, std::function<void()> completion) override {
        payloads.push_back(std::move(payload));
        if (whenTold) whenTold();
        if (answers)
            completion();
        else
            pending.push_back(std::move(completion));
    }
    void invalidateConnection() override { ++invalidations; }

    std::vector<Dictionary> payloads;
    std::vector<std::function<void()>> pending;
    std::function<void()> whenTold;
    bool answers = true;
    int invalidations = 0;
};

}  // namespace lumacast
