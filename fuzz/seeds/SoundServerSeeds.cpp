#include <string_view>
#include <utility>
#include <vector>

#include "fuzz/seeds/Seeds.h"

namespace lumacast::fuzz {

namespace {

/// Names of properties, see the target.
constexpr std::uint8_t kPid = 0, kBinary = 1, kMachine = 2, kKernelPid = 3, kPeer = 4, kServerType = 5;
constexpr std::uint8_t kNone = 255;

void append(Data& to, const Data& bytes) { to.insert(to.end(), bytes.begin(), bytes.end()); }

Data client(std::uint8_t index, const std::vector<std::pair<std::uint8_t, std::string_view>>& properties) {
    Data result{0, index, static_cast<std::uint8_t>(properties.size())};
    for (const auto& [name, value] : properties) {
        // A text ends with a zero byte; names of even numbers get one from the target.
        const bool needsEnd = name % 2 != 0;
        append(result, {name, static_cast<std::uint8_t>(value.size() + (needsEnd ? 1 : 0))});
        result.insert(result.end(), value.begin(), value.end());
        if (needsEnd) result.push_back(0);
    }
    return result;
}

Data playback(std::uint8_t index, std::uint8_t client, std::uint8_t sink, const Data& positions) {
    const auto channels = static_cast<std::uint8_t>(positions.size());
    Data result{1, index, client, sink, channels, channels};
    append(result, positions);
    return result;
}

Data piece(std::uint64_t counted, std::uint64_t age, std::uint32_t latency, std::uint16_t frames) {
    Data result{4};
    const auto number = [&result](std::uint64_t value, int bytes) {
        for (int i = 0; i < bytes; ++i) result.push_back(static_cast<std::uint8_t>(value >> 8 * i));
    };
    number(counted, 8);
    number(age, 8);
    number(latency, 4);
    number(0, 4);
    number(frames, 2);
    return result;
}

Data pieces(std::uint64_t first) {
    Data result;
    for (std::uint64_t i = 0; i < 8; ++i) append(result, piece(first + 882 * (i + 1), 20, 700, 882));
    return result;
}

}  // namespace

void writeSoundServerSeeds(const std::filesystem::path& corpora) {
    const auto write = [&](const char* name, const Data& bytes) { writeSeed(corpora, "sound_server", name, bytes); };

    Data pulse{0, 1};
    append(pulse, client(1, {{kPid, "41"}, {kBinary, "lumacastd"}, {kPeer, "UNIX socket client"}}));
    append(pulse, client(2, {{kPid, "77"},
                             {kBinary, "player"},
                             {kMachine, "0123456789abcdef0123456789abcdef"},
                             {kPeer, "UNIX socket client"}}));
    append(pulse, client(3, {{kPid, "78"}, {kBinary, "player"}, {kPeer, "TCP/IP client from 10.0.0.1"}}));
    append(pulse, playback(4, 2, 6, {1, 2}));
    append(pulse, playback(5, 3, 6, {0}));
    append(pulse, {2, 6, 7, 3, 8, 1, 7});
    append(pulse, pieces(0));
    write("pulseaudio", pulse);

    Data pipe{1, 1};
    append(pipe, client(1, {{kKernelPid, "30"}, {kPid, "41"}, {kBinary, "lumacastd"}, {kServerType, "unix"}}));
    append(pipe, client(2, {{kKernelPid, "30"}, {kPid, "77"}, {kBinary, "player"}, {kServerType, "unix"}}));
    append(pipe, client(3, {{kKernelPid, "79"}}));
    append(pipe, playback(4, 2, 6, {0}));
    append(pipe, playback(5, 3, 6, {1, 2, 5, 6, 3, 7}));
    append(pipe, {3, 8, 1, kNone, 3, 9, 1, 7});
    append(pipe, pieces(1'000'000));
    write("pipewire", pipe);

    Data nonsense{0, 1};
    append(nonsense, client(2, {{kPid, "999999999999"}, {kPid, "-3"}, {kKernelPid, "5"}, {kBinary, ""}}));
    append(nonsense, playback(4, 2, 6, Data(200, 9)));
    append(nonsense, piece(~0ull, ~0ull, ~0u, 65535));
    append(nonsense, piece(0, 0, 0, 0));
    write("nonsense", nonsense);
}

}  // namespace lumacast::fuzz
