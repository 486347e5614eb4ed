#include "linux/network/RoutingTable.h"

#include <linux/if.h>
#include <linux/netlink.h>
#include <linux/rtnetlink.h>
#include <sys/socket.h>
#include <sys/time.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <span>
#include <vector>

namespace lumacast {

namespace {

constexpr timeval kPatience{0, 200'000};
constexpr int kStrangersPassedOver = 16;

/// The value of one attribute of a message; none when it isn't there, or not as long as it should be.
template <class T>
std::optional<T> attribute(std::span<const char> attributes, unsigned short wanted) {
    while (attributes.size() >= sizeof(rtattr)) {
        rtattr header;
        std::memcpy(&header, attributes.data(), sizeof header);
        if (header.rta_len < sizeof header || header.rta_len > attributes.size()) break;
        if (header.rta_type == wanted && header.rta_len >= RTA_LENGTH(sizeof(T))) {
            T value;
            std::memcpy(&value, attributes.data() + RTA_LENGTH(0), sizeof value);
            return value;
        }
        attributes = attributes.subspan(std::min<std::size_t>(RTA_ALIGN(header.rta_len), attributes.size()));
    }
    return std::nullopt;
}

/// The errors with which the kernel says that there is no way: no route, refusing routes, a family it does not speak.
bool meansNoWay(int error) {
    switch (error) {
        case ENETUNREACH:
        case EHOSTUNREACH:
        case EINVAL:
        case EACCES:
        case ENODEV:
        case ENETDOWN:
        case EOPNOTSUPP:
        case EAFNOSUPPORT: return true;
        default: return false;
    }
}

}  // namespace

/// A question with room for its attributes.
struct RoutingTable::Request {
    nlmsghdr header{};
    union {
        rtmsg route;
        ifinfomsg device;
    } body{};
    char attributes[64] = {};
};

struct RoutingTable::Answer {
    int error = 0;
    std::vector<char> body;  ///< what follows the message's header
};

RoutingTable::RoutingTable() : socket_(::socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC, NETLINK_ROUTE)) {
    if (socket_ && ::setsockopt(socket_.get(), SOL_SOCKET, SO_RCVTIMEO, &kPatience, sizeof kPatience) != 0)
        socket_.reset();
}

std::optional<RoutingTable::Answer> RoutingTable::ask(Request& request) {
    sockaddr_nl kernel{};
    kernel.nl_family = AF_NETLINK;
    request.header.nlmsg_flags = NLM_F_REQUEST;
    request.header.nlmsg_seq = ++sequence_;
    const auto sent = ::sendto(socket_.get(), &request, request.header.nlmsg_len, 0,
                               reinterpret_cast<const sockaddr*>(&kernel), sizeof kernel);
    if (sent != static_cast<ssize_t>(request.header.nlmsg_len)) return std::nullopt;
    for (int strangers = 0; strangers < kStrangersPassedOver; ++strangers) {
        char bytes[8192];
        socklen_t length = sizeof kernel;
        const ssize_t got =
            ::recvfrom(socket_.get(), bytes, sizeof bytes, 0, reinterpret_cast<sockaddr*>(&kernel), &length);
        if (got < 0) return std::nullopt;
        nlmsghdr header;
        if (kernel.nl_pid != 0 || static_cast<std::size_t>(got) < sizeof header) continue;
        std::memcpy(&header, bytes, sizeof header);
        if (header.nlmsg_seq != sequence_ || header.nlmsg_len < sizeof header ||
            header.nlmsg_len > static_cast<std::size_t>(got))
            continue;
        Answer answer{0, {bytes + NLMSG_HDRLEN, bytes + header.nlmsg_len}};
        if (header.nlmsg_type == NLMSG_ERROR && answer.body.size() >= sizeof(nlmsgerr)) {
            nlmsgerr failure;
            std::memcpy(&failure, answer.body.data(), sizeof failure);
            answer.error = -failure.error;
        }
        return answer;
    }
    return std::nullopt;
}

std::optional<Way> RoutingTable::wayTo(const NetworkAddress& address) {
    if (!socket_) return std::nullopt;
    Request request;
    const rtattr destination{static_cast<unsigned short>(RTA_LENGTH(address.length())), RTA_DST};
    request.header.nlmsg_type = RTM_GETROUTE;
    request.header.nlmsg_len = NLMSG_LENGTH(sizeof(rtmsg)) + RTA_SPACE(address.length());
    request.body.route.rtm_family = static_cast<unsigned char>(address.family);
    request.body.route.rtm_dst_len = static_cast<unsigned char>(address.length() * 8);
    char* const at = reinterpret_cast<char*>(&request) + NLMSG_SPACE(sizeof(rtmsg));
    std::memcpy(at, &destination, sizeof destination);
    std::memcpy(at + RTA_LENGTH(0), address.bytes.data(), address.length());

    const auto answer = ask(request);
    if (!answer) return std::nullopt;
    if (answer->error != 0) return meansNoWay(answer->error) ? std::optional(Way::None) : std::nullopt;
    rtmsg route;
    if (answer->body.size() < sizeof route) return std::nullopt;
    std::memcpy(&route, answer->body.data(), sizeof route);
    if (route.rtm_type != RTN_UNICAST && route.rtm_type != RTN_LOCAL) return Way::None;
    const auto device = attribute<int>(std::span(answer->body).subspan(NLMSG_ALIGN(sizeof route)), RTA_OIF);
    return device ? stateOf(*device) : std::nullopt;
}

std::optional<Way> RoutingTable::stateOf(int device) {
    Request request;
    request.header.nlmsg_type = RTM_GETLINK;
    request.header.nlmsg_len = NLMSG_LENGTH(sizeof(ifinfomsg));
    request.body.device.ifi_family = AF_UNSPEC;
    request.body.device.ifi_index = device;
    const auto answer = ask(request);
    if (!answer) return std::nullopt;
    if (answer->error != 0) return answer->error == ENODEV ? std::optional(Way::None) : std::nullopt;  // gone meanwhile
    ifinfomsg link;
    if (answer->body.size() < sizeof link) return std::nullopt;
    std::memcpy(&link, answer->body.data(), sizeof link);
    // Devices without a state of their own (loopback, tunnels) say "unknown"; RFC 2863, 3.1.12.
    const auto state =
        attribute<std::uint8_t>(std::span(answer->body).subspan(NLMSG_ALIGN(sizeof link)), IFLA_OPERSTATE);
    const bool isRunning = !state || *state == IF_OPER_UP || *state == IF_OPER_UNKNOWN;
    return (link.ifi_flags & IFF_UP) != 0 && isRunning ? Way::Usable : Way::NeedsConnection;
}

}  // namespace lumacast
