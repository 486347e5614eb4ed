#include "linux/display/AuthorityFile.h"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <climits>
#include <cstdlib>

#include "linux/ipc/Fd.h"

namespace lumacast::x11 {
namespace {

constexpr std::uint16_t kThisMachine = 256;
constexpr std::uint16_t kAnyMachine = 65535;
constexpr std::string_view kMethod = "MIT-MAGIC-COOKIE-1";
constexpr std::size_t kMostBytes = 256 * 1024;

class Reader {
public:
    explicit Reader(std::span<const std::uint8_t> bytes) : bytes_(bytes) {}
    std::optional<std::uint16_t> number() {
        if (bytes_.size() < 2) return std::nullopt;
        const auto value = static_cast<std::uint16_t>(bytes_[0] << 8 | bytes_[1]);
        bytes_ = bytes_.subspan(2);
        return value;
    }
    std::optional<std::string_view> text() {
        const auto length = number();
        if (!length || bytes_.size() < *length) return std::nullopt;
        const std::string_view value(reinterpret_cast<const char*>(bytes_.data()), *length);
        bytes_ = bytes_.subspan(*length);
        return value;
    }

private:
    std::span<const std::uint8_t> bytes_;
};

std::vector<std::uint8_t> contentsOf(const std::string& path) {
    const Fd file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    std::vector<std::uint8_t> bytes;
    std::array<std::uint8_t, 4096> part;
    while (file && bytes.size() < kMostBytes) {
        const ssize_t got = ::read(file.get(), part.data(), part.size());
        if (got <= 0) break;
        bytes.insert(bytes.end(), part.begin(), part.begin() + got);
    }
    return bytes;
}

}  // namespace

std::optional<AuthorityKey> findKey(std::span<const std::uint8_t> file, std::string_view host,
                                    std::string_view number) {
    Reader reader(file);
    while (const auto family = reader.number()) {
        const auto address = reader.text(), display = reader.text(), method = reader.text(), secret = reader.text();
        if (!address || !display || !method || !secret) break;
        const bool ours = *family == kAnyMachine || (*family == kThisMachine && *address == host);
        if (!ours || *method != kMethod || (!display->empty() && *display != number)) continue;
        return AuthorityKey{std::string(*method), {secret->begin(), secret->end()}};
    }
    return std::nullopt;
}

std::optional<AuthorityKey> userKey(std::string_view number) {
    std::string path;
    if (const char* const named = std::getenv("XAUTHORITY"))
        path = named;
    else if (const char* const home = std::getenv("HOME"))
        path = std::string(home) + "/.Xauthority";
    std::array<char, HOST_NAME_MAX + 1> host{};
    if (path.empty() || ::gethostname(host.data(), host.size() - 1) != 0) return std::nullopt;
    return findKey(contentsOf(path), host.data(), number);
}

}  // namespace lumacast::x11
