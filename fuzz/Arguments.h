#pragma once
#include "base/Identifiers.h"
#include "base/MessageTables.h"
#include "fuzz/Input.h"

namespace lumacast::fuzz {

/// Arguments of the declared types with any values these types admit. `windows` are layers that there are, which a
/// random number would hardly hit.
Array argumentsFor(const MessageDeclaration& declaration, std::span<const ContextID> windows, Input& in);

}  // namespace lumacast::fuzz
