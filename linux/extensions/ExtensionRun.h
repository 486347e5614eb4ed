#pragma once
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <vector>

#include "linux/extensions/ExtensionProcess.h"
#include "linux/extensions/ExtensionServices.h"
#include "linux/extensions/FileTokens.h"
#include "linux/ipc/ExtensionRequests.h"

namespace lumacast {

/// The requests of one extension object and the process that serves them. Outlives the object as long as its process
/// has requests to complete.
///
/// What changes its process happens on the reactor; what is told is told on a queue of its own, on which handlers may
/// wait. Operations from any lane, none blocks (a token's file is asked for at most 100 ms).
class ExtensionRun final : public IpcExportedObject, public std::enable_shared_from_this<ExtensionRun> {
public:
    ExtensionRun(std::shared_ptr<ExtensionServices> services, std::shared_ptr<const InstalledExtension> installed);

    const InstalledExtension& installed() const { return *installed_; }
    void setCompletionHandler(AppExtension::RequestCompletionHandler handler);
    void begin(std::vector<ExtensionItem> items, AppExtension::BeginHandler handler);
    std::shared_ptr<ExtensionContext> context(ExtensionRequestID request);
    std::optional<std::string> issueToken(const std::string& path);
    void kill(int signal);
    /// The object has gone.
    void abandon();

    void receiveMessage(const std::shared_ptr<IpcConnection>& connection, std::uint16_t message, Array arguments,
                        IpcReply reply) override;

private:
    enum class Stage { Waiting, HandedOver, Taken };
    struct Request {
        Stage stage = Stage::Waiting;
        std::vector<ExtensionItem> items;
        AppExtension::BeginHandler handler;  ///< until it was called
        std::shared_ptr<ExtensionContext> context;
    };
    /// One process, from the decision to launch it until it is over.
    struct Session {
        std::shared_ptr<ExtensionProcess> process;  ///< null while its command is made
        std::shared_ptr<IpcConnection> requests, auxiliary;
    };

    // On the reactor.
    void proceed();
    void launch();
    void launched(const std::shared_ptr<Session>& session, std::optional<ConfinedCommand> command);
    void greeted(const std::shared_ptr<Session>& session, ExtensionProcess::Greeting requests,
                 ExtensionProcess::Greeting auxiliary);
    void handOver(ExtensionRequestID id);
    void taken(ExtensionRequestID id);
    void complete(ExtensionRequestID id, const Array& items);
    void cancel(ExtensionRequestID id, const Value& error);
    void endIfAbandoned();
    void letGo();

    /// The process is over or has to be: what it has not taken fails, what it has is never told.
    void over(const std::shared_ptr<Session>& session, int error);
    void fail(Request& request, int error);
    std::vector<ExtensionItem> itemsFrom(const Array& items);
    const std::string& name() const { return installed_->manifest.identifier; }

    const std::shared_ptr<ExtensionServices> services_;
    const std::shared_ptr<const InstalledExtension> installed_;
    const std::shared_ptr<SerialQueue> queue_;
    FileTokens tokens_;

    std::mutex mutex_;
    std::shared_ptr<AppExtension::RequestCompletionHandler> completionHandler_;
    std::map<ExtensionRequestID, Request> requests_;
    std::uint64_t lastRequest_ = 0;
    std::shared_ptr<Session> session_;
    bool isAbandoned_ = false;

    std::unique_ptr<Timer> end_;  ///< the reactor's own
};

}  // namespace lumacast
