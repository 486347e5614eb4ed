#pragma once
// Payloads, from what travels to what an extension gets.

#include <optional>
#include <variant>

#include "base/Identifiers.h"
#include "client/extension/Samples.h"

namespace lumacast::extension {

enum class Action : std::int64_t { Start = 1, Pause = 2, Resume = 3, Finish = 4 };

struct ActionPayload {
    Action action = Action::Start;
    std::optional<Dictionary> userInfo;
};

/// A payload without a meaning here: of a later daemon, or a frame without a picture.
struct UnknownPayload {};

using Payload = std::variant<UnknownPayload, ActionPayload, Frame, Sound, BundleIdentifier>;

/// None for a payload that says what it is and is not it: a member that is missing, of another type, or impossible. Samples have
/// no completion yet.
std::optional<Payload> payloadIn(const Dictionary& payload);

}  // namespace lumacast::extension
