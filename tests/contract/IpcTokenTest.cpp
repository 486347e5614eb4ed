// Tokens exchanged for files over a connection: the transport's part of it, between two ends and with a peer that
// speaks bytes.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include "linux/ipc/FileTokens.h"
#include "tests/contract/IpcHostileWorld.h"

namespace lumacast {
namespace {

Bytes bytesOf(std::string_view text) {
    return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

class IpcTokenTest : public IpcHostileTest {
protected:
    struct Exchanged {
        int error = -1;  ///< -1: not yet
        bool hasFile = false;
        std::string contents;
        bool isClosedOnExec = false;
    };

    /// The daemon's end of the newest connection keeps the token "good" for a file that holds "contents".
    void keep() {
        const auto connection = delegate->accepted.get().back().lock();
        ASSERT_TRUE(connection);
        keepFileTokens(connection, [this](Bytes token) {
            TokenAnswer answer;
            asked.change([&](auto& all) { all.emplace_back(token.begin(), token.end()); });
            if (std::string_view(reinterpret_cast<const char*>(token.data()), token.size()) != "good") {
                answer.error = EACCES;
                answer.isPeerRefused = asked.get().size() > 3;
                return answer;
            }
            answer.file = Fd(memfd_create("file", MFD_CLOEXEC));
            EXPECT_EQ(::pwrite(answer.file.get(), "contents", 8, 0), 8);
            return answer;
        });
    }
    Exchanged exchange(const std::shared_ptr<IpcConnection>& connection, std::string_view token) {
        Shared<Exchanged> result;
        exchangeFileToken(connection, bytesOf(token), [&](Fd file, std::optional<Error> error) {
            Exchanged exchanged;
            exchanged.error = error ? static_cast<int>(error->code()) : 0;
            exchanged.hasFile = static_cast<bool>(file);
            char text[64] = {};
            if (file && ::pread(file.get(), text, sizeof text - 1, 0) >= 0) exchanged.contents = text;
            exchanged.isClosedOnExec = file && (::fcntl(file.get(), F_GETFD) & FD_CLOEXEC) != 0;
            result.set(exchanged);
        });
        EXPECT_TRUE(until([&] { return result.get().error >= 0; }));
        return result.get();
    }
    static Data tokenFrame(FrameKind kind, std::string_view token, std::uint64_t sequence, std::uint16_t message = 0,
                           std::uint8_t handles = 0, std::string_view records = {}) {
        FrameHeader header = messageHeader(kind, message, sequence, handles);
        return rawFrame(header, Data(token.begin(), token.end()), Data(records.begin(), records.end()));
    }

    Shared<std::vector<std::string>> asked;
};

TEST_F(IpcTokenTest, AGoodTokenBringsTheFileAndOthersAnError) {
    ASSERT_TRUE(isServed());
    keep();
    const Exchanged good = exchange(friendly, "good");
    EXPECT_EQ(good.error, 0);
    EXPECT_EQ(good.contents, "contents");
    EXPECT_TRUE(good.isClosedOnExec);
    const Exchanged bad = exchange(friendly, "bad");
    EXPECT_EQ(bad.error, EACCES);
    EXPECT_FALSE(bad.hasFile);
    EXPECT_EQ(exchange(friendly, "good").contents, "contents") << "the connection goes on";
    EXPECT_TRUE(isServed());
}

TEST_F(IpcTokenTest, ATokenThatCanBeNoneIsNotSent) {
    ASSERT_TRUE(isServed());
    keep();
    EXPECT_EQ(exchange(friendly, "").error, EMSGSIZE);
    EXPECT_EQ(exchange(friendly, std::string(kMaximumTokenBytes + 1, 'x')).error, EMSGSIZE);
    EXPECT_EQ(exchange(friendly, std::string(kMaximumTokenBytes, 'x')).error, EACCES) << "the longest is asked for";
    EXPECT_EQ(asked.get().size(), 1u);
}

TEST_F(IpcTokenTest, WhoIsAskedForTokensWithoutKeepingAnyDropsTheAsker) {
    ASSERT_TRUE(isServed());
    RawPeer peer(path());
    peer.hello();
    peer.send(tokenFrame(FrameKind::ExchangeToken, "good", 1));
    expectDropped(peer, "a token that nobody has issued");
}

TEST_F(IpcTokenTest, WhoGuessesIsDroppedAndItsOthersAreAnswered) {
    ASSERT_TRUE(isServed());
    keep();
    Shared<std::vector<int>> errors;
    for (int i = 0; i < 8; ++i)
        exchangeFileToken(friendly, bytesOf("bad"), [&](Fd, std::optional<Error> error) {
            errors.change([&](auto& all) { all.push_back(error ? static_cast<int>(error->code()) : 0); });
        });
    ASSERT_TRUE(until([&] { return errors.get().size() == 8; })) << "every exchange ends";
    EXPECT_THAT(errors.get(), ::testing::Each(::testing::AnyOf(EACCES, EPIPE)));
    EXPECT_LE(asked.get().size(), 4u) << "nothing is looked up for it after that";
    EXPECT_EQ(exchange(friendly, "good").error, EPIPE);
}

TEST_F(IpcTokenTest, MalformedFramesDropTheirSender) {
    ASSERT_TRUE(isServed());
    const std::pair<Data, const char*> cases[] = {
        {tokenFrame(FrameKind::ExchangeToken, "", 1), "a token that can be none"},
        {tokenFrame(FrameKind::ExchangeToken, std::string(kMaximumTokenBytes + 1, 'x'), 1), "a token that can be none"},
        {tokenFrame(FrameKind::ExchangeToken, "good", 1, 5), "a token that can be none"},
        {tokenFrame(FrameKind::TokenExchanged, "", 1, EACCES), "a file for no token"},
        {tokenFrame(FrameKind::TokenExchanged, "", 1, 0), "a token frame with other contents"},
        {tokenFrame(FrameKind::TokenExchanged, "x", 1, EACCES), "a token frame with other contents"},
        {tokenFrame(static_cast<FrameKind>(8), "", 1), "unknown kind"},
    };
    std::size_t lines = 0;
    for (const auto& [frame, reason] : cases) {
        RawPeer peer(path());
        peer.hello();
        peer.send(frame);
        expectDropped(peer, reason, lines++);
    }
}

TEST_F(IpcTokenTest, DescriptorsThatNobodyAskedForAreClosed) {
    ASSERT_TRUE(isServed());
    RawPeer peer(path());
    peer.hello();
    const Fd file(memfd_create("file", MFD_CLOEXEC));
    peer.send(tokenFrame(FrameKind::TokenExchanged, "", 1, 0, 1, "\3"), {file.get()});
    expectDropped(peer, "a file for no token");
    RawPeer other(path());
    other.hello();
    other.send(tokenFrame(FrameKind::ExchangeToken, "good", 1, 0, 1, "\3"), {file.get()});
    expectDropped(other, "a token that can be none", 1);
}

}  // namespace
}  // namespace lumacast
