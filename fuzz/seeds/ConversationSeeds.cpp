#include "fuzz/seeds/Seeds.h"

namespace lumacast::fuzz {

namespace {

// The steps of a script, see the target.
constexpr std::uint8_t kLend = 0, kGiveBack = 1, kSendPlane = 2, kLetGo = 3, kTokens = 4, kExchange = 5,
                       kAskForFile = 6, kSendFile = 7, kAsk = 8, kAnswer = 9, kAnything = 10;
constexpr std::uint8_t kIssue = 0, kHandOver = 2, kEndRequest = 3, kEndAll = 4;
constexpr std::uint8_t kWrongOne = 200;

class Script {
public:
    Script& step(std::uint8_t what, const Data& arguments = {}) {
        bytes_.push_back(what);
        bytes_.insert(bytes_.end(), arguments.begin(), arguments.end());
        return *this;
    }
    Script& token(std::uint8_t request) { return step(kTokens, {request, kIssue}).step(kTokens, {request, kHandOver}); }
    Script& exchange(std::uint8_t token, std::uint8_t change = 0) { return step(kExchange, {token, change}); }
    const Data& bytes() const { return bytes_; }

private:
    Data bytes_;
};

}  // namespace

void writeConversationSeeds(const std::filesystem::path& corpora) {
    const auto write = [&](const char* name, const Script& script) {
        writeSeed(corpora, "connections", name, script.bytes());
    };
    write("lend", Script().step(kLend, {0}).step(kLend, {1}).step(kGiveBack, {0}).step(kGiveBack, {0}));
    write("lend-too-many",
          Script().step(kLend, {0}).step(kLend, {0}).step(kLend, {1}).step(kLend, {0}).step(kLend, {0}));
    write(
        "lend-and-ask",
        Script().step(kLend, {2}).step(kAnswer, {0, 1}).step(kGiveBack, {0}).step(kLend, {3}).step(kAnswer, {0, 0, 0}));
    write("give-back-twice", Script().step(kLend, {0}).step(kGiveBack, {0}).step(kGiveBack, {201}));
    write("answer-of-another-type", Script().step(kLend, {2}).step(kAnswer, {0, 3}));
    write("plane", Script()
                       .step(kSendPlane, {0x44, 0, 1, 0})
                       .step(kSendPlane, {0x88, 0, 0, 0})
                       .step(kLetGo, {0})
                       .step(kLetGo, {0}));
    write("plane-too-large", Script().step(kSendPlane, {0xff, 0, 0, 7, 0, 4, 0, 0}));
    write("plane-in-memory-that-can-shrink", Script().step(kSendPlane, {0x44, 201, 0, 0}));
    write("ask", Script()
                     .step(kAsk, {0, 3, 1, 2, 3})
                     .step(kAsk, {0, 0})
                     .step(kAsk, {0, 0})
                     .step(kLetGo, {1})
                     .step(kLetGo, {101})
                     .step(kLetGo, {201}));
    write("token", Script().token(1).exchange(0).exchange(0));
    write("token-not-handed-over", Script().step(kTokens, {1, kIssue}).exchange(0));
    write("token-of-a-request-that-is-over",
          Script().token(1).token(2).step(kTokens, {1, kEndRequest}).exchange(0).exchange(1));
    write("token-of-a-process-that-is-over", Script().token(1).step(kTokens, {1, kEndAll}).exchange(0));
    Script guesses;
    guesses.token(1);
    for (std::uint8_t i = 0; i < 7; ++i) guesses.exchange(0, kWrongOne + i);
    write("token-guessed", guesses.exchange(0, kWrongOne));
    write("token-too-long", Script().step(kExchange, Data(231, 232)));
    write("file",
          Script().step(kAskForFile, {64}).step(kSendFile, {0, 1}).step(kAskForFile, {9}).step(kSendFile, {0, 52}));
    write("file-with-another-record", Script().step(kAskForFile, {64}).step(kSendFile, {0, 201}));
    write("file-for-nothing", Script().step(kSendFile, {0, 1}));
    write("file-for-a-long-token", Script().step(kAskForFile, {129}).step(kAskForFile, {0}));
    write("lost-with-everything-open", Script()
                                           .step(kLend, {2})
                                           .step(kAskForFile, {8})
                                           .step(kSendPlane, {0x22, 0, 0, 0})
                                           .step(kAsk, {0, 1, 7})
                                           .token(1));
    write("anything", Script()
                          .step(kLend, {0})
                          .step(kAnything, {4, 1, 0, 0, 0, 0, 0, 0})
                          .step(kAnything, {7, 1, 0, 0, 0, 1, 4, 0, 1, 3})
                          .step(kAnything, {0, 0, 0, 0, 255, 0, 3, 1, 2, 3, 0}));
}

}  // namespace lumacast::fuzz
