#pragma once
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "base/Log.h"
#include "fuzz/Input.h"
#include "fuzz/Pieces.h"
#include "linux/extensions/FileTokens.h"
#include "linux/ipc/IncomingFrames.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"

namespace lumacast::fuzz {

/// A file that tokens are issued for. Goes with the process.
class TokenFiles final {
public:
    TokenFiles();
    ~TokenFiles();
    TokenFiles(const TokenFiles&) = delete;
    TokenFiles& operator=(const TokenFiles&) = delete;

    const std::string& directory() const { return directory_; }
    std::string file() const { return directory_ + "/clip.mp4"; }
    const std::shared_ptr<DiskLane>& disk() const { return disk_; }

private:
    std::string directory_;
    const std::shared_ptr<DiskLane> disk_ = std::make_shared<DiskLane>();
};

/// A connection and its peer, on one reactor and one thread, with a model of what must come of each step.
class Conversation final : public IpcExportedObject {
public:
    Conversation(Input script, const Wares& wares, const TokenFiles& files);
    Conversation(const Conversation&) = delete;
    Conversation& operator=(const Conversation&) = delete;
    ~Conversation() override;

    void run();

    void receiveMessage(const std::shared_ptr<IpcConnection>& connection, std::uint16_t message, Array arguments,
                        IpcReply reply) override;

private:
    /// A message or an exchange of ours, and how often each of its ends was told.
    struct Asked {
        bool wantsReply = false;
        int replies = 0, errors = 0;
    };
    struct Token {
        std::string text;
        bool isGood = true;
        std::optional<std::uint64_t> request;
    };
    using Numbers = std::set<std::uint64_t>;

    void turn();
    void step();
    void end();
    void readPeer();
    void takeFrame(const IncomingFrames::Frame& frame);
    void takeTokenAnswer(const IncomingFrames::Frame& frame);
    void check() const;
    void checkEnd() const;

    // What the peer does.
    void say(FrameHeader header, const Data& value, const Data& records = {}, std::vector<int> descriptors = {});
    void sendPlane();
    void giveBackPlane();
    void ask();
    void answer();
    void exchangeToken();
    void sendFile();
    void sendAnything();
    // What this end does.
    void lend();
    void askForFile();
    void changeTokens();
    void letGo();
    /// One of them, or any number.
    std::uint64_t numberFrom(const Numbers& numbers);
    void peerBroke(bool aRule) { mustBeRefused_ = mustBeRefused_ || aRule; }

    Input script_;
    const Wares& wares_;
    const TokenFiles& files_;
    Log log_;
    Reactor reactor_;
    LinuxIpc ipc_{reactor_, log_, {}};
    const std::shared_ptr<IpcExportedObject> self_{this, [](IpcExportedObject*) {}};
    std::shared_ptr<IpcConnection> connection_;
    Fd peer_;
    std::unique_ptr<Timer> turn_;
    int turns_ = 0, steps_ = 0, turnsAtEnd_ = 0;

    // The model.
    FileTokens tokens_;
    std::vector<Token> issued_;
    bool mustBeRefused_ = false;  ///< the peer has broken a rule
    bool isWild_ = false;         ///< it has said something that the model does not follow
    int losses_ = 0, wrongTokens_ = 0;
    const char* wrong_ = nullptr;  ///< what did not hold in a handler
    std::vector<std::shared_ptr<Asked>> asked_;
    std::vector<std::weak_ptr<SharedPlane>> lent_;
    std::vector<std::shared_ptr<SharedPlane>> held_;
    std::vector<IpcReply> replies_;

    // What the peer knows.
    IncomingFrames incoming_;
    std::uint64_t sequence_ = 0, lastSequenceSeen_ = 0, lastLease_ = 100, exchange_ = 0;
    Numbers leases_;                              ///< of planes that it has seen and not given back
    Numbers requests_;                            ///< that it has seen and not answered
    Numbers filesAskedFor_;                       ///< the same of exchanges
    Numbers ownRequests_;                         ///< that were not answered
    Numbers ownLeases_;                           ///< that were not given back
    std::map<std::uint64_t, bool> ownExchanges_;  ///< not answered: whether there must be a file
};

}  // namespace lumacast::fuzz
