#pragma once
#include <chrono>
#include <memory>
#include <mutex>
#include <optional>

#include "client/extension/Extension.h"
#include "extensions/live-push/EncoderLane.h"
#include "extensions/live-push/Sender.h"

namespace lumacast::extensions {

/// The extension: encodes a broadcast's samples and pushes them to a media server.
class LivePush final : public extension::Handler {
public:
    /// How long the end of a broadcast waits for what is on its way; less than the daemon's own patience.
    static constexpr std::chrono::seconds kEndLimit{5};

    explicit LivePush(Sender::Timing timing = {}) : timing_(timing) {}

    void connected(extension::Broadcast& broadcast) override { broadcast_ = &broadcast; }
    void started(std::optional<Dictionary> userInfo, extension::Completion completion) override;
    void finished(extension::Completion completion) override;
    void frame(extension::Frame frame) override;
    void sound(extension::Sound sound) override;
    void ended() override { end(); }

private:
    void report(const PushSettings& settings, const Sender::Report& now);
    void fail(std::int64_t code, const std::string& text);
    void end();

    const Sender::Timing timing_;
    extension::Broadcast* broadcast_ = nullptr;
    std::atomic<EncoderLane*> wantsKeyFrames_{nullptr};
    std::unique_ptr<Sender> sender_;
    std::unique_ptr<EncoderLane> encoder_;
};

}  // namespace lumacast::extensions
