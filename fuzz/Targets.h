#pragma once
// Everything that can be fuzzed, under its name. The name is the fuzzer's (`fuzz_<name>`), the dictionary's and the
// corpus folder's too.

#include <cstdint>
#include <span>
#include <string_view>

namespace lumacast::fuzz {

using Bytes = std::span<const std::uint8_t>;

struct Target {
    std::string_view name;
    /// Takes any bytes. Throws BrokenProperty when what must hold for every input does not; crashes, hangs and the
    /// sanitizers' findings are for the caller to notice. Deterministic; leaves nothing behind.
    void (*run)(Bytes input);
};

std::span<const Target> targets();
/// Throws std::out_of_range for a name that no target has.
const Target& targetNamed(std::string_view name);

// One file each.
void archives(Bytes input);
void authorityFile(Bytes input);
void broadcastSettings(Bytes input);
void connections(Bytes input);
void desktopEntry(Bytes input);
void deviceInfo(Bytes input);
void extensionItems(Bytes input);
void extensionManifest(Bytes input);
void frames(Bytes input);
void manifest(Bytes input);
void messages(Bytes input);
void movies(Bytes input);
void payloads(Bytes input);
void preferences(Bytes input);
void recoveries(Bytes input);
void soundServer(Bytes input);
void stringsTable(Bytes input);
void values(Bytes input);

}  // namespace lumacast::fuzz
