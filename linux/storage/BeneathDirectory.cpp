#include "linux/storage/BeneathDirectory.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <memory>
#include <vector>

#include "linux/calls/FileCalls.h"

namespace lumacast {

namespace {

constexpr int kDirectoryFlags = O_PATH | O_DIRECTORY | O_CLOEXEC;
constexpr int kMaximumDepth = 64;
constexpr int kMaximumLinks = 40;  // as the kernel follows

Fd openBeneath(int base, const std::string& path) {
    open_how how{};
    how.flags = static_cast<std::uint64_t>(kDirectoryFlags | O_NOFOLLOW);
    how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
    return Fd(calls::openResolved(base, path, how));
}

Fd walkBeneath(Fd base, const std::vector<std::string>& components) {
    for (const std::string& component : components) {
        base.reset(calls::openAt(base.get(), component, kDirectoryFlags | O_NOFOLLOW));
        if (!base) break;
    }
    return base;
}

std::vector<std::string> componentsOf(std::string_view path) {
    std::vector<std::string> result;
    while (!path.empty()) {
        const std::size_t slash = path.find('/');
        const std::string_view component = path.substr(0, slash);
        if (!component.empty()) result.emplace_back(component);
        path.remove_prefix(slash == std::string_view::npos ? path.size() : slash + 1);
    }
    return result;
}

bool isTrusted(const struct stat& status, uid_t user) { return status.st_uid == 0 || status.st_uid == user; }

/// Puts the components of `path` before those that are still to be walked.
void walkFirst(std::vector<std::string>& rest, std::string_view path) {
    std::vector<std::string> components = componentsOf(path);
    rest.insert(rest.end(), components.rbegin(), components.rend());
}

int removeTree(int directory, const std::string& name, int depth) {
    if (depth > kMaximumDepth) return ELOOP;
    if (calls::unlinkAt(directory, name) == 0) return 0;
    if (errno != EISDIR && errno != EPERM) return errno;
    const int refusal = errno;
    Fd opened(calls::openAt(directory, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!opened) return errno == ENOTDIR || errno == ELOOP ? refusal : errno;

    const std::unique_ptr<DIR, int (*)(DIR*)> entries(::fdopendir(opened.get()), &::closedir);
    if (!entries) return errno;
    const int inside = opened.release();  // the stream closes it
    int firstError = 0;
    while (const dirent* entry = ::readdir(entries.get())) {
        const std::string child = entry->d_name;
        if (child == "." || child == "..") continue;
        const int error = removeTree(inside, child, depth + 1);
        if (error != 0 && firstError == 0) firstError = error;
    }
    if (firstError != 0) return firstError;
    return calls::unlinkAt(directory, name, AT_REMOVEDIR) == 0 ? 0 : errno;
}

}  // namespace

Resolution availableResolution() {
    const Fd root(calls::openAt(AT_FDCWD, "/", kDirectoryFlags));
    return openBeneath(root.get(), ".") ? Resolution::Kernel : Resolution::Walk;
}

std::string withSingleSlashes(std::string_view path) {
    std::string result;
    for (const char c : path)
        if (c != '/' || !result.ends_with('/')) result += c;
    while (result.size() > 1 && result.ends_with('/')) result.pop_back();
    return result;
}

std::variant<Fd, int> openFolder(const std::string& directory, uid_t user) {
    if (directory.find('\0') != std::string::npos) return EINVAL;
    Fd at(calls::openAt(AT_FDCWD, "/", kDirectoryFlags));
    std::vector<std::string> rest;  // the next one last
    walkFirst(rest, directory);
    for (int links = 0; at && !rest.empty();) {
        const std::string name = std::move(rest.back());
        rest.pop_back();
        Fd next(calls::openAt(at.get(), name, O_PATH | O_CLOEXEC | O_NOFOLLOW));
        struct stat status = {};
        if (!next || ::fstat(next.get(), &status) != 0) return errno;
        if (!S_ISLNK(status.st_mode)) {
            if (!S_ISDIR(status.st_mode)) return ENOTDIR;
            at = std::move(next);
            continue;
        }
        if (!isTrusted(status, user)) return EACCES;
        if (++links > kMaximumLinks) return ELOOP;
        std::array<char, 4096> target{};
        const ssize_t length = ::readlinkat(next.get(), "", target.data(), target.size());
        if (length <= 0) return length < 0 ? errno : ENOENT;
        if (target[0] == '/') at.reset(calls::openAt(AT_FDCWD, "/", kDirectoryFlags));
        walkFirst(rest, std::string_view(target.data(), static_cast<std::size_t>(length)));
    }
    if (!at) return errno;
    return at;
}

std::variant<Fd, int> openTrusted(const std::string& directory, uid_t user) {
    auto opened = openFolder(directory, user);
    const auto* folder = std::get_if<Fd>(&opened);
    struct stat status = {};
    if (folder && ::fstat(folder->get(), &status) != 0) return errno;
    if (folder && !isTrusted(status, user)) return EACCES;
    return opened;
}

std::variant<Fd, int> openTrusted(const std::string& directory) {
    return openTrusted(directory, ::geteuid());
}

std::variant<ResolvedName, int> resolveForUser(const std::string& path, uid_t user) {
    const std::size_t slash = path.rfind('/');
    if (!path.starts_with('/')) return EINVAL;
    ResolvedName result;
    result.name = path.substr(slash + 1);
    if (result.name.empty() || result.name == "." || result.name == ".." ||
        result.name.find('\0') != std::string::npos)
        return EINVAL;
    auto folder = openFolder(path.substr(0, slash + 1), user);
    if (const int* error = std::get_if<int>(&folder)) return *error;
    result.directory = std::move(std::get<Fd>(folder));
    return result;
}

std::variant<ResolvedName, int> resolveBeneath(const std::string& base, const std::string& path,
                                               Resolution resolution) {
    if (path.find('\0') != std::string::npos) return EINVAL;
    const std::string top = withSingleSlashes(base);
    const std::string whole = withSingleSlashes(path);
    if (whole == top) {
        const std::size_t slash = top.rfind('/');
        auto parent = openTrusted(top.substr(0, slash + 1));
        if (const int* error = std::get_if<int>(&parent)) return *error;
        return ResolvedName{std::move(std::get<Fd>(parent)), top.substr(slash + 1)};
    }
    if (!whole.starts_with(top + "/")) return EACCES;
    std::vector<std::string> components = componentsOf(std::string_view(whole).substr(top.size() + 1));
    for (const std::string& component : components)
        if (component == ".." || component == ".") return EACCES;

    ResolvedName result;
    result.name = std::move(components.back());
    components.pop_back();
    auto opened = openTrusted(top);
    if (const int* error = std::get_if<int>(&opened)) return *error;
    result.directory = std::move(std::get<Fd>(opened));
    if (components.empty()) return result;
    if (resolution == Resolution::Walk) {
        result.directory = walkBeneath(std::move(result.directory), components);
    } else {
        std::string relative;
        for (const std::string& component : components) relative += (relative.empty() ? "" : "/") + component;
        result.directory = openBeneath(result.directory.get(), relative);
    }
    if (!result.directory) return errno;
    return result;
}

int removeTree(int directory, const std::string& name) { return removeTree(directory, name, 0); }

}  // namespace lumacast
