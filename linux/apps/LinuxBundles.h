#pragma once
#include <chrono>
#include <memory>
#include <string>
#include <vector>

#include "linux/apps/IconThemes.h"
#include "linux/apps/Languages.h"
#include "linux/system/DiskLane.h"
#include "linux/system/LinuxEnvironment.h"
#include "platform/Bundles.h"

namespace lumacast {

class BundleLibrary;
class KnownProcesses;

/// Applications by their desktop entries (the id is the bundle identifier; the bundle's path is the entry's) and by
/// application folders with a manifest (the bundle's path is the folder's), and the client framework's resources. What
/// was read is kept until a directory changes; a disk that does not answer within the patience leaves what was known
/// before. Within the freshness what was found is answered from memory, as long as the process runs the same program.
/// Callable from any lane.
///
/// A script has no identity of its own: its process runs an interpreter, and who only names a script proves nothing.
class LinuxBundles final : public Bundles {
public:
    struct Options {
        std::vector<std::string> applicationDirectories;  ///< most important first
        std::vector<std::string> searchPath;              ///< where the commands of desktop entries are found
        std::string frameworkBundlePath;
        std::vector<Locale> locales;  ///< the user's, see userLocales
        IconThemes icons;
        std::chrono::milliseconds patience{100};
        std::chrono::milliseconds freshness{0};  ///< how long a look at the disk counts; what was not found never does
        std::function<void()> beforeEachQuestion;  ///< tests put a slow disk here; runs on the disk's thread
    };
    static Options optionsFrom(const LinuxEnvironment& environment);

    /// Reads the framework bundle and the installed applications once, waiting for the disk.
    explicit LinuxBundles(Options options);

    std::optional<std::string> executablePath(ProcessID pid) override;
    std::optional<std::string> bundlePathForExecutable(const std::string& path) override;
    std::shared_ptr<const Bundle> open(const std::string& path) override;
    std::shared_ptr<const Bundle> withIdentifier(const BundleIdentifier& identifier) override;
    std::optional<Data> applicationIcon(const BundleIdentifier& identifier, IconFormat format) override;
    std::string frameworkBundlePath() override;
    std::vector<std::string> preferredLanguages() override;
    std::vector<std::string> preferredLocalizations(const std::vector<std::string>& available) override;

private:
    template <class T>
    std::optional<T> ask(std::function<T(BundleLibrary&)> question);

    const Options options_;
    std::vector<std::string> languages_;
    const std::shared_ptr<BundleLibrary> library_;  ///< shared with questions the disk has not answered yet
    const std::shared_ptr<KnownProcesses> processes_;
    DiskLane disk_;
};

}  // namespace lumacast
