#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <functional>
#include <string>
#include <vector>

#include "tests/checkers/BoxChecker.h"

namespace lumacast::checkers {

/// The bytes of a movie that a test changes by name: places are paths such as "moov/trak:2/mdia/mdhd", where ":2" is the
/// second of its kind.
class BoxDoctor final {
public:
    using Bytes = std::vector<char>;

    explicit BoxDoctor(Bytes bytes) : bytes_(std::move(bytes)) {}
    [[nodiscard]] const Bytes& bytes() const { return bytes_; }
    Bytes& bytes() { return bytes_; }

    /// Where the box begins; the test fails when it isn't there.
    [[nodiscard]] std::size_t at(const std::string& path) const {
        std::size_t begin = 0, end = bytes_.size(), found = 0;
        for (std::size_t from = 0; from <= path.size();) {
            const std::size_t slash = std::min(path.find('/', from), path.size());
            const std::string step = path.substr(from, slash - from);
            found = child(begin, end, step.substr(0, 4), step.size() > 5 ? std::atoi(step.c_str() + 5) : 1);
            if (found == bytes_.size()) {
                ADD_FAILURE() << "there is no " << path;
                return 0;
            }
            begin = found + 8 + ownBytes(step.substr(0, 4));
            end = found + number(found);
            from = slash + 1;
        }
        return found;
    }

    [[nodiscard]] std::uint32_t number(std::size_t place, std::size_t count = 4) const {
        std::uint32_t value = 0;
        for (std::size_t byte = 0; byte < count; ++byte)
            value = value << 8 | static_cast<std::uint8_t>(bytes_[place + byte]);
        return value;
    }
    void setNumber(std::size_t place, std::uint32_t value, std::size_t count = 4) {
        for (std::size_t byte = 0; byte < count; ++byte)
            bytes_[place + byte] = static_cast<char>(value >> (8 * (count - 1 - byte)));
    }

    /// A field of a box, `offset` bytes from the beginning of its header.
    void set(const std::string& path, std::size_t offset, std::uint32_t value, std::size_t count = 4) {
        setNumber(at(path) + offset, value, count);
    }
    void add(const std::string& path, std::size_t offset, std::uint32_t value, std::size_t count = 4) {
        const std::size_t place = at(path) + offset;
        setNumber(place, number(place, count) + value, count);
    }
    void rename(const std::string& path, const std::string& type) {
        std::copy(type.begin(), type.end(), bytes_.begin() + static_cast<std::ptrdiff_t>(at(path) + 4));
    }
    /// Adds a box of zeros at the end of the file.
    void append(const std::string& type, std::size_t content) {
        const std::size_t before = bytes_.size();
        bytes_.resize(before + 8 + content);
        setNumber(before, static_cast<std::uint32_t>(8 + content));
        std::copy(type.begin(), type.end(), bytes_.begin() + static_cast<std::ptrdiff_t>(before + 4));
    }

private:
    /// What stands in a box before the boxes in it.
    static std::size_t ownBytes(const std::string& type) {
        if (type == "stsd" || type == "dref") return 8;
        if (type == "avc1") return 78;
        return type == "mp4a" ? 28 : 0;
    }
    [[nodiscard]] std::size_t child(std::size_t begin, std::size_t end, const std::string& type, int count) const {
        while (begin + 8 <= end) {
            const bool isIt = std::equal(type.begin(), type.end(), bytes_.begin() + static_cast<std::ptrdiff_t>(begin + 4));
            if (isIt && --count == 0) return begin;
            // A size of 1 stands for 64 bits behind the type.
            begin += std::max<std::size_t>(8, number(begin) == 1 ? number(begin + 12) : number(begin));
        }
        return bytes_.size();
    }

    Bytes bytes_;
};

/// One way to break a movie, and what the checker must say then.
struct Damage {
    const char* what;
    const char* finding;
    const char* clause;  ///< of ISO/IEC, as the finding has it; "" where the standard does not ask for it
    std::function<void(BoxDoctor&)> doctor;
};

/// Whether a finding has these words and names this clause, or no clause.
inline bool isNamed(const Findings& findings, const Damage& damage) {
    const std::string clause = *damage.clause != 0 ? std::string(" [ISO/IEC ") + damage.clause + "]" : "";
    return std::any_of(findings.begin(), findings.end(), [&](const std::string& finding) {
        return finding.find(damage.finding) != std::string::npos &&
               (clause.empty() ? finding.find("[ISO/IEC") == std::string::npos : finding.ends_with(clause));
    });
}

}  // namespace lumacast::checkers
