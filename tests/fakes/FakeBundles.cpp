#include "tests/fakes/FakeBundles.h"

#include <algorithm>

namespace lumacast {

std::optional<std::string> FakeBundles::executablePath(ProcessID pid) {
    const std::lock_guard lock(mutex_);
    const auto found = executables_.find(pid);
    return found == executables_.end() ? std::nullopt : std::optional(found->second);
}

std::optional<std::string> FakeBundles::bundlePathForExecutable(const std::string& path) {
    const std::lock_guard lock(mutex_);
    for (std::string folder = path; !folder.empty(); folder.resize(std::min(folder.rfind('/'), folder.size())))
        if (const auto found = bundles_.find(folder); found != bundles_.end() && found->second->bundleIdentifier)
            return folder;
    return std::nullopt;
}

std::shared_ptr<const Bundle> FakeBundles::open(const std::string& path) {
    const std::lock_guard lock(mutex_);
    const auto found = bundles_.find(path);
    return found == bundles_.end() ? nullptr : found->second;
}

std::shared_ptr<const Bundle> FakeBundles::withIdentifier(const BundleIdentifier& identifier) {
    const std::lock_guard lock(mutex_);
    ++identifiersLookedUp_;
    const auto found = paths_.find(identifier);
    return found == paths_.end() ? nullptr : bundles_.at(found->second);
}

std::optional<Data> FakeBundles::applicationIcon(const BundleIdentifier& identifier, IconFormat format) {
    const std::lock_guard lock(mutex_);
    const auto found = icons_.find({identifier, format});
    return found == icons_.end() ? std::nullopt : std::optional(found->second);
}

void FakeBundles::setIcon(const BundleIdentifier& identifier, IconFormat format, Data png) {
    const std::lock_guard lock(mutex_);
    icons_[{identifier, format}] = std::move(png);
}

std::vector<std::string> FakeBundles::preferredLanguages() {
    const std::lock_guard lock(mutex_);
    ++languagesLookedUp_;
    return languages_;
}

std::vector<std::string> FakeBundles::preferredLocalizations(const std::vector<std::string>& available) {
    std::vector<std::string> result;
    for (std::string tag : preferredLanguages()) {
        for (;;) {
            const bool has = std::find(available.begin(), available.end(), tag) != available.end();
            if (has && std::find(result.begin(), result.end(), tag) == result.end()) result.push_back(tag);
            const std::size_t dash = tag.rfind('-');
            if (dash == std::string::npos) break;
            tag.resize(dash);
        }
    }
    return result;
}

void FakeBundles::install(FakeBundle bundle) {
    auto shared = std::make_shared<const FakeBundle>(std::move(bundle));
    const std::lock_guard lock(mutex_);
    if (shared->bundleIdentifier) paths_.insert_or_assign(*shared->bundleIdentifier, shared->path);
    bundles_.insert_or_assign(shared->path, shared);
}

void FakeBundles::installApplication(const BundleIdentifier& identifier, const std::string& displayName) {
    FakeBundle bundle;
    bundle.bundleIdentifier = identifier;
    bundle.path = "/fake/apps/" + identifier.text();
    for (const std::string_view key : {kInfoDisplayName, kInfoName}) {
        bundle.infos.emplace(key, displayName);
        bundle.localizedInfos.emplace(key, displayName);
    }
    install(std::move(bundle));
}

void FakeBundles::uninstall(const BundleIdentifier& identifier) {
    const std::lock_guard lock(mutex_);
    std::erase_if(icons_, [&](const auto& icon) { return icon.first.first == identifier; });
    const auto found = paths_.find(identifier);
    if (found == paths_.end()) return;
    bundles_.erase(found->second);
    paths_.erase(found);
}

void FakeBundles::run(ProcessID pid, const BundleIdentifier& identifier) {
    runExecutable(pid, "/fake/apps/" + identifier.text() + "/program");
}

void FakeBundles::runExecutable(ProcessID pid, const std::string& path) {
    const std::lock_guard lock(mutex_);
    executables_.insert_or_assign(pid, path);
}

void FakeBundles::processEnded(ProcessID pid) {
    const std::lock_guard lock(mutex_);
    executables_.erase(pid);
}

void FakeBundles::setPreferredLanguages(std::vector<std::string> languages) {
    const std::lock_guard lock(mutex_);
    languages_ = std::move(languages);
}

std::size_t FakeBundles::identifiersLookedUp() const {
    const std::lock_guard lock(mutex_);
    return identifiersLookedUp_;
}

std::size_t FakeBundles::languagesLookedUp() const {
    const std::lock_guard lock(mutex_);
    return languagesLookedUp_;
}

}  // namespace lumacast
