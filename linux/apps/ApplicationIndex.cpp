#include "linux/apps/ApplicationIndex.h"

#include <sys/stat.h>

#include <set>

#include "linux/apps/ApplicationFiles.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumApplications = 4096;
constexpr std::size_t kMaximumDirectories = 256;
constexpr int kMaximumDepth = 4;
constexpr std::string_view kEntry = ".desktop";
constexpr std::string_view kFolder = ".app";

bool isDirectory(const std::string& path, struct stat& status) {
    return ::stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

}  // namespace

class InstalledApplications::Collector {
public:
    Collector(InstalledApplications& result, const std::vector<std::string>& searchPath)
        : result_(result), searchPath_(searchPath) {
        ::clock_gettime(CLOCK_REALTIME, &now_);
    }

    /// `prefix` is what the names of the folders above add to an id. Ids already taken belong to a more important
    /// place.
    void collect(const std::string& directory, const std::string& prefix, int depth) {
        if (depth > kMaximumDepth || result_.directories_.size() == kMaximumDirectories) return;
        struct stat status = {};
        const bool exists = isDirectory(directory, status);
        if (exists || depth == 0) result_.directories_.push_back({directory, status.st_mtim, exists});
        if (!exists) return;
        if (now_.tv_sec - status.st_mtim.tv_sec < 2) result_.racy_ = true;
        for (const std::string& name : namesIn(directory, kMaximumApplications).value_or(std::vector<std::string>())) {
            const std::string path = directory + "/" + name;
            if (name.ends_with(kEntry)) {
                addEntry(path, prefix + name.substr(0, name.size() - kEntry.size()));
            } else if (isDirectory(path, status)) {
                if (name.ends_with(kFolder))
                    addFolder(path);
                else
                    collect(path, prefix + name + "-", depth + 1);
            }
        }
    }

    /// Settles whose program is whose once every directory was read.
    void finish() {
        for (const auto* claims : {&named_, &started_})
            for (const auto& [program, identifier] : *claims) result_.programs_.emplace(program, identifier);
    }

private:
    void addEntry(const std::string& path, const std::string& identifier) {
        if (seen_.size() >= kMaximumApplications || !seen_.insert(identifier).second) return;
        const auto entry = readDesktopEntry(path);
        if (!entry || !entry->isApplication || entry->hidden || !isBundleIdentifier(identifier)) return;
        InstalledApplication application{identifier, path, {}};
        auto& claims = entry->lumacastExecutable.empty() ? started_ : named_;
        std::optional<std::string> program;
        if (!entry->lumacastExecutable.empty()) {
            program = resolvedProgram(entry->lumacastExecutable, {});
        } else if (const auto command = entry->program()) {
            program = resolvedProgram(*command, searchPath_);
            if (!program && !entry->tryExec.empty()) program = resolvedProgram(entry->tryExec, searchPath_);
        }
        // Whatever the entry calls it: what counts is what its processes run.
        if (program && isInterpreter(*program)) program.reset();
        if (program) {
            application.program = *program;
            claims.emplace_back(*program, identifier);
        }
        result_.applications_.emplace(identifier, std::move(application));
    }

    void addFolder(const std::string& path) {
        const auto manifest = readManifest(path);
        if (!manifest || manifest->identifier.empty() || seen_.size() >= kMaximumApplications) return;
        if (!seen_.insert(manifest->identifier).second) return;
        result_.applications_.emplace(manifest->identifier, InstalledApplication{manifest->identifier, path, {}});
    }

    InstalledApplications& result_;
    const std::vector<std::string>& searchPath_;
    timespec now_{};
    std::set<std::string> seen_;  ///< hidden entries too: they cover those of less important directories
    std::vector<std::pair<std::string, std::string>> named_;
    std::vector<std::pair<std::string, std::string>> started_;
};

InstalledApplications InstalledApplications::read(const std::vector<std::string>& directories,
                                                  const std::vector<std::string>& searchPath) {
    InstalledApplications result;
    result.readAt_ = std::chrono::steady_clock::now();
    Collector collector(result, searchPath);
    for (const std::string& directory : directories) collector.collect(directory, "", 0);
    collector.finish();
    return result;
}

const InstalledApplication* InstalledApplications::withIdentifier(const std::string& identifier) const {
    const auto found = applications_.find(identifier);
    return found == applications_.end() ? nullptr : &found->second;
}

const InstalledApplication* InstalledApplications::withProgram(const std::string& program) const {
    const auto found = programs_.find(program);
    return found == programs_.end() ? nullptr : withIdentifier(found->second);
}

bool InstalledApplications::isOutdated() const {
    if (racy_) return true;
    for (const Directory& directory : directories_) {
        struct stat status = {};
        if (isDirectory(directory.path, status) != directory.exists) return true;
        const bool same = status.st_mtim.tv_sec == directory.modified.tv_sec &&
                          status.st_mtim.tv_nsec == directory.modified.tv_nsec;
        if (directory.exists && !same) return true;
    }
    return false;
}

}  // namespace lumacast
