// What the pages name is there: files, folders, tests, variables, and in the tour and the lanes every name of the code.

#include <fnmatch.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <regex>
#include <set>

#include "tests/docs/Markdown.h"
#include "tests/docs/SourceTree.h"
#include "tests/unit/architecture/SourceText.h"

namespace lumacast::docs {
namespace {

namespace fs = std::filesystem;

/// Whether a path, as a page writes it, names something of the tree: from the top, from `src`, or from the page's
/// folder; a header and its source may be named without their endings.
bool isPathThere(const Page& page, std::string path) {
    while (path.ends_with('/')) path.pop_back();
    const std::string here = fs::path(page.path).parent_path().string();
    for (const std::string& base :
         {std::string(), std::string("src"), here, std::string("linux"), std::string("linux/media")})
        for (const char* ending : {"", ".h", ".cpp", ".py"}) {
            const std::string candidate = (fs::path(base) / (path + ending)).lexically_normal().string();
            if (!candidate.starts_with("..") && isThere(candidate)) return true;
        }
    return false;
}

bool isPath(const std::string& text) {
    static const std::regex kPath(
        "(src|linux|headless|debian|client|extensions|examples|tests|scripts|docs|packaging|fuzz|bench|resources|cmake|base|platform|"
        "support|broadcast|writer|capture|session|daemon|\\.ci)/[\\w./@-]*");
    return std::regex_match(text, kPath);
}

bool isFileName(const std::string& text) {
    static const std::regex kName("[A-Za-z_]\\w*\\.(h|cpp|py|html)");
    return std::regex_match(text, kName);
}

bool isFileThere(const std::string& name) {
    const auto& files = treeFiles();
    return std::any_of(files.begin(), files.end(),
                       [&](const std::string& file) { return fs::path(file).filename() == name; });
}

/// Some test of this name, or of this pattern.
bool isTest(const std::string& pattern) {
    const auto& names = testNames();
    return std::any_of(names.begin(), names.end(),
                       [&](const std::string& name) { return ::fnmatch(pattern.c_str(), name.c_str(), 0) == 0; });
}

/// What a page names and isn't there.
std::vector<std::string> faultsOf(const Page& page) {
    static const std::regex kTest("[A-Z]\\w+\\.[A-Z*][\\w*]+");
    static const std::regex kVariable("(LC_[A-Z][A-Z_]+)(=.*)?");
    static const std::regex kKey("(LC[A-Z][a-z]\\w*)(=.*)?");
    static const std::string code =
        textBelow("", {".h", ".cpp", ".txt", ".cmake", ".py"}) + textBelow("scripts", {""}) + textBelow("bench", {""});
    static const std::string product = textBelow("src", {".h", ".cpp"}) + textBelow("linux", {".h", ".cpp"}) +
                                       textBelow("client", {".h", ".cpp"}) + textBelow("extensions", {".h", ".cpp"});
    std::vector<std::string> faults;
    for (const Span& span : page.spans) {
        std::smatch match;
        const auto fault = [&](const char* what) { faults.push_back(at(page, span.line) + span.text + what); };
        if (isPath(span.text) && !isPathThere(page, span.text)) fault(" is not there");
        if (isFileName(span.text) && !isFileThere(span.text)) fault(" is no file");
        if (std::regex_match(span.text, match, kTest) && !isFileName(span.text) && !isTest(span.text))
            fault(" is no test");
        if (std::regex_match(span.text, match, kVariable) && code.find(match[1].str()) == std::string::npos)
            fault(" is read nowhere");
        if (std::regex_match(span.text, match, kKey) && product.find(match[1].str()) == std::string::npos)
            fault(" is no name of the system");
    }
    return faults;
}

TEST(Names, OfFilesTestsAndVariablesAreThoseOfTheTree) {
    std::size_t spans = 0;
    for (const Page& page : allPages()) {
        spans += page.spans.size();
        if (page.path == "docs/texts.md" || page.path == "docs/reference/log.md") continue;  // texts of the code
        for (const std::string& fault : faultsOf(page)) ADD_FAILURE() << fault;
    }
    EXPECT_GT(spans, 1000u) << "the pages were not found";
}

TEST(Names, ThatAreNotThereAreSeen) {
    const auto faults = [](const std::string& text) { return faultsOf(pageOf("docs/planted.md", text + "\n")).size(); };
    EXPECT_EQ(faults("`src/base/Value.h` `linux/ipc/` `base/Limits` `tour.md` `docs/tour.md`"), 0u);
    EXPECT_EQ(faults("`src/base/NoSuchThing.h`"), 1u);
    EXPECT_EQ(faults("`linux/no_such_folder/`"), 1u);
    EXPECT_EQ(faults("`NoSuchThing.cpp`"), 1u);
    EXPECT_EQ(faults("`Names.ThatAreNotThereAreSeen` `Names.*Seen`"), 0u);
    EXPECT_EQ(faults("`Names.ThatNobodyWrote`"), 1u);
    EXPECT_EQ(faults("`LC_LONG_TESTS=1`"), 0u);
    EXPECT_EQ(faults("`LC_NO_SUCH_"
                     "VARIABLE`"),
              1u);
    EXPECT_EQ(faults("`LCFullResCapture=true`"), 0u);
    EXPECT_EQ(faults("`LCNoSuchPreference=true`"), 1u);
}

/// `Type::function` and `function()`: the last name.
std::string lastName(const std::string& text) {
    static const std::regex kName("(?:\\w+::)*(\\w+)(?:\\(\\)|<T>)?");
    std::smatch match;
    if (!std::regex_match(text, match, kName)) return {};
    const std::string name = match[1].str();
    const auto isUpper = [](char c) { return c >= 'A' && c <= 'Z'; };
    const auto isLower = [](char c) { return c >= 'a' && c <= 'z'; };
    const bool isOfTheCode =
        std::any_of(name.begin(), name.end(), isUpper) && std::any_of(name.begin(), name.end(), isLower);
    return isOfTheCode ? name : "";
}

/// What a page that follows the code names, and the code doesn't. A name right before a bold path must be in that file
/// or folder.
std::vector<std::string> strangersIn(const Page& page) {
    std::vector<std::string> faults;
    for (std::size_t i = 0; i < page.spans.size(); ++i) {
        const Span& span = page.spans[i];
        if (span.isBold && !isPathThere(page, span.text) && !isFileThere(span.text))
            faults.push_back(at(page, span.line) + span.text + " is not there");
        const std::string name = span.isBold ? "" : lastName(span.text);
        if (name.empty()) continue;
        if (!isNameInCode(name) && !isNameInCode(name + "_") && !isFileThere(name + ".cpp"))
            faults.push_back(at(page, span.line) + span.text + " is not in the code");
    }
    static const std::regex kNameInFile("`([\\w:]+)`,?\\s+\\(?(?:\\w+ )?\\*\\*`([^`]+)`\\*\\*");
    for (std::sregex_iterator pair(page.prose.begin(), page.prose.end(), kNameInFile), end; pair != end; ++pair) {
        const std::string name = lastName((*pair)[1].str()), path = (*pair)[2].str();
        if (!name.empty() && isPath(path) && !isNameIn(path, name))
            faults.push_back(page.path + ": " + name + " is not in " + path);
    }
    return faults;
}

TEST(Names, OfTheCodeInTheTourAndTheLanesAreItsOwn) {
    for (const char* path : {"docs/tour.md", "docs/lanes.md", "docs/maintaining.md", "docs/record-your-application.md",
                             "docs/write-an-upload-extension.md"}) {
        const Page& page = docs::page(path);
        EXPECT_GT(page.spans.size(), 12u) << path;
        for (const std::string& fault : strangersIn(page)) ADD_FAILURE() << fault;
    }
}

TEST(Names, ThatTheCodeDoesNotHaveAreSeen) {
    const auto faults = [](const std::string& text) {
        return strangersIn(pageOf("docs/planted.md", text + "\n")).size();
    };
    EXPECT_EQ(faults("`LCRecordingManager::receiveMessage` (**`src/daemon/ManagerRequests.cpp`**) `Guarded<T>`"), 0u);
    EXPECT_EQ(faults("`LCRecordingManager::receiveMessage` (**`src/daemon/ManagerSave.cpp`**)"), 1u)
        << "in another file";
    EXPECT_EQ(faults("`LCRecordingManager::recieveMessage`"), 1u);
    EXPECT_EQ(faults("(**`src/daemon/ManagerDreams.cpp`**)"), 1u);
    EXPECT_EQ(faults("`kNoSuchConstant` and `noSuchFunction()`"), 2u);
}

/// Whether a file of the system makes a thread or a serial queue.
bool makesLane(const std::string& code) {
    static const std::regex kThread(
        "std::thread "
        "[a-z_]+;|std::thread\\(|startDetachedThread\\(|performOnOwnThread\\(|quietThread(IfAny)?\\(|serialQueue\\(\\s*\"");
    return std::regex_search(code, kThread);
}

TEST(Names, OfWhateverMakesAThreadOrAQueueStandInTheLanes) {
    // What they are made with is no lane.
    const std::set<std::string> kTools{"Threads", "QuietThread", "ThreadScheduler", "ThreadSchedulerQueue"};
    const Page& lanes = docs::page("docs/lanes.md");
    std::set<std::string> makers;
    for (const char* folder : {"src", "linux", "headless"})
        for (const auto& file : architecture::sourcesBelow(folder))
            if (makesLane(architecture::codeOf(file.text))) makers.insert(fs::path(file.path).stem().string());
    EXPECT_GT(makers.size(), 25u);
    for (const std::string& maker : makers) {
        if (kTools.contains(maker)) continue;
        const auto isIt = [&](const Span& span) { return span.text == maker; };
        EXPECT_TRUE(std::any_of(lanes.spans.begin(), lanes.spans.end(), isIt)) << maker << " is not in docs/lanes.md";
    }
    EXPECT_TRUE(makesLane("void f() { thread_ = std::thread([] {}); }"));
    EXPECT_TRUE(makesLane("queue_(scheduler.serialQueue( \"label\"))"));
    EXPECT_FALSE(makesLane("std::thread::id id; int thread = 1;"));
}

/// Rows of the lanes' table that name a file.
std::ptrdiff_t rowsWith(const Page& lanes, const std::string& stem) {
    std::istringstream lines(lanes.text);
    std::ptrdiff_t rows = 0;
    for (std::string line; std::getline(lines, line);)
        if (line.starts_with("| ") && line.find("`" + stem + "`") != std::string::npos) ++rows;
    return rows;
}

TEST(Names, OfFilesThatMakeSeveralQueuesStandInTheLanesOnceForEach) {
    static const std::regex kQueue("serialQueue\\(\\s*\"");
    const Page& lanes = docs::page("docs/lanes.md");
    std::ptrdiff_t queues = 0;
    for (const char* folder : {"src", "linux", "headless"})
        for (const auto& file : architecture::sourcesBelow(folder)) {
            const std::string code = architecture::codeOf(file.text);
            const auto made = std::distance(std::sregex_iterator(code.begin(), code.end(), kQueue), std::sregex_iterator());
            const std::string stem = fs::path(file.path).stem().string();
            EXPECT_GE(rowsWith(lanes, stem), made) << stem << " makes queues that docs/lanes.md doesn't have";
            queues += made;
        }
    EXPECT_GT(queues, 12);
}

}  // namespace
}  // namespace lumacast::docs
