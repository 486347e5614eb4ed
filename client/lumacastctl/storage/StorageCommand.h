#pragma once
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <string>

#include "client/lumacastctl/Form.h"

namespace lumacast::ctl {

/// What `lumacastctl storage` shows.
enum class StoragePart { All, Purgeable, List };

/// Longer than the daemon takes to say that its disk does not answer.
inline constexpr std::chrono::seconds kStorageLimit{65};

/// `lumacastctl storage [purgeable | list]`: asks the daemon whose runtime directory this is and prints to `out`, or to
/// `complaints` why there is no answer and what to do. Answers the process's exit status. Blocks for at most `limit`.
int showStorage(const std::string& runtimeDirectory, StoragePart part, Form form, std::FILE* out, std::FILE* complaints,
                std::chrono::milliseconds limit = kStorageLimit);

/// `lumacastctl storage purge URGENCY`: the same for a purge, which is answered when it has ended.
int purgeStorage(const std::string& runtimeDirectory, std::int32_t urgency, Form form, std::FILE* out,
                 std::FILE* complaints, std::chrono::milliseconds limit = kStorageLimit);

}  // namespace lumacast::ctl
