#pragma once
#include <cstddef>
#include <map>
#include <mutex>

#include "platform/Bundles.h"

namespace lumacast {

/// One bundle as the test describes it. Described first, then shared and never changed again.
class FakeBundle final : public Bundle {
public:
    std::optional<BundleIdentifier> identifier() const override { return bundleIdentifier; }
    std::optional<std::string> localizedInfo(std::string_view key) const override { return look(localizedInfos, key); }
    std::optional<std::string> info(std::string_view key) const override { return look(infos, key); }
    std::string resourcePath() const override { return path; }
    std::vector<std::string> localizations() const override { return languages; }
    std::optional<std::string> resource(std::string_view name, std::string_view type,
                                        std::string_view localization) const override {
        return look(resources, std::string(localization) + "/" + std::string(name) + "." + std::string(type));
    }
    std::optional<std::string> string(std::string_view key, std::string_view table) const override {
        const auto found = tables.find(table);
        return found == tables.end() ? std::nullopt : look(found->second, key);
    }

    using Texts = std::map<std::string, std::string, std::less<>>;

    std::optional<BundleIdentifier> bundleIdentifier;
    std::string path;
    Texts infos, localizedInfos;
    std::vector<std::string> languages;
    Texts resources;  ///< "<localization>/<name>.<type>" to the path
    std::map<std::string, Texts, std::less<>> tables;

private:
    static std::optional<std::string> look(const Texts& texts, std::string_view key) {
        const auto found = texts.find(key);
        return found == texts.end() ? std::nullopt : std::optional(found->second);
    }
};

/// The applications and folders that the test installs. Thread-safe.
class FakeBundles final : public Bundles {
public:
    std::optional<std::string> executablePath(ProcessID pid) override;
    std::optional<std::string> bundlePathForExecutable(const std::string& path) override;
    std::shared_ptr<const Bundle> open(const std::string& path) override;
    std::shared_ptr<const Bundle> withIdentifier(const BundleIdentifier& identifier) override;
    std::optional<Data> applicationIcon(const BundleIdentifier& identifier, IconFormat format) override;
    std::string frameworkBundlePath() override { return "/fake/Lumacast.framework"; }
    std::vector<std::string> preferredLanguages() override;
    /// A wanted language suits a localization with the same tag, and one with the tag that is left without its last
    /// parts.
    std::vector<std::string> preferredLocalizations(const std::vector<std::string>& available) override;

    /// Makes the bundle findable under its path, and under its identifier where it has one.
    void install(FakeBundle bundle);
    /// Installs a simple application at "/fake/apps/<identifier>" whose executable lies in it.
    void installApplication(const BundleIdentifier& identifier, const std::string& displayName);
    /// The icon that the application has in this format.
    void setIcon(const BundleIdentifier& identifier, IconFormat format, Data png);
    void uninstall(const BundleIdentifier& identifier);
    /// This process runs the application's executable from now on.
    void run(ProcessID pid, const BundleIdentifier& identifier);
    /// This process runs an executable that belongs to whatever bundle its path lies in.
    void runExecutable(ProcessID pid, const std::string& path);
    void processEnded(ProcessID pid);
    void setPreferredLanguages(std::vector<std::string> languages);
    /// How often bundles were asked for by their identifiers, as for an application's name.
    std::size_t identifiersLookedUp() const;
    /// How often the user's languages were asked for, as for every text.
    std::size_t languagesLookedUp() const;

private:
    mutable std::mutex mutex_;
    std::map<std::string, std::shared_ptr<const FakeBundle>> bundles_;
    std::map<BundleIdentifier, std::string> paths_;
    std::map<ProcessID, std::string> executables_;
    std::vector<std::string> languages_{"en"};
    std::map<std::pair<BundleIdentifier, IconFormat>, Data> icons_;
    std::size_t identifiersLookedUp_ = 0, languagesLookedUp_ = 0;
};

}  // namespace lumacast
