// lumacast-catalog: what this device's AppStream catalogues say of applications.
//   lumacast-catalog --locale LOCALE [--catalog DIRECTORY]... -- IDENTIFIER...
// Writes a JSON array of products to the standard output and ends with status 0, also when nothing was found.

#include <appstream.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/resource.h>

#include <clocale>
#include <cstdio>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/Value.h"
#include "linux/system/Json.h"

namespace {

using lumacast::Array;
using lumacast::Dictionary;
using lumacast::Value;

struct Unreference {
    void operator()(void* object) const { g_object_unref(object); }
    void operator()(GPtrArray* list) const { g_ptr_array_unref(list); }
};
template <class T>
using Owned = std::unique_ptr<T, Unreference>;
using List = Owned<GPtrArray>;

struct Arguments {
    std::string locale = "C";
    std::vector<std::string> catalogs, identifiers;
};

std::optional<Arguments> argumentsFrom(const std::vector<std::string_view>& words) {
    Arguments arguments;
    for (std::size_t at = 0; at < words.size(); ++at) {
        if (words[at] == "--") {
            arguments.identifiers.assign(words.begin() + static_cast<std::ptrdiff_t>(at) + 1, words.end());
            return arguments;
        }
        if (at + 1 == words.size()) break;
        if (words[at] == "--locale")
            arguments.locale = words[++at];
        else if (words[at] == "--catalog")
            arguments.catalogs.emplace_back(words[++at]);
        else
            break;
    }
    return std::nullopt;
}

/// Bytes of other people are read here: whatever they lead to ends soon.
void limitThisProcess() {
#ifndef LC_SANITIZED  // a sanitizer maps far more than it uses
    constexpr rlimit kMemory{2ull << 30, 2ull << 30};
    ::setrlimit(RLIMIT_AS, &kMemory);
#endif
    constexpr rlimit kSeconds{30, 30};
    ::setrlimit(RLIMIT_CPU, &kSeconds);
    ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0);
}

Owned<AsPool> openCatalogs(const Arguments& arguments) {
    Owned<AsPool> pool(as_pool_new());
    as_pool_set_locale(pool.get(), arguments.locale.c_str());
    as_pool_set_flags(pool.get(), static_cast<AsPoolFlags>(AS_POOL_FLAG_LOAD_OS_CATALOG |
                                                           AS_POOL_FLAG_LOAD_OS_METAINFO | AS_POOL_FLAG_LOAD_FLATPAK));
    if (!arguments.catalogs.empty()) as_pool_set_load_std_data_locations(pool.get(), FALSE);
    for (const std::string& catalog : arguments.catalogs)
        as_pool_add_extra_data_location(pool.get(), catalog.c_str(), AS_FORMAT_STYLE_CATALOG);
    // A catalogue that can't be read takes nothing from the others.
    GError* error = nullptr;
    as_pool_load(pool.get(), nullptr, &error);
    g_clear_error(&error);
    return pool;
}

/// The component that counts most, or null.
AsComponent* bestOf(const GPtrArray& list) {
    AsComponent* best = nullptr;
    for (guint i = 0; i < list.len; ++i) {
        auto* const component = AS_COMPONENT(list.pdata[i]);
        if (!best || as_component_get_priority(component) > as_component_get_priority(best)) best = component;
    }
    return best;
}

/// The identifier, then the same without or with the ending that desktop entries' files have.
std::vector<std::string> spellings(const std::string& identifier) {
    constexpr std::string_view kEnding = ".desktop";
    if (identifier.ends_with(kEnding)) return {identifier, identifier.substr(0, identifier.size() - kEnding.size())};
    return {identifier, identifier + std::string(kEnding)};
}

Owned<AsComponent> find(AsPool* pool, const std::string& identifier) {
    // Those that took the place of one with this id are among them.
    const auto byId = [&](const char* name) { return as_pool_get_components_by_id(pool, name); };
    const auto byEntry = [&](const char* name) {
        return as_pool_get_components_by_launchable(pool, AS_LAUNCHABLE_KIND_DESKTOP_ID, name);
    };
    const auto search = [&](const auto& question) -> AsComponent* {
        for (const std::string& spelling : spellings(identifier)) {
            const List found(question(spelling.c_str()));
            AsComponent* const best = found ? bestOf(*found) : nullptr;
            if (best) return AS_COMPONENT(g_object_ref(best));
        }
        return nullptr;
    };
    AsComponent* component = search(byId);
    if (!component) component = search(byEntry);
    return Owned<AsComponent>(component);
}

Array genresOf(AsComponent* component) {
    Array genres;
    const List mainCategories(as_get_default_categories(FALSE));
    const List single(g_ptr_array_new());
    g_ptr_array_add(single.get(), component);
    as_utils_sort_components_into_categories(single.get(), mainCategories.get(), FALSE);
    for (guint i = 0; i < mainCategories->len; ++i) {
        auto* const category = AS_CATEGORY(mainCategories->pdata[i]);
        if (as_category_has_component(category, component)) genres.emplace_back(as_category_get_name(category));
    }
    if (!genres.empty()) return genres;
    const GPtrArray* const written = as_component_get_categories(component);
    for (guint i = 0; written && i < written->len; ++i)
        genres.emplace_back(static_cast<const char*>(written->pdata[i]));
    return genres;
}

Value describe(AsComponent* component) {
    Dictionary product;
    if (const char* name = as_component_get_name(component)) product.set("name", name);
    if (const char* developer = as_component_get_developer_name(component)) product.set("developer", developer);
    const char* const homepage = as_component_get_url(component, AS_URL_KIND_HOMEPAGE);
    const std::string_view page = homepage ? homepage : "";
    if (page.starts_with("https://") || page.starts_with("http://"))
        product.set("link", page);
    else
        product.set("link", std::string("appstream:") + as_component_get_id(component));
    if (Array genres = genresOf(component); !genres.empty()) product.set("genres", std::move(genres));
    return product;
}

}  // namespace

int main(int count, char** words) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    const auto arguments = argumentsFrom({words + 1, words + count});
    if (!arguments) {
        std::fprintf(stderr, "usage: lumacast-catalog --locale LOCALE [--catalog DIRECTORY]... -- IDENTIFIER...\n");
        return 2;
    }
    limitThisProcess();
    std::setlocale(LC_ALL, "");  // for the categories' names
    const auto pool = openCatalogs(*arguments);
    Array products;
    for (const std::string& identifier : arguments->identifiers)
        if (const auto component = find(pool.get(), identifier)) products.push_back(describe(component.get()));
    std::printf("%s\n", lumacast::jsonText(products).c_str());
    return std::fflush(stdout) == 0 ? 0 : 1;
}
