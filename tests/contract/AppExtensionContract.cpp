// The roles AppExtensions and AppExtension: what the daemon may count on, whoever launches the programs.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>

#include <chrono>
#include <thread>

#include "base/Limits.h"
#include "tests/contract/ExtensionTools.h"
#include "tests/contract/ExtensionsWorld.h"

namespace lumacast {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class AppExtensionContract : public ::testing::TestWithParam<ExtensionsWorldMaker> {
protected:
    std::unique_ptr<ExtensionsWorld> world_ = GetParam()();
    ExtensionsWorld& world() { return *world_; }
    std::vector<std::shared_ptr<AppExtension>> find(const std::string& point = "org.example.point") {
        return findExtensions(*world_, point).found;
    }
    std::shared_ptr<AppExtension> installed(const std::string& identifier = "org.example.Upload") {
        world_->install({identifier});
        const auto found = find();
        return found.empty() ? nullptr : found.front();
    }
};

TEST_P(AppExtensionContract, ALookupFindsTheExtensionsOfItsPointInTheSameOrderEachTime) {
    for (const char* identifier : {"org.example.a", "org.example.b", "org.example.c"}) world().install({identifier});
    world().install({"org.example.other", "org.example.other-point"});
    for (int i = 0; i < 3; ++i) {
        std::vector<std::string> identifiers;
        for (const auto& extension : find()) {
            identifiers.push_back(extension->identifier().text());
            EXPECT_EQ(extension->extensionPointIdentifier(), "org.example.point");
        }
        EXPECT_THAT(identifiers, ElementsAre("org.example.a", "org.example.b", "org.example.c"));
    }
    EXPECT_EQ(find("org.example.other-point").size(), 1u);
    EXPECT_THAT(find("org.example"), IsEmpty()) << "a point is no prefix";
}

TEST_P(AppExtensionContract, AnExtensionAnswersWhatItsEntrySays) {
    ExtensionToInstall extension{"org.example.Upload"};
    extension.activationRule = Value(Dictionary{{"Streaming", true}, {"Other", false}});
    extension.processMode = "LCBroadcastProcessModeSampleBuffer";
    extension.name = "Upload";
    extension.germanName = "Hochladen";
    extension.icons = {pngOf(1), pngOf(2)};
    world().install(extension);
    const auto found = find();
    ASSERT_EQ(found.size(), 1u);
    const Value* rule = found[0]->attributes().find(kExtensionActivationRule);
    ASSERT_TRUE(rule);
    EXPECT_EQ(*rule, *extension.activationRule);
    const Value* own = found[0]->infoDictionary().find(kExtensionDictionary);
    ASSERT_TRUE(own && own->as<Dictionary>());
    const Value* mode = own->as<Dictionary>()->find("LCBroadcastProcessMode");
    ASSERT_TRUE(mode);
    EXPECT_EQ(*mode, Value("LCBroadcastProcessModeSampleBuffer"));
    const Value* name = found[0]->infoDictionary().find(kExtensionDisplayName);
    ASSERT_TRUE(name);
    EXPECT_EQ(*name, Value("Hochladen")) << "the user reads German";
    EXPECT_EQ(found[0]->icons(), extension.icons);
}

TEST_P(AppExtensionContract, WhatAnEntryDoesNotSayIsNotThere) {
    const auto extension = installed();
    ASSERT_TRUE(extension);
    EXPECT_EQ(extension->attributes().find(kExtensionActivationRule), nullptr);
    const Value* own = extension->infoDictionary().find(kExtensionDictionary);
    EXPECT_TRUE(!own || !own->as<Dictionary>()->find("LCBroadcastProcessMode"));
    EXPECT_THAT(extension->icons(), IsEmpty());
}

TEST_P(AppExtensionContract, EachLookupAnswersNewObjects) {
    world().install({"org.example.Upload"});
    const auto first = find(), second = find();
    ASSERT_EQ(first.size(), 1u);
    ASSERT_EQ(second.size(), 1u);
    EXPECT_NE(first[0], second[0]);
}

TEST_P(AppExtensionContract, WhatIsInstalledAndRemovedLaterIsSeen) {
    EXPECT_THAT(find(), IsEmpty());
    world().install({"org.example.Upload"});
    EXPECT_EQ(find().size(), 1u);
    world().uninstall("org.example.Upload");
    EXPECT_THAT(find(), IsEmpty());
}

TEST_P(AppExtensionContract, ALookupThatFailsAnswersItsErrorAndNoExtension) {
    world().install({"org.example.Upload"});
    world().breakLookups();
    const auto lookup = findExtensions(world(), "org.example.point");
    EXPECT_TRUE(lookup.error);
    EXPECT_THAT(lookup.found, IsEmpty());
}

TEST_P(AppExtensionContract, ARequestIsBegunAndCompletedWithWhatTheExtensionReturns) {
    const auto extension = installed();
    ASSERT_TRUE(extension);
    Completions completions(*extension);
    const auto begun = begin(*extension, "echo", {textItem("a title", "a text")});
    ASSERT_TRUE(begun.request) << (begun.error ? describe(*begun.error) : "");
    ASSERT_TRUE(eventually([&] { return completions.count() == 1; }));
    const auto completed = completions.get().front();
    EXPECT_EQ(completed.request, *begun.request);
    ASSERT_EQ(completed.items.size(), 1u);
    EXPECT_EQ(completed.items[0].attributedTitle, "a title");
    EXPECT_EQ(textOf(completed.items[0]), "a text");
}

TEST_P(AppExtensionContract, HandlersComeOnALaneOfTheExtensionsOwnAndMayWait) {
    const auto extension = installed();
    ASSERT_TRUE(extension);
    // As the daemon does it: the begin handler waits until the endpoint has been taken.
    const std::shared_ptr<Semaphore> isSet = world().scheduler().semaphore(0);
    const auto endpoint = world().listenForPing();
    std::atomic<bool> hasReturned{false}, wasInline{false}, wasOnRequestLane{false}, hadAuxiliary{false}, isDone{false};
    extension->beginExtensionRequestWithInputItems(
        {ExtensionItem{}}, [&, raw = extension.get()](std::optional<ExtensionRequestID> request, std::optional<Error>) {
            wasInline = !hasReturned;
            wasOnRequestLane = world().isOnRequestLane();
            const auto context = request ? raw->extensionContextForRequest(*request) : nullptr;
            const auto auxiliary = context ? context->auxiliaryConnection() : nullptr;
            hadAuxiliary = auxiliary != nullptr;
            if (auxiliary) {
                auxiliary->remoteProxy({})->send(static_cast<std::uint16_t>(ExtensionVendorMessage::SetEndpoint),
                                                 {Value(endpoint)}, [isSet](Array) { isSet->signal(); });
                isSet->wait();
            }
            isDone = true;
        });
    hasReturned = true;
    ASSERT_TRUE(eventually([&] { return isDone.load(); }));
    EXPECT_FALSE(wasInline && wasOnRequestLane);
    EXPECT_FALSE(wasOnRequestLane);
    EXPECT_TRUE(hadAuxiliary);
    EXPECT_TRUE(eventually([&] { return world().wasPinged(); }))
        << "the extension reaches the daemon through the endpoint";
}

TEST_P(AppExtensionContract, TheCompletionSlotHoldsTheNewestHandlerForOlderRequestsToo) {
    const auto extension = installed();
    ASSERT_TRUE(extension);
    std::atomic<int> first{0}, second{0};
    extension->setRequestCompletionHandler([&](auto, auto) { ++first; });
    ASSERT_TRUE(begin(*extension, "hold").request);
    extension->setRequestCompletionHandler([&](auto, auto) { ++second; });
    ASSERT_TRUE(begin(*extension, "release").request);
    ASSERT_TRUE(eventually([&] { return second == 1; }));
    EXPECT_EQ(first, 0);
}

TEST_P(AppExtensionContract, ARequestIsCompletedOnce) {
    const auto extension = installed();
    ASSERT_TRUE(extension);
    Completions completions(*extension);
    ASSERT_TRUE(begin(*extension, "twice").request);
    // Whatever came of the second has come when a later one is through.
    ASSERT_TRUE(begin(*extension, "echo", {textItem("later", "")}).request);
    ASSERT_TRUE(eventually([&] { return completions.hasTitle("later"); }));
    EXPECT_EQ(completions.count(), 2u);
    EXPECT_TRUE(completions.hasTitle("first"));
    EXPECT_FALSE(completions.hasTitle("second"));
}

TEST_P(AppExtensionContract, ARequestThatIsGivenUpIsNotTold) {
    const auto extension = installed();
    ASSERT_TRUE(extension);
    Completions completions(*extension);
    ASSERT_TRUE(begin(*extension, "cancel").request);
    ASSERT_TRUE(begin(*extension, "echo", {textItem("later", "")}).request);
    ASSERT_TRUE(eventually([&] { return completions.hasTitle("later"); }));
    EXPECT_EQ(completions.count(), 1u);
}

TEST_P(AppExtensionContract, ARequestHasItsContextUntilItIsOver) {
    const auto extension = installed();
    ASSERT_TRUE(extension);
    Completions completions(*extension);
    EXPECT_EQ(extension->extensionContextForRequest(ExtensionRequestID{1000}), nullptr);
    const auto held = begin(*extension, "hold"), other = begin(*extension, "hold");
    ASSERT_TRUE(held.request && other.request);
    EXPECT_NE(*held.request, *other.request);
    EXPECT_TRUE(extension->extensionContextForRequest(*held.request));
    ASSERT_TRUE(begin(*extension, "release").request);
    ASSERT_TRUE(eventually([&] { return completions.count() == 2; }));
    EXPECT_EQ(extension->extensionContextForRequest(*held.request), nullptr);
}

TEST_P(AppExtensionContract, AnExtensionThatDiesIsNotToldOfAndTheNextRequestLaunchesItAnew) {
    const auto extension = installed();
    ASSERT_TRUE(extension);
    Completions completions(*extension);
    const auto held = begin(*extension, "hold");
    ASSERT_TRUE(held.request);
    const std::size_t before = world().processCount();
    static_cast<void>(begin(*extension, "leave"));
    ASSERT_TRUE(eventually([&] { return world().processCount() == before - 1; }));
    ASSERT_TRUE(eventually([&] { return !extension->extensionContextForRequest(*held.request); }));
    const auto again = begin(*extension, "echo", {textItem("again", "")});
    ASSERT_TRUE(again.request) << (again.error ? describe(*again.error) : "");
    ASSERT_TRUE(eventually([&] { return completions.hasTitle("again"); }));
    EXPECT_EQ(completions.count(), 1u) << "what it has left is not told";
}

TEST_P(AppExtensionContract, AKilledExtensionEndsAndTheNextRequestLaunchesItAnew) {
    const auto extension = installed();
    ASSERT_TRUE(extension);
    extension->kill(SIGKILL);  // none is running
    Completions completions(*extension);
    const std::size_t before = world().processCount();
    ASSERT_TRUE(begin(*extension, "hold").request);
    EXPECT_EQ(world().processCount(), before + 1);
    extension->kill(SIGKILL);
    ASSERT_TRUE(eventually([&] { return world().processCount() == before; }));
    ASSERT_TRUE(begin(*extension, "echo", {textItem("again", "")}).request);
    ASSERT_TRUE(eventually([&] { return completions.hasTitle("again"); }));
    EXPECT_EQ(completions.count(), 1u);
}

TEST_P(AppExtensionContract, TwoObjectsHaveTwoProcesses) {
    world().install({"org.example.Upload"});
    const auto one = find(), other = find();
    ASSERT_TRUE(one.size() == 1 && other.size() == 1);
    const std::size_t before = world().processCount();
    ASSERT_TRUE(begin(*one[0], "hold").request);
    ASSERT_TRUE(begin(*other[0], "hold").request);
    ASSERT_TRUE(begin(*one[0], "hold").request) << "one process serves all requests of an object";
    EXPECT_EQ(world().processCount(), before + 2);
    one[0]->kill(SIGKILL);
    ASSERT_TRUE(eventually([&] { return world().processCount() == before + 1; }));
    EXPECT_TRUE(begin(*other[0], "hold").request);
}

TEST_P(AppExtensionContract, AnExtensionThatCantBeLaunchedIsAnError) {
    ExtensionToInstall extension{"org.example.Upload"};
    extension.canBeLaunched = false;
    world().install(extension);
    const auto found = find();
    ASSERT_EQ(found.size(), 1u);
    const auto begun = begin(*found[0], "echo");
    EXPECT_FALSE(begun.request);
    EXPECT_TRUE(begun.error);
}

TEST_P(AppExtensionContract, NoMoreRequestsAreBegunThanTheLimitAllows) {
    const auto extension = installed();
    ASSERT_TRUE(extension);
    Completions completions(*extension);
    const std::uint64_t limit = limitOf(Limit::ExtensionRequestsInFlight);
    for (std::uint64_t i = 0; i + 1 < limit; ++i) ASSERT_TRUE(begin(*extension, "hold").request) << i;
    ASSERT_TRUE(begin(*extension, "echo").request) << "the limit itself is fine";
    ASSERT_TRUE(eventually([&] { return completions.count() == 1; }));
    ASSERT_TRUE(begin(*extension, "hold").request) << "what is completed makes room";
    const auto excess = begin(*extension, "echo");
    EXPECT_FALSE(excess.request);
    EXPECT_TRUE(excess.error);
}

TEST_P(AppExtensionContract, NoMoreItemsAreReturnedThanTheLimitAllows) {
    const auto extension = installed();
    ASSERT_TRUE(extension);
    Completions completions(*extension);
    const std::uint64_t limit = limitOf(Limit::ExtensionItemsReturned);
    for (const std::uint64_t count : {limit, limit + 1}) {
        ASSERT_TRUE(begin(*extension, "many", {textItem("count", std::to_string(count))}).request);
        ASSERT_TRUE(eventually([&] { return completions.count() == 1; }));
        const auto items = completions.take().front().items;
        ASSERT_EQ(items.size(), limit);
        EXPECT_EQ(textOf(items.back()), std::to_string(limit - 1)) << "the first ones";
    }
}

TEST_P(AppExtensionContract, WhatAnObjectHadBegunIsCompletedAfterItHasGone) {
    auto extension = installed();
    ASSERT_TRUE(extension);
    const std::size_t before = world().processCount();
    Completions completions(*extension);
    extension->beginExtensionRequestWithInputItems({textItem("command", "echo"), textItem("last", "")},
                                                   [](auto, auto) {});
    extension.reset();
    ASSERT_TRUE(eventually([&] { return completions.hasTitle("last"); }));
    EXPECT_TRUE(eventually([&] { return world().processCount() == before; })) << "then its process ends";
}

TEST_P(AppExtensionContract, ATokenIsIssuedForAFileThatIsThere) {
    const auto extension = installed();
    ASSERT_TRUE(extension);
    const std::string path = world().makeFile("clip.mp4", "a clip");
    const auto one = extension->issueReadOnlyFileToken("a.class", path),
               other = extension->issueReadOnlyFileToken("a.class", path);
    ASSERT_TRUE(one && other);
    EXPECT_FALSE(one->empty());
    EXPECT_NE(*one, *other);
    EXPECT_FALSE(extension->issueReadOnlyFileToken("a.class", path + ".not-there"));
    EXPECT_FALSE(extension->issueReadOnlyFileToken("a.class", world().directory()));
    EXPECT_FALSE(extension->issueReadOnlyFileToken("a.class", "/etc/passwd"));
    EXPECT_FALSE(extension->issueReadOnlyFileToken("a.class", ""));
}

INSTANTIATE_TEST_SUITE_P(Fake, AppExtensionContract, ::testing::Values(&fakeExtensionsWorld));
INSTANTIATE_TEST_SUITE_P(Port, AppExtensionContract, ::testing::Values(&portExtensionsWorld));

}  // namespace
}  // namespace lumacast
