#pragma once
// A client of the real daemon made of bytes, in the test's own process.

#include <chrono>
#include <filesystem>
#include <optional>
#include <string>

#include "base/MessageTables.h"
#include "tests/contract/RawPeer.h"
#include "tests/system/World.h"

namespace lumacast::test {

inline std::string servicePath(const World& world) { return world.path("run/lumacast/com.orvane.lumacastd.sock"); }

/// Makes the test's own process an application ("org.lumacast.Tests"), before the daemon looks.
inline void installThisProcess(World& world) {
    world.install("org.lumacast.Tests", "Tests", std::filesystem::read_symlink("/proc/self/exe").string());
}

inline Data requestState(std::uint64_t sequence) {
    return rawFrame(messageHeader(FrameKind::Request,
                                  static_cast<std::uint16_t>(DaemonMessage::SynchronousGetCurrentState), sequence),
                    encoded(Array{}));
}

/// Has said hello and asks for its state.
class RawClient {
public:
    explicit RawClient(const World& world) : peer_(servicePath(world)) { connected_ = peer_.hello() && readHello(); }

    bool isConnected() const { return connected_; }
    RawPeer& peer() { return peer_; }
    /// How long the answer took; none when the connection ended or nothing came within ten seconds.
    std::optional<std::chrono::nanoseconds> askForState() {
        const auto begin = std::chrono::steady_clock::now();
        if (!peer_.send(requestState(++sequence_))) return std::nullopt;
        const Data bytes = peer_.read(kFrameHeaderBytes);
        FrameHeader header;
        if (bytes.size() != kFrameHeaderBytes || readFrameHeader(bytes, header) != nullptr) return std::nullopt;
        if (header.kind != FrameKind::Reply || header.sequence != sequence_) return std::nullopt;
        if (peer_.read(header.valueBytes).size() != header.valueBytes) return std::nullopt;
        return std::chrono::steady_clock::now() - begin;
    }

private:
    bool readHello() { return peer_.read(kHelloBytes) == makeHello(); }

    RawPeer peer_;
    bool connected_ = false;
    std::uint64_t sequence_ = 0;
};

}  // namespace lumacast::test
