// Who may include whom.

#include <gtest/gtest.h>

#include <map>
#include <set>

#include "tests/unit/architecture/SourceText.h"

namespace lumacast::architecture {
namespace {

/// The folders that stand for layers, longest first where one lies in another.
constexpr std::string_view kFolders[] = {"src/base",    "src/writer/media", "src/platform", "src/support",
                                         "src/broadcast", "src/writer",     "src/capture",  "src/session",
                                         "src/daemon",  "linux/ipc",        "linux",        "headless", "client/lumacastctl",
                                         "client/extension", "client",      "extensions",   "examples",     "tests"};

/// What each layer may include besides itself: layers, and single headers.
const std::map<std::string_view, std::set<std::string_view>> kMayInclude{
    {"src/base", {}},
    {"src/writer/media", {"src/base"}},
    {"src/platform", {"src/writer/media", "src/base"}},
    {"src/support", {"src/platform", "src/writer/media", "src/base"}},
    {"src/broadcast", {"src/support", "src/platform", "src/writer/media", "src/base"}},
    {"src/writer", {"src/broadcast", "src/support", "src/platform", "src/writer/media", "src/base"}},
    {"src/capture", {"src/broadcast", "src/support", "src/platform", "src/writer/media", "src/base"}},
    {"src/session",
     {"src/writer", "src/capture", "src/broadcast", "src/support", "src/platform", "src/writer/media", "src/base"}},
    {"src/daemon",
     {"src/session", "src/writer", "src/capture", "src/broadcast", "src/support", "src/platform", "src/writer/media",
      "src/base"}},
    // The port gives its reactor to the thread scheduler.
    {"linux", {"linux/ipc", "src/platform", "src/writer/media", "src/base", "src/support/ThreadScheduler.h"}},
    {"linux/ipc", {"linux", "src/platform", "src/writer/media", "src/base"}},
    // The second port has the first one's services, and shows the examples' scene.
    {"headless",
     {"linux", "linux/ipc", "src/platform", "src/writer/media", "src/base", "examples/scene/Scene.h", "examples/scene/FramePattern.h",
      "client/Recorder.h"}},
    {"client",
     {"src/base", "src/writer/media", "src/broadcast/LCBroadcastConfiguration.h",
      "src/broadcast/ConfigurationArchive.h", "linux/ipc",
      "src/platform/IpcConnection.h", "src/platform/IpcEndpoint.h", "src/platform/IpcListener.h",
      "src/platform/Scheduler.h"}},
    // The administrator's tool is no client of the daemon: it asks the admin service and looks at what the port looks
    // at.
    {"client/lumacastctl", {"client", "linux", "linux/ipc", "src/platform", "src/writer/media", "src/base"}},
    // What the daemon and an extension tell each other, besides.
    {"client/extension",
     {"src/base", "src/writer/media", "src/broadcast/LCBroadcastConfiguration.h",
      "src/broadcast/ConfigurationArchive.h", "src/broadcast/PayloadKeys.h", "linux/ipc",
      "src/platform/IpcConnection.h", "src/platform/IpcEndpoint.h", "src/platform/IpcListener.h"}},
    // A clip's movie is a descriptor.
    {"extensions", {"client/extension", "src/base", "src/writer/media", "linux/ipc/Fd.h"}},
};

std::string_view layerOf(std::string_view path) {
    std::string_view best;
    for (const std::string_view folder : kFolders)
        if (path.starts_with(folder) && path.substr(folder.size()).starts_with('/') && folder.size() > best.size())
            best = folder;
    return best;
}

/// The path of an included file below the top of the tree: includes are written from src/ or from the top.
std::string resolved(const std::string& name) {
    const std::string belowSrc = "src/" + name;
    return layerOf(belowSrc).empty() ? name : belowSrc;
}

/// What is wrong with one file's includes, one line each.
std::vector<std::string> forbiddenEdges(const SourceFile& file) {
    std::vector<std::string> edges;
    const std::string_view from = layerOf(file.path);
    const auto allowed = kMayInclude.find(from);
    if (allowed == kMayInclude.end()) return {file.path + " is in no layer"};
    for (const Include& include : includesOf(file.text)) {
        if (!include.isQuoted) continue;
        const std::string target = resolved(include.name);
        const std::string_view to = layerOf(target);
        if (to == from || allowed->second.contains(to) || allowed->second.contains(target)) continue;
        edges.push_back(file.path + ":" + std::to_string(include.line) + " includes " + include.name);
    }
    return edges;
}

TEST(IncludeTable, EveryIncludeOfTheTreeIsAllowed) {
    std::size_t files = 0;
    for (const char* folder : {"src", "linux", "headless", "client", "extensions"}) {
        for (const SourceFile& file : sourcesBelow(folder)) {
            ++files;
            for (const std::string& edge : forbiddenEdges(file)) ADD_FAILURE() << edge;
        }
    }
    EXPECT_GT(files, 100u) << "the tree was not found";
}

TEST(IncludeTable, AForbiddenEdgeIsSeen) {
    const auto edge = [](const std::string& path, const std::string& include) {
        return forbiddenEdges({path, "#pragma once\n#include <string>\n  # include \"" + include + "\"\n"}).size();
    };
    EXPECT_EQ(edge("src/base/Planted.h", "platform/Clock.h"), 1u);
    EXPECT_EQ(edge("src/base/Planted.h", "base/Value.h"), 0u);
    EXPECT_EQ(edge("src/writer/media/Planted.h", "writer/MovieSettings.h"), 1u);
    EXPECT_EQ(edge("src/writer/Planted.h", "writer/media/MediaTime.h"), 0u);
    EXPECT_EQ(edge("src/writer/Planted.cpp", "capture/LCCaptureManager.h"), 1u);
    EXPECT_EQ(edge("src/capture/Planted.cpp", "writer/LCMovieWriter.h"), 1u);
    EXPECT_EQ(edge("src/session/Planted.cpp", "daemon/LCRecordingManager.h"), 1u);
    EXPECT_EQ(edge("src/daemon/Planted.cpp", "linux/ipc/Reactor.h"), 1u);
    EXPECT_EQ(edge("src/daemon/Planted.cpp", "tests/fakes/FakeClock.h"), 1u);
    EXPECT_EQ(edge("src/daemon/Planted.cpp", "session/LCRecordingSession.h"), 0u);
    EXPECT_EQ(edge("linux/apps/Planted.cpp", "support/TempStore.h"), 1u);
    EXPECT_EQ(edge("linux/apps/Planted.cpp", "support/ThreadScheduler.h"), 0u);
    EXPECT_EQ(edge("linux/desktop/Planted.cpp", "headless/user/SyntheticUserAlerts.h"), 1u);
    EXPECT_EQ(edge("headless/Planted.cpp", "linux/system/LinuxClock.h"), 0u);
    EXPECT_EQ(edge("headless/Planted.cpp", "tests/fakes/FakeClock.h"), 1u);
    EXPECT_EQ(edge("client/Planted.cpp", "linux/system/IniFile.h"), 1u);
    EXPECT_EQ(edge("client/Planted.cpp", "platform/Platform.h"), 1u);
    EXPECT_EQ(edge("client/Planted.cpp", "linux/ipc/LinuxIpc.h"), 0u);
    EXPECT_EQ(edge("client/extension/Planted.cpp", "broadcast/PayloadKeys.h"), 0u);
    EXPECT_EQ(edge("client/extension/Planted.cpp", "client/Recorder.h"), 1u);
    EXPECT_EQ(edge("client/extension/Planted.cpp", "broadcast/LCBroadcastExtensionProxy.h"), 1u);
    EXPECT_EQ(edge("extensions/planted/Planted.cpp", "linux/media/AvHandles.h"), 1u);
    EXPECT_EQ(edge("extensions/planted/Planted.cpp", "linux/ipc/Reactor.h"), 1u);
    EXPECT_EQ(edge("extensions/planted/Planted.cpp", "client/extension/Extension.h"), 0u);
    EXPECT_EQ(edge("src/base/Planted.h", "Value.h"), 1u) << "not written from a root";
    EXPECT_EQ(edge("src/other/Planted.h", "base/Value.h"), 1u) << "a folder that is no layer";
}

TEST(IncludeTable, TheLayersHaveNoCycle) {
    // Each layer of src/ may include only what stands before it in the order of the build.
    const std::vector<std::string_view> order{"src/base",      "src/writer/media", "src/platform", "src/support",
                                              "src/broadcast", "src/writer",       "src/capture",  "src/session",
                                              "src/daemon"};
    for (std::size_t at = 0; at < order.size(); ++at) {
        const std::set<std::string_view> before(order.begin(), order.begin() + static_cast<std::ptrdiff_t>(at));
        for (const std::string_view to : kMayInclude.at(order[at]))
            EXPECT_TRUE(before.contains(to)) << order[at] << " " << to;
    }
}

}  // namespace
}  // namespace lumacast::architecture
