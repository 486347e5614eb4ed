// The shortest application that records itself: three seconds of a window that is red, green and blue.

#include <cstdio>
#include <filesystem>
#include <thread>

#include "../Window.h"
#include "client/Recorder.h"

// [record]
int main(int argc, char** argv) {
    using namespace lumacast;
    if (argc != 2) return std::fprintf(stderr, "usage: recorder MOVIE\n"), 2;
    Window window(320, 240);

    client::Recorder recorder({.stopped = [](const auto& error, const auto& /*movie*/) {
        if (error) std::fprintf(stderr, "ended by itself: %s\n", client::textOf(*error).c_str());
    }});
    const auto start = recorder.startAndWait({.windows = {ContextID{window.id()}}, .size = {320, 240}});
    if (start.error) return std::fprintf(stderr, "not started: %s\n", client::textOf(*start.error).c_str()), 1;

    for (const std::uint32_t colour : {0xff0000, 0x00ff00, 0x0000ff}) {  // what is to be recorded happens here
        window.fill(colour);
        std::this_thread::sleep_for(std::chrono::seconds(1));
    }

    const auto stop = recorder.stopAndWait();
    if (stop.error) return std::fprintf(stderr, "not saved: %s\n", client::textOf(*stop.error).c_str()), 1;
    std::filesystem::copy_file(stop.movie->path(), argv[1]);  // the daemon's own file does not stay
}
// [/record]
