#pragma once
#include "platform/IpcEndpoint.h"

namespace lumacast {

/// An endpoint that stands for itself only.
class NamelessEndpoint final : public IpcEndpoint {};

}  // namespace lumacast
