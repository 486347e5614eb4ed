#pragma once
// Distinct types for identifiers that must not be mixed up.

#include <compare>
#include <cstdint>
#include <functional>
#include <string>
#include <utility>

namespace lumacast {

/// The identifier of an application's bundle, e.g. "org.example.Player". A value; never empty where a role answers one
/// (an unknown application is an absent optional, not an empty identifier).
class BundleIdentifier {
public:
    BundleIdentifier() = default;
    explicit BundleIdentifier(std::string text) : text_(std::move(text)) {}

    const std::string& text() const { return text_; }
    auto operator<=>(const BundleIdentifier&) const = default;

private:
    std::string text_;
};

/// The identifier of one window layer of an application (on X11: the window id). 0 names nothing.
enum class ContextID : std::uint32_t {};

/// A process identifier of this machine. 0 and below name no process.
enum class ProcessID : std::int32_t {};

/// A user of this machine, by the kernel's number.
enum class UserID : std::uint32_t {};
/// Nobody: what a peer that can't be told has.
inline constexpr UserID kNoUser{0xffffffff};

constexpr std::uint32_t number(UserID user) { return static_cast<std::uint32_t>(user); }
constexpr std::int32_t number(ProcessID pid) { return static_cast<std::int32_t>(pid); }
constexpr std::uint32_t number(ContextID id) { return static_cast<std::uint32_t>(id); }

/// A size in pixels, possibly fractional.
struct Size {
    double width = 0;
    double height = 0;
    bool operator==(const Size&) const = default;
};

/// A 2-D affine transform: x' = a*x + c*y + tx, y' = b*x + d*y + ty.
struct AffineTransform {
    double a = 1, b = 0, c = 0, d = 1, tx = 0, ty = 0;
    bool operator==(const AffineTransform&) const = default;
};

}  // namespace lumacast

template <>
struct std::hash<lumacast::BundleIdentifier> {
    std::size_t operator()(const lumacast::BundleIdentifier& id) const noexcept {
        return std::hash<std::string>{}(id.text());
    }
};
