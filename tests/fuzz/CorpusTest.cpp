// Replays the corpus: tests/corpus/<target>/ through the target of that name. LC_VERBOSE=1 names each file before it is
// read, for those that end the process.

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

#include "fuzz/Targets.h"

namespace lumacast::fuzz {
namespace {

namespace fs = std::filesystem;

constexpr std::size_t kMaximumFiles = 300, kMaximumBytes = 4096;
constexpr std::chrono::seconds kPatience{30};  // for one input, under a sanitizer on a busy machine; what takes longer hangs

const fs::path kCorpus = fs::path(LC_SOURCE_DIR) / "tests/corpus";

std::vector<fs::path> filesOf(const Target& target) {
    std::vector<fs::path> files;
    std::error_code missing;
    for (const auto& entry : fs::directory_iterator(kCorpus / target.name, missing)) files.push_back(entry.path());
    std::sort(files.begin(), files.end());
    return files;
}

std::vector<std::uint8_t> contentsOf(const fs::path& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

class Corpus : public ::testing::TestWithParam<Target> {};

TEST_P(Corpus, IsThereAndSmall) {
    const auto files = filesOf(GetParam());
    EXPECT_FALSE(files.empty()) << kCorpus / GetParam().name << " is missing or empty";
    EXPECT_LE(files.size(), kMaximumFiles);
    for (const fs::path& file : files) EXPECT_LE(fs::file_size(file), kMaximumBytes) << file;
}

TEST_P(Corpus, EveryInputIsTakenInTime) {
    for (const fs::path& file : filesOf(GetParam())) {
        const auto input = contentsOf(file);
        if (std::getenv("LC_VERBOSE")) std::fprintf(stderr, "%s\n", file.c_str());
        const auto begin = std::chrono::steady_clock::now();
        try {
            GetParam().run(input);
        } catch (const std::exception& broken) {
            ADD_FAILURE() << file << ": " << broken.what();
        }
        EXPECT_LT(std::chrono::steady_clock::now() - begin, kPatience) << file;
    }
}

INSTANTIATE_TEST_SUITE_P(Fuzz, Corpus, ::testing::ValuesIn(targets().begin(), targets().end()),
                         [](const auto& instance) { return std::string(instance.param.name); });

TEST(Corpora, HaveNoFolderWithoutATarget) {
    for (const auto& folder : fs::directory_iterator(kCorpus)) {
        const std::string name = folder.path().filename();
        EXPECT_TRUE(std::any_of(targets().begin(), targets().end(), [&](const Target& target) {
            return target.name == name;
        })) << name;
    }
}

}  // namespace
}  // namespace lumacast::fuzz
