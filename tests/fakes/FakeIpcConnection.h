#pragma once
// One end of a connection in memory.

#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <vector>

#include "base/Wire.h"
#include "platform/IpcConnection.h"
#include "tests/fakes/FakeIpc.h"

namespace lumacast {

/// What all ends in one process share.
struct FakeIpc::Process {
    Process(std::shared_ptr<FakeIpcMachine> itsMachine, std::shared_ptr<SerialQueue> mainQueue, ProcessID itsPid,
            FaultPlan& itsFaults, Log& itsLog)
        : machine(std::move(itsMachine)), queue(std::move(mainQueue)), pid(itsPid), faults(itsFaults), log(itsLog) {}

    const std::shared_ptr<FakeIpcMachine> machine;
    const std::shared_ptr<SerialQueue> queue;
    const ProcessID pid;
    FaultPlan& faults;
    Log& log;

    std::mutex mutex;
    bool alive = true;
    bool reading = true;
    std::map<std::pair<ProcessID, std::string>, Value> grants;
    std::map<ProcessID, UserID> users;
    std::vector<std::weak_ptr<FakeIpcConnection>> ends;
    std::set<std::shared_ptr<FakeIpcConnection>> accepted;  ///< owned until they are lost
    std::vector<std::weak_ptr<FakeListenerState>> listeners;

    bool isAlive() {
        const std::lock_guard lock(mutex);
        return alive;
    }
    bool isReading() {
        const std::lock_guard lock(mutex);
        return alive && reading;
    }
};

/// Where a listener and its endpoints meet.
struct FakeListenerState {
    std::shared_ptr<FakeIpc::Process> process;
    std::mutex mutex;
    bool closed = false;
    bool resumed = false;
    std::weak_ptr<IpcListener> listener;
    std::weak_ptr<IpcListenerDelegate> delegate;
    std::deque<std::shared_ptr<FakeIpcConnection>> waiting;
};

/// What travels from one end to the other. `End` comes last.
struct FakeFrame {
    enum class Kind { Message, Request, Reply, NoReply, End };
    Kind kind = Kind::End;
    std::uint16_t message = 0;
    std::uint64_t sequence = 0;
    int error = 0;  ///< for NoReply; 0 when the receiver deliberately gives none
    WireBody body;
};

class FakeIpcConnection final : public IpcConnection, public std::enable_shared_from_this<FakeIpcConnection> {
public:
    FakeIpcConnection(std::shared_ptr<FakeIpc::Process> process, ProcessID peerPid, bool isAccepted);
    ~FakeIpcConnection() override;

    /// Two ends of one connection.
    static void join(const std::shared_ptr<FakeIpcConnection>& a, const std::shared_ptr<FakeIpcConnection>& b);

    void setExportedInterface(const Protocol& interface) override;
    void setExportedObject(std::weak_ptr<IpcExportedObject> object) override;
    void setRemoteInterface(const Protocol& interface) override;
    void setInterruptionHandler(Handler handler) override;
    void setInvalidationHandler(Handler handler) override;
    void resume() override;
    void invalidate() override;
    ProcessID processIdentifier() const override { return peerPid_; }
    UserID userIdentifier() const override;
    std::optional<Value> valueForEntitlement(std::string_view name) override;
    std::unique_ptr<IpcRemoteProxy> remoteProxy(ErrorHandler errorHandler) override;

    /// Sends bytes as they are, declared or not, as a broken or malicious process would.
    void sendRaw(std::uint16_t message, Data bytes, bool asRequest);
    /// The process of this end has died.
    void processDied();
    /// The process reads again.
    void readOn();

private:
    class Proxy;
    class LentPlane;
    class Answer;
    struct Pending {
        const MessageDeclaration* declaration = nullptr;
        std::function<void(Array)> reply;
        ErrorHandler errorHandler;
    };
    using Leases = std::map<std::uint64_t, Value::PlaneRef>;

    void send(std::uint16_t message, Array arguments, std::function<void(Array)> reply, ErrorHandler errorHandler);
    int commit(FakeFrame& frame, Pending& pending);
    void reply(std::uint64_t sequence, const MessageDeclaration& declaration, Array values);
    void noteSecondAnswer();
    bool finishRequest();
    void giveNoReply(std::uint64_t sequence, int error);
    int pack(Array values, FakeFrame& frame);
    void fail(const ErrorHandler& errorHandler, int error);
    bool give(FakeFrame frame);
    bool receive(FakeFrame frame);
    void scheduleLocked();
    void deliverOne();
    void dispatch(FakeFrame frame);
    const char* dispatchMessage(FakeFrame& frame);
    const char* dispatchReply(FakeFrame& frame);
    void leaveUnanswered(ErrorHandler errorHandler);
    void drop(const char* reason);
    void lose(bool tellPeer);
    void deliverLoss();
    void giveBack(std::uint64_t lease);

    const std::shared_ptr<FakeIpc::Process> process_;
    const ProcessID peerPid_;
    const bool isAccepted_;

    mutable std::mutex mutex_;
    std::weak_ptr<FakeIpcConnection> peer_;
    const Protocol* exportedInterface_ = nullptr;
    const Protocol* remoteInterface_ = nullptr;
    std::weak_ptr<IpcExportedObject> exportedObject_;
    Handler interruptionHandler_, invalidationHandler_;
    bool joined_ = false;
    bool resumed_ = false;
    bool lost_ = false;
    std::deque<FakeFrame> incoming_;
    std::size_t incomingBytes_ = 0;
    std::uint64_t nextSequence_ = 1;
    std::uint64_t nextLease_ = 1;
    std::map<std::uint64_t, Pending> pending_;
    std::deque<ErrorHandler> unanswered_;  ///< of requests that will have no reply, oldest first
    std::uint64_t requestsToAnswer_ = 0;   ///< the peer's whose reply is neither given nor released
    Leases leases_;
};

}  // namespace lumacast
