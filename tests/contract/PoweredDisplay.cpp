#include "tests/contract/PoweredDisplay.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <cstddef>
#include <cstring>
#include <optional>
#include <set>
#include <string_view>

namespace lumacast::test {
namespace {

// Of the core protocol, and what this adds to it.
constexpr std::uint8_t kQueryExtension = 98, kGetInputFocus = 43, kOurOpcode = 250, kInfo = 7;
constexpr std::uint8_t kReply = 1, kGenericEvent = 35;
constexpr std::size_t kAnswer = 32;

using Bytes = std::vector<std::uint8_t>;

sockaddr_un addressOf(const std::string& path, bool abstract, socklen_t& length) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path + (abstract ? 1 : 0), path.data(), path.size());
    length = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + path.size() + 1);
    return address;
}

std::uint32_t number(const Bytes& bytes, std::size_t at, std::size_t size) {
    std::uint32_t value = 0;
    std::memcpy(&value, bytes.data() + at, size);  // little-endian on both sides
    return value;
}

std::size_t padded(std::size_t size) {
    return (size + 3) / 4 * 4;
}

/// What came, with the descriptors; false when the other end has gone.
bool receive(int socket, Bytes& into, std::vector<Fd>* descriptors) {
    std::array<std::uint8_t, 65536> part;
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int) * 16)> control;
    iovec data{part.data(), part.size()};
    msghdr message{};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    const ssize_t got = ::recvmsg(socket, &message, MSG_CMSG_CLOEXEC);
    if (got <= 0) return false;
    into.insert(into.end(), part.begin(), part.begin() + got);
    for (cmsghdr* header = CMSG_FIRSTHDR(&message); header != nullptr; header = CMSG_NXTHDR(&message, header))
        for (std::size_t at = 0; CMSG_LEN((at + 1) * sizeof(int)) <= header->cmsg_len; ++at) {
            int descriptor = -1;
            std::memcpy(&descriptor, CMSG_DATA(header) + at * sizeof(int), sizeof descriptor);
            Fd own(descriptor);
            if (descriptors != nullptr) descriptors->push_back(std::move(own));
        }
    return true;
}

bool sendAll(int socket, const Bytes& bytes, std::vector<Fd>* descriptors) {
    std::size_t sent = 0;
    while (sent < bytes.size()) {
        alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int) * 16)> control{};
        iovec data{const_cast<std::uint8_t*>(bytes.data()) + sent, bytes.size() - sent};
        msghdr message{};
        message.msg_iov = &data;
        message.msg_iovlen = 1;
        if (descriptors != nullptr && !descriptors->empty()) {
            message.msg_control = control.data();
            message.msg_controllen = CMSG_SPACE(sizeof(int) * descriptors->size());
            cmsghdr* const header = CMSG_FIRSTHDR(&message);
            header->cmsg_level = SOL_SOCKET;
            header->cmsg_type = SCM_RIGHTS;
            header->cmsg_len = CMSG_LEN(sizeof(int) * descriptors->size());
            for (std::size_t i = 0; i < descriptors->size(); ++i) {
                const int descriptor = (*descriptors)[i].get();
                std::memcpy(CMSG_DATA(header) + i * sizeof(int), &descriptor, sizeof descriptor);
            }
        }
        const ssize_t took = ::sendmsg(socket, &message, MSG_NOSIGNAL);
        if (took <= 0) return false;
        if (descriptors != nullptr) descriptors->clear();
        sent += static_cast<std::size_t>(took);
    }
    return true;
}

}  // namespace

struct PoweredDisplay::Relay {
    Fd client, server;
    Bytes requests, answers;
    std::vector<Fd> descriptors;
    bool clientIsIn = false, serverIsIn = false;  ///< past the greeting
    std::uint16_t sequence = 0;
    std::set<std::uint16_t> askedForExtension, askedForPower;
};

