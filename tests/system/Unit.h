#pragma once
// The shipped units, as text.

#include <fstream>
#include <iterator>
#include <string>
#include <utility>
#include <vector>

namespace lumacast::test {

inline std::string shippedUnit() {
    return std::string(LC_SOURCE_DIR) + "/packaging/systemd/lumacastd@.service";
}
/// The folder of those of users' own managers.
inline std::string shippedUserUnits() {
    return std::string(LC_SOURCE_DIR) + "/packaging/systemd/user/";
}
inline std::string packagingText() {
    return std::string(LC_SOURCE_DIR) + "/packaging/README.md";
}

inline std::string textOf(const std::string& path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), {}};
}

inline std::string withAll(std::string text, const std::string& what, const std::string& by) {
    for (auto at = text.find(what); at != std::string::npos; at = text.find(what, at + by.size()))
        text.replace(at, what.size(), by);
    return text;
}

}  // namespace lumacast::test
