#pragma once
// The library's side of the connection: its thread, and how it comes and goes.

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "base/Log.h"
#include "base/MessageTables.h"
#include "client/Answers.h"
#include "client/ClientMessages.h"
#include "client/Errors.h"
#include "client/PendingAnswers.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"

namespace lumacast::client {

/// Where a link stands; see Link.cpp for what leads from one to the next.
enum class LinkState {
    Away,       ///< the daemon isn't there; a timer tries again
    Busy,       ///< it is, but so many wait to be accepted that there is no place now; a timer tries again
    Reached,    ///< connected, but it has not answered yet
    Open,       ///< it has answered on this connection
    Dismissed,  ///< a daemon that lives has ended this connection; the next request connects again
    Closed,
};

/// A connection to the daemon that is made again when it is lost. Everything but the calls that are said to be callable
/// from any lane runs on the link's own thread, in a Reactor; nothing there blocks.
class Link final : public IpcExportedObject, public std::enable_shared_from_this<Link> {
public:
    using Answered = PendingAnswers::Answered;

    Link(Events events, const std::string& runtimeDirectory);
    Link(const Link&) = delete;
    Link& operator=(const Link&) = delete;

    /// Starts the thread and connects. Throws std::system_error when no thread can be had.
    void open();
    /// Ends the connection, answers what is pending and ends the thread, which it waits for unless it is called on it.
    /// No handler runs after it. Once, from any lane.
    void close();

    /// Sends a message without a reply; it is lost when there is no connection. From any lane.
    void send(DaemonMessage message, Array arguments);
    /// Sends a message that has a reply. `answered` is called once, later, on the link's thread. From any lane.
    void ask(DaemonMessage message, Array arguments, Answered answered);
    /// Whether the caller is a handler. From any lane.
    bool isOwnThread() const { return reactor_.isCurrent(); }

    void receiveMessage(const std::shared_ptr<IpcConnection>& connection, std::uint16_t message, Array arguments,
                        IpcReply reply) override;

private:
    using Clock = std::chrono::steady_clock;
    struct Request {
        DaemonMessage message;
        Array arguments;
        std::optional<std::uint64_t> question;  ///< none for a message without a reply
    };

    void onOwnThread(Task task);
    void request(Request request);
    void transmit(Request request);
    void failLater(std::uint64_t question, ConnectionError error);
    ConnectionError errorFor(const Error& error) const;

    void connect();
    void reached(LinuxIpc::Attempt attempt);
    void proved(std::uint64_t connection);
    void lost(std::uint64_t connection);
    void goAway();
    void tryAgainAfter(std::chrono::milliseconds delay);
    void tryAgain();
    void tellDisconnected();
    void shutDown();

    const Events events_;
    Log log_;
    Reactor reactor_;
    LinuxIpc ipc_;
    ClientMessages messages_{events_};
    PendingAnswers pending_;

    LinkState state_ = LinkState::Away;
    std::uint64_t connectionNumber_ = 0;  ///< of the connection that counts; what an older one reports is dropped
    std::shared_ptr<IpcConnection> connection_;
    Peer daemon_;                        ///< who listened when it was made
    std::vector<Request> held_;          ///< asked while the daemon was busy
    std::optional<bool> toldConnected_;  ///< the last of the two events
    bool wasOpen_ = false;               ///< whether the connection that was lost last had been
    int looks_ = 0;                      ///< how often the daemon was seen alive after that
    std::chrono::milliseconds delay_;
    Clock::time_point openSince_, busySince_;
    std::unique_ptr<Timer> timer_;
    std::thread thread_;
};

}  // namespace lumacast::client