PoweredDisplay::PoweredDisplay(const std::string& behind)
    : behind_(behind), name_(":" + std::to_string(40000 + ::getpid() % 20000)) {
    socklen_t length = 0;
    const sockaddr_un address = addressOf("/tmp/.X11-unix/X" + name_.substr(1), true, length);
    listener_.reset(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    if (::bind(listener_.get(), reinterpret_cast<const sockaddr*>(&address), length) != 0 ||
        ::listen(listener_.get(), 4) != 0)
        name_.clear();
    thread_ = std::thread([this] { serve(); });
}

PoweredDisplay::~PoweredDisplay() {
    over_.signal();
    thread_.join();
}

void PoweredDisplay::serve() {
    while (true) {
        std::array<pollfd, 2> polled{{{over_.descriptor(), POLLIN, 0}, {listener_.get(), POLLIN, 0}}};
        ::poll(polled.data(), polled.size(), -1);
        if (polled[0].revents != 0) return;
        Fd client(::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
        if (client) relay(std::move(client));
    }
}

void PoweredDisplay::relay(Fd client) {
    Relay relay;
    relay.client = std::move(client);
    socklen_t length = 0;
    const sockaddr_un address = addressOf("/tmp/.X11-unix/X" + behind_.substr(1), false, length);
    relay.server.reset(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    if (::connect(relay.server.get(), reinterpret_cast<const sockaddr*>(&address), length) != 0) return;
    while (true) {
        std::array<pollfd, 3> polled{
            {{over_.descriptor(), POLLIN, 0}, {relay.client.get(), POLLIN, 0}, {relay.server.get(), POLLIN, 0}}};
        ::poll(polled.data(), polled.size(), -1);
        if (polled[0].revents != 0) return;
        if (polled[1].revents != 0 &&
            (!receive(relay.client.get(), relay.requests, &relay.descriptors) || !passRequests(relay)))
            return;
        if (polled[2].revents != 0 && (!receive(relay.server.get(), relay.answers, nullptr) || !passAnswers(relay)))
            return;
    }
}

bool PoweredDisplay::passRequests(Relay& relay) {
    Bytes& in = relay.requests;
    Bytes out;
    std::size_t at = 0;
    while (in.size() - at >= 12 || (relay.clientIsIn && in.size() - at >= 4)) {
        std::size_t size = 0;
        if (!relay.clientIsIn)
            size = 12 + padded(number(in, at + 6, 2)) + padded(number(in, at + 8, 2));
        else if (number(in, at + 2, 2) != 0)
            size = number(in, at + 2, 2) * 4u;
        else
            size = in.size() - at >= 8 ? number(in, at + 4, 4) * 4u : in.size() + 1;
        if (in.size() - at < size) break;
        if (relay.clientIsIn) {
            ++relay.sequence;
            if (in[at] == kQueryExtension &&
                std::string_view(reinterpret_cast<const char*>(in.data() + at + 8), number(in, at + 4, 2)) == "DPMS")
                relay.askedForExtension.insert(relay.sequence);
            if (in[at] == kOurOpcode && in[at + 1] == kInfo && size == 4) {
                relay.askedForPower.insert(relay.sequence);
                in[at] = kGetInputFocus;
                in[at + 1] = 0;
            }
        }
        relay.clientIsIn = true;
        out.insert(out.end(), in.begin() + static_cast<std::ptrdiff_t>(at),
                   in.begin() + static_cast<std::ptrdiff_t>(at + size));
        at += size;
    }
    in.erase(in.begin(), in.begin() + static_cast<std::ptrdiff_t>(at));
    return sendAll(relay.server.get(), out, &relay.descriptors);
}

bool PoweredDisplay::passAnswers(Relay& relay) {
    Bytes& in = relay.answers;
    Bytes out;
    std::size_t at = 0;
    while (in.size() - at >= (relay.serverIsIn ? kAnswer : 8)) {
        std::size_t size = kAnswer;
        if (!relay.serverIsIn)
            size = 8 + number(in, at + 6, 2) * 4u;
        else if (in[at] == kReply || (in[at] & 0x7F) == kGenericEvent)
            size += number(in, at + 4, 4) * 4u;
        if (in.size() - at < size) break;
        const auto sequence = static_cast<std::uint16_t>(number(in, at + 2, 2));
        if (relay.serverIsIn && in[at] == kReply && relay.askedForExtension.erase(sequence) != 0) {
            in[at + 8] = 1;
            in[at + 9] = kOurOpcode;
        } else if (relay.serverIsIn && in[at] == kReply && relay.askedForPower.erase(sequence) != 0) {
            const std::uint16_t power = power_;
            std::memcpy(in.data() + at + 8, &power, sizeof power);
            in[at + 10] = 1;
            ++questions_;
        }
        relay.serverIsIn = true;
        out.insert(out.end(), in.begin() + static_cast<std::ptrdiff_t>(at),
                   in.begin() + static_cast<std::ptrdiff_t>(at + size));
        at += size;
    }
    in.erase(in.begin(), in.begin() + static_cast<std::ptrdiff_t>(at));
    return sendAll(relay.client.get(), out, nullptr);
}

}  // namespace lumacast::test
