#include "linux/apps/LinuxBundles.h"

#include "linux/apps/BundleLibrary.h"
#include "linux/apps/KnownProcesses.h"
#include "linux/apps/ProcessImage.h"

namespace lumacast {

namespace {

/// Pixels of a side.
int sizeOf(IconFormat format) {
    switch (format) {
        case IconFormat::Small: return 32;
        case IconFormat::Medium: return 64;
        case IconFormat::Large: return 128;
    }
    return 64;
}

std::string withoutTrailingSlashes(std::string path) {
    while (path.size() > 1 && path.ends_with('/')) path.pop_back();
    return path;
}

}  // namespace

LinuxBundles::Options LinuxBundles::optionsFrom(const LinuxEnvironment& environment) {
    Options options;
    options.applicationDirectories = LinuxEnvironment::below(environment.dataDirectories, "applications");
    options.searchPath = environment.searchPath;
    options.frameworkBundlePath = environment.resourceBundle;
    options.locales = userLocales(environment.languageList, environment.messageLocale);
    options.icons = {environment.home, environment.dataDirectories, environment.configDirectories};
    options.freshness = std::chrono::seconds(1);
    return options;
}

LinuxBundles::LinuxBundles(Options options)
    : options_(std::move(options)),
      library_(
          std::make_shared<BundleLibrary>(options_.applicationDirectories, options_.searchPath, options_.locales)),
      processes_(std::make_shared<KnownProcesses>()) {
    for (const Locale& locale : options_.locales) languages_.push_back(languageTag(locale));
    if (languages_.empty()) languages_.push_back("en");
    const auto framework = library_->open(options_.frameworkBundlePath);
    if (!framework) return;
    for (const std::string& localization : preferredLocalizations(framework->localizations()))
        library_->open(options_.frameworkBundlePath + "/" + localization + ".lproj");
}

template <class T>
std::optional<T> LinuxBundles::ask(std::function<T(BundleLibrary&)> question) {
    const auto asked = [library = library_, before = options_.beforeEachQuestion, question = std::move(question)] {
        if (before) before();
        return question(*library);
    };
    return disk_.ask<T>(options_.patience, asked);
}

std::optional<std::string> LinuxBundles::executablePath(ProcessID pid) {
    if (auto path = processes_->path(pid, options_.freshness)) return path;
    const auto answer = ask<std::optional<std::string>>(
        [pid, processes = processes_](BundleLibrary&) -> std::optional<std::string> {
            const Fd process = openProcess(pid);
            const auto image = processImage(process);
            if (!image) return std::nullopt;
            processes->keep(pid, process, *image);
            return image->path;
        });
    return answer ? *answer : std::nullopt;
}

std::optional<std::string> LinuxBundles::bundlePathForExecutable(const std::string& path) {
    if (library_->isFresh(options_.freshness))
        if (auto known = library_->knownPathForProgram(path)) return known;
    const auto answer =
        ask<std::optional<std::string>>([path](BundleLibrary& library) { return library.pathForProgram(path); });
    return answer ? *answer : library_->knownPathForProgram(path);
}

std::shared_ptr<const Bundle> LinuxBundles::open(const std::string& path) {
    const std::string place = withoutTrailingSlashes(path);
    if (!place.starts_with('/')) return nullptr;
    if (auto known = library_->known(place, options_.freshness)) return known;
    const auto answer =
        ask<std::shared_ptr<const Bundle>>([place](BundleLibrary& library) { return library.open(place); });
    return answer ? *answer : library_->known(place);
}

std::shared_ptr<const Bundle> LinuxBundles::withIdentifier(const BundleIdentifier& identifier) {
    const auto answer = ask<std::shared_ptr<const Bundle>>(
        [name = identifier.text()](BundleLibrary& library) -> std::shared_ptr<const Bundle> {
            const auto path = library.pathForIdentifier(name);
            const auto bundle = path ? library.open(*path) : nullptr;
            // A folder met earlier may have become another application's.
            return bundle && bundle->identifier() == BundleIdentifier(name) ? bundle : nullptr;
        });
    if (answer) return *answer;
    const auto path = library_->knownPathForIdentifier(identifier.text());
    return path ? library_->known(*path) : nullptr;
}

std::optional<Data> LinuxBundles::applicationIcon(const BundleIdentifier& identifier, IconFormat format) {
    const auto answer = ask<std::optional<Data>>(
        [name = identifier.text(), icons = options_.icons, size = sizeOf(format)](BundleLibrary& library)
            -> std::optional<Data> {
            const auto path = library.pathForIdentifier(name);
            const auto bundle = path ? library.open(*path) : nullptr;
            const auto icon = bundle ? bundle->info(kInfoIcon) : std::nullopt;
            return icon ? icons.png(*icon, size) : std::nullopt;
        });
    return answer ? *answer : std::nullopt;
}

std::string LinuxBundles::frameworkBundlePath() { return options_.frameworkBundlePath; }

std::vector<std::string> LinuxBundles::preferredLanguages() { return languages_; }

std::vector<std::string> LinuxBundles::preferredLocalizations(const std::vector<std::string>& available) {
    return matchingLocalizations(languages_, available);
}

}  // namespace lumacast
