// Peers of the real daemon's socket that break its rules, or do not read: each is dropped with one line, and everybody
// else is served.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/resource.h>

#include <algorithm>
#include <functional>
#include <sstream>

#include "base/Limits.h"
#include "tests/system/MovingWindow.h"
#include "tests/system/RawClient.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

constexpr char kDropped[] = "IPC: connection of process ";

std::vector<std::string> linesWith(const std::string& text, const std::string& part) {
    std::vector<std::string> result;
    std::istringstream lines(text);
    for (std::string line; std::getline(lines, line);)
        if (line.find(part) != std::string::npos) result.push_back(line);
    return result;
}

Data microphone(std::uint64_t sequence, const Data& value, std::uint8_t handles = 0, bool keepSizes = false) {
    FrameHeader header = messageHeader(FrameKind::Message, static_cast<std::uint16_t>(DaemonMessage::SetMicrophoneEnabled),
                                       sequence, handles);
    if (keepSizes) header.valueBytes = static_cast<std::uint32_t>(limitOf(Limit::MessageBytes));
    return rawFrame(header, value, {}, keepSizes);
}

Data nested(std::uint64_t depth) {
    Data bytes;
    for (std::uint64_t i = 0; i < depth; ++i) bytes.insert(bytes.end(), {9, 1, 0, 0, 0});
    bytes.push_back(0);
    return bytes;
}

/// A request whose one descriptor has this record.
Data withRecord(const HandleRecord& record) {
    Data records;
    appendRecord(records, record);
    return rawFrame(messageHeader(FrameKind::Request,
                                  static_cast<std::uint16_t>(DaemonMessage::SaveVideoToCameraRoll), 1, 1),
                    Data{9, 1, 0, 0, 0, 13, 0}, records);
}

/// One way to break the rules. What is sent may not all be taken.
struct Offence {
    const char* name;
    std::function<void(RawPeer&)> commit;
};

