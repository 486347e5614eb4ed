#pragma once
#include <atomic>
#include <cstdint>
#include <deque>
#include <memory>
#include <mutex>
#include <optional>
#include <unordered_map>
#include <utility>
#include <vector>

#include "linux/ipc/FileTokens.h"
#include "linux/ipc/Handles.h"
#include "linux/ipc/IncomingFrames.h"
#include "linux/ipc/IpcCore.h"
#include "linux/ipc/OutgoingQueue.h"
#include "linux/ipc/Peer.h"
#include "linux/ipc/Reactor.h"
#include "platform/IpcConnection.h"

namespace lumacast {

/// A connection over a Unix stream socket. Reads and delivers on the reactor; writes at once on whatever lane sends,
/// and leaves to the reactor only what the kernel does not take.
class LinuxIpcConnection final : public IpcConnection,
                                 public PlaneLender,
                                 public std::enable_shared_from_this<LinuxIpcConnection> {
public:
    /// Without a socket the connection is lost as soon as it is resumed. `seat`: an accepted connection's.
    LinuxIpcConnection(std::shared_ptr<IpcCore> core, Fd socket, Peer peer, std::optional<UserTable::Seat> seat);
    LinuxIpcConnection(const LinuxIpcConnection&) = delete;
    LinuxIpcConnection& operator=(const LinuxIpcConnection&) = delete;
    ~LinuxIpcConnection() override;

    void setExportedInterface(const Protocol& interface) override;
    void setExportedObject(std::weak_ptr<IpcExportedObject> object) override;
    void setRemoteInterface(const Protocol& interface) override;
    void setInterruptionHandler(Handler handler) override;
    void setInvalidationHandler(Handler handler) override;
    void resume() override;
    void invalidate() override;
    ProcessID processIdentifier() const override { return peer_.pid; }
    UserID userIdentifier() const override { return UserID{peer_.uid}; }
    std::optional<Value> valueForEntitlement(std::string_view name) override;
    std::unique_ptr<IpcRemoteProxy> remoteProxy(ErrorHandler errorHandler) override;

    void giveBack(std::uint64_t lease) override;

    /// Sends our hello. Each end does, before anything else.
    void sendHello();

    using Greeted = std::function<void(const std::shared_ptr<LinuxIpcConnection>&)>;
    /// An accepted connection waits for its peer's hello, for a limited time, and only then is shown to anybody:
    /// `greeted` is called on the reactor. A peer that says something else, or nothing, is dropped. On the reactor.
    void awaitHello(Greeted greeted);
    /// Reads the hello if it has come, as the reactor would in its next turn. On the reactor.
    void lookForHello();
    /// Counts as one of its user's open connections from now on. False when the user has too many.
    [[nodiscard]] bool takeItsPlace();

    using ReplyHandler = std::function<void(Array values)>;
    /// See IpcRemoteProxy::send.
    void send(std::uint16_t message, Array arguments, ReplyHandler reply, ErrorHandler errorHandler);
    /// Sends the reply of the request `sequence`. Callable from any lane.
    void reply(std::uint64_t sequence, const MessageDeclaration& declaration, Array values);
    /// The request `sequence` will have no reply. Callable from any lane.
    void leaveUnanswered(std::uint64_t sequence);

    /// See keepFileTokens and exchangeFileToken.
    void keepTokens(TokenKeeper keeper);
    void exchangeToken(Bytes token, FileHandler handler);

private:
    struct PendingReply {
        const MessageDeclaration* declaration;
        ReplyHandler reply;
        ErrorHandler errorHandler;
    };
    enum class State { Suspended, Open, Lost };

    // The way out (any lane; LinuxIpcConnectionSend.cpp).
    int commit(EncodedFrame& encoded, PendingReply& pending);
    void sendOrLose(OutgoingFrame& frame);
    void sendTransport(FrameKind kind, std::uint64_t sequence, std::uint16_t number);
    void flush();
    void sayNoMoreLocked();
    void waitForRoomLocked();
    void fail(const ErrorHandler& errorHandler, int error);
    void failExchange(FileHandler handler, int error);

    // The way in (the reactor; LinuxIpcConnectionReceive.cpp).
    Reactor::Again turn(std::uint32_t events);
    bool readHello();
    Reactor::Again readFrames();
    void dispatch(IncomingFrames::Frame& frame);
    const char* receiveMessage(IncomingFrames::Frame& frame);
    const char* receiveReply(IncomingFrames::Frame& frame);
    const char* receivePlaneReturned(const FrameHeader& header);
    const char* receiveNoReply(const FrameHeader& header);
    const char* receiveExchange(const IncomingFrames::Frame& frame);
    const char* receiveExchanged(IncomingFrames::Frame& frame);
    bool finishRequest();
    bool startWatching();
    [[nodiscard]] bool hold(std::uint64_t bytes);

    // The end.
    bool isLost();
    void drop(std::string_view reason);
    void lose();
    void deliverLoss();

    const std::shared_ptr<IpcCore> core_;
    const Peer peer_;
    const std::shared_ptr<ByteBudget> budget_;  ///< of the peer's user; null where nobody counts
    std::atomic<std::uint64_t> nextLease_{1};

    std::mutex mutex_;
    State state_ = State::Suspended;
    Fd socket_;  ///< closed on the reactor only, or in the destructor
    std::unique_ptr<Reactor::Watch> watch_;
    std::optional<UserTable::Seat> seat_;
    const Protocol* exportedInterface_ = nullptr;
    const Protocol* remoteInterface_ = nullptr;
    std::weak_ptr<IpcExportedObject> exportedObject_;
    Handler interruptionHandler_;
    Handler invalidationHandler_;
    OutgoingQueue outgoing_;
    std::uint64_t nextSequence_ = 1;
    std::unordered_map<std::uint64_t, PendingReply> pending_;
    std::deque<ErrorHandler> unanswered_;  ///< of requests without a reply, oldest first; to be told of the loss
    std::unordered_map<std::uint64_t, std::shared_ptr<SharedPlane>> leases_;
    std::shared_ptr<TokenKeeper> tokenKeeper_;
    std::unordered_map<std::uint64_t, FileHandler> exchanges_;  ///< that wait for their answer
    std::uint64_t nextExchange_ = 1;
    std::uint64_t requestsToAnswer_ = 0;  ///< the peer's whose reply is neither given nor released

    // The reactor's own.
    IncomingFrames incoming_;
    Data hello_;
    bool isGreeted_ = false;
    bool hasFramesLeft_ = false;
    std::uint64_t heldBytes_ = 0;  ///< of an unfinished message, as counted in the budget
    Greeted greeted_;
    std::unique_ptr<Timer> helloTimer_;
    std::uint64_t lastSequence_ = 0;
};

}  // namespace lumacast
