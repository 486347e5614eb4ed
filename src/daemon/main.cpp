// The daemon's entry: builds the world, top to bottom, and runs it.

#include <cstdlib>

#include "daemon/Process.h"

int main() {
    const auto owner = lumacast::makePlatform();
    if (!owner) return EXIT_FAILURE;
    const lumacast::Platform& platform = owner->platform();

    platform.log.line("lumacastd Starting!");
    lumacast::Process process(platform);
    process.start();
    platform.scheduler.runMainLoop();
    return -1;  // the platform ends the process; the loop is not meant to return
}
