// The library in clip mode, against a host in the test.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "broadcast/ConfigurationArchive.h"
#include "linux/ipc/LinuxKeyedArchive.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/extension/ListeningHandler.h"

namespace lumacast::test {
namespace {

using Answer = ExtensionRequestHostMessage;

/// Exchanges of tokens that the test makes good.
class Exchanges final {
public:
    struct Asked {
        std::string token;
        std::function<void(Fd)> exchanged;
    };
    extension::TokenExchange exchange() {
        return [this](const std::shared_ptr<IpcConnection>&, Data token, std::function<void(Fd)> exchanged) {
            asked.add({std::string(token.begin(), token.end()), std::move(exchanged)});
        };
    }
    Told<Asked> asked;
};

class Clips : public ::testing::Test {
protected:
    void SetUp() override { EXPECT_EQ(handler.next(), "connected"); }

    Fd movie(const std::string& text) {
        return Fd(::open(scratch.write("movie", text).c_str(), O_RDONLY | O_CLOEXEC));
    }
    /// The clip of a token that is exchanged at once.
    std::unique_ptr<extension::Clip> clip(std::int64_t request, const std::string& token, bool isLast = false,
                                          Value userInfo = {}) {
        host.beginClip(request, token, isLast, std::move(userInfo));
        auto asked = exchanges.asked.next();
        EXPECT_TRUE(asked && asked->token == token);
        if (asked) asked->exchanged(movie(token));
        auto clip = handler.clips.next();
        return clip ? std::move(*clip) : nullptr;
    }
    static std::string textOf(const Fd& file) {
        char bytes[64];
        const auto count = ::read(file.get(), bytes, sizeof bytes);
        return count > 0 ? std::string(bytes, static_cast<std::size_t>(count)) : std::string();
    }

