#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "tests/checkers/BoxReader.h"
#include "tests/checkers/Finding.h"

namespace lumacast::checkers {

/// A box, where it begins in the file, and where its content does.
struct Box {
    std::string type;
    std::uint64_t begin = 0;
    std::uint64_t offset = 0;  ///< of the content
    std::span<const std::uint8_t> content;

    [[nodiscard]] std::uint64_t end() const { return offset + content.size(); }
};

/// A run of bytes in the file.
struct Extent {
    std::uint64_t begin = 0;
    std::uint64_t end = 0;
};

/// Whether it lies within one of `wholes`, which are in the order of the file and apart.
[[nodiscard]] bool isWithin(const std::vector<Extent>& wholes, const Extent& extent);

/// A file's bytes as they were when it was opened; the file must not become shorter meanwhile.
class MappedFile final {
public:
    explicit MappedFile(const std::string& path);
    ~MappedFile();
    MappedFile(const MappedFile&) = delete;
    MappedFile& operator=(const MappedFile&) = delete;

    [[nodiscard]] bool good() const { return good_; }
    [[nodiscard]] std::span<const std::uint8_t> bytes() const { return bytes_; }

private:
    bool good_ = false;
    std::span<const std::uint8_t> bytes_;
};

/// Takes down what is wrong with one part of the file, each with the rule that it breaks: a part and clause of the
/// standard ("14496-12, 8.6.1.2"), or "" where it is not the standard that asks for it.
class Complaints final {
public:
    Complaints(Findings& all, std::string where) : all_(all), where_(std::move(where)) {}

    void find(const std::string& clause, const std::string& text) const {
        all_.push_back(where_ + ": " + text + (clause.empty() ? "" : " [ISO/IEC " + clause + "]"));
    }
    void require(bool isSo, const std::string& clause, const std::string& otherwise) const {
        if (!isSo) find(clause, otherwise);
    }
    [[nodiscard]] const std::string& where() const { return where_; }
    /// The same about something else.
    [[nodiscard]] Complaints about(const std::string& where) const { return {all_, where}; }

private:
    Findings& all_;
    std::string where_;
};

/// A box that begins with a version and flags; its fields from there on.
struct FullBox {
    std::uint8_t version = 0;
    std::uint32_t flags = 0;
    BoxReader fields;

    explicit FullBox(const Box& box) : fields(box.content) {
        version = fields.u8();
        flags = static_cast<std::uint32_t>(fields.unsignedOf(3));
    }
    /// A version above `newest` is a finding.
    FullBox(const Box& box, std::uint8_t newest, const Complaints& complaints) : FullBox(box) {
        complaints.require(version <= newest, "14496-12, 4.2",
                           box.type + " has version " + std::to_string(version) + ", which nobody knows");
    }
};

/// The boxes that fill `bytes`, the first at file offset `offset`. What doesn't nest exactly is a finding.
[[nodiscard]] std::vector<Box> boxesIn(std::span<const std::uint8_t> bytes, std::uint64_t offset,
                                       const Complaints& complaints);
/// The boxes within a box.
[[nodiscard]] std::vector<Box> childrenOf(const Box& box, const Complaints& complaints);

/// The only box of this type; none or several is a finding and gives nothing.
[[nodiscard]] const Box* onlyBox(const std::vector<Box>& boxes, const std::string& type, const std::string& clause,
                                 const Complaints& complaints);
[[nodiscard]] const Box* onlyBox(std::vector<Box>&&, const std::string&, const std::string&, const Complaints&) = delete;
/// The same of a box that need not be there.
[[nodiscard]] const Box* anyBox(const std::vector<Box>& boxes, const std::string& type, const std::string& clause,
                                const Complaints& complaints);
[[nodiscard]] const Box* anyBox(std::vector<Box>&&, const std::string&, const std::string&, const Complaints&) = delete;

/// A table must end where its box ends.
void requireEnd(const BoxReader& fields, const std::string& type, const std::string& clause, const Complaints& complaints);
/// Reads how many entries a table has: no more than its own bytes can hold, so that a wrong count, which is a finding,
/// can't make a walk endless.
[[nodiscard]] std::uint64_t entriesOf(BoxReader& fields, std::size_t entryBytes, const std::string& type,
                                      const std::string& clause, const Complaints& complaints);

}  // namespace lumacast::checkers
