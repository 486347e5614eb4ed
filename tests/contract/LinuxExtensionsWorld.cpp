#include "tests/contract/LinuxExtensionsWorld.h"

#include <unistd.h>

#include <gtest/gtest.h>

#include <cstdio>
#include <filesystem>

#include "broadcast/LCExtensionHostContext.h"
#include "linux/system/Json.h"

namespace lumacast {

namespace fs = std::filesystem;

namespace {

std::string firstProgram(std::initializer_list<const char*> paths) {
    for (const char* path : paths)
        if (::access(path, X_OK) == 0) return path;
    return {};
}

}  // namespace

LinuxExtensionsWorld::LinuxExtensionsWorld(const Change& change) {
    LinuxAppExtensions::Options options;
    options.dataDirectories = {dataHome(), scratch_.path("share")};
    options.locales = userLocales("de:en", "de_DE.UTF-8");
    options.readableFiles = scratch_.makeDirectory("files");
    options.sandbox.launcher = LC_EXTENSION_LAUNCHER;
    options.sandbox.bubblewrap = firstProgram({"/usr/bin/bwrap", "/usr/local/bin/bwrap"});
    options.sandbox.ownDirectories = ownDirectories();
    options.sandbox.forbidden = {scratch_.path("files"), scratch_.path("state")};
    // The sanitizer's search for leaks stops the process from outside, which the sandbox is there to prevent.
    options.sandbox.baseEnvironment = {"LANG=de_DE.UTF-8", "ASAN_OPTIONS=detect_leaks=0"};
    options.sandbox.variable = [](const std::string& name) {
        return name == "GRANTED" ? std::optional<std::string>("granted value") : std::nullopt;
    };
    if (change) change(options);
    extensions_ = std::make_unique<LinuxAppExtensions>(*reactor_, scheduler_, ipc_, log_, std::move(options));
    extensions_->setContextClass(LCExtensionHostContext::contextClass(log_));
    thread_ = std::thread([this] { reactor_->run(); });
}

LinuxExtensionsWorld::~LinuxExtensionsWorld() {
    if (::testing::Test::HasFailure())
        for (const std::string& line : lines()) std::fprintf(stderr, "log: %s\n", line.c_str());
    extensions_.reset();
    reactor_->sync([] {});
    reactor_->sync([] {});
    reactor_->requestStop();
    thread_.join();
}

std::string LinuxExtensionsWorld::manifestOf(const ExtensionToInstall& extension, const std::string& more) {
    Dictionary manifest{{"identifier", extension.identifier},
                        {"extensionPoint", extension.point},
                        {"displayName", extension.name},
                        {"executable", "program"}};
    if (!extension.canBeLaunched) manifest.set("executable", "no-program");
    if (!extension.germanName.empty()) manifest.set("displayName[de]", extension.germanName);
    if (extension.activationRule) manifest.set("activationRule", *extension.activationRule);
    if (!extension.processMode.empty()) manifest.set("processMode", extension.processMode);
    Array icons;
    for (std::size_t i = 0; i < extension.icons.size(); ++i) icons.emplace_back("icons/" + std::to_string(i) + ".png");
    if (!icons.empty()) manifest.set("icons", Value(std::move(icons)));
    std::string text = jsonText(Value(manifest));
    if (!more.empty()) text.insert(text.size() - 1, ", " + more);
    return text;
}

std::string LinuxExtensionsWorld::installFolder(const std::string& name, const std::string& manifest) {
    const std::string folder = "data/lumacast/extensions/" + name;
    scratch_.write(folder + "/manifest.json", manifest);
    const std::string program = scratch_.path(folder + "/program");
    std::error_code error;
    fs::remove(program, error);
    fs::copy_file(LC_EXTENSION_PROBE, program);
    fs::permissions(program, fs::perms(0755));
    return scratch_.path(folder);
}

void LinuxExtensionsWorld::install(const ExtensionToInstall& extension) {
    const std::string folder = installFolder(extension.identifier, manifestOf(extension));
    for (std::size_t i = 0; i < extension.icons.size(); ++i)
        scratch_.write("data/lumacast/extensions/" + extension.identifier + "/icons/" + std::to_string(i) + ".png",
                       std::string(extension.icons[i].begin(), extension.icons[i].end()));
    if (extension.canBeLaunched) return;
    // It is there and may be run, but it is no program.
    const std::string name = "data/lumacast/extensions/" + extension.identifier + "/no-program";
    fs::permissions(scratch_.write(name,
                                   "\x7f"
                                   "ELF, but not really"),
                    fs::perms(0755));
}

void LinuxExtensionsWorld::uninstall(const std::string& identifier) {
    fs::remove_all(scratch_.path("data/lumacast/extensions/" + identifier));
}

void LinuxExtensionsWorld::breakLookups() {
    const std::string place = scratch_.path("data/lumacast/extensions");
    fs::remove_all(place);
    fs::create_directories(fs::path(place).parent_path());
    fs::create_symlink("extensions", place);  // to itself: it can't be read, whoever asks
}

std::string LinuxExtensionsWorld::makeFile(const std::string& name, const std::string& text) {
    return scratch_.write("files/" + name, text);
}

std::shared_ptr<IpcEndpoint> LinuxExtensionsWorld::listenForPing() {
    listener_ = ipc_.anonymousListener();
    listener_->setDelegate(ping_);
    listener_->resume();
    return listener_->endpoint();
}

std::size_t LinuxExtensionsWorld::processCount() {
    return processes().size();
}

pid_t LinuxExtensionsWorld::onlyProcess() {
    const auto all = processes();
    return all.size() == 1 ? all.front() : 0;
}

std::vector<pid_t> LinuxExtensionsWorld::processes() {
    // Every process of ours is started by this one.
    std::vector<pid_t> all;
    for (const auto& task : fs::directory_iterator("/proc/self/task")) {
        std::ifstream children(task.path() / "children");
        for (pid_t child = 0; children >> child;) all.push_back(child);
    }
    return all;
}

std::size_t LinuxExtensionsWorld::linesWith(std::string_view text) const {
    std::size_t count = 0;
    for (const std::string& line : log_.recentLines())
        if (line.find(text) != std::string::npos) ++count;
    return count;
}

std::unique_ptr<ExtensionsWorld> portExtensionsWorld() {
    return std::make_unique<LinuxExtensionsWorld>();
}

}  // namespace lumacast
