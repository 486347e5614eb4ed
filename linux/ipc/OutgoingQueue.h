#pragma once
#include <cstdint>
#include <deque>
#include <memory>
#include <utility>
#include <vector>

#include "base/Value.h"
#include "linux/ipc/Fd.h"
#include "linux/ipc/IpcCore.h"
#include "platform/IpcConnection.h"

namespace lumacast {

/// One frame on its way out. Its descriptors go with its first byte.
struct OutgoingFrame {
    Data bytes;
    std::vector<int> descriptors;  ///< borrowed from what `keep` and `own` hold
    std::vector<Value> keep;
    std::vector<Fd> own;
    /// For a message without a reply: whom to tell when it waits and the connection is lost before it has gone.
    IpcConnection::ErrorHandler onLost;
    std::size_t written = 0;
};

/// What waits for a peer that reads slower than we write. Never blocks. Not thread-safe: the connection's lock guards
/// it.
class OutgoingQueue {
public:
    /// `budget`: where the bytes that wait are counted, if anywhere.
    explicit OutgoingQueue(std::shared_ptr<ByteBudget> budget) : budget_(std::move(budget)) {}
    OutgoingQueue(const OutgoingQueue&) = delete;
    OutgoingQueue& operator=(const OutgoingQueue&) = delete;
    ~OutgoingQueue() { takeAll(); }

    enum class Result {
        Sent,  ///< the kernel has it
        Queued,  ///< it waits for flush
        Full,  ///< not taken: too many bytes wait already
        Broken,  ///< not taken: nobody is at the other end
    };
    /// Sends at once when nothing waits, else queues. A frame that was not queued is left with the caller.
    Result send(int socket, OutgoingFrame& frame);

    enum class Flushed { All, Some, Broken };
    /// Sends a bounded part of what waits. Frames that have gone are moved to `done`, for the caller to release outside
    /// its lock.
    Flushed flush(int socket, std::vector<OutgoingFrame>& done);

    bool empty() const { return waiting_.empty(); }
    /// Takes what waits.
    std::deque<OutgoingFrame> takeAll();

private:
    bool hasRoomFor(const OutgoingFrame& frame);
    void sent(std::uint64_t bytes);

    const std::shared_ptr<ByteBudget> budget_;
    std::deque<OutgoingFrame> waiting_;
    std::uint64_t waitingBytes_ = 0;
};

}  // namespace lumacast
