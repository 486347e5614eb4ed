// An application that asks the daemon for its state and stays until its standard input ends. Installed under many
// names it is many applications.

#include <cstdio>

#include "client/Recorder.h"

int main() {
    lumacast::client::Recorder recorder({});
    const auto answer = recorder.stateAndWait();
    const lumacast::Value* isRecording = answer.state ? answer.state->find("isRecording") : nullptr;
    std::puts(isRecording ? "state" : "none");
    std::fflush(stdout);
    while (std::getchar() != EOF) {
    }
    return 0;
}
