#pragma once
#include <filesystem>
#include <string>

#include "base/Value.h"

namespace lumacast::fuzz {

/// Writes `bytes` as `corpora/<target>/seed-<name>`. Throws when the disk refuses.
void writeSeed(const std::filesystem::path& corpora, const std::string& target, const std::string& name,
               const Data& bytes);

void writeArchiveSeeds(const std::filesystem::path& corpora);
void writeConversationSeeds(const std::filesystem::path& corpora);
void writeFrameSeeds(const std::filesystem::path& corpora);
void writeItemSeeds(const std::filesystem::path& corpora);
void writeMessageSeeds(const std::filesystem::path& corpora);
void writePayloadSeeds(const std::filesystem::path& corpora);
void writeRecoverySeeds(const std::filesystem::path& corpora);
void writeSettingsSeeds(const std::filesystem::path& corpora);
void writeSoundServerSeeds(const std::filesystem::path& corpora);
void writeValueSeeds(const std::filesystem::path& corpora);

}  // namespace lumacast::fuzz
