#include "fuzz/Conversation.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <filesystem>
#include <fstream>
#include <stdexcept>

#include "base/Limits.h"
#include "fuzz/Property.h"

namespace lumacast::fuzz {

namespace {

/// What one step does, and what comes of that, is over after so many turns of the loop.
constexpr int kTurnsPerStep = 4;
constexpr int kMostSteps = 48;
constexpr int kMostTurnsAtEnd = 100'000;

using A = ArgumentType;
constexpr std::array kPlane{A::SharedPlaneObject};
constexpr std::array kAny{A::Any};
constexpr std::array kBool{A::Bool};
constexpr std::array kMessages{MessageDeclaration{"lend:", kPlane},
                               MessageDeclaration{"lendAndAsk:", kPlane, Reply::Expected, kBool},
                               MessageDeclaration{"ask:", kAny, Reply::Expected, kAny}};
constexpr Protocol kProtocol{"Conversation", kMessages};

}  // namespace

TokenFiles::TokenFiles() {
    std::string pattern = std::filesystem::temp_directory_path() / "lumacast-fuzz-XXXXXX";
    if (!::mkdtemp(pattern.data())) throw std::runtime_error("no folder can be made");
    directory_ = pattern;
    std::ofstream(file()) << "clip";
}

TokenFiles::~TokenFiles() {
    std::error_code ignored;
    std::filesystem::remove_all(directory_, ignored);
}

Conversation::Conversation(Input script, const Wares& wares, const TokenFiles& files)
    : script_(script), wares_(wares), files_(files), tokens_(files.directory(), files.disk()) {
    std::array<int, 2> pair{};
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, pair.data()) != 0)
        throw std::runtime_error("no sockets can be made");
    peer_ = Fd(pair[1]);
    connection_ = ipc_.adopt(Fd(pair[0]), Peer());
    connection_->setExportedInterface(kProtocol);
    connection_->setRemoteInterface(kProtocol);
    connection_->setExportedObject(self_);
    connection_->setInvalidationHandler([this] { ++losses_; });
    keepFileTokens(connection_, [this](Bytes token) { return tokens_.exchange(token); });
    connection_->resume();
    Data hello(kHelloBytes);
    const bool isThere = ::recv(peer_.get(), hello.data(), hello.size(), 0) == static_cast<ssize_t>(hello.size());
    require(isThere && hello == makeHello(), "a connection begins with its hello");
    if (!sendTo(peer_.get(), hello, {})) throw std::runtime_error("no hello can be sent");
}

Conversation::~Conversation() = default;

void Conversation::run() {
    turn();
    reactor_.run();
    checkEnd();
}

void Conversation::turn() {
    // A timer that is due comes once a turn; a task could come again in the same one.
    if (++turns_ % kTurnsPerStep == 0) {
        readPeer();
        check();
        if (turnsAtEnd_ == 0 && steps_++ < kMostSteps && !script_.isAtEnd() && losses_ == 0)
            step();
        else
            end();
    }
    turn_ = reactor_.after(std::chrono::nanoseconds(0), [this] { turn(); });
}

void Conversation::end() {
    if (turnsAtEnd_++ == 0) {
        if (script_.flag())
            connection_->invalidate();
        else if (losses_ == 0)
            ::shutdown(peer_.get(), SHUT_RDWR);
    }
    if (turnsAtEnd_ > kMostTurnsAtEnd) throw BrokenProperty("a connection that ends is over soon");
    if (losses_ == 0 || turnsAtEnd_ < 3) return;
    held_.clear();
    replies_.clear();
    reactor_.requestStop();
}

void Conversation::receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t message, Array arguments,
                                  IpcReply reply) {
    if (const auto* plane = arguments[0].as<Value::PlaneRef>()) {
        const SharedPlane& picture = **plane;
        if (picture.pixels().size() < picture.stride() * static_cast<std::size_t>(picture.height()))
            wrong_ = "a plane's pixels are all there";
        held_.push_back(*plane);
    }
    if (static_cast<bool>(reply) != (kMessages[message].reply == Reply::Expected)) wrong_ = "a request can be answered";
    if (reply) replies_.push_back(std::move(reply));
}

