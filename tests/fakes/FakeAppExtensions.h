#pragma once
// Extensions that the test installs, and their processes.

#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/AppExtension.h"
#include "platform/Scheduler.h"
#include "tests/fakes/FakeIpc.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {

class FakeAppExtension;

/// What runs in the process of one extension. On that process's main queue.
class FakeExtensionProgram {
public:
    virtual ~FakeExtensionProgram() = default;
    /// A request begins with these items. It may complete it at once, later, or never.
    virtual void beginRequest(FakeAppExtension&, ExtensionRequestID, const std::vector<ExtensionItem>&) {}
    /// `setEndpoint:completionHandler:` of the auxiliary connection.
    virtual void setEndpoint(FakeIpc&, const std::shared_ptr<IpcEndpoint>&, const std::function<void()>& completion) {
        completion();
    }
};

/// What the test says of one installed extension.
struct FakeInstalledExtension {
    BundleIdentifier identifier;
    std::string point;
    Dictionary attributes;
    Dictionary info;
    std::vector<Data> icons;
    /// Makes the program that a launched process runs; empty: one that takes everything and does nothing.
    std::function<std::shared_ptr<FakeExtensionProgram>()> program;
};

/// The extensions of a machine. Failing calls: "AppExtensions.match" (the lookup has an error), "AppExtension.begin" (the
/// extension can't be launched), "AppExtension.vendor" (its request has no auxiliary connection), "AppExtension.token".
/// Thread-safe.
class FakeAppExtensions final : public AppExtensions {
public:
    /// Makes the process of a launched extension, on the daemon's machine.
    using MakeProcess = std::function<std::unique_ptr<FakeIpc>(ProcessID)>;

    FakeAppExtensions(Scheduler& scheduler, FakeIpc& daemon, MakeProcess makeProcess, FaultPlan& faults);
    ~FakeAppExtensions() override;

    void setContextClass(ExtensionContextClass contextClass) override;
    void extensionsWithMatchingPoint(const std::string& extensionPointIdentifier, Matched handler) override;

    void install(FakeInstalledExtension extension);
    void uninstall(const BundleIdentifier& identifier);
    /// Which files are there for tokens. At first every path names one.
    void setFiles(std::function<bool(const std::string& path)> isFile);
    /// What the lookups asked for, oldest first.
    std::vector<std::string> lookups() const;
    /// The objects that lookups have answered with and somebody still holds, oldest first.
    std::vector<std::shared_ptr<FakeAppExtension>> extensions() const;

    struct Shared;

private:
    const std::shared_ptr<Shared> shared_;
    const std::shared_ptr<SerialQueue> lookupQueue_;
};

/// One extension object and its process.
class FakeAppExtension final : public AppExtension, public std::enable_shared_from_this<FakeAppExtension> {
public:
    struct Begun {
        ExtensionRequestID request;
        std::vector<ExtensionItem> items;
    };
    struct Token {
        std::string tokenClass, path, text;
    };

    FakeAppExtension(std::shared_ptr<FakeAppExtensions::Shared> shared, FakeInstalledExtension installed);
    ~FakeAppExtension() override;

    BundleIdentifier identifier() const override { return installed_.identifier; }
    std::string extensionPointIdentifier() const override { return installed_.point; }
    const Dictionary& attributes() const override { return installed_.attributes; }
    const Dictionary& infoDictionary() const override { return installed_.info; }
    std::vector<Data> icons() const override { return installed_.icons; }
    void setRequestCompletionHandler(RequestCompletionHandler handler) override;
    void beginExtensionRequestWithInputItems(std::vector<ExtensionItem> items, BeginHandler handler) override;
    std::shared_ptr<ExtensionContext> extensionContextForRequest(ExtensionRequestID request) override;
    std::optional<std::string> issueReadOnlyFileToken(std::string_view tokenClass, const std::string& path) override;
    void kill(int signal) override;

    /// The extension completes the request: the handler of that moment is called later, on the extension's lane.
    /// A second completion of a request is ignored; more items than the limits table allows are cut.
    void complete(ExtensionRequestID request, std::vector<ExtensionItem> returned);
    /// The extension gives the request up: nobody is told.
    void cancel(ExtensionRequestID request);
    /// The process ends by itself.
    void crash();
    bool isRunning() const;
    std::vector<Begun> begun() const;
    std::vector<Token> tokens() const;
    std::vector<int> signals() const;

private:
    struct Vendor;
    struct Process;
    std::shared_ptr<Process> launch();

    const std::shared_ptr<FakeAppExtensions::Shared> shared_;
    const FakeInstalledExtension installed_;
    const std::shared_ptr<SerialQueue> queue_;

    mutable std::mutex mutex_;
    RequestCompletionHandler completionHandler_;
    std::shared_ptr<Process> process_;
    std::map<ExtensionRequestID, std::shared_ptr<ExtensionContext>> contexts_;
    std::uint64_t lastRequest_ = 0;
    std::vector<Begun> begun_;
    std::vector<Token> tokens_;
    std::vector<int> signals_;
};

}  // namespace lumacast
