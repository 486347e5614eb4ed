#pragma once
#include <chrono>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "linux/apps/ApplicationIndex.h"
#include "linux/apps/Languages.h"
#include "platform/Bundles.h"

namespace lumacast {

/// What is known of the applications and bundles on the disk: answers after a look whether it changed, or from memory
/// alone. Thread-safe.
class BundleLibrary final {
public:
    BundleLibrary(std::vector<std::string> applicationDirectories, std::vector<std::string> searchPath,
                  std::vector<Locale> locales);

    // These look at the disk, and wait for it.
    std::optional<std::string> pathForProgram(const std::string& program);
    std::optional<std::string> pathForIdentifier(const std::string& identifier);
    std::shared_ptr<const Bundle> open(const std::string& path);

    // These answer what was known last, and never wait.
    std::optional<std::string> knownPathForProgram(const std::string& program) const;
    std::optional<std::string> knownPathForIdentifier(const std::string& identifier) const;
    std::shared_ptr<const Bundle> known(const std::string& path) const;
    /// The same only where the disk was looked at no longer ago than that.
    std::shared_ptr<const Bundle> known(const std::string& path, std::chrono::steady_clock::duration freshness) const;
    /// Whether the directories were looked at no longer ago than that.
    bool isFresh(std::chrono::steady_clock::duration freshness) const;

private:
    struct Kept {
        std::vector<std::string> sources;  ///< what the bundle was made from
        std::string stamp;                 ///< theirs when it was; empty when they changed meanwhile
        std::shared_ptr<const Bundle> bundle;
        std::chrono::steady_clock::time_point lookedAt;
    };
    std::shared_ptr<const InstalledApplications> current();
    std::shared_ptr<const InstalledApplications> snapshot() const;
    std::string identifierOfEntry(const std::string& path) const;

    const std::vector<std::string> directories_;
    const std::vector<std::string> searchPath_;
    const std::vector<Locale> locales_;

    std::mutex reading_;  ///< one look at the directories at a time; held while the disk is asked, by its threads only
    mutable std::mutex mutex_;
    std::shared_ptr<const InstalledApplications> applications_;
    std::chrono::steady_clock::time_point lookedAt_;  ///< when they were last found to be up to date
    std::map<std::string, std::string> folders_;  ///< application folders met by their program: identifier, path
    std::map<std::string, std::string> programs_;  ///< programs met in them: program, path
    std::map<std::string, Kept> bundles_;
};

}  // namespace lumacast
