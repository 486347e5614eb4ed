#include "examples/self_recorder/DrawingCommands.h"

#include "examples/scene/Picture.h"

namespace lumacast::example {
namespace {

constexpr int kLargest = 8192;
constexpr int kFarthest = 32000;

bool reachable(int place) {
    return place >= -kFarthest && place <= kFarthest;
}

}  // namespace

bool sizeIsUsable(int width, int height) {
    return width >= scene::kMinimumWidth && height >= scene::kMinimumHeight && width <= kLargest && height <= kLargest;
}

void addDrawingCommands(CommandTable& commands, Loop& loop, SceneWindow& window, Painter& painter) {
    commands.add("size W H", "resize the window", [&window](const Arguments& arguments, const Reply& reply) {
        const auto width = wholeNumber(arguments[0]), height = wholeNumber(arguments[1]);
        if (!width || !height || !sizeIsUsable(*width, *height)) return reply("error unusable size");
        window.resize(*width, *height);
        reply("ok");
    });
    commands.add("move X Y", "move the window", [&window](const Arguments& arguments, const Reply& reply) {
        const auto x = wholeNumber(arguments[0]), y = wholeNumber(arguments[1]);
        if (!x || !y || !reachable(*x) || !reachable(*y)) return reply("error unusable place");
        window.move(*x, *y);
        reply("ok");
    });
    commands.add("hide", "unmap the window", [&window](const Arguments&, const Reply& reply) {
        window.hide();
        reply("ok");
    });
    commands.add("show", "map the window again", [&window](const Arguments&, const Reply& reply) {
        window.show();
        reply("ok");
    });
    commands.add("raise", "put the window above all others", [&window](const Arguments&, const Reply& reply) {
        window.raise();
        reply("ok");
    });
    commands.add("still", "stop drawing: nothing changes", [&painter](const Arguments&, const Reply& reply) {
        painter.setStill(true);
        reply("ok");
    });
    commands.add("moving", "draw again", [&painter](const Arguments&, const Reply& reply) {
        painter.setStill(false);
        reply("ok");
    });
    commands.add("frame", "print the number of the frame shown", [&painter](const Arguments&, const Reply& reply) {
        reply("frame " + std::to_string(painter.frame()));
    });
    commands.add("help", "print the commands, several lines",
                 [&commands](const Arguments&, const Reply& reply) { reply(commands.help() + "ok"); });
    commands.add("quit", "end the application", [&loop](const Arguments&, const Reply& reply) {
        reply("ok");
        loop.quit(0);
    });
}

}  // namespace lumacast::example
