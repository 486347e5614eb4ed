#pragma once
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "base/Log.h"
#include "linux/apps/Languages.h"
#include "linux/extensions/Sandbox.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"
#include "linux/system/LinuxEnvironment.h"
#include "platform/AppExtension.h"
#include "platform/Scheduler.h"

namespace lumacast {

struct ExtensionServices;

/// The installed extensions of this device: folders with a manifest in the data directories, each launched in a process
/// and a sandbox of its own. Lookups read the disk on a lane of their own and give up after five seconds (ETIMEDOUT).
class LinuxAppExtensions final : public AppExtensions {
public:
    struct Options {
        std::vector<std::string> dataDirectories;  ///< the most important first
        std::vector<Locale> locales;               ///< the user's
        std::string readableFiles;  ///< where the files are that tokens stand for: the temporary directory
        Sandbox::Options sandbox;
        /// How long an extension whose object has gone may go on with its requests.
        std::chrono::nanoseconds lastRequests = std::chrono::minutes(1);
    };
    static Options optionsFrom(const LinuxEnvironment& environment, const std::string& temporaryDirectory);

    /// All but the options are borrowed and outlive this and every object it has answered with.
    LinuxAppExtensions(Reactor& reactor, Scheduler& scheduler, LinuxIpc& ipc, Log& log, Options options);
    LinuxAppExtensions(const LinuxAppExtensions&) = delete;
    LinuxAppExtensions& operator=(const LinuxAppExtensions&) = delete;
    /// Ends all processes. Nothing is told any more.
    ~LinuxAppExtensions() override;

    void setContextClass(ExtensionContextClass contextClass) override;
    void extensionsWithMatchingPoint(const std::string& extensionPointIdentifier, Matched handler) override;

private:
    const std::shared_ptr<ExtensionServices> services_;
};

}  // namespace lumacast
