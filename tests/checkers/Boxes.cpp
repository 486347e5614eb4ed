#include "tests/checkers/Boxes.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>

namespace lumacast::checkers {

bool isWithin(const std::vector<Extent>& wholes, const Extent& extent) {
    if (extent.end < extent.begin) return false;
    const auto after = std::upper_bound(wholes.begin(), wholes.end(), extent.begin,
                                        [](std::uint64_t begin, const Extent& whole) { return begin < whole.begin; });
    return after != wholes.begin() && extent.end <= std::prev(after)->end;
}

MappedFile::MappedFile(const std::string& path) {
    const int file = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (file < 0) return;
    struct stat status {};
    if (::fstat(file, &status) == 0 && S_ISREG(status.st_mode)) {
        good_ = true;
        const auto size = static_cast<std::size_t>(status.st_size);
        void* const memory = size == 0 ? nullptr : ::mmap(nullptr, size, PROT_READ, MAP_PRIVATE, file, 0);
        if (memory == MAP_FAILED) good_ = false;
        else if (memory != nullptr) bytes_ = {static_cast<const std::uint8_t*>(memory), size};
    }
    ::close(file);
}

MappedFile::~MappedFile() {
    if (!bytes_.empty()) ::munmap(const_cast<std::uint8_t*>(bytes_.data()), bytes_.size());
}

std::vector<Box> boxesIn(std::span<const std::uint8_t> bytes, std::uint64_t offset, const Complaints& complaints) {
    std::vector<Box> boxes;
    while (!bytes.empty()) {
        BoxReader header(bytes);
        std::uint64_t size = header.u32();
        const std::string type = header.fourCharacters();
        if (size == 1) size = header.u64();
        const std::size_t headerBytes = bytes.size() - header.left();
        if (!header.good() || size < headerBytes || size > bytes.size()) {
            complaints.find("14496-12, 4.2", "the box at " + std::to_string(offset) + " doesn't fit where it is");
            return boxes;
        }
        boxes.push_back({type, offset, offset + headerBytes, bytes.subspan(headerBytes, size - headerBytes)});
        bytes = bytes.subspan(size);
        offset += size;
    }
    return boxes;
}

std::vector<Box> childrenOf(const Box& box, const Complaints& complaints) {
    return boxesIn(box.content, box.offset, complaints.about(complaints.where() + " " + box.type));
}

const Box* anyBox(const std::vector<Box>& boxes, const std::string& type, const std::string& clause,
                  const Complaints& complaints) {
    const auto isIt = [&](const Box& box) { return box.type == type; };
    const auto count = std::count_if(boxes.begin(), boxes.end(), isIt);
    if (count == 1) return &*std::find_if(boxes.begin(), boxes.end(), isIt);
    if (count > 1)
        complaints.find(clause, "there are " + std::to_string(count) + " " + type + " boxes instead of one");
    return nullptr;
}

const Box* onlyBox(const std::vector<Box>& boxes, const std::string& type, const std::string& clause,
                   const Complaints& complaints) {
    const bool none = std::none_of(boxes.begin(), boxes.end(), [&](const Box& box) { return box.type == type; });
    complaints.require(!none, clause, "there are 0 " + type + " boxes instead of one");
    return none ? nullptr : anyBox(boxes, type, clause, complaints);
}

void requireEnd(const BoxReader& fields, const std::string& type, const std::string& clause,
                const Complaints& complaints) {
    complaints.require(fields.good() && fields.left() == 0, clause, type + " has another size than its entries");
}

std::uint64_t entriesOf(BoxReader& fields, std::size_t entryBytes, const std::string& type, const std::string& clause,
                        const Complaints& complaints) {
    const std::uint64_t count = fields.u32();
    if (fields.good() && count * entryBytes == fields.left()) return count;
    complaints.find(clause, type + " has another size than its entries");
    return std::min<std::uint64_t>(count, fields.left() / entryBytes);
}

}  // namespace lumacast::checkers
