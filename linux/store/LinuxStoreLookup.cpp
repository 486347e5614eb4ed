#include "linux/store/LinuxStoreLookup.h"

#include <sys/eventfd.h>

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <string_view>

#include "base/Value.h"
#include "linux/apps/Languages.h"
#include "linux/ipc/Fd.h"
#include "linux/store/ProgramOutput.h"
#include "linux/system/Json.h"
#include "linux/system/LinuxEnvironment.h"

namespace lumacast {

namespace {

constexpr std::size_t kMostWaiting = 32;
constexpr std::size_t kMostIdentifiers = 64;
constexpr std::size_t kLongestIdentifier = 255;
constexpr std::size_t kLongestText = 4096;
constexpr std::size_t kMostGenres = 32;
constexpr int kLocalized = 1;

bool isIdentifier(const std::string& text) {
    return !text.empty() && text.size() <= kLongestIdentifier && std::all_of(text.begin(), text.end(), [](char c) {
        return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '.' || c == '_' ||
               c == '-';
    });
}

std::string localeName(const Locale& locale) {
    std::string name = locale.language;
    if (!locale.country.empty()) name += "_" + locale.country;
    if (!locale.modifier.empty()) name += "@" + locale.modifier;
    return name;
}

std::optional<std::string> textIn(const Value* value) {
    const auto* text = value ? value->as<std::string>() : nullptr;
    return text && !text->empty() && text->size() <= kLongestText ? std::optional(*text) : std::nullopt;
}

StoreProduct productFrom(const Dictionary& written) {
    StoreProduct product;
    product.displayName = textIn(written.find("name"));
    product.artistName = textIn(written.find("developer"));
    product.shortProductURL = textIn(written.find("link"));
    const Value* const genres = written.find("genres");
    if (const auto* names = genres ? genres->as<Array>() : nullptr) {
        product.genreNames.emplace();
        for (const Value& name : *names)
            if (auto text = textIn(&name); text && product.genreNames->size() < kMostGenres)
                product.genreNames->push_back(std::move(*text));
    }
    return product;
}

std::vector<StoreProduct> productsFrom(const std::string& json) {
    std::vector<StoreProduct> products;
    const auto written = valueFromJson(json);
    const Array* const list = written ? written->as<Array>() : nullptr;
    if (!list) return {};
    for (const Value& item : *list)
        if (const auto* product = item.as<Dictionary>(); product && products.size() < kMostIdentifiers)
            products.push_back(productFrom(*product));
    return products;
}

}  // namespace

/// What the lookups and their owner share.
struct LinuxStoreLookup::State {
    explicit State(Options given) : options(std::move(given)) {}

    std::vector<StoreProduct> find(const StoreRequest& request) const {
        const bool localized = request.localizationStyle == kLocalized;
        ProgramRun run{{options.program, "--locale", localized ? options.locale : "C"}, options.environment};
        run.patience = options.patience;
        for (const std::string& catalog : options.catalogs)
            run.command.insert(run.command.end(), {"--catalog", catalog});
        run.command.emplace_back("--");
        std::size_t identifiers = 0;
        for (const std::string& identifier : request.bundleIdentifiers) {
            if (!isIdentifier(identifier) || identifiers == kMostIdentifiers) continue;
            run.command.push_back(identifier);
            ++identifiers;
        }
        if (identifiers == 0 || options.program.empty() || !cancel) return {};
        const auto output = outputOf(run, cancel.get());
        return output ? productsFrom(*output) : std::vector<StoreProduct>{};
    }

    const Options options;
    const Fd cancel{::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)};  ///< can be read from the end on
    std::atomic<std::size_t> waiting{0};
};

LinuxStoreLookup::Options LinuxStoreLookup::optionsFrom(const LinuxEnvironment& environment) {
    Options options;
    const std::string directory = environment.executable.substr(0, environment.executable.rfind('/') + 1);
    options.program = directory + "lumacast-catalog";
    if (::access(options.program.c_str(), X_OK) != 0)
        options.program = directory + "../libexec/lumacast/lumacast-catalog";
    options.locale = localeName(userLocales(environment.languageList, environment.messageLocale).front());
    std::string dataDirectories;
    for (std::size_t i = 1; i < environment.dataDirectories.size(); ++i)
        dataDirectories += (i > 1 ? ":" : "") + environment.dataDirectories[i];
    options.environment = {"HOME=" + environment.home, "PATH=/usr/bin:/bin", "XDG_DATA_HOME=" + environment.dataHome,
                           "XDG_DATA_DIRS=" + dataDirectories, "XDG_CACHE_HOME=" + environment.cacheDirectory,
                           "LANGUAGE=" + environment.languageList, "LC_ALL=" + environment.messageLocale,
                           // The library's own helpers are not to load others' modules, which would look for a bus.
                           "GIO_USE_VFS=local", "GIO_MODULE_DIR=/nonexistent"};
    return options;
}

LinuxStoreLookup::LinuxStoreLookup(Scheduler& scheduler, Options options)
    : state_(std::make_shared<State>(std::move(options))), queue_(scheduler.serialQueue("store lookup")) {}

LinuxStoreLookup::~LinuxStoreLookup() {
    const std::uint64_t one = 1;
    [[maybe_unused]] const ssize_t ignored = ::write(state_->cancel.get(), &one, sizeof one);
}

void LinuxStoreLookup::start(const StoreRequest& request, Handler handler) {
    const bool isTooMany = ++state_->waiting > kMostWaiting;
    queue_->async([state = state_, request = isTooMany ? StoreRequest{} : request, handler = std::move(handler)] {
        const auto products = state->find(request);
        --state->waiting;
        handler(products);
    });
}

}  // namespace lumacast
