// src/ is standard C++ alone, and waits only through the scheduler.

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

#include "tests/unit/architecture/SourceText.h"

namespace lumacast::architecture {
namespace {

/// The headers of the C++20 library.
constexpr std::string_view kStandardHeaders[] = {
    "algorithm", "any", "array", "atomic", "barrier", "bit", "bitset", "cassert", "cctype", "cerrno", "cfenv", "cfloat",
    "charconv", "chrono", "cinttypes", "climits", "clocale", "cmath", "codecvt", "compare", "complex", "concepts",
    "condition_variable", "coroutine", "csetjmp", "csignal", "cstdarg", "cstddef", "cstdint", "cstdio", "cstdlib",
    "cstring", "ctime", "cuchar", "cwchar", "cwctype", "deque", "exception", "execution", "filesystem", "format",
    "forward_list", "fstream", "functional", "future", "initializer_list", "iomanip", "ios", "iosfwd", "iostream",
    "istream", "iterator", "latch", "limits", "list", "locale", "map", "memory", "memory_resource", "mutex", "new",
    "numbers", "numeric", "optional", "ostream", "queue", "random", "ranges", "ratio", "regex", "scoped_allocator",
    "semaphore", "set", "shared_mutex", "source_location", "span", "sstream", "stack", "stdexcept", "stop_token",
    "streambuf", "string", "string_view", "strstream", "syncstream", "system_error", "thread", "tuple", "type_traits",
    "typeindex", "typeinfo", "unordered_map", "unordered_set", "utility", "valarray", "variant", "vector", "version"};

/// What waits, or keeps state beside what Process owns.
constexpr std::string_view kForbiddenNames[] = {
    "std::condition_variable", "std::condition_variable_any", "std::thread", "std::jthread", "std::this_thread",
    "sleep_for", "sleep_until", "std::promise", "std::future", "std::shared_future", "std::packaged_task", "std::async",
    "std::latch", "std::barrier", "std::counting_semaphore", "std::binary_semaphore", "std::timed_mutex",
    "std::recursive_timed_mutex", "std::shared_timed_mutex", "std::recursive_mutex", "thread_local"};

std::vector<std::string> foreignHeaders(const SourceFile& file) {
    std::vector<std::string> found;
    for (const Include& include : includesOf(file.text)) {
        if (include.isQuoted) continue;
        if (std::find(std::begin(kStandardHeaders), std::end(kStandardHeaders), include.name) ==
            std::end(kStandardHeaders))
            found.push_back(file.path + ":" + std::to_string(include.line) + " includes <" + include.name + ">");
    }
    return found;
}

std::vector<std::string> blockingNames(const SourceFile& file) {
    // The one place where threads are made and waits are real.
    if (file.path.starts_with("src/support/ThreadScheduler")) return {};
    std::vector<std::string> found;
    const std::string code = codeOf(file.text);
    for (const std::string_view name : kForbiddenNames)
        if (usesName(code, name)) found.push_back(file.path + " uses " + std::string(name));
    return found;
}

TEST(StandardOnly, SrcIncludesNoForeignHeader) {
    const auto files = sourcesBelow("src");
    EXPECT_GT(files.size(), 50u) << "the tree was not found";
    for (const SourceFile& file : files)
        for (const std::string& line : foreignHeaders(file)) ADD_FAILURE() << line;
}

TEST(StandardOnly, AForeignHeaderIsSeen) {
    EXPECT_EQ(
        foreignHeaders({"src/a.h", "#include <vector>\n#include <unistd.h>\n#include <xcb/xcb.h>\n#include <math.h>\n"})
            .size(),
        3u);
    EXPECT_TRUE(foreignHeaders({"src/a.h", "#include <vector>\n#include \"base/Value.h\"\n"}).empty());
}

TEST(StandardOnly, SrcWaitsOnlyThroughTheScheduler) {
    for (const SourceFile& file : sourcesBelow("src"))
        for (const std::string& line : blockingNames(file)) ADD_FAILURE() << line;
}

TEST(StandardOnly, ABlockingPrimitiveIsSeen) {
    const auto count = [](const std::string& path, const std::string& text) {
        return blockingNames({path, text}).size();
    };
    EXPECT_EQ(count("src/daemon/a.cpp", "std::condition_variable wake_;"), 1u);
    EXPECT_EQ(count("src/daemon/a.cpp", "auto t = std::thread([] {});\nstd::this_thread::yield();"), 2u);
    EXPECT_EQ(count("src/daemon/a.cpp", "thread_local int x = 1'000;"), 1u);
    EXPECT_EQ(
        count("src/daemon/a.cpp", "// std::thread\n/* std::future<int> */ const char* s = \"std::promise \\\" x\";"),
        0u);
    EXPECT_EQ(count("src/daemon/a.cpp", "char c = '\"'; std::async(f); // \""), 1u);
    EXPECT_EQ(count("src/daemon/a.cpp", "std::thread_maker m; xstd::thread y;"), 0u);
    EXPECT_EQ(count("src/support/ThreadSchedulerPool.h", "std::thread t;"), 0u);
    EXPECT_EQ(count("src/support/Other.h", "std::thread t;"), 1u);
}

}  // namespace
}  // namespace lumacast::architecture
