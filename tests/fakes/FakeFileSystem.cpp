#include "tests/fakes/FakeFileSystem.h"

#include <algorithm>
#include <cerrno>

#include "tests/fakes/FakeError.h"

namespace lumacast {

namespace {

std::string withSingleSlashes(std::string_view path) {
    std::string result;
    for (const char c : path)
        if (c != '/' || !result.ends_with('/')) result += c;
    while (result.size() > 1 && result.ends_with('/')) result.pop_back();
    return result;
}

std::string folderOf(const std::string& path) { return path.substr(0, path.rfind('/')); }

}  // namespace

FakeFileSystem::FakeFileSystem(const Clock& clock, FaultPlan& faults, std::string root)
    : clock_(clock),
      faults_(faults),
      root_(std::move(root)),
      base_(withSingleSlashes(root_ + "/private/var/mobile/Library/Lumacast")) {
    auto parent = std::make_shared<FakeFile>();
    parent->isDirectory = true;
    nodes_.emplace(folderOf(base_), std::move(parent));
}

std::variant<std::string, int> FakeFileSystem::resolve(const std::string& path) const {
    if (path.find('\0') != std::string::npos) return EINVAL;
    const std::string whole = withSingleSlashes(path);
    if (whole == base_) return whole;
    if (!whole.starts_with(base_ + "/")) return EACCES;
    for (std::size_t at = base_.size(); at < whole.size();) {
        const std::size_t end = std::min(whole.find('/', at + 1), whole.size());
        const std::string component = whole.substr(at + 1, end - at - 1);
        if (component == ".." || component == ".") return EACCES;
        const auto node = nodes_.find(whole.substr(0, at));
        if (node == nodes_.end()) return ENOENT;
        if (node->second->isLink) return ELOOP;
        if (!node->second->isDirectory) return ENOTDIR;
        at = end;
    }
    return whole;
}

std::variant<std::shared_ptr<FakeFile>, int> FakeFileSystem::find(const std::string& path) const {
    const auto place = resolve(path);
    if (const int* error = std::get_if<int>(&place)) return *error;
    const auto node = nodes_.find(std::get<std::string>(place));
    if (node == nodes_.end()) return ENOENT;
    return node->second;
}

std::variant<std::shared_ptr<FakeFile>, int> FakeFileSystem::make(const std::string& path, bool isDirectory) {
    const auto place = resolve(path);
    if (const int* error = std::get_if<int>(&place)) return *error;
    const std::string& whole = std::get<std::string>(place);
    if (nodes_.contains(whole)) return EEXIST;
    auto file = std::make_shared<FakeFile>();
    file->isDirectory = isDirectory;
    file->size = isDirectory ? 4096 : 0;
    file->created = file->modified = clock_.now();
    file->order = ++made_;
    nodes_.emplace(whole, file);
    return file;
}

std::uint64_t FakeFileSystem::used() const {
    std::uint64_t sum = 0;
    for (const auto& [path, file] : nodes_)
        if (!file->isDirectory) sum += file->size;
    return sum;
}

bool FakeFileSystem::exists(const std::string& path) {
    if (faults_.fails("FileSystem.exists")) return false;
    const std::lock_guard lock(mutex_);
    return std::holds_alternative<std::shared_ptr<FakeFile>>(find(path));
}

std::optional<Error> FakeFileSystem::createDirectory(const std::string& path) {
    if (faults_.fails("FileSystem.createDirectory")) return fakeSystemError(ETIMEDOUT);
    const std::lock_guard lock(mutex_);
    const auto made = make(path, true);
    if (const int* error = std::get_if<int>(&made)) return fakeSystemError(*error);
    return std::nullopt;
}

Result<FileAttributes> FakeFileSystem::attributes(const std::string& path) {
    if (faults_.fails("FileSystem.attributes")) return fakeSystemError(ETIMEDOUT);
    const std::lock_guard lock(mutex_);
    const auto found = find(path);
    if (const int* error = std::get_if<int>(&found)) return fakeSystemError(*error);
    const FakeFile& file = *std::get<0>(found);
    return FileAttributes{file.size, file.modified, file.created, file.isDirectory};
}

Result<std::vector<std::string>> FakeFileSystem::list(const std::string& directory) {
    if (disk_) disk_(directory);
    if (faults_.fails("FileSystem.list")) return fakeSystemError(EIO);
    const std::lock_guard lock(mutex_);
    const auto found = find(directory);
    if (const int* error = std::get_if<int>(&found)) return fakeSystemError(*error);
    if (!std::get<0>(found)->isDirectory) return fakeSystemError(ENOTDIR);
    const std::string folder = withSingleSlashes(directory);
    std::vector<std::pair<std::uint64_t, std::string>> names;
    for (const auto& [path, file] : nodes_)
        if (folderOf(path) == folder) names.emplace_back(file->order, path.substr(folder.size() + 1));
    std::sort(names.begin(), names.end());
    std::vector<std::string> result;
    for (auto& [order, name] : names) result.push_back(std::move(name));
    return result;
}

std::optional<Error> FakeFileSystem::remove(const std::string& path) {
    if (disk_) disk_(path);
    const bool fails = faults_.fails("FileSystem.remove");
    const std::lock_guard lock(mutex_);
    if (fails) {
        notRemoved_.insert(withSingleSlashes(path));
        return fakeSystemError(EIO);
    }
    const auto found = find(path);
    if (const int* error = std::get_if<int>(&found)) return fakeSystemError(*error);
    const std::string whole = withSingleSlashes(path);
    std::erase_if(nodes_, [&](const auto& node) { return node.first == whole || node.first.starts_with(whole + "/"); });
    return std::nullopt;
}

std::optional<Error> FakeFileSystem::move(const std::string& from, const std::string& to) {
    if (disk_) disk_(from);
    if (faults_.fails("FileSystem.move")) return fakeSystemError(EIO);
    const std::lock_guard lock(mutex_);
    const auto source = find(from);
    if (const int* error = std::get_if<int>(&source)) return fakeSystemError(*error);
    const auto place = resolve(to);
    if (const int* error = std::get_if<int>(&place)) return fakeSystemError(*error);
    const std::string oldName = withSingleSlashes(from), newName = std::get<std::string>(place);
    if (oldName == newName) return std::nullopt;
    if (const auto there = nodes_.find(newName); there != nodes_.end() && there->second->isDirectory)
        return fakeSystemError(EISDIR);
    if (newName.starts_with(oldName + "/")) return fakeSystemError(EINVAL);
    std::map<std::string, std::shared_ptr<FakeFile>> moved;
    for (const auto& [path, file] : nodes_)
        if (path == oldName || path.starts_with(oldName + "/"))
            moved.emplace(newName + path.substr(oldName.size()), file);
    std::erase_if(nodes_, [&](const auto& n) { return n.first == oldName || n.first.starts_with(oldName + "/"); });
    nodes_.erase(newName);
    nodes_.merge(moved);
    return std::nullopt;
}

bool FakeFileSystem::userMayReadAndRemove(UserID user, const std::string& path) {
    if (faults_.fails("FileSystem.userMayReadAndRemove")) return false;
    const std::lock_guard lock(mutex_);
    const auto found = usersFiles_.find(path);
    return found != usersFiles_.end() && found->second.first == user;
}

std::optional<Error> FakeFileSystem::removeForUser(UserID user, const std::string& path) {
    if (disk_) disk_(path);
    if (faults_.fails("FileSystem.removeForUser")) return fakeSystemError(EIO);
    const std::lock_guard lock(mutex_);
    const auto found = usersFiles_.find(path);
    if (found == usersFiles_.end()) return fakeSystemError(ENOENT);
    if (found->second.first != user) return fakeSystemError(EACCES);
    usersFiles_.erase(found);
    return std::nullopt;
}

void FakeFileSystem::addUsersFile(UserID user, const std::string& path, std::uint64_t size,
                                  std::shared_ptr<const FakeMovie> movie) {
    const std::lock_guard lock(mutex_);
    auto file = std::make_shared<FakeFile>();
    file->size = size;
    file->movie = std::move(movie);
    usersFiles_[path] = {user, std::move(file)};
}

bool FakeFileSystem::isThere(const std::string& path) const {
    const std::lock_guard lock(mutex_);
    return usersFiles_.contains(path) || std::holds_alternative<std::shared_ptr<FakeFile>>(find(path));
}

bool FakeFileSystem::isFolder(const std::string& path) const {
    const std::lock_guard lock(mutex_);
    const auto found = find(path);
    const auto* file = std::get_if<std::shared_ptr<FakeFile>>(&found);
    return file && (*file)->isDirectory;
}

Result<std::uint64_t> FakeFileSystem::freeSize(const std::string& path) {
    if (faults_.fails("FileSystem.freeSize")) return fakeSystemError(ETIMEDOUT);
    const std::lock_guard lock(mutex_);
    const auto found = find(path);
    if (const int* error = std::get_if<int>(&found)) return fakeSystemError(*error);
    const std::uint64_t taken = used();
    return capacity_ > taken ? capacity_ - taken : 0;
}

void FakeFileSystem::setFreeSize(std::uint64_t bytes) {
    const std::lock_guard lock(mutex_);
    capacity_ = used() + bytes;
}

void FakeFileSystem::addFile(const std::string& path, std::uint64_t size, std::optional<Date> modified) {
    const std::lock_guard lock(mutex_);
    nodes_.erase(withSingleSlashes(path));
    const auto made = make(path, false);
    if (const auto* file = std::get_if<std::shared_ptr<FakeFile>>(&made)) {
        (*file)->size = size;
        if (modified) (*file)->modified = *modified;
    }
}

void FakeFileSystem::addLink(const std::string& path) {
    const std::lock_guard lock(mutex_);
    const auto made = make(path, false);
    if (const auto* file = std::get_if<std::shared_ptr<FakeFile>>(&made)) (*file)->isLink = true;
}

bool FakeFileSystem::removalHasFailed(const std::string& path) const {
    const std::lock_guard lock(mutex_);
    return notRemoved_.contains(withSingleSlashes(path));
}

std::vector<std::string> FakeFileSystem::files() const {
    const std::lock_guard lock(mutex_);
    std::vector<std::string> result;
    for (const auto& [path, file] : nodes_)
        if (!file->isDirectory) result.push_back(path);
    return result;
}

Result<std::shared_ptr<FakeFile>> FakeFileSystem::create(const std::string& path) {
    if (faults_.fails("FileSystem.create")) return fakeSystemError(EIO);
    const std::lock_guard lock(mutex_);
    auto made = make(path, false);
    if (const int* error = std::get_if<int>(&made)) return fakeSystemError(*error);
    return std::get<0>(std::move(made));
}

bool FakeFileSystem::append(FakeFile& file, std::uint64_t bytes) {
    if (faults_.fails("FileSystem.append")) return false;
    const std::lock_guard lock(mutex_);
    if (used() + bytes > capacity_) return false;
    file.size += bytes;
    file.modified = clock_.now();
    return true;
}

void FakeFileSystem::setMovie(FakeFile& file, std::shared_ptr<const FakeMovie> movie) {
    const std::lock_guard lock(mutex_);
    file.movie = std::move(movie);
}

std::shared_ptr<const FakeMovie> FakeFileSystem::movie(const std::string& path) const {
    const std::lock_guard lock(mutex_);
    if (const auto users = usersFiles_.find(path); users != usersFiles_.end()) return users->second.second->movie;
    const auto found = find(path);
    const auto* file = std::get_if<std::shared_ptr<FakeFile>>(&found);
    return file ? (*file)->movie : nullptr;
}

}  // namespace lumacast
