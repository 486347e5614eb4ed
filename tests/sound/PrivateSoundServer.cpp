#include "tests/sound/PrivateSoundServer.h"

#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <fstream>

namespace lumacast::test {

namespace {

namespace fs = std::filesystem;

std::string makeDirectory(const std::vector<std::string>& folders) {
    // Short: socket paths are limited.
    std::string path = (fs::temp_directory_path() / "lc-sound-XXXXXX").string();
    if (!::mkdtemp(path.data())) return {};
    for (const std::string& folder : folders) {
        fs::create_directories(path + "/" + folder);
        ::chmod((path + "/" + folder).c_str(), 0700);
    }
    return path;
}

void removeDirectory(const std::string& path) {
    std::error_code ignored;
    if (!path.empty()) fs::remove_all(path, ignored);
}

bool accepts(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof address.sun_path) return false;
    std::memcpy(address.sun_path, path.c_str(), path.size());
    const Fd socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    return ::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
}

template <class Condition>
bool within(std::chrono::seconds limit, const Condition& condition) {
    const auto end = std::chrono::steady_clock::now() + limit;
    while (!condition()) {
        if (std::chrono::steady_clock::now() > end) return false;
        ::poll(nullptr, 0, 10);
    }
    return true;
}

std::string firstLineOf(std::vector<std::string> command) {
    return SoundProcess(std::move(command)).readLine();
}

/// Whether an application can play: a server that accepts clients may still be looking for its outputs.
bool plays(const std::string& address) {
    return within(std::chrono::seconds(20), [&address] { return TonePlayer(address).tell("play probe 100 0 2"); });
}

void expectThatItRuns(const SoundProcess& server, const char* name) {
    EXPECT_EQ(server.ownEnd(), "") << "the end of the test's own " << name << ", which nobody ended";
}

std::string pulseSocket(const std::string& address) { return address.substr(std::strlen("unix:")); }

constexpr const char* kPipeWire = R"(context.properties = {
    core.daemon = true
    core.name = pipewire-0
    default.clock.rate = 48000
    default.clock.quantum = 1024
}
context.spa-libs = {
    audio.convert.* = audioconvert/libspa-audioconvert
    support.* = support/libspa-support
}
context.modules = [
    { name = libpipewire-module-protocol-native }
    { name = libpipewire-module-metadata }
    { name = libpipewire-module-spa-node-factory }
    { name = libpipewire-module-client-node }
    { name = libpipewire-module-access }
    { name = libpipewire-module-adapter }
    { name = libpipewire-module-link-factory }
    { name = libpipewire-module-session-manager }
]
context.objects = [
    { factory = spa-node-factory args = {
        factory.name = support.node.driver node.name = Dummy-Driver
        node.group = pipewire.dummy priority.driver = 20000 } }
    { factory = adapter args = {
        factory.name = support.null-audio-sink node.name = null0 media.class = Audio/Sink
        object.linger = true audio.position = [ FL FR ] priority.session = 1000 } }
    { factory = adapter args = {
        factory.name = support.null-audio-sink node.name = null1 media.class = Audio/Sink
        object.linger = true audio.position = [ FL FR ] priority.session = 500 } }
    { factory = adapter args = {
        factory.name = support.null-audio-sink node.name = source0 media.class = Audio/Source/Virtual
        object.linger = true audio.position = [ MONO ] } }
]
)";

/// What the session manager does without devices and without a session bus.
constexpr const char* kSessionManager = R"(load_module("metadata")
default_access.properties["enable-flatpak-portal"] = false
default_access.enable()
device_defaults.enable()
load_script("intended-roles.lua")
)";

}  // namespace

PrivateSoundServer::PrivateSoundServer(Begin begin) : directory_(makeDirectory({"run", "pulse", "home"})) {
    if (begin == Begin::Now) start();
}

PrivateSoundServer::~PrivateSoundServer() {
    if (server_) expectThatItRuns(*server_, "pulseaudio");
    server_.reset();
    removeDirectory(directory_);
}

std::string PrivateSoundServer::name() const { return firstLineOf({"pulseaudio", "--version"}); }

bool PrivateSoundServer::isThere() const { return server_ && accepts(pulseSocket(address())); }

