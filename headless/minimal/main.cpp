// The shortest application that records itself where there is no display: the first of the windows that every process
// has.

#include <unistd.h>

#include <chrono>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <system_error>
#include <thread>

#include "client/Recorder.h"

int main(int argc, char** argv) {
    using namespace lumacast;
    if (argc != 2) return std::fprintf(stderr, "usage: minimal-headless MOVIE\n"), 2;
    client::Recorder recorder({});
    client::StartOptions options;
    options.windows = {ContextID{8 * static_cast<std::uint32_t>(::getpid())}};
    options.size = {320, 180};
    const client::StartAnswer start = recorder.startAndWait(options);
    if (start.error) return std::fprintf(stderr, "not started: %s\n", client::textOf(*start.error).c_str()), 1;
    std::this_thread::sleep_for(std::chrono::seconds(3));
    const client::StopAnswer stop = recorder.stopAndWait();
    if (!stop.movie) return std::fprintf(stderr, "no movie\n"), 1;
    std::error_code failure;  // the daemon's own file does not stay
    return std::filesystem::copy_file(stop.movie->path(), argv[1], failure) ? 0 : 1;
}
