#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>

#include <atomic>
#include <chrono>
#include <cstring>
#include <functional>
#include <future>

#include "linux/network/LinuxNetworkReachability.h"
#include "linux/network/RoutingTable.h"
#include "tests/contract/HeardSound.h"
#include "tests/contract/OwnNetwork.h"
#include "tests/fakes/FakeNetworkReachability.h"

namespace lumacast {
namespace {

using test::ip;
using test::makeDevice;
using test::PacketEar;
using test::withOwnNetwork;
using Flags = std::optional<std::uint32_t>;

constexpr std::uint32_t kReachable = NetworkReachability::kReachable;
constexpr std::uint32_t kLater = kReachable | NetworkReachability::kConnectionRequired;
constexpr const char* kHost = "probe.example";

NetworkAddress address(const char* text) {
    return NetworkAddress::parse(text).value();
}
/// Kept for documentation: nobody is there.
NetworkAddress hostAddress() {
    return address("198.51.100.7");
}

LinuxNetworkReachability::Options resolvingTo(std::vector<NetworkAddress> addresses) {
    return {[addresses](const std::string&) { return addresses; }, std::chrono::seconds(30)};
}

class NetworkReachabilityWorld {
public:
    enum class Network { Usable, WaitsForAConnection, Nowhere, Unreadable };

    virtual ~NetworkReachabilityWorld() = default;
    /// The flags of the way to a host in such a network.
    virtual Flags flagsIn(Network network) = 0;
};

class FakeNetworkReachabilityWorld final : public NetworkReachabilityWorld {
public:
    Flags flagsIn(Network network) override {
        FakeNetworkReachability reachability;
        switch (network) {
            case Network::Usable: reachability.setFlags(kReachable); break;
            case Network::WaitsForAConnection: reachability.setFlags(kLater); break;
            case Network::Nowhere: reachability.setFlags(0); break;
            case Network::Unreadable: break;
        }
        return reachability.flags(kHost);
    }
};

class PortNetworkReachabilityWorld final : public NetworkReachabilityWorld {
public:
    Flags flagsIn(Network network) override {
        const test::SharedWithProcesses<Flags> flags;
        const bool possible = withOwnNetwork([&] {
            EXPECT_TRUE(makeDevice());
            EXPECT_TRUE(network == Network::Nowhere || ip("route add default via 10.77.0.2"));
            EXPECT_TRUE(network != Network::WaitsForAConnection || ip("link set far down"));
            EXPECT_TRUE(network != Network::Unreadable || test::forbidNetlink());
            *flags = LinuxNetworkReachability(resolvingTo({hostAddress()})).flags(kHost);
        });
        EXPECT_TRUE(possible) << "this user may not make a network of its own";
        return *flags;
    }
};

using Maker = std::function<std::unique_ptr<NetworkReachabilityWorld>()>;
using Network = NetworkReachabilityWorld::Network;

class NetworkReachabilityContract : public ::testing::TestWithParam<Maker> {
protected:
    std::unique_ptr<NetworkReachabilityWorld> world_ = GetParam()();
};

TEST_P(NetworkReachabilityContract, AWayThatCanBeUsedIsReachable) {
    EXPECT_EQ(world_->flagsIn(Network::Usable), kReachable);
}
TEST_P(NetworkReachabilityContract, AWayThatNeedsAConnectionSaysSo) {
    EXPECT_EQ(world_->flagsIn(Network::WaitsForAConnection), kLater);
}
TEST_P(NetworkReachabilityContract, NoWayIsNoFlag) {
    EXPECT_EQ(world_->flagsIn(Network::Nowhere), 0u);
}
TEST_P(NetworkReachabilityContract, WhatCannotBeReadIsNone) {
    EXPECT_EQ(world_->flagsIn(Network::Unreadable), std::nullopt);
}

INSTANTIATE_TEST_SUITE_P(Fake, NetworkReachabilityContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeNetworkReachabilityWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, NetworkReachabilityContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortNetworkReachabilityWorld>(); })));

Flags flagsTo(std::vector<NetworkAddress> addresses) {
    return LinuxNetworkReachability(resolvingTo(std::move(addresses))).flags(kHost);
}

/// What waits for a connection although the cable is there, e.g. for a modem that dials on demand.
bool makeDormant() {
    return ip("link set near mode dormant") && ip("link set far down") && ip("link set far up");
}