bool PrivateSoundServer::start() {
    fs::remove(directory_ + "/pulse/native");
    const std::string native = "module-native-protocol-unix auth-cookie-enabled=0";
    const auto sink = [](const std::string& name) {
        return "module-null-sink sink_name=" + name + " rate=48000 norewinds=1";
    };
    server_ = std::make_unique<SoundProcess>(
        std::vector<std::string>{"pulseaudio", "-n", "--daemonize=no", "--exit-idle-time=-1", "--disallow-exit",
                                 "--use-pid-file=no", "--realtime=no", "-L", sink("null0"), "-L", sink("null1"), "-L",
                                 native},
        std::vector<std::string>{"XDG_RUNTIME_DIR=" + directory_ + "/run", "PULSE_RUNTIME_PATH=" + directory_ + "/pulse",
                                 "HOME=" + directory_ + "/home", "XDG_CONFIG_HOME", "DBUS_SESSION_BUS_ADDRESS", "DISPLAY"});
    return within(std::chrono::seconds(20), [this] { return isThere(); }) && plays(address());
}

void PrivateSoundServer::kill() {
    if (server_) server_->kill();
    server_.reset();
}
void PrivateSoundServer::hang() { server_->send(SIGSTOP); }
void PrivateSoundServer::goOn() { server_->send(SIGCONT); }

PrivatePipeWire::PrivatePipeWire(PrivateSoundServer::Begin begin)
    : directory_(makeDirectory({"run", "home", "config/wireplumber/main.lua.d", "config/wireplumber/bluetooth.lua.d"})) {
    std::ofstream(directory_ + "/config/private.conf") << kPipeWire;
    std::ofstream(directory_ + "/config/wireplumber/main.lua.d/90-enable-all.lua") << kSessionManager;
    std::ofstream(directory_ + "/config/wireplumber/bluetooth.lua.d/90-enable-all.lua") << "\n";
    if (begin == PrivateSoundServer::Begin::Now) start();
}

PrivatePipeWire::~PrivatePipeWire() {
    for (const auto& server : servers_) expectThatItRuns(*server, "sound servers");
    while (!servers_.empty()) servers_.pop_back();
    removeDirectory(directory_);
}

std::vector<std::string> PrivatePipeWire::environment() const {
    return {"XDG_RUNTIME_DIR=" + directory_ + "/run",
            "HOME=" + directory_ + "/home",
            "XDG_CONFIG_HOME=" + directory_ + "/config",
            "XDG_STATE_HOME=" + directory_ + "/state",
            "DBUS_SESSION_BUS_ADDRESS=unix:path=/nonexistent",
            "PULSE_RUNTIME_PATH",
            "DISPLAY"};
}

std::string PrivatePipeWire::name() const {
    SoundProcess program({"pipewire", "--version"});
    program.readLine();
    std::string line = program.readLine();
    const std::size_t version = line.rfind(' ');
    return "PipeWire " + (version == std::string::npos ? line : line.substr(version + 1));
}

bool PrivatePipeWire::isThere() const { return servers_.size() == 3 && accepts(pulseSocket(address())); }

bool PrivatePipeWire::start() {
    fs::remove_all(directory_ + "/run/pulse");
    fs::remove(directory_ + "/run/pipewire-0");
    servers_.push_back(std::make_unique<SoundProcess>(
        std::vector<std::string>{"pipewire", "-c", directory_ + "/config/private.conf"}, environment()));
    if (!within(std::chrono::seconds(20), [this] { return accepts(directory_ + "/run/pipewire-0"); })) return false;
    servers_.push_back(std::make_unique<SoundProcess>(std::vector<std::string>{"wireplumber"}, environment()));
    servers_.push_back(std::make_unique<SoundProcess>(std::vector<std::string>{"pipewire-pulse"}, environment()));
    return within(std::chrono::seconds(20), [this] { return isThere(); }) && plays(address());
}

void PrivatePipeWire::kill() {
    while (!servers_.empty()) {
        servers_.back()->kill();
        servers_.pop_back();
    }
}
void PrivatePipeWire::hang() {
    for (const auto& server : servers_) server->send(SIGSTOP);
}
void PrivatePipeWire::goOn() {
    for (const auto& server : servers_) server->send(SIGCONT);
}

}  // namespace lumacast::test