    ScratchDirectory scratch;
    Exchanges exchanges;
    ListeningHandler handler;
    StandInHost host{handler, exchanges.exchange()};
};

TEST_F(Clips, AClipIsAMovieToReadAndWhatTheHostSaysOfIt) {
    const auto first = clip(7, "one", false, Dictionary{{"keep", std::int64_t{5}}});
    ASSERT_TRUE(first);
    EXPECT_EQ(host.taken.next(), 7);
    EXPECT_EQ(textOf(first->movie), "one");
    EXPECT_EQ(first->url, "file:///clips/one.mp4");
    EXPECT_EQ(first->number, 1u);
    EXPECT_EQ(first->userInfo, (Dictionary{{"keep", std::int64_t{5}}}));
    EXPECT_FALSE(first->isLast);
    const auto last = clip(8, "two", true);
    ASSERT_TRUE(last);
    EXPECT_EQ(last->number, 2u);
    EXPECT_FALSE(last->userInfo);
    EXPECT_TRUE(last->isLast);
}

TEST_F(Clips, ARequestIsCompletedWhenItsAnswerIsReleased) {
    auto first = clip(7, "one"), second = clip(8, "two");
    second.reset();
    auto answer = host.answers().next();
    ASSERT_TRUE(answer);
    EXPECT_EQ(answer->number, static_cast<std::uint16_t>(Answer::CompleteRequest));
    EXPECT_EQ(answer->arguments, (Array{Value(std::int64_t{8}), Value(Array{})}));
    EXPECT_TRUE(host.answers().isEmpty());
    first.reset();
    answer = host.answers().next();
    EXPECT_EQ(answer->arguments[0], Value(std::int64_t{7}));
}

TEST_F(Clips, AConfigurationAndServiceInfoAreReturned) {
    auto first = clip(7, "one");
    extension::BroadcastConfiguration wanted;
    wanted.clipDuration = 2.5;
    wanted.videoCompressionProperties = Dictionary{{"AverageBitRate", std::int64_t{900'000}}};
    EXPECT_TRUE(first->answer.setConfiguration(wanted));
    first->answer.setServiceInfo({{"viewURL", "https://example/live"}});
    first.reset();
    const auto answer = host.answers().next();
    ASSERT_TRUE(answer);
    const auto items = decodeItems(*answer->arguments[1].as<Array>());
    ASSERT_TRUE(items && items->size() == 2);
    EXPECT_EQ((*items)[0].attributedTitle, kItemBroadcastConfiguration);
    ASSERT_TRUE((*items)[0].attachments.at(0).hasItemConformingTo(kGenericDataType));
    LinuxKeyedArchive archives;
    const auto* archive = (*items)[0].attachments[0].item.as<Data>();
    ASSERT_TRUE(archive);
    const auto configuration = configurationIn(archives, *archive);
    ASSERT_TRUE(configuration);
    EXPECT_EQ(configuration->clipDuration, 2.5);
    EXPECT_EQ(configuration->videoCompressionProperties, wanted.videoCompressionProperties);
    EXPECT_EQ((*items)[1].attributedTitle, kItemServiceInfo);
    EXPECT_EQ((*items)[1].attachments.at(0).item, Value(Dictionary{{"viewURL", "https://example/live"}}));
}

TEST_F(Clips, AConfigurationThatCannotBeArchivedIsSaidToBeSo) {
    auto first = clip(7, "one");
    extension::BroadcastConfiguration wanted;
    wanted.videoCompressionProperties = Dictionary{{"Text", std::string(100'000, 'x')}};
    EXPECT_FALSE(first->answer.setConfiguration(wanted));
    first.reset();
    EXPECT_EQ(host.answers().next()->arguments[1], Value(Array{}));
}

TEST_F(Clips, AClipThatWasNotTakenIsCancelledWithItsError) {
    auto first = clip(7, "one");
    first->answer.setServiceInfo({{"never", "sent"}});
    first->answer.fail(Error("org.example", 3));
    first.reset();
    const auto answer = host.answers().next();
    ASSERT_TRUE(answer);
    EXPECT_EQ(answer->number, static_cast<std::uint16_t>(Answer::CancelRequest));
    EXPECT_EQ(answer->arguments[1].asError()->code(), 3);
}

TEST_F(Clips, MoviesThatComeInAnotherOrderAreHandedOverInTheRequests) {
    host.beginClip(1, "one", false);
    host.beginClip(2, "two", false);
    auto one = exchanges.asked.next(), two = exchanges.asked.next();
    ASSERT_TRUE(one && two);
    two->exchanged(movie("two"));
    EXPECT_TRUE(handler.clips.isEmpty());
    one->exchanged(movie("one"));
    EXPECT_EQ((*handler.clips.next())->url, "file:///clips/one.mp4");
    EXPECT_EQ((*handler.clips.next())->url, "file:///clips/two.mp4");
}

TEST_F(Clips, AClipWithoutAMovieIsMissedAndItsRequestCancelled) {
    host.beginClip(1, "one", true);
    exchanges.asked.next()->exchanged(Fd());
    EXPECT_EQ(handler.next(), "last clip missed");
    const auto answer = host.answers().next();
    ASSERT_TRUE(answer);
    EXPECT_EQ(answer->number, static_cast<std::uint16_t>(Answer::CancelRequest));
    EXPECT_EQ(answer->arguments[0], Value(std::int64_t{1}));
}

TEST_F(Clips, ARequestThatIsNoClipIsCancelledAndTheNextOneServed) {
    const auto good = StandInHost::clipItems("one", false);
    std::vector<std::vector<ExtensionItem>> wrong(6, good);
    wrong[0].erase(wrong[0].begin());                      // without the flag
    wrong[1][0].attachments[0].item = "yes";               // a flag that is none
    wrong[2][1].attachments[0].item = "a token as text";   // not the bytes of one
    wrong[3][2].attachments[0].item = std::int64_t{5};     // user info that is no dictionary
    wrong[4][3].attachments[0].item = {};                  // no file
    wrong[5][3].attachments[0].typeIdentifier = "public.movie";
    std::int64_t request = 10;
    for (const auto& items : wrong) host.begin(request++, items);
    host.begin(request++, Array{Value("no item")});
    for (std::int64_t number = 10; number < request; ++number) {
        const auto answer = host.answers().next();
        ASSERT_TRUE(answer);
        EXPECT_EQ(answer->number, static_cast<std::uint16_t>(Answer::CancelRequest)) << number;
        EXPECT_EQ(answer->arguments[0], Value(number));
    }
    EXPECT_TRUE(clip(99, "one"));
}

TEST_F(Clips, WithoutAnExchangeThereIsNoClipAfterTheHostHasGone) {
    host.beginClip(1, "one", false);
    auto asked = exchanges.asked.next();
    host.hangUp();
    EXPECT_EQ(handler.next(), "ended");
    EXPECT_EQ(host.status(), 0);
    asked->exchanged(movie("one"));
    EXPECT_TRUE(handler.clips.isEmpty());
}

TEST_F(Clips, ClipsThatHadComeAreToldBeforeTheEnd) {
    auto first = clip(1, "one");
    host.hangUp();
    EXPECT_EQ(handler.next(), "ended");
    EXPECT_EQ(textOf(first->movie), "one");
    first.reset();  // an answer that nobody hears
    EXPECT_EQ(host.status(), 0);
}

TEST(Extension, AClipsTokenIsExchangedOverTheConnectionItCameOver) {
    ScratchDirectory scratch;
    const std::string path = scratch.write("movie", "a movie");
    ListeningHandler handler;
    StandInHost host(handler);
    host.keepTokens([&](std::span<const std::uint8_t> token) {
        TokenAnswer answer;
        if (std::string(token.begin(), token.end()) == "good") answer.file = Fd(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
        return answer;
    });
    host.beginClip(1, "bad", false);
    host.beginClip(2, "good", true);
    EXPECT_EQ(handler.next(), "connected");
    EXPECT_EQ(handler.next(), "clip missed");
    const auto clip = handler.clips.next();
    ASSERT_TRUE(clip);
    EXPECT_EQ((*clip)->number, 2u);
    char bytes[16];
    EXPECT_EQ(::read((*clip)->movie.get(), bytes, sizeof bytes), 7);
}

}  // namespace
}  // namespace lumacast::test
