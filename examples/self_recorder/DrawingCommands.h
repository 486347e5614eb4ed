#pragma once

#include "examples/self_recorder/CommandTable.h"
#include "examples/self_recorder/Loop.h"
#include "examples/self_recorder/Painter.h"
#include "examples/self_recorder/SceneWindow.h"

namespace lumacast::example {

/// Adds the commands that concern the window and what is drawn in it. Borrows all four for the table's life.
void addDrawingCommands(CommandTable& commands, Loop& loop, SceneWindow& window, Painter& painter);

/// A window size the scene can be drawn at.
[[nodiscard]] bool sizeIsUsable(int width, int height);

}  // namespace lumacast::example
