#pragma once
// The host of an extension that takes clips, in the test's process.

#include <fcntl.h>

#include <cerrno>
#include <chrono>
#include <optional>
#include <span>
#include <string>

#include "extensions/hls-clips/HlsClips.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/extension/StandInHost.h"
#include "tests/extension/TestClips.h"

namespace lumacast::test {

/// The host of an extension that takes clips.
class ClipHost final {
public:
    explicit ClipHost(std::chrono::milliseconds patience = std::chrono::seconds(20)) : extension(patience) {
        host.keepTokens([this](std::span<const std::uint8_t> token) {
            TokenAnswer answer;
            answer.file = Fd(::open(std::string(token.begin(), token.end()).c_str(), O_RDONLY | O_CLOEXEC));
            answer.error = answer.file ? 0 : EACCES;
            return answer;
        });
    }
    /// Hands over the next clip and waits for its answer: the returned items by their titles; none when it was given
    /// up.
    std::optional<Dictionary> broadcast(const Dictionary& userInfo, bool isLast = false, const ClipPlan& plan = {}) {
        return handOver(clips.nextFile(plan), userInfo, isLast);
    }
    std::optional<Dictionary> handOver(const std::string& file, const Dictionary& userInfo, bool isLast = false) {
        host.beginClip(++requests, file, isLast, userInfo);
        const auto answer = host.answers().next();
        if (!answer || answer->number != static_cast<std::uint16_t>(ExtensionRequestHostMessage::CompleteRequest))
            return std::nullopt;
        Dictionary returned;
        const auto items = decodeItems(*answer->arguments[1].as<Array>());
        for (const ExtensionItem& item : items.value()) returned.set(item.attributedTitle, item.attachments.at(0).item);
        return returned;
    }
    static Dictionary infoOf(const std::optional<Dictionary>& returned) {
        const Value* info = returned ? returned->find(kItemServiceInfo) : nullptr;
        const auto* dictionary = info ? info->as<Dictionary>() : nullptr;
        return dictionary ? *dictionary : Dictionary();
    }

    ScratchDirectory scratch;
    TestClips clips{scratch};
    extensions::HlsClips extension;
    StandInHost host{extension};
    std::int64_t requests = 0;
};

}  // namespace lumacast::test
