// An application with one window, whose every frame carries its number. It is driven by lines on standard input.

#include <unistd.h>

#include <CLI/CLI.hpp>
#include <cstdio>
#include <optional>
#include <string>

#include "examples/self_recorder/Beeper.h"
#include "examples/self_recorder/CommandReader.h"
#include "examples/self_recorder/CommandTable.h"
#include "examples/self_recorder/DrawingCommands.h"
#include "examples/self_recorder/Loop.h"
#include "examples/self_recorder/Painter.h"
#include "examples/self_recorder/Recording.h"
#include "examples/self_recorder/SceneWindow.h"

namespace {

using namespace lumacast;

int fail(const std::string& why) {
    std::fprintf(stderr, "self_recorder: %s\n", why.c_str());
    return 1;
}

}  // namespace

int main(int argc, char** argv) {
    CLI::App options("Shows a moving scene in a window; commands come from standard input, one per line.");
    example::Painter::Options painting;
    std::string size = "640x360", name = "self recorder";
    bool part = false;
    double beepFrequency = 1000, tone = 0;
    options.add_option("--fps", painting.framesPerSecond, "frames per second")->check(CLI::Range(1, 240));
    options.add_option("--size", size, "size of the window, WxH");
    options.add_option("--name", name, "title and class of the window");
    options.add_option("--frames-log", painting.framesLog,
                       "file for one line per frame: number, host time in ns when shown, and when sent");
    options.add_flag("--still", painting.still, "draw one frame, then nothing until the command 'moving'");
    options.add_option("--beep-every", painting.markEvery,
                       "mark every so many frames with a white border, and beep when they are shown")
        ->check(CLI::Range(10, 1'000'000));
    options.add_option("--beep-frequency", beepFrequency, "of the beeps, in Hz")->check(CLI::Range(100, 10'000));
    options.add_option("--tone", tone, "hum a steady tone of so many Hz")->check(CLI::Range(100, 10'000));
    options.add_flag("--part", part, "move only a small part of the scene");
    example::CommandTable commands;
    const auto run = [&] {
        int width = 0, height = 0, used = 0;
        if (std::sscanf(size.c_str(), "%dx%d%n", &width, &height, &used) != 2 ||
            used != static_cast<int>(size.size()) || !example::sizeIsUsable(width, height))
            return fail("--size needs WxH, at least 160x90");
        if (part) painting.motion = scene::Motion::SmallPart;

        example::Loop loop;
        example::SceneWindow window(width, height, name);
        if (!window.error().empty()) return fail(window.error());
        std::optional<example::Beeper> beeper, hum;
        if (tone > 0) hum.emplace(tone, true);
        if (painting.markEvery > 0) beeper.emplace(beepFrequency);
        painting.onMark = [&beeper](std::int64_t hostTime) { beeper->playAt(hostTime); };
        example::Painter painter(loop, window, painting);
        if (!painter.error().empty()) return fail(painter.error());
        window.events.closed = [&loop] { loop.quit(0); };
        window.events.lost = [&loop] { loop.quit(1); };
        example::addDrawingCommands(commands, loop, window, painter);
        if (beeper) example::addBeepCommands(commands, *beeper);
        const example::Recording recording(loop, commands, window, painter);
        loop.watch(window.descriptor(), [&window] { window.pump(); });
        // Events that arrived while a reply was awaited don't wake the descriptor again.
        loop.beforeWaiting([&window] { window.pump(); });
        const example::CommandReader reader(loop, commands, STDIN_FILENO);

        char line[32];
        std::snprintf(line, sizeof line, "window 0x%x", window.identifier());
        example::printLine(line);
        return loop.run();
    };
    CLI11_PARSE(options, argc, argv);
    return run();
}
