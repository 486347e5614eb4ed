// The shortest application that broadcasts itself: nine seconds of a window that is red, green and blue, through an
// upload extension that the user has installed.

#include <cstdio>
#include <string>
#include <thread>

#include "../Window.h"
#include "client/Recorder.h"

int main(int argc, char** argv) {
    using namespace lumacast;
    if (argc != 3) return std::fprintf(stderr, "usage: broadcaster EXTENSION DIRECTORY\n"), 2;
    Window window(320, 240);

    client::Recorder recorder({.broadcastServiceInfo = [](const Value& info) { std::puts(describe(info).c_str()); }});
    client::BroadcastSetup setup;
    setup.host = BundleIdentifier("org.example.Broadcaster");  // this application
    setup.extension = argv[1] + std::string(".*");             // the last component does not count
    setup.configuration = LCBroadcastConfiguration{.clipDuration = 3, .videoCompressionProperties = {}};
    setup.userInfo.set("directory", argv[2]);  // the extension's own, or one that its manifest is granted
    if (const auto error = recorder.setUpBroadcastAndWait(setup))
        return std::fprintf(stderr, "not set up: %s\n", client::textOf(*error).c_str()), 1;

    const auto start = recorder.startAndWait(
        {.windows = {ContextID{window.id()}}, .size = {320, 240}, .broadcast = true}, std::chrono::minutes(1));
    if (start.error) return std::fprintf(stderr, "not started: %s\n", client::textOf(*start.error).c_str()), 1;

    for (const std::uint32_t colour : {0xff0000, 0x00ff00, 0x0000ff}) {
        window.fill(colour);
        std::this_thread::sleep_for(std::chrono::seconds(3));
    }

    const auto stop = recorder.stopAndWait();
    if (stop.error) return std::fprintf(stderr, "ended with: %s\n", client::textOf(*stop.error).c_str()), 1;
}
