// Writes the printed pages of the documentation: print_tables [FOLDER, default the source tree]. Says which have
// changed.

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>

#include "tests/tables/Tables.h"

int main(int argc, char** argv) {
    namespace fs = std::filesystem;
    if (argc > 2) return std::fprintf(stderr, "usage: print_tables [FOLDER]\n"), 2;
    const fs::path top(argc == 2 ? argv[1] : LC_SOURCE_DIR);
    for (const auto& page : lumacast::tables::printedPages()) {
        const fs::path path = top / page.path;
        std::ifstream before(path, std::ios::binary);
        if (std::string(std::istreambuf_iterator<char>(before), {}) == page.text) continue;
        std::error_code ignored;
        fs::create_directories(path.parent_path(), ignored);
        std::ofstream file(path, std::ios::binary);
        if (!(file << page.text).flush()) return std::fprintf(stderr, "%s can't be written\n", path.c_str()), 1;
        std::printf("%s\n", path.c_str());
    }
    return 0;
}
