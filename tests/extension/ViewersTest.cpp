// The server that docs/broadcast.md proposes: that both extensions' streams get to viewers, and what its origin is
// spared.

#include <gtest/gtest.h>

#include <filesystem>
#include <set>
#include <sstream>

#include "tests/extension/ClipHost.h"
#include "tests/extension/PrivateNginx.h"
#include "tests/extension/SampleHost.h"
#include "tests/extension/StreamJudge.h"

namespace lumacast::test {
namespace {

/// docs/live-server.conf with ports and folders of the test's own.
class LiveServer final {
public:
    LiveServer() {
        for (const char* folder : {"temp", "www/rtmp", "cache"}) scratch_.makeDirectory(folder);
        scratch_.write("nginx.conf", configuration());
        process_ = std::make_unique<checkers::Child>(
            std::vector<std::string>{"/usr/sbin/nginx", "-p", scratch_.path(), "-c", scratch_.path("nginx.conf"), "-e",
                                     scratch_.path("error.log")},
            std::vector<std::string>{}, scratch_.path("stderr.log"));
        EXPECT_TRUE(waitUntil([&] { return std::filesystem::exists(scratch_.path("nginx.pid")); })) << log();
    }

    std::string origin() const { return "http://127.0.0.1:" + origin_; }
    std::string edge() const { return "http://127.0.0.1:" + edge_; }
    std::string rtmp(const std::string& key) const { return "rtmp://127.0.0.1:" + rtmp_ + "/live/" + key; }
    std::string file(const std::string& name) const { return ScratchDirectory::read(scratch_.path("www/" + name)); }
    std::string log() const { return ScratchDirectory::read(scratch_.path("error.log")); }
    /// The requests that got to the origin, one a line.
    std::string asked() const { return ScratchDirectory::read(scratch_.path("origin.log")); }

private:
    std::string configuration() const {
        std::string text = ScratchDirectory::read(LC_SOURCE_DIR "/docs/live-server.conf");
        const auto put = [&text](const std::string& place, const std::string& own) {
            EXPECT_NE(text.find(place), std::string::npos) << place;
            for (auto at = text.find(place); at != std::string::npos; at = text.find(place, at + own.size()))
                text.replace(at, place.size(), own);
        };
        put("listen 8080;", "listen 8080;\n    access_log " + scratch_.path("origin.log") + " asked;");
        put("1935", rtmp_);
        put("8080", origin_);
        put("8000", edge_);
        put("/srv/live", scratch_.path("www"));
        put("/var/cache/live", scratch_.path("cache"));
        std::string http = "http {\n  access_log off;\n  log_format asked '$request';\n";
        for (const std::string kind : {"client_body", "proxy", "fastcgi", "uwsgi", "scgi"})
            http += "  " + kind + "_temp_path " + scratch_.path("temp/" + kind) + ";\n";
        put("http {\n", http);
        return text + (::geteuid() == 0 ? "user root;\n" : "") + "daemon off;\nmaster_process off;\npid " +
               scratch_.path("nginx.pid") + ";\n";
    }

    ScratchDirectory scratch_;
    const std::string origin_ = std::to_string(PrivateNginx::freePort()),
                      edge_ = std::to_string(PrivateNginx::freePort()),
                      rtmp_ = std::to_string(PrivateNginx::freePort());
    std::unique_ptr<checkers::Child> process_;
};

TEST(Viewers, SeeTheStreamOfClipsAtTheEdgeAndTheOriginIsAskedForEachSegmentOnce) {
    LiveServer server;
    ClipHost host;
    for (int at = 0; at < 4; ++at)
        ASSERT_TRUE(host.broadcast({{"url", server.origin() + "/hls/"}}, at == 3, {.frames = 15})) << server.log();
    for (int viewer = 0; viewer < 3; ++viewer) expectFrames(server.edge() + "/hls/index.m3u8", 0, 59);
    std::multiset<std::string> segments;
    EXPECT_TRUE(waitUntil([&] {
        std::istringstream lines(server.asked());
        segments.clear();
        for (std::string line; std::getline(lines, line);)
            if (line.starts_with("GET ") && line.find(".m4s") != std::string::npos) segments.insert(line);
        return segments.size() >= 4;
    }));
    EXPECT_EQ(segments.size(), 4u) << server.asked();
    for (const std::string& segment : segments) EXPECT_EQ(segments.count(segment), 1u) << segment;
    // Nobody broadcasts from where the viewers are.
    const auto edge = extensions::makeUpload(server.edge() + "/hls/", [] { return false; });
    EXPECT_NE(edge->put("watch.html", {'x'}, "text/html"), "");
    EXPECT_NE(server.file("hls/watch.html"), "x");
}

TEST(Viewers, SeeThePushedStreamAtTheEdge) {
    LiveServer server;
    SampleHost host;
    host.start({{"url", server.rtmp("show")}});
    host.show(200);
    EXPECT_TRUE(host.finish());
    EXPECT_TRUE(waitUntil([&] { return server.file("rtmp/show.m3u8").find("show-1.ts") != std::string::npos; }))
        << server.log();
    // A live playlist does not end: its first segments, one by one.
    std::uint32_t next = 0;
    for (const char* name : {"show-0.ts", "show-1.ts"}) {
        const auto pictures = picturesOf(server.edge() + "/rtmp/" + name);
        ASSERT_FALSE(pictures.empty()) << name;
        for (const auto& picture : pictures) EXPECT_EQ(picture.number, next++) << name;
    }
    EXPECT_GE(next, 60u);
}

}  // namespace
}  // namespace lumacast::test
