#pragma once
#include <atomic>
#include <functional>
#include <memory>
#include <string>
#include <thread>

#include "linux/extensions/LinuxAppExtensions.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/ExtensionsWorld.h"
#include "tests/contract/IpcWorld.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast {

/// Extensions of the port: the folders of a private data directory, the probe as their program, the sandbox of this
/// machine or what the options leave of it.
class LinuxExtensionsWorld final : public ExtensionsWorld {
public:
    using Change = std::function<void(LinuxAppExtensions::Options&)>;
    explicit LinuxExtensionsWorld(const Change& change = {});
    ~LinuxExtensionsWorld() override;

    AppExtensions& extensions() override { return *extensions_; }
    Scheduler& scheduler() override { return scheduler_; }
    void install(const ExtensionToInstall& extension) override;
    void uninstall(const std::string& identifier) override;
    void breakLookups() override;
    std::string makeFile(const std::string& name, const std::string& text) override;
    std::string directory() override { return scratch_.path("files"); }
    std::shared_ptr<IpcEndpoint> listenForPing() override;
    bool wasPinged() override { return ping_->was; }
    bool isOnRequestLane() override { return reactor_->isCurrent(); }
    std::size_t processCount() override;
    /// The one process there is: with bubblewrap what watches over it, else itself. 0 when there are none or more.
    pid_t onlyProcess();

    /// A folder with the probe as "program" and this manifest; its path. `text` replaces "@" by the identifier's line.
    std::string installFolder(const std::string& name, const std::string& manifest);
    static std::string manifestOf(const ExtensionToInstall& extension, const std::string& more = {});
    ScratchDirectory& scratch() { return scratch_; }
    std::string dataHome() const { return scratch_.path("data"); }
    std::string ownDirectories() const { return scratch_.path("state/extension-data"); }
    std::vector<std::string> lines() const { return log_.recentLines(); }
    Reactor& reactor() { return *reactor_; }
    /// The lines that hold this text.
    std::size_t linesWith(std::string_view text) const;

private:
    std::vector<pid_t> processes();

    ScratchDirectory scratch_;
    Log log_;
    const std::shared_ptr<Reactor> reactor_ = std::make_shared<Reactor>("extensions test");
    ThreadScheduler scheduler_{reactor_};
    LinuxIpc ipc_{*reactor_, log_, {}};
    const std::shared_ptr<PingListener> ping_ = std::make_shared<PingListener>();
    std::shared_ptr<IpcListener> listener_;
    std::unique_ptr<LinuxAppExtensions> extensions_;
    std::thread thread_;
};

}  // namespace lumacast
