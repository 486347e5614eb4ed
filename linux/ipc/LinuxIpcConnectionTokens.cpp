// A connection's exchange of tokens for files: both ends of it.

#include <fcntl.h>

#include <cerrno>
#include <utility>

#include "base/Limits.h"
#include "linux/ipc/FileTokens.h"
#include "linux/ipc/LinuxIpcConnection.h"

namespace lumacast {

namespace {

OutgoingFrame tokenFrame(FrameHeader header, Bytes contents) {
    OutgoingFrame frame;
    frame.bytes.resize(kFrameHeaderBytes);
    writeFrameHeader(header, frame.bytes);
    frame.bytes.insert(frame.bytes.end(), contents.begin(), contents.end());
    return frame;
}

}  // namespace

void LinuxIpcConnection::keepTokens(TokenKeeper keeper) {
    const auto shared = std::make_shared<TokenKeeper>(std::move(keeper));
    const std::lock_guard lock(mutex_);
    tokenKeeper_ = shared;
}

void LinuxIpcConnection::exchangeToken(Bytes token, FileHandler handler) {
    int error = 0;
    if (token.empty() || token.size() > kMaximumTokenBytes) {
        error = EMSGSIZE;
    } else {
        FrameHeader header;
        header.kind = FrameKind::ExchangeToken;
        header.valueBytes = static_cast<std::uint32_t>(token.size());
        const std::lock_guard lock(mutex_);
        header.sequence = nextExchange_;
        OutgoingFrame frame = tokenFrame(header, token);
        if (state_ == State::Lost || !socket_) {
            error = EPIPE;
        } else if (exchanges_.size() >= limitOf(Limit::MessagesInFlight)) {
            error = EAGAIN;
        } else {
            const auto result = outgoing_.send(socket_.get(), frame);
            if (result == OutgoingQueue::Result::Full) error = ENOBUFS;
            if (result == OutgoingQueue::Result::Broken) error = EPIPE;
            if (result == OutgoingQueue::Result::Queued) waitForRoomLocked();
            if (error == 0) exchanges_.emplace(nextExchange_++, std::exchange(handler, nullptr));
        }
    }
    if (error != 0) failExchange(std::move(handler), error);
}

/// Later, on the reactor.
void LinuxIpcConnection::failExchange(FileHandler handler, int error) {
    core_->reactor.async(
        [handler = std::move(handler), error] { handler(Fd(), Error(std::string(kSystemErrorDomain), error)); });
}

const char* LinuxIpcConnection::receiveExchange(const IncomingFrames::Frame& frame) {
    std::shared_ptr<TokenKeeper> keeper;
    {
        const std::lock_guard lock(mutex_);
        keeper = tokenKeeper_;
    }
    if (!keeper || !*keeper) return "a token that nobody has issued";
    TokenAnswer answer = (*keeper)(frame.value);
    if (answer.isPeerRefused) return "too many tokens that were never issued";
    FrameHeader header;
    header.kind = FrameKind::TokenExchanged;
    header.sequence = frame.header.sequence;
    const bool hasFile = static_cast<bool>(answer.file);
    header.handles = hasFile ? 1 : 0;
    header.recordBytes = hasFile ? 1 : 0;
    header.message = hasFile ? 0 : static_cast<std::uint16_t>(answer.error != 0 ? answer.error : EACCES);
    OutgoingFrame sent = tokenFrame(header, hasFile ? Bytes(&kFileRecord, 1) : Bytes());
    if (hasFile) {
        sent.descriptors.push_back(answer.file.get());
        sent.own.push_back(std::move(answer.file));
    }
    sendOrLose(sent);
    return nullptr;
}

const char* LinuxIpcConnection::receiveExchanged(IncomingFrames::Frame& frame) {
    FileHandler handler;
    {
        const std::lock_guard lock(mutex_);
        const auto found = exchanges_.find(frame.header.sequence);
        if (found == exchanges_.end()) return "a file for no token";
        handler = std::move(found->second);
        exchanges_.erase(found);
    }
    if (frame.descriptors.size() == 1 && frame.records.size() == 1 && frame.records[0] == kFileRecord) {
        handler(std::move(frame.descriptors.front()), std::nullopt);
        return nullptr;
    }
    const bool isMalformed = !frame.descriptors.empty() || frame.header.message == 0;
    handler(Fd(), Error(std::string(kSystemErrorDomain), isMalformed ? EBADMSG : frame.header.message));
    return isMalformed ? "a malformed descriptor record" : nullptr;
}

void keepFileTokens(const std::shared_ptr<IpcConnection>& connection, TokenKeeper keeper) {
    if (const auto ours = std::dynamic_pointer_cast<LinuxIpcConnection>(connection))
        ours->keepTokens(std::move(keeper));
}

void exchangeFileToken(const std::shared_ptr<IpcConnection>& connection, Bytes token, FileHandler handler) {
    if (const auto ours = std::dynamic_pointer_cast<LinuxIpcConnection>(connection))
        return ours->exchangeToken(token, std::move(handler));
    handler(Fd(), Error(std::string(kSystemErrorDomain), EPIPE));
}

}  // namespace lumacast