void Conversation::readPeer() {
    std::array<std::uint8_t, 65'536> scratch;
    while (incoming_.receive(peer_.get(), scratch) == IncomingFrames::Received::Bytes) {
        for (;;) {
            IncomingFrames::Frame frame;
            const char* reason = nullptr;
            const auto next = incoming_.next(frame, reason);
            require(next != IncomingFrames::Next::Malformed, "what a connection sends is well-formed");
            if (next == IncomingFrames::Next::Incomplete) break;
            takeFrame(frame);
        }
        incoming_.endTurn();
    }
}

void Conversation::takeFrame(const IncomingFrames::Frame& frame) {
    const FrameHeader& header = frame.header;
    switch (header.kind) {
        case FrameKind::Message:
        case FrameKind::Request: {
            require(header.sequence == ++lastSequenceSeen_, "messages are numbered");
            if (header.kind == FrameKind::Request) requests_.insert(header.sequence);
            const auto records = readRecords(frame.records, header.handles);
            require(records.has_value(), "descriptors have good records");
            for (std::size_t i = 0; i < records->size(); ++i) {
                const auto* plane = std::get_if<PlaneRecord>(&(*records)[i]);
                if (!plane) continue;
                require(leases_.insert(plane->lease).second, "no plane is lent twice under one lease");
                require((::fcntl(frame.descriptors[i].get(), F_GET_SEALS) & F_SEAL_SHRINK) != 0,
                        "lent memory can't shrink");
            }
            require(isWild_ || leases_.size() <= limitOf(Limit::PlanesLeased), "so many planes are lent at a time");
            break;
        }
        case FrameKind::Reply:
        case FrameKind::NoReply:
            require(ownRequests_.erase(header.sequence) == 1 || isWild_, "a request is answered once");
            break;
        case FrameKind::PlaneReturned:
            require(ownLeases_.erase(header.sequence) == 1 || isWild_, "a plane is given back once");
            break;
        case FrameKind::ExchangeToken:
            require(filesAskedFor_.insert(header.sequence).second, "exchanges are numbered");
            break;
        case FrameKind::TokenExchanged: takeTokenAnswer(frame); break;
    }
}

void Conversation::takeTokenAnswer(const IncomingFrames::Frame& frame) {
    const bool hasFile = frame.header.handles == 1;
    if (hasFile) {
        const int file = frame.descriptors.front().get();
        std::array<char, 8> contents{};
        require((::fcntl(file, F_GETFL) & O_ACCMODE) == O_RDONLY, "a file is handed out to be read");
        require(::pread(file, contents.data(), contents.size(), 0) == 4, "it is the file the token was issued for");
    }
    const auto expected = ownExchanges_.find(frame.header.sequence);
    if (expected == ownExchanges_.end()) return require(isWild_, "an exchange is answered once");
    require(expected->second == hasFile || isWild_, "a token is good once, while its request goes on");
    ownExchanges_.erase(expected);
}

void Conversation::check() const {
    if (wrong_) throw BrokenProperty(wrong_);
    require(losses_ <= 1, "a loss is told once");
    for (const auto& asked : asked_) {
        require(asked->replies + asked->errors <= 1, "what was asked ends once");
        require(asked->replies == 0 || asked->wantsReply, "only what wants a reply gets one");
    }
    if (turnsAtEnd_ > 0 || isWild_) return;
    require((losses_ == 1) == mustBeRefused_, "a peer that breaks the rules is dropped, and no other");
    if (losses_ == 1) return;
    const auto alive = std::count_if(lent_.begin(), lent_.end(), [](const auto& plane) { return !plane.expired(); });
    require(static_cast<std::size_t>(alive) == leases_.size(), "a plane is kept as long as it is lent, and no longer");
    require(ownLeases_.size() == held_.size(), "a plane that nobody holds was given back");
    require(ownRequests_.size() == replies_.size(), "every request is answered when it is decided");
    require(ownExchanges_.empty(), "every exchange is answered");
}

void Conversation::checkEnd() const {
    check();
    require(losses_ == 1, "a loss is told");
    for (const auto& asked : asked_)
        require(!asked->wantsReply || asked->replies + asked->errors == 1, "whoever waits is told in the end");
    require(std::all_of(lent_.begin(), lent_.end(), [](const auto& plane) { return plane.expired(); }),
            "what was lent is back when the peer has gone");
}

}  // namespace lumacast::fuzz
