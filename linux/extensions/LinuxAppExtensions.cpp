#include "linux/extensions/LinuxAppExtensions.h"

#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <utility>

#include "linux/apps/ApplicationFiles.h"
#include "linux/extensions/ExtensionRun.h"

namespace lumacast {

namespace {

constexpr std::chrono::seconds kLookPatience{5};
constexpr std::chrono::milliseconds kIconPatience{100};

/// The object that a lookup answers with. What it does, its run does.
class LinuxAppExtension final : public AppExtension {
public:
    LinuxAppExtension(std::shared_ptr<ExtensionServices> services, std::shared_ptr<const InstalledExtension> installed)
        : services_(services),
          installed_(installed),
          run_(std::make_shared<ExtensionRun>(std::move(services), std::move(installed))) {}
    ~LinuxAppExtension() override { run_->abandon(); }

    BundleIdentifier identifier() const override { return BundleIdentifier(installed_->manifest.identifier); }
    std::string extensionPointIdentifier() const override { return installed_->manifest.extensionPoint; }
    const Dictionary& attributes() const override { return installed_->attributes; }
    const Dictionary& infoDictionary() const override { return installed_->information; }
    std::vector<Data> icons() const override {
        return services_->disk
            ->ask<std::vector<Data>>(kIconPatience, [installed = installed_] { return readIcons(*installed); })
            .value_or(std::vector<Data>());
    }
    void setRequestCompletionHandler(RequestCompletionHandler handler) override {
        run_->setCompletionHandler(std::move(handler));
    }
    void beginExtensionRequestWithInputItems(std::vector<ExtensionItem> items, BeginHandler handler) override {
        run_->begin(std::move(items), std::move(handler));
    }
    std::shared_ptr<ExtensionContext> extensionContextForRequest(ExtensionRequestID request) override {
        return run_->context(request);
    }
    std::optional<std::string> issueReadOnlyFileToken(std::string_view, const std::string& path) override {
        return run_->issueToken(path);
    }
    void kill(int signal) override { run_->kill(signal); }

private:
    const std::shared_ptr<ExtensionServices> services_;
    const std::shared_ptr<const InstalledExtension> installed_;
    const std::shared_ptr<ExtensionRun> run_;
};

std::shared_ptr<ExtensionServices> servicesWith(Reactor& reactor, Scheduler& scheduler, LinuxIpc& ipc, Log& log,
                                                LinuxAppExtensions::Options options) {
    auto installed = std::make_shared<InstalledExtensions>(log, options.dataDirectories, options.locales);
    auto sandbox = std::make_shared<Sandbox>(log, options.sandbox);
    return std::shared_ptr<ExtensionServices>(new ExtensionServices{
        .reactor = reactor,
        .scheduler = scheduler,
        .ipc = ipc,
        .log = log,
        .options = std::move(options),
        .installed = std::move(installed),
        .sandbox = std::move(sandbox),
        .lookups = scheduler.serialQueue("extension lookups"),
        .disk = std::make_shared<DiskLane>(),
        .isOver = false,
        .mutex = {},
        .contextClass = {},
        .processes = {},
        .launches = std::make_unique<LaunchLane>(),
    });
}

std::optional<std::string> variable(const std::string& name) {
    const char* value = ::getenv(name.c_str());
    return value ? std::optional<std::string>(value) : std::nullopt;
}

}  // namespace

LinuxAppExtensions::Options LinuxAppExtensions::optionsFrom(const LinuxEnvironment& environment,
                                                            const std::string& temporaryDirectory) {
    Options options;
    options.dataDirectories = environment.dataDirectories;
    options.locales = userLocales(environment.languageList, environment.messageLocale);
    options.readableFiles = temporaryDirectory;
    const std::string directory = environment.executable.substr(0, environment.executable.rfind('/') + 1);
    options.sandbox.launcher = directory + "lumacast-extension-launcher";
    if (::access(options.sandbox.launcher.c_str(), X_OK) != 0)
        options.sandbox.launcher = directory + "../libexec/lumacast/lumacast-extension-launcher";
    options.sandbox.bubblewrap = resolvedProgram("bwrap", environment.searchPath).value_or("");
    options.sandbox.isUnsandboxedAllowed = [directories = environment.systemDirectories] {
        return unsandboxedExtensionsAllowed(directories);
    };
    options.sandbox.ownDirectories = environment.stateDirectory + "/extension-data";
    options.sandbox.forbidden = {environment.runtimeDirectory,
                                 environment.stateDirectory,
                                 environment.cacheDirectory,
                                 temporaryDirectory,
                                 "/proc",
                                 "/sys",
                                 "/dev",
                                 "/run"};
    for (const char* name : {"LANG", "LC_ALL", "LC_MESSAGES", "LANGUAGE", "TZ"})
        if (const auto value = variable(name))
            options.sandbox.baseEnvironment.push_back(std::string(name) + "=" + *value);
    options.sandbox.variable = variable;
    return options;
}

LinuxAppExtensions::LinuxAppExtensions(Reactor& reactor, Scheduler& scheduler, LinuxIpc& ipc, Log& log, Options options)
    : services_(servicesWith(reactor, scheduler, ipc, log, std::move(options))) {}

LinuxAppExtensions::~LinuxAppExtensions() {
    services_->isOver = true;
    std::vector<std::weak_ptr<ExtensionProcess>> processes;
    std::unique_ptr<LaunchLane> launches;
    {
        const std::lock_guard lock(services_->mutex);
        processes.swap(services_->processes);
        launches.swap(services_->launches);
    }
    launches.reset();
    for (const auto& weak : processes) {
        const auto process = weak.lock();
        if (!process) continue;
        process->endNow();
        services_->reactor.async([process] { process->forget(); });
    }
}

void LinuxAppExtensions::setContextClass(ExtensionContextClass contextClass) {
    const std::lock_guard lock(services_->mutex);
    services_->contextClass = std::move(contextClass);
}

void LinuxAppExtensions::extensionsWithMatchingPoint(const std::string& point, Matched handler) {
    services_->lookups->async([services = services_, point, handler = std::move(handler)] {
        using Found = std::variant<std::vector<std::shared_ptr<const InstalledExtension>>, int>;
        const auto answer =
            services->disk->ask<Found>(kLookPatience, [installed = services->installed] { return installed->look(); });
        const int* error = answer ? std::get_if<int>(&*answer) : nullptr;
        if (!answer || error) return handler({}, Error(std::string(kSystemErrorDomain), error ? *error : ETIMEDOUT));
        std::vector<std::shared_ptr<AppExtension>> matching;
        for (const auto& installed : std::get<std::vector<std::shared_ptr<const InstalledExtension>>>(*answer))
            if (installed->manifest.extensionPoint == point)
                matching.push_back(std::make_shared<LinuxAppExtension>(services, installed));
        handler(std::move(matching), std::nullopt);
    });
}

}  // namespace lumacast
