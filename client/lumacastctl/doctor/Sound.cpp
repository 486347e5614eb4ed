#include "client/lumacastctl/doctor/Sound.h"

#include <unistd.h>

#include "linux/admin/UnixSocket.h"

namespace lumacast::ctl {

namespace {

constexpr std::string_view kUnixPrefix = "unix:";
constexpr char kPulseAudio[] = "PulseAudio";

std::string pulseSocket(const LinuxEnvironment::Variables& variables, const std::string& runtime) {
    const std::string server = variables("PULSE_SERVER").value_or("");
    if (server.starts_with(kUnixPrefix)) return server.substr(kUnixPrefix.size());
    if (server.starts_with('/')) return server;
    if (const auto path = variables("PULSE_RUNTIME_PATH"); path && !path->empty()) return *path + "/native";
    return runtime + "/pulse/native";
}

std::string pipeWireSocket(const LinuxEnvironment::Variables& variables, const std::string& runtime) {
    const std::string remote = variables("PIPEWIRE_REMOTE").value_or("pipewire-0");
    if (remote.starts_with('/')) return remote;
    const std::string directory = variables("PIPEWIRE_RUNTIME_DIR").value_or("");
    return (directory.empty() ? runtime : directory) + "/" + remote;
}

}  // namespace

SoundFacts probeSound(const LinuxEnvironment::Variables& variables) {
    std::string runtime = variables("XDG_RUNTIME_DIR").value_or("");
    if (runtime.empty()) runtime = "/run/user/" + std::to_string(::getuid());
    SoundFacts facts;
    facts.sockets = {{kPulseAudio, pulseSocket(variables, runtime)}, {"PipeWire", pipeWireSocket(variables, runtime)}};
    for (SoundFacts::Socket& socket : facts.sockets) socket.answers = static_cast<bool>(connectTo(socket.path));
    return facts;
}

Findings checkSound(const SoundFacts& facts) {
    constexpr char kSubject[] = "sound";
    std::vector<std::string> silent;
    const SoundFacts::Socket* pipeWire = nullptr;
    for (const SoundFacts::Socket& socket : facts.sockets) {
        if (!socket.answers)
            silent.push_back(socket.server + " at " + socket.path);
        else if (socket.server == kPulseAudio)
            return {ok(kSubject, "applications' sound is recorded through the sound server at " + socket.path + ".")};
        else
            pipeWire = &socket;
    }
    if (pipeWire)
        return {warning(kSubject, pipeWire->server + " at " + pipeWire->path +
                                      " can be reached, but movies are silent: nobody answers as " + listText(silent) +
                                      "; start pipewire-pulse.")};
    return {warning(
        kSubject, "no sound server answers (looked for " + listText(silent) +
                      "), so movies are silent until one does; start one, or set PULSE_SERVER as the session has it.")};
}

}  // namespace lumacast::ctl
