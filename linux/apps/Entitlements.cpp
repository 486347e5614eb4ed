#include "linux/apps/Entitlements.h"

#include <stdlib.h>
#include <sys/stat.h>

#include <algorithm>

#include "linux/apps/ApplicationFiles.h"
#include "linux/apps/ProcessImage.h"
#include "linux/system/IniFile.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumDropIns = 256;
constexpr std::size_t kMaximumBytes = 64 * 1024;

/// The file that names a bundle: the desktop entry, or the manifest in the folder.
std::string entryOf(const std::string& bundlePath) {
    return bundlePath.ends_with(".desktop") ? bundlePath : bundlePath + "/" + std::string(kManifestName);
}

void readDropIns(const Entitlements::Options& options, const std::string& identifier,
                 Entitlements::Explanation& answer) {
    for (const std::string& directory : options.directories) {
        for (const std::string& name : namesIn(directory, kMaximumDropIns).value_or(std::vector<std::string>())) {
            if (!name.ends_with(".conf")) continue;
            const std::string path = directory + "/" + name;
            if (const auto reason = whyNotAdministratorOwned(path, options.administrator)) {
                answer.findings.push_back("passed over " + path + ": " + *reason);
                continue;
            }
            const auto file = readSmallFile(path, kMaximumBytes);
            const IniFile dropIn = file ? IniFile::parse(file->text) : IniFile();
            const IniSection* section = dropIn.section(identifier);
            if (!section) continue;
            answer.findings.push_back("counted " + path);
            for (const auto& [key, text] : section->entries) answer.entitlements.set(key, iniValue(text));
        }
    }
}

}  // namespace

std::optional<std::string> whyNotAdministratorOwned(const std::string& path, uid_t administrator) {
    const std::unique_ptr<char, void (*)(void*)> real(::realpath(path.c_str(), nullptr), &::free);
    if (!real) return "it can't be read";
    std::string place = real.get();
    for (bool above = false; true; above = true) {
        const std::string shown = place.empty() ? "/" : place;
        struct stat status = {};
        if (::lstat(shown.c_str(), &status) != 0) return shown + " can't be read";
        if (status.st_uid != administrator && status.st_uid != 0) return shown + " belongs to somebody else";
        const bool othersMayWrite = (status.st_mode & (S_IWGRP | S_IWOTH)) != 0;
        const bool onlyOwnersRename = above && (status.st_mode & S_ISVTX) != 0;
        if (othersMayWrite && !onlyOwnersRename) return shown + " may be written to by others";
        if (place.empty()) return std::nullopt;
        place.resize(place.rfind('/'));
    }
}

Entitlements::Entitlements(Bundles& bundles, Options options) : bundles_(bundles), options_(std::move(options)) {}

std::vector<std::string> Entitlements::directoriesFrom(const LinuxEnvironment& environment) {
    auto directories = LinuxEnvironment::below(environment.systemDirectories, "entitlements.d");
    std::reverse(directories.begin(), directories.end());
    return directories;
}

std::optional<Value> Entitlements::value(ProcessID pid, std::string_view name) {
    // The question touches this object and the bundles. That is safe: each of its looks at the disk ends with the
    // patience, and the lane waits for it when it is destroyed.
    const auto question = [this, pid, wanted = std::string(name)]() -> std::optional<Value> {
        const Explanation answer = explain(pid);
        const Value* value = answer.counts ? answer.entitlements.find(wanted) : nullptr;
        return value ? std::optional(*value) : std::nullopt;
    };
    return questions_.ask<std::optional<Value>>(options_.patience, question).value_or(std::nullopt);
}

Entitlements::Explanation Entitlements::explain(ProcessID pid) {
    Explanation answer;
    const auto executable = bundles_.executablePath(pid);
    if (!executable) {
        answer.findings.push_back("the process has no executable that can be read");
        return answer;
    }
    const auto bundlePath = bundles_.bundlePathForExecutable(*executable);
    const auto bundle = bundlePath ? bundles_.open(*bundlePath) : nullptr;
    if (bundle) answer.application = bundle->identifier();
    if (!answer.application) {
        answer.findings.push_back(*executable + " belongs to no application");
        return answer;
    }
    const auto look = [options = options_, pid, path = *executable, entry = entryOf(*bundlePath), answer] {
        Explanation result = answer;
        const auto image = processImage(pid);
        // The path alone proves nothing: the process must run the very file that lies there now.
        if (!image || image->deleted || image->path != path) {
            result.findings.push_back(path + " is not, or no longer, what the process runs");
            return result;
        }
        for (const std::string& needed : {path, entry})
            if (const auto reason = whyNotAdministratorOwned(needed, options.administrator))
                result.findings.push_back("nothing counts: " + *reason);
        result.counts = result.findings.empty();
        if (result.counts) readDropIns(options, result.application->text(), result);
        return result;
    };
    if (const auto result = disk_.ask<Explanation>(options_.patience, look)) return *result;
    answer.findings.push_back("the disk did not answer in time");
    return answer;
}

}  // namespace lumacast
