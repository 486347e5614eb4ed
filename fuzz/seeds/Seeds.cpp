#include "fuzz/seeds/Seeds.h"

#include <fstream>
#include <stdexcept>

namespace lumacast::fuzz {

void writeSeed(const std::filesystem::path& corpora, const std::string& target, const std::string& name,
               const Data& bytes) {
    const std::filesystem::path folder = corpora / target;
    std::filesystem::create_directories(folder);
    std::ofstream file(folder / ("seed-" + name), std::ios::binary);
    file.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    if (!file.flush()) throw std::runtime_error("can't write " + (folder / name).string());
}

}  // namespace lumacast::fuzz
