#include "linux/apps/BundleLibrary.h"

#include <sys/stat.h>

#include <algorithm>

#include "linux/apps/ApplicationFiles.h"
#include "linux/apps/LinuxBundle.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumKept = 128;
constexpr std::chrono::seconds kLookAgain{2};
constexpr std::string_view kEntry = ".desktop";

/// Changes whenever one of the files or folders does.
std::string stampOf(const std::vector<std::string>& paths) {
    std::string stamp;
    for (const std::string& path : paths) {
        struct stat status = {};
        if (::stat(path.c_str(), &status) == 0)
            for (const auto number : {static_cast<long long>(status.st_ino), static_cast<long long>(status.st_size),
                                      static_cast<long long>(status.st_mode), static_cast<long long>(status.st_uid),
                                      static_cast<long long>(status.st_mtim.tv_sec),
                                      static_cast<long long>(status.st_mtim.tv_nsec)})
                stamp += std::to_string(number) + " ";
        stamp += ";";
    }
    return stamp;
}

template <class Map>
void keep(Map& map, const std::string& key, typename Map::mapped_type value) {
    if (map.size() >= kMaximumKept && !map.contains(key)) map.clear();
    map[key] = std::move(value);
}

template <class Map>
std::optional<std::string> find(const Map& map, const std::string& key) {
    const auto found = map.find(key);
    return found == map.end() ? std::nullopt : std::optional(found->second);
}

}  // namespace

BundleLibrary::BundleLibrary(std::vector<std::string> applicationDirectories, std::vector<std::string> searchPath,
                             std::vector<Locale> locales)
    : directories_(std::move(applicationDirectories)),
      searchPath_(std::move(searchPath)),
      locales_(std::move(locales)),
      applications_(std::make_shared<const InstalledApplications>(
          InstalledApplications::read(directories_, searchPath_))) {}

std::shared_ptr<const InstalledApplications> BundleLibrary::snapshot() const {
    const std::lock_guard lock(mutex_);
    return applications_;
}

std::shared_ptr<const InstalledApplications> BundleLibrary::current() {
    const std::lock_guard reading(reading_);
    auto applications = snapshot();
    const auto now = std::chrono::steady_clock::now();
    if (!applications->isOutdated()) {
        const std::lock_guard lock(mutex_);
        lookedAt_ = now;
        return applications;
    }
    applications =
        std::make_shared<const InstalledApplications>(InstalledApplications::read(directories_, searchPath_));
    const std::lock_guard lock(mutex_);
    applications_ = applications;
    lookedAt_ = now;
    return applications;
}

bool BundleLibrary::isFresh(std::chrono::steady_clock::duration freshness) const {
    const std::lock_guard lock(mutex_);
    return freshness.count() > 0 && std::chrono::steady_clock::now() - lookedAt_ <= freshness;
}

std::optional<std::string> BundleLibrary::pathForProgram(const std::string& program) {
    auto applications = current();
    if (!applications->withProgram(program) && std::chrono::steady_clock::now() - applications->readAt() > kLookAgain) {
        // The program may have come after its entry, which no directory that was read tells.
        const std::lock_guard reading(reading_);
        applications =
            std::make_shared<const InstalledApplications>(InstalledApplications::read(directories_, searchPath_));
        const std::lock_guard lock(mutex_);
        applications_ = applications;
    }
    if (const InstalledApplication* application = applications->withProgram(program)) return application->path;
    const auto folder = applicationFolder(program);
    const std::lock_guard lock(mutex_);
    if (!folder) {
        programs_.erase(program);
        return std::nullopt;
    }
    keep(programs_, program, *folder);
    return folder;
}

std::optional<std::string> BundleLibrary::pathForIdentifier(const std::string& identifier) {
    if (const InstalledApplication* application = current()->withIdentifier(identifier)) return application->path;
    const std::lock_guard lock(mutex_);
    return find(folders_, identifier);
}

std::shared_ptr<const Bundle> BundleLibrary::open(const std::string& path) {
    std::vector<std::string> sources{path};
    {
        const std::lock_guard lock(mutex_);
        const auto found = bundles_.find(path);
        if (found != bundles_.end()) sources = found->second.sources;
    }
    const auto now = std::chrono::steady_clock::now();
    std::string stamp = stampOf(sources);
    {
        const std::lock_guard lock(mutex_);
        const auto found = bundles_.find(path);
        if (found != bundles_.end() && found->second.stamp == stamp) {
            found->second.lookedAt = now;
            return found->second.bundle;
        }
    }
    OpenedBundle opened = path.ends_with(kEntry) ? openDesktopEntry(path, identifierOfEntry(path), locales_)
                                                 : openFolder(path, locales_);
    // Stamped before and after: what changed while it was read is read again the next time.
    const bool steady = opened.sources != sources || stampOf(sources) == stamp;
    if (opened.sources != sources) stamp = stampOf(opened.sources);
    const std::lock_guard lock(mutex_);
    if (!opened.bundle) {
        bundles_.erase(path);
        return nullptr;
    }
    keep(bundles_, path, Kept{std::move(opened.sources), steady ? stamp : "", opened.bundle, now});
    if (const auto identifier = opened.bundle->identifier(); identifier && !path.ends_with(kEntry))
        keep(folders_, identifier->text(), path);
    return opened.bundle;
}

std::optional<std::string> BundleLibrary::knownPathForProgram(const std::string& program) const {
    const std::lock_guard lock(mutex_);
    if (const InstalledApplication* application = applications_->withProgram(program)) return application->path;
    return find(programs_, program);
}

std::optional<std::string> BundleLibrary::knownPathForIdentifier(const std::string& identifier) const {
    const std::lock_guard lock(mutex_);
    if (const InstalledApplication* application = applications_->withIdentifier(identifier)) return application->path;
    return find(folders_, identifier);
}

std::shared_ptr<const Bundle> BundleLibrary::known(const std::string& path) const {
    const std::lock_guard lock(mutex_);
    const auto found = bundles_.find(path);
    return found == bundles_.end() ? nullptr : found->second.bundle;
}

std::shared_ptr<const Bundle> BundleLibrary::known(const std::string& path,
                                                   std::chrono::steady_clock::duration freshness) const {
    const std::lock_guard lock(mutex_);
    const auto found = bundles_.find(path);
    if (found == bundles_.end() || freshness.count() <= 0) return nullptr;
    return std::chrono::steady_clock::now() - found->second.lookedAt <= freshness ? found->second.bundle : nullptr;
}

std::string BundleLibrary::identifierOfEntry(const std::string& path) const {
    std::string id = path.substr(path.rfind('/') + 1);
    for (const std::string& directory : directories_) {
        if (!path.starts_with(directory + "/")) continue;
        id = path.substr(directory.size() + 1);
        std::replace(id.begin(), id.end(), '/', '-');
        break;
    }
    return id.substr(0, id.size() - kEntry.size());
}

}  // namespace lumacast
