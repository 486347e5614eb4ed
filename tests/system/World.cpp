#include "tests/system/World.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <stdlib.h>

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>

namespace lumacast::test {

namespace fs = std::filesystem;

pid_t processRunning(const std::string& program) {
    for (const auto& entry : fs::directory_iterator("/proc")) {
        const std::string name = entry.path().filename().string();
        if (name.find_first_not_of("0123456789") != std::string::npos) continue;
        std::ifstream file(entry.path() / "cmdline");
        std::string first;
        std::getline(file, first, '\0');
        if (first == program) return static_cast<pid_t>(std::stol(name));
    }
    return 0;
}

bool longTests() {
    const char* wanted = ::getenv("LC_LONG_TESTS");
    return wanted && std::strcmp(wanted, "1") == 0;
}

Application::Application(World& world, const std::string& program, const std::string& name,
                         const std::vector<std::string>& options)
    : log_(world.path(name + " frames.txt")) {
    std::vector<std::string> command{program, "--name", name, "--frames-log", log_};
    command.insert(command.end(), options.begin(), options.end());
    child_ = std::make_unique<checkers::Child>(command, world.environment(), world.path(name + ".log"));
    const std::string line = child_->readLine();
    if (line.starts_with("window 0x")) window_ = static_cast<std::uint32_t>(std::stoul(line.substr(9), nullptr, 16));
    EXPECT_NE(window_, 0u) << line;
}

std::string Application::ask(const std::string& command) {
    child_->send(command);
    for (int again = 0;;) {
        std::string line = child_->readLine();
        if (line.starts_with("event ")) {
            events_.push_back(std::move(line));
        } else if (command == "start" && line.starts_with("error -5803") && again++ < 20) {
            // A desktop that does not say within 100 ms who is in front says "nobody"; on a busy machine one asks
            // again.
            child_->send(command);
        } else {
            return line;
        }
    }
}

std::string Application::answer() {
    for (;;) {
        std::string line = child_->readLine();
        if (!line.starts_with("event ")) return line;
        events_.push_back(std::move(line));
    }
}

std::uint32_t Application::askForFrame(const std::string& command) {
    const std::string answer = ask(command);
    const auto at = answer.find("frame ");
    EXPECT_NE(at, std::string::npos) << command << ": " << answer;
    return at == std::string::npos ? 0 : static_cast<std::uint32_t>(std::stoul(answer.substr(at + 6)));
}

bool Application::waitForFrame(std::uint32_t number) {
    return waitUntil([&] { return askForFrame("frame") >= number; }, std::chrono::seconds(60));
}

bool Application::wasTold(const std::string& event) const {
    return std::find(events_.begin(), events_.end(), event) != events_.end();
}

std::string Application::nextEvent() {
    if (events_.empty()) return child_->readLine();
    std::string event = std::move(events_.front());
    events_.erase(events_.begin());
    return event;
}

std::string Application::stop(const std::string& command) {
    const std::string answer = ask(command);
    EXPECT_TRUE(answer.starts_with("stopped frame ")) << answer;
    const auto at = answer.find(" /");
    return at == std::string::npos ? "" : answer.substr(at + 1);
}

void Application::kill() {
    ASSERT_GT(child_->pid(), 1);  // -1 would be everybody
    ::kill(child_->pid(), SIGKILL);
    child_->wait();
}

checkers::FramesLog Application::framesLog() const {
    std::string error;
    const auto log = checkers::readFramesLog(log_, error);
    EXPECT_TRUE(log) << error;
    return log.value_or(checkers::FramesLog{});
}

World::World(Consent consent, const std::string& screen) : display_(screen) {
    EXPECT_FALSE(display_.name().empty()) << "no display";
    addVariable("DISPLAY=" + display_.name());
    addVariable("WAYLAND_DISPLAY=");
    if (consent == Consent::Suppressed)
        std::ofstream(path("config/lumacast/com.orvane.lumacastd.conf")) << "LCSuppressAlert=true\n";
    install("org.lumacast.SelfRecorder", "Self Recorder", LC_SELF_RECORDER);
}

std::string World::installExtension(const std::string& identifier, const std::string& program, bool takesSamples) {
    const fs::path folder = path("data/lumacast/extensions/" + identifier);
    fs::create_directories(folder);
    fs::copy_file(program, folder / "program", fs::copy_options::overwrite_existing);
    nlohmann::json manifest{{"identifier", identifier},
                            {"displayName", "Test extension"},
                            {"extensionPoint", "com.orvane.broadcast-services-upload"},
                            {"executable", "program"}};
    if (takesSamples) manifest["processMode"] = "LCBroadcastProcessModeSampleBuffer";
    std::ofstream(folder / "manifest.json") << manifest.dump();
    const std::string data = path("state/lumacast/extension-data/" + identifier);
    fs::create_directories(data);
    return data;
}

std::string World::installExtensionFolder(const std::string& folder) {
    const fs::path name = fs::path(folder).filename(), installed = path("data/lumacast/extensions") / name;
    fs::create_directories(installed);
    fs::copy(folder, installed, fs::copy_options::recursive);
    return (installed / name).string();
}

pid_t World::extensionProcess(const std::string& identifier) const {
    return processRunning(path("data/lumacast/extensions/" + identifier + "/program"));
}

int World::endDaemon(int signal) {
    EXPECT_GT(daemon().pid(), 1);
    if (daemon().pid() <= 1) return -1;  // would be everybody
    ::kill(daemon().pid(), signal);
    return daemon().wait();
}

std::unique_ptr<Application> World::application(std::vector<std::string> options) {
    return std::make_unique<Application>(*this, LC_SELF_RECORDER, "Self Recorder", options);
}

std::unique_ptr<Application> World::otherApplication(const std::string& name, std::vector<std::string> options) {
    const std::string program = path(name);
    fs::copy_file(LC_SELF_RECORDER, program);
    install("org.lumacast." + name, name, program);
    return std::make_unique<Application>(*this, program, name, options);
}

nlohmann::json World::recording() {
    const auto sessions = status()["sessions"];
    for (const auto& session : sessions)
        if (session.contains("current")) return session["current"];
    return {};
}

bool World::waitForElapsed(double seconds) {
    return waitUntil([&] {
        const auto current = recording();
        return !current.is_null() && current["elapsedSeconds"].get<double>() >= seconds;
    }, std::chrono::seconds(60));
}

std::size_t World::daemonDescriptors() {
    const fs::directory_iterator open("/proc/" + std::to_string(user_.daemon().pid()) + "/fd");
    return static_cast<std::size_t>(std::distance(fs::begin(open), fs::end(open)));
}

std::size_t World::daemonNumber(const std::string& name) {
    std::ifstream file("/proc/" + std::to_string(user_.daemon().pid()) + "/status");
    for (std::string line; std::getline(file, line);)
        if (line.starts_with(name + ":")) return std::stoul(line.substr(name.size() + 1));
    ADD_FAILURE() << "no " << name;
    return 0;
}

std::vector<std::string> World::troubledDisk() const {
    // A blank in the library's own path would end it there.
    const std::string library = path("slow_disk.so");
    std::error_code known;
    fs::create_symlink(LC_SLOW_DISK, library, known);
    return {"LD_PRELOAD=" + library, "LC_DISK=" + fs::path(moviePath()).parent_path().string(),
            "LC_DISK_STALLED=" + path("disk stalled"), "LC_DISK_FULL=" + path("disk full"),
            "LC_DISK_QUOTA=" + path("disk quota")};
}

void World::setFlag(const std::string& name, bool on) const {
    if (on)
        std::ofstream file(path(name));
    else
        fs::remove(path(name));
}

std::string World::moviePath(const std::string& name) const {
    return path("state/lumacast/root/private/var/mobile/Library/Lumacast/" + name + ".mp4");
}

std::vector<checkers::NumberedPicture> picturesOf(const std::string& movie, bool mayEndEarly) {
    checkers::MovieReader reader(movie);
    EXPECT_EQ(reader.error(), "");
    std::vector<checkers::NumberedPicture> pictures;
    const bool whole = checkers::readFrameNumbers(reader, pictures);
    EXPECT_TRUE(mayEndEarly || whole) << reader.error();
    return pictures;
}

}  // namespace lumacast::test
