// A peer that does the daemon no good, until its standard input ends. Then it prints what came of it: connections made,
// of them ended by the daemon, connections refused, bytes taken, bytes read.
//
//   hostile_peer hello-trickle|trickle|connections|messages|requests|deaf|garbage RUNTIME_DIRECTORY
//
//   hello-trickle  200 connections, each says its hello a byte every tenth of a second and never the last one
//   trickle        a hello, then a large message, a byte every tenth of a second
//   connections    connects, says hello and leaves, again and again; half of them leave without a hello
//   messages       messages as fast as they are taken
//   requests       hundreds of requests at once, and their answers read
//   deaf           the same, whose answers it does not read
//   garbage        bytes that are no messages

#include <fcntl.h>
#include <poll.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <functional>
#include <map>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "base/Limits.h"
#include "base/MessageTables.h"
#include "tests/contract/RawPeer.h"

namespace {

using namespace lumacast;

/// All connections of the process, and what came of them. Sockets do not block.
class Peers {
public:
    using Peer = std::unique_ptr<RawPeer>;

    explicit Peers(std::string path) : path_(std::move(path)) {}

    /// A new connection; none when none was to be had.
    Peer connect() {
        auto peer = std::make_unique<RawPeer>();
        if (peer->descriptor() < 0 || !peer->connectTo(path_)) {
            ++refused_;
            return nullptr;
        }
        ::fcntl(peer->descriptor(), F_SETFL, O_NONBLOCK);
        ++made_;
        return peer;
    }
    /// Answers how many bytes were taken. A peer that was dropped is none afterwards.
    std::size_t send(Peer& peer, Bytes bytes) {
        const ssize_t sent = ::send(peer->descriptor(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
        if (sent < 0 && errno != EAGAIN) drop(peer);
        const auto count = static_cast<std::size_t>(std::max<ssize_t>(sent, 0));
        taken_ += count;
        return count;
    }
    /// Reads what is there.
    void read(Peer& peer) {
        std::array<std::uint8_t, 65'536> bytes;
        while (peer) {
            const ssize_t got = ::recv(peer->descriptor(), bytes.data(), bytes.size(), 0);
            if (got < 0 && errno == EAGAIN) return;
            if (got <= 0) drop(peer);
            read_ += static_cast<std::size_t>(std::max<ssize_t>(got, 0));
        }
    }
    void print() const { std::printf("%zu %zu %zu %zu %zu\n", made_, ended_, refused_, taken_, read_); }

private:
    void drop(Peer& peer) {
        ++ended_;
        peer.reset();
    }

    const std::string path_;
    std::size_t made_ = 0, ended_ = 0, refused_ = 0, taken_ = 0, read_ = 0;
};

/// Whether standard input has ended; waits so long for that.
bool isOver(int milliseconds) {
    pollfd input{STDIN_FILENO, POLLIN, 0};
    return ::poll(&input, 1, milliseconds) != 0;
}

Data requestState(std::uint64_t number) {
    return rawFrame(messageHeader(FrameKind::Request,
                                  static_cast<std::uint16_t>(DaemonMessage::SynchronousGetCurrentState), number),
                    encoded(Array{}));
}
Data pauseRecording(std::uint64_t number) {
    return rawFrame(messageHeader(FrameKind::Message, static_cast<std::uint16_t>(DaemonMessage::PauseRecording), number),
                    encoded(Array{}));
}
/// The beginning of a large message.
Data large() {
    FrameHeader header = messageHeader(FrameKind::Message,
                                       static_cast<std::uint16_t>(DaemonMessage::SetMicrophoneEnabled), 1);
    header.valueBytes = static_cast<std::uint32_t>(limitOf(Limit::MessageBytes) / 2);
    return rawFrame(header, Data(4096, 0), {}, true);
}
Data allButTheLast(Data bytes) {
    bytes.pop_back();
    return bytes;
}
Data garbage(std::uint64_t number) {
    std::mt19937_64 random(number);
    Data bytes(64);
    std::generate(bytes.begin(), bytes.end(), [&] { return static_cast<std::uint8_t>(random()); });
    return bytes;
}

constexpr int kTrickle = 100;  // ms
constexpr int kAgain = 5;      // ms until one that was dropped comes again

/// Byte by byte over each of `count` connections; those that have ended are made again.
void trickle(Peers& peers, std::size_t count, const Data& first, const Data& rest) {
    std::vector<std::pair<Peers::Peer, std::size_t>> all(count);
    const auto begin = [&] {
        for (auto& [peer, at] : all) {
            if (peer) continue;
            at = 0;
            if ((peer = peers.connect()) && !first.empty()) peers.send(peer, first);
        }
    };
    do {
        begin();
        for (auto& [peer, at] : all) {
            if (peer && at < rest.size()) at += peers.send(peer, Bytes(rest).subspan(at, 1));
            if (peer) peers.read(peer);
        }
    } while (!isOver(kTrickle));
}

/// `atATime` messages after each other, again and again, as fast as they are taken. `reads` the answers, or not.
void flood(Peers& peers, Data (*message)(std::uint64_t), std::size_t atATime, bool reads) {
    Peers::Peer peer;
    std::uint64_t number = 0;
    Data out;
    for (int wait = 0; !isOver(wait);) {
        if (!peer) {
            number = 0;
            out = makeHello();
            peer = peers.connect();
        }
        while (peer && out.size() < atATime * kFrameHeaderBytes) {
            const Data one = message(++number);
            out.insert(out.end(), one.begin(), one.end());
        }
        const std::size_t taken = peer ? peers.send(peer, out) : 0;
        out.erase(out.begin(), out.begin() + static_cast<std::ptrdiff_t>(taken));
        if (peer && reads) peers.read(peer);
        wait = !peer ? kAgain : taken == 0 ? 1 : 0;
    }
}

/// Comes and goes; every second one without a hello.
void comeAndGo(Peers& peers) {
    for (std::size_t i = 0; !isOver(0); ++i) {
        Peers::Peer peer = peers.connect();
        if (peer && i % 2 == 0) peers.send(peer, makeHello());
    }
}

}  // namespace

int main(int argc, char** argv) {
    const std::string what = argc == 3 ? argv[1] : "";
    const std::map<std::string, std::function<void(Peers&)>> all{
        {"hello-trickle", [](Peers& peers) { trickle(peers, 200, {}, allButTheLast(makeHello())); }},
        {"trickle", [](Peers& peers) { trickle(peers, 1, makeHello(), large()); }},
        {"connections", comeAndGo},
        {"messages", [](Peers& peers) { flood(peers, pauseRecording, 500, true); }},
        {"requests", [](Peers& peers) { flood(peers, requestState, 500, true); }},
        {"deaf", [](Peers& peers) { flood(peers, requestState, 1, false); }},
        {"garbage", [](Peers& peers) { flood(peers, garbage, 100, true); }},
    };
    const auto chosen = all.find(what);
    if (chosen == all.end()) {
        std::fprintf(stderr, "usage: hostile_peer hello-trickle|trickle|connections|messages|requests|deaf|garbage "
                             "RUNTIME_DIRECTORY\n");
        return 2;
    }
    Peers peers(std::string(argv[2]) + "/com.orvane.lumacastd.sock");
    chosen->second(peers);
    peers.print();
    return 0;
}
