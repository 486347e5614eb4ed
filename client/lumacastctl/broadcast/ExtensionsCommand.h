#pragma once
#include <chrono>
#include <cstdio>
#include <string>

#include "client/Answers.h"
#include "client/lumacastctl/Form.h"

namespace lumacast::ctl {

/// The table of installed upload extensions, or a sentence that there are none.
std::string extensionsText(const client::BroadcastExtensionsAnswer& answer);
/// The same as one line of JSON: {"extensions": [{"identifier", "displayName", "iconBytes"}]}.
std::string extensionsJson(const client::BroadcastExtensionsAnswer& answer);

/// `lumacastctl extensions`: asks the daemon whose sockets are in this directory. Answers the process's exit status.
/// Blocks for at most `limit`.
int showExtensions(const std::string& runtimeDirectory, Form form, std::FILE* out, std::FILE* complaints,
                   std::chrono::milliseconds limit = std::chrono::seconds(5));

}  // namespace lumacast::ctl
