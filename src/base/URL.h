#pragma once
#include <string>
#include <utility>

namespace lumacast {

/// A resource's address, kept as its text. For a file it is "file://" followed by the absolute path as it stands
/// (percent-encoding is neither added nor removed: both ends of the wire are ours).
class URL {
public:
    URL() = default;
    explicit URL(std::string text) : text_(std::move(text)) {}

    static URL file(const std::string& path) { return URL("file://" + path); }

    const std::string& text() const { return text_; }

    /// The path of a file URL; empty for any other URL.
    std::string path() const {
        return text_.starts_with(kFileScheme) ? text_.substr(sizeof(kFileScheme) - 1) : std::string();
    }

    bool operator==(const URL&) const = default;

private:
    static constexpr char kFileScheme[] = "file://";
    std::string text_;
};

}  // namespace lumacast
