#pragma once
#include <map>
#include <string>
#include <vector>

#include "linux/apps/Languages.h"
#include "linux/apps/StringsTable.h"
#include "platform/Bundles.h"

namespace lumacast {

/// Texts of an information dictionary by their keys.
using Information = std::map<std::string, std::string, std::less<>>;

/// Everything a bundle answers, read when it was opened; so a bundle never asks the disk again.
struct BundleContents {
    std::optional<BundleIdentifier> identifier;
    Information localizedInfo;
    Information info;
    std::string resourcePath;
    std::vector<std::string> localizations;
    std::map<std::string, std::vector<std::string>, std::less<>> files;  ///< localization, names in its folder
    std::map<std::string, StringsTable, std::less<>> tables;             ///< table name, texts
};

class LinuxBundle final : public Bundle {
public:
    explicit LinuxBundle(BundleContents contents) : contents_(std::move(contents)) {}

    std::optional<BundleIdentifier> identifier() const override { return contents_.identifier; }
    std::optional<std::string> localizedInfo(std::string_view key) const override;
    std::optional<std::string> info(std::string_view key) const override;
    std::string resourcePath() const override { return contents_.resourcePath; }
    std::vector<std::string> localizations() const override { return contents_.localizations; }
    std::optional<std::string> resource(std::string_view name, std::string_view type,
                                        std::string_view localization) const override;
    std::optional<std::string> string(std::string_view key, std::string_view table) const override;

private:
    const BundleContents contents_;
};

/// A bundle, and the files and folders it was made from: when one of them changes, so may the bundle.
struct OpenedBundle {
    std::shared_ptr<const Bundle> bundle;
    std::vector<std::string> sources;
};

/// Opens a desktop entry (a path that ends in ".desktop"; `identifier` is its id), a language folder ("*.lproj") or a
/// folder with resources, with or without a manifest. A null bundle when there is nothing
/// to open there. Of each language folder at
/// most 256 names, at most 64 language folders, tables of at most 256 KiB. Blocks as long as the disk does.
OpenedBundle openDesktopEntry(const std::string& path, const std::string& identifier,
                              const std::vector<Locale>& locales);
OpenedBundle openFolder(const std::string& path, const std::vector<Locale>& locales);

}  // namespace lumacast