TEST(LinuxNetworkReachability, NothingIsSentToTheHost) {
    ASSERT_TRUE(withOwnNetwork([] {
        ASSERT_TRUE(makeDevice() && ip("route add default via 10.77.0.2") && ip("-6 route add default dev near"));
        const NetworkAddress host = hostAddress(), newer = address("2001:db8:7::7");
        PacketEar ear;
        ASSERT_TRUE(ear.isListening());
        ear.heardOf(host);
        EXPECT_EQ(flagsTo({host}), kReachable);
        EXPECT_EQ(ear.heardOf(host), 0);
        EXPECT_EQ(flagsTo({newer}), kReachable);
        EXPECT_EQ(ear.heardOf(newer), 0);
        EXPECT_EQ(flagsTo({}), 0u);
        EXPECT_EQ(ear.heardOf(host), 0);
        // The ear hears: a packet to the host makes the machine look for its neighbour.
        const Fd socket(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
        sockaddr_in target{};
        target.sin_family = AF_INET;
        target.sin_port = htons(9);
        std::memcpy(&target.sin_addr, host.bytes.data(), 4);
        ASSERT_EQ(::sendto(socket.get(), "x", 1, 0, reinterpret_cast<const sockaddr*>(&target), sizeof target), 1);
        EXPECT_TRUE(eventually([&] { return ear.heardOf(host) > 0; }));
    }));
}

TEST(LinuxNetworkReachability, TheBestOfAllAddressesCounts) {
    ASSERT_TRUE(withOwnNetwork([] {
        ASSERT_TRUE(makeDevice());
        const NetworkAddress near = address("10.77.0.9"), nowhere = hostAddress(), newer = address("2001:db8:7::7");
        EXPECT_EQ(flagsTo({nowhere, near}), kReachable);
        EXPECT_EQ(flagsTo({newer, nowhere}), 0u);
        ASSERT_TRUE(ip("link set far down"));
        EXPECT_EQ(flagsTo({nowhere, near, newer}), kLater);
    }));
}

TEST(LinuxNetworkReachability, RoutesThatRefuseAreNoWay) {
    ASSERT_TRUE(withOwnNetwork([] {
        ASSERT_TRUE(makeDevice() && ip("route add default via 10.77.0.2"));
        for (const char* kind : {"blackhole", "unreachable", "prohibit"}) {
            ASSERT_TRUE(ip(std::string("route replace ") + kind + " 198.51.100.0/24")) << kind;
            EXPECT_EQ(flagsTo({hostAddress()}), 0u) << kind;
        }
        EXPECT_EQ(flagsTo({address("203.0.113.1")}), kReachable);
        EXPECT_EQ(flagsTo({address("224.0.0.1")}), 0u);
    }));
}

TEST(LinuxNetworkReachability, ADeviceThatWaitsForItsConnectionNeedsOne) {
    ASSERT_TRUE(withOwnNetwork([] {
        ASSERT_TRUE(makeDevice() && ip("route add default via 10.77.0.2") && makeDormant());
        // The kernel takes its time over it, and would take back what was said meanwhile.
        ASSERT_TRUE(eventually([] { return ip("link show near | grep -q 'state DORMANT'"); }));
        EXPECT_EQ(flagsTo({hostAddress()}), kLater);
        // A name can be resolved only over that connection.
        EXPECT_EQ(flagsTo({}), kLater);
        ASSERT_TRUE(ip("link set near state up"));
        EXPECT_TRUE(eventually([] { return flagsTo({hostAddress()}) == kReachable; }));
        EXPECT_EQ(flagsTo({}), 0u);
        ASSERT_TRUE(ip("link set near down"));
        EXPECT_EQ(flagsTo({hostAddress()}), 0u);
        EXPECT_EQ(flagsTo({}), 0u);
    }));
}

TEST(LinuxNetworkReachability, TheSystemsResolverIsNotWaitedForWithoutLimit) {
    ASSERT_TRUE(withOwnNetwork([] {
        LinuxNetworkReachability reachability;
        const auto before = std::chrono::steady_clock::now();
        EXPECT_EQ(reachability.flags("nobody.invalid"), 0u);
        EXPECT_LT(std::chrono::steady_clock::now() - before, std::chrono::seconds(4));
        EXPECT_EQ(reachability.flags("localhost"), 0u);  // even that device is down
        ASSERT_TRUE(ip("link set lo up"));
        EXPECT_EQ(reachability.flags("localhost"), kReachable);
        EXPECT_EQ(reachability.flags("127.0.0.1"), kReachable);
    }));
}

TEST(LinuxNetworkReachability, AResolverThatHangsKeepsTwoThreadsAndNoCaller) {
    std::promise<void> end;
    const auto ended = end.get_future().share();
    const auto calls = std::make_shared<std::atomic<int>>(0);
    {
        LinuxNetworkReachability reachability({[ended, calls](const std::string&) {
                                                   ++*calls;
                                                   ended.wait();
                                                   return std::vector<NetworkAddress>{};
                                               },
                                               std::chrono::milliseconds(50)});
        const auto before = std::chrono::steady_clock::now();
        for (int i = 0; i < 6; ++i) reachability.flags(kHost);
        EXPECT_LT(std::chrono::steady_clock::now() - before, std::chrono::seconds(5));
        EXPECT_LE(*calls, 2);
        end.set_value();
    }
    EXPECT_GE(*calls, 1);
}

TEST(LinuxNetworkReachability, WhatIsNoHostNameIsNotAskedFor) {
    const auto calls = std::make_shared<std::atomic<int>>(0);
    LinuxNetworkReachability reachability({[calls](const std::string&) {
                                               ++*calls;
                                               return std::vector{hostAddress()};
                                           },
                                           std::chrono::seconds(30)});
    for (const std::string& name : {std::string(), std::string(254, 'a'), std::string("a\0b", 3), std::string("a b"),
                                    std::string("a\nb"), std::string("\xc3\xa4.example")})
        EXPECT_EQ(reachability.flags(name), std::nullopt) << name;
    EXPECT_EQ(*calls, 0);
    (void)reachability.flags(std::string(253, 'a'));
    EXPECT_EQ(*calls, 1);
}

TEST(LinuxNetworkReachability, AddressesAreReadAsTheyAreWritten) {
    EXPECT_EQ(NetworkAddress::parse("198.51.100.7")->bytes[3], 7);
    EXPECT_EQ(NetworkAddress::parse("2001:db8::7")->length(), 16u);
    EXPECT_EQ(NetworkAddress::parse("198.51.100"), std::nullopt);
    EXPECT_EQ(NetworkAddress::parse("probe.example"), std::nullopt);
}

}  // namespace
}  // namespace lumacast