const std::vector<Offence>& offences() {
    static const std::vector<Offence> all{
        {"a hello that is none", [](RawPeer& peer) { peer.send(Data(16, 'x')); }},
        {"descriptors with the hello", [](RawPeer& peer) { peer.send(makeHello(), {0}); }},
        {"a malformed frame",
         [](RawPeer& peer) {
             peer.hello();
             peer.send(Data(kFrameHeaderBytes, 0xFF));
         }},
        {"a truncated message",
         [](RawPeer& peer) {
             peer.hello();
             peer.send(Bytes(microphone(1, encoded(Array{true}))).first(kFrameHeaderBytes + 2));
             ::shutdown(peer.descriptor(), SHUT_WR);
         }},
        {"an oversized message",
         [](RawPeer& peer) {
             peer.hello();
             peer.send(microphone(1, {}, 0, true));
         }},
        {"arrays in arrays",
         [](RawPeer& peer) {
             peer.hello();
             peer.send(microphone(1, nested(100'000)));
         }},
        {"arguments of other types",
         [](RawPeer& peer) {
             peer.hello();
             peer.send(microphone(1, encoded(Array{"text", 1.5})));
         }},
        {"an unknown message",
         [](RawPeer& peer) {
             peer.hello();
             peer.send(rawFrame(messageHeader(FrameKind::Message, 999, 1), encoded(Array{})));
         }},
        {"a message sent twice",
         [](RawPeer& peer) {
             peer.hello();
             const Data once = microphone(1, encoded(Array{true}));
             peer.send(once);
             peer.send(once);
         }},
        {"a reply to nothing",
         [](RawPeer& peer) {
             peer.hello();
             peer.send(rawFrame(messageHeader(FrameKind::Reply, 0, 7), encoded(Array{})));
         }},
        {"too many descriptors",
         [](RawPeer& peer) {
             peer.hello();
             peer.send(microphone(1, encoded(Array{true})),
                       std::vector<int>(limitOf(Limit::HandlesPerMessage) + 1, 0));
         }},
        {"descriptors that nothing speaks of",
         [](RawPeer& peer) {
             peer.hello();
             peer.send(microphone(1, encoded(Array{true})), {0, 1});
         }},
        {"a descriptor of the wrong kind",
         [](RawPeer& peer) {
             peer.hello();
             const Fd counter(::eventfd(0, EFD_CLOEXEC));
             peer.send(withRecord(EndpointRecord{}), {counter.get()});
         }},
        {"memory that could shrink",
         [](RawPeer& peer) {
             peer.hello();
             const Fd memory = planeMemory(4096, 0);
             peer.send(withRecord(PlaneRecord{1, 16, 16, 64, 1, {}}), {memory.get()});
         }},
    };
    return all;
}

TEST(HostileClients, EachIsDroppedWithOneLineAndEverybodyElseIsServed) {
    World world;
    installThisProcess(world);
    world.startDaemon();
    const auto application = world.application(kMoving);
    ASSERT_TRUE(application->waitForFrame(1));
    const std::uint32_t first = application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(0.3));
    const std::size_t descriptors = world.daemonDescriptors();
    std::size_t lines = 0;
    for (int round = 0; round < 3; ++round) {
        for (const Offence& offence : offences()) {
            SCOPED_TRACE(offence.name);
            RawPeer peer(servicePath(world));
            offence.commit(peer);
            EXPECT_TRUE(peer.seesEnd());
            EXPECT_TRUE(waitUntil([&] { return linesWith(world.daemonLog(), kDropped).size() > lines; }));
            EXPECT_TRUE(application->ask("state").starts_with("state ")) << "not served";
            const auto all = linesWith(world.daemonLog(), kDropped);
            EXPECT_EQ(all.size(), lines + 1) << "one line each";
            lines = all.size();
        }
    }
    ASSERT_TRUE(application->waitForFrame(first + 30));
    EXPECT_TRUE(waitUntil([&] { return world.daemonDescriptors() <= descriptors; }))
        << descriptors << " before, now " << world.daemonDescriptors();
    EXPECT_GT(picturesOf(application->stop()).size(), 20u);
}

TEST(HostileClients, OneThatNeverReadsCostsBoundedMemoryAndNobodyElse) {
    World world;
    installThisProcess(world);
    world.startDaemon();
    const auto application = world.application(kMoving);
    ASSERT_TRUE(application->waitForFrame(1));
    ASSERT_TRUE(application->ask("state").starts_with("state "));
    const std::size_t before = world.daemonNumber("VmRSS");
    std::size_t largest = before, sent = 0;
    RawClient deaf(world);
    ASSERT_TRUE(deaf.isConnected());
    ASSERT_EQ(::fcntl(deaf.peer().descriptor(), F_SETFL, O_NONBLOCK), 0);
    // As many requests as it takes; it reads none of the answers.
    const auto isDropped = [&] {
        for (std::size_t i = 0; i < 500; ++i) {
            if (!deaf.peer().send(requestState(sent + 1))) break;
            ++sent;
        }
        largest = std::max(largest, world.daemonNumber("VmRSS"));
        EXPECT_TRUE(application->ask("state").starts_with("state ")) << "not served";
        pollfd end{deaf.peer().descriptor(), 0, 0};
        return ::poll(&end, 1, 0) == 1 && (end.revents & POLLHUP) != 0;
    };
    EXPECT_TRUE(waitUntil(isDropped, std::chrono::seconds(120)));
    std::printf("a deaf client: %zu requests sent, memory grew by at most %zu kB\n", sent, largest - before);
    EXPECT_TRUE(waitUntil([&] { return linesWith(world.daemonLog(), kDropped).size() == 1; })) << world.daemonLog();
#ifndef LC_SANITIZED  // a sanitizer keeps what was freed on purpose
    // What may wait for it, its copies on the way, and as much again for the allocator.
    EXPECT_LE(largest - before, 2 * limitOf(Limit::QueuedBytesPerReader) / 1024 + 8192);
#endif
    EXPECT_TRUE(application->ask("state").starts_with("state "));
}

TEST(HostileClients, ASilentCrowdKeepsNobodyOut) {
    World world;
    // What an ordinary session starts with; the daemon asks for more itself.
    rlimit before{};
    ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &before), 0);
    const rlimit ordinary{std::min<rlim_t>(1024, before.rlim_max), before.rlim_max};
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &ordinary), 0);
    world.startDaemon();
    rlimit daemons{};
    ASSERT_EQ(::prlimit(world.daemon().pid(), RLIMIT_NOFILE, nullptr, &daemons), 0);
    EXPECT_GE(daemons.rlim_cur, std::min<rlim_t>(2 * limitOf(Limit::ConnectionsPerUser), before.rlim_max));
    const rlimit wide{std::max<rlim_t>(before.rlim_cur, std::min<rlim_t>(4096, before.rlim_max)), before.rlim_max};
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &wide), 0);
    const std::size_t descriptors = world.daemonDescriptors();
    std::vector<RawPeer> silent;
    for (std::uint64_t i = 0; i < limitOf(Limit::ConnectionsPerUser); ++i) silent.emplace_back(servicePath(world));
    const auto application = world.application(kMoving);
    ASSERT_TRUE(application->waitForFrame(1));
    EXPECT_TRUE(application->ask("state").starts_with("state ")) << world.daemonLog();
    EXPECT_EQ(linesWith(world.daemonLog(), "too many without a hello").size(), 1u) << "one line for all of them";
    silent.clear();
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &before), 0);
    EXPECT_TRUE(waitUntil([&] { return world.daemonDescriptors() <= descriptors + 8; }));
}

}  // namespace
}  // namespace lumacast::test
