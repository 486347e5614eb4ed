#pragma once
#include <stdlib.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

namespace lumacast {

/// A private directory of one test, removed with all it holds at the end.
class ScratchDirectory final {
public:
    ScratchDirectory() {
        std::string pattern = (std::filesystem::temp_directory_path() / "lc-scratch-XXXXXX").string();
        if (::mkdtemp(pattern.data())) path_ = std::filesystem::canonical(pattern).string();
    }
    ~ScratchDirectory() {
        std::error_code ignored;
        if (!path_.empty()) std::filesystem::remove_all(path_, ignored);
    }
    ScratchDirectory(const ScratchDirectory&) = delete;
    ScratchDirectory& operator=(const ScratchDirectory&) = delete;

    const std::string& path() const { return path_; }
    std::string path(const std::string& name) const { return path_ + "/" + name; }

    /// Writes a file, making its folders; answers its path.
    std::string write(const std::string& name, const std::string& text) const {
        std::filesystem::create_directories(std::filesystem::path(path(name)).parent_path());
        std::ofstream(path(name), std::ios::binary) << text;
        return path(name);
    }
    std::string makeDirectory(const std::string& name) const {
        std::filesystem::create_directories(path(name));
        return path(name);
    }
    static std::string read(const std::string& path) {
        std::ifstream file(path, std::ios::binary);
        return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
    }

private:
    std::string path_;
};

}  // namespace lumacast
