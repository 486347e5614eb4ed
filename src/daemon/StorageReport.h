#pragma once
#include <optional>
#include <string>
#include <vector>

#include "platform/FileSystem.h"
#include "platform/StoragePurgeService.h"
#include "support/TempStore.h"

namespace lumacast {

/// The temporary movies for the administrator: "temporaryDirectory", "freeBytes", "purgeableBytes" as the purge service
/// is told it, "filesBytes" for all files together, and "files", the newest first: "name", "bytes", "modified" (seconds
/// since 1970) and "recording", which is true for the paths in `beingRecorded`. A file that vanishes or can't be read
/// meanwhile has its name alone; a directory that can't be listed adds "error". Waits for the disk: not on the request
/// lane.
Dictionary storageReport(FileSystem& fileSystem, const TempStore& store, const std::optional<PurgeRecord>& purgeable,
                         const std::vector<std::string>& beingRecorded);

}  // namespace lumacast
