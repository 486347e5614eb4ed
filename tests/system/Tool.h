#pragma once
// The administrator's tool, run to its end.

#include <string>
#include <vector>

#include "tests/checkers/tests/Child.h"
#include "tests/system/World.h"

namespace lumacast::test {

struct Outcome {
    int status = -1;
    std::string out;
};

/// Runs `lumacastctl` with these arguments as the world's user; what it complains of is in `tool.log`.
inline Outcome tool(const World& world, std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), LC_CTL);
    checkers::Child child(arguments, world.environment(), world.path("tool.log"));
    Outcome outcome;
    outcome.out = child.readAll();
    outcome.status = child.wait();
    return outcome;
}

}  // namespace lumacast::test
