// The role KeyedArchive: objects as bytes.

#include <gtest/gtest.h>

#include <functional>
#include <limits>
#include <memory>

#include "base/Limits.h"
#include "linux/ipc/LinuxKeyedArchive.h"
#include "platform/IpcEndpoint.h"
#include "tests/contract/IpcWorld.h"
#include "tests/fakes/FakeKeyedArchive.h"
#include "writer/media/PixelBuffer.h"

namespace lumacast {
namespace {

class SomeEndpoint final : public IpcEndpoint {};

Value nestedArrays(std::uint64_t depth) {
    Value value(1);
    for (std::uint64_t i = 0; i < depth; ++i) value = Value(Array{value});
    return value;
}

using Maker = std::function<std::unique_ptr<KeyedArchive>()>;

class KeyedArchiveContract : public ::testing::TestWithParam<Maker> {
protected:
    std::unique_ptr<KeyedArchive> archive_ = GetParam()();
    KeyedArchive& archive() { return *archive_; }
    bool isArchived(Dictionary fields) { return archive().archivedData({"Class", std::move(fields)}).has_value(); }
};

TEST_P(KeyedArchiveContract, AnObjectComesBackAsItWasArchived) {
    const ArchivedObject object{
        "Configuration",
        {{"number", 5.25},
         {"smallest", std::numeric_limits<std::int64_t>::min()},
         {"largest", std::numeric_limits<std::uint64_t>::max()},
         {"yes", true},
         {"text", "sch\u00f6n"},
         {"bytes", Data{0, 1, 255}},
         {"date", Date{12.5}},
         {"place", URL("file:///a%20b")},
         {"nothing", Value()},
         {"settings",
          Dictionary{{"AverageBitRate", 1'000'000}, {"Profile", "High"}, {"list", Array{1, "x", Array{}}}}}}};
    const auto data = archive().archivedData(object);
    ASSERT_TRUE(data);
    const auto back = archive().unarchivedRoot(*data, "Configuration");
    ASSERT_TRUE(back);
    EXPECT_EQ(back->className, "Configuration");
    EXPECT_EQ(Value(back->fields), Value(object.fields));
}

TEST_P(KeyedArchiveContract, AnObjectWithoutFieldsIsOneToo) {
    const auto data = archive().archivedData({"Empty", {}});
    ASSERT_TRUE(data);
    const auto back = archive().unarchivedRoot(*data, "Empty");
    ASSERT_TRUE(back);
    EXPECT_TRUE(back->fields.empty());
}

TEST_P(KeyedArchiveContract, TwoArchivesAreApart) {
    const auto one = archive().archivedData({"Class", {{"n", 1}}}),
               other = archive().archivedData({"Class", {{"n", 2}}});
    ASSERT_TRUE(one && other);
    EXPECT_EQ(Value(archive().unarchivedRoot(*one, "Class")->fields), Value(Dictionary{{"n", 1}}));
    EXPECT_EQ(Value(archive().unarchivedRoot(*other, "Class")->fields), Value(Dictionary{{"n", 2}}));
}

TEST_P(KeyedArchiveContract, AnObjectOfAnotherClassIsNotGivenOut) {
    const auto data = archive().archivedData({"Class", {{"n", 1}}});
    ASSERT_TRUE(data);
    for (const char* other : {"", "Clas", "Classy", "class", "Other"})
        EXPECT_FALSE(archive().unarchivedRoot(*data, other)) << other;
    EXPECT_TRUE(archive().unarchivedRoot(*data, "Class"));
}

TEST_P(KeyedArchiveContract, WhatIsNoArchiveIsNone) {
    EXPECT_FALSE(archive().unarchivedRoot({}, "Class"));
    EXPECT_FALSE(archive().unarchivedRoot({1, 2, 3}, "Class"));
    const auto data = archive().archivedData({"Class", {{"n", 1}, {"text", "some"}}});
    ASSERT_TRUE(data);
    for (std::size_t length = 0; length < data->size(); ++length)
        EXPECT_FALSE(archive().unarchivedRoot(Data(data->begin(), data->begin() + static_cast<long>(length)), "Class"))
            << "cut after " << length;
    Data longer = *data;
    longer.push_back(0);
    EXPECT_FALSE(archive().unarchivedRoot(longer, "Class"));
    Data spoilt = *data;
    spoilt.front() ^= 1;
    EXPECT_FALSE(archive().unarchivedRoot(spoilt, "Class"));
}

TEST_P(KeyedArchiveContract, HandlesAndErrorsAreNotArchived) {
    const Value handles[]{Value(Value::EndpointRef(std::make_shared<SomeEndpoint>())),
                          Value(Value::PlaneRef(std::make_shared<PlainPlane>(4, 4))), Value(Error("domain", 1))};
    for (const Value& handle : handles) {
        EXPECT_FALSE(isArchived({{"k", handle}}));
        EXPECT_FALSE(isArchived({{"k", Array{1, handle}}}));
        EXPECT_FALSE(isArchived({{"k", Dictionary{{"inner", handle}}}}));
    }
    EXPECT_TRUE(isArchived({{"k", 1}}));
}

INSTANTIATE_TEST_SUITE_P(Fake, KeyedArchiveContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeKeyedArchive>(); })));
INSTANTIATE_TEST_SUITE_P(Port, KeyedArchiveContract,
                         ::testing::Values(Maker([] { return std::make_unique<LinuxKeyedArchive>(); })));

/// Every limit that archives keep: one overflow for each row of the table. A new row without its case does not compile.
class ArchiveLimitTest : public ::testing::TestWithParam<std::tuple<LimitRow, Maker>> {
protected:
    static bool isArchived(KeyedArchive& archive, Dictionary fields) {
        const auto data = archive.archivedData({"Class", std::move(fields)});
        return data && archive.unarchivedRoot(*data, "Class");
    }
};

TEST_P(ArchiveLimitTest, IsKept) {
    const Limit limit = std::get<0>(GetParam()).limit;
    const std::uint64_t most = limitOf(limit);
    const auto archive = std::get<1>(GetParam())();
    switch (limit) {
        case Limit::ArchiveBytes: {
            EXPECT_TRUE(isArchived(*archive, {{"k", Data(most - 512)}}));
            EXPECT_FALSE(isArchived(*archive, {{"k", Data(most)}}));
            Data tooLong = archive->archivedData({"Class", {{"k", Data(most - 512)}}}).value_or(Data());
            tooLong.resize(most + 1);
            EXPECT_FALSE(archive->unarchivedRoot(tooLong, "Class"));
            return;
        }
        case Limit::ArchiveDepth:
            // The fields are the first dictionary.
            EXPECT_TRUE(isArchived(*archive, {{"k", nestedArrays(most - 1)}}));
            EXPECT_FALSE(isArchived(*archive, {{"k", nestedArrays(most)}}));
            return;
        case Limit::MessageBytes:
        case Limit::MessageDepth:
        case Limit::HandlesPerMessage:
        case Limit::ConnectionsPerUser:
        case Limit::MessagesInFlight:
        case Limit::QueuedBytesPerReader:
        case Limit::ContextIdentifiersPerRequest:
        case Limit::HelloBytes:
        case Limit::PlanesLeased:
        case Limit::MessageValues:
        case Limit::HeldBytesPerUser:
        case Limit::ConnectionsBeforeHello:
        case Limit::RequestsWithoutReply:
        case Limit::StartsWaitingForUser:
        case Limit::StartsOfApplicationWaitingForUser:
        case Limit::ExtensionsInstalled:
        case Limit::ExtensionItemsReturned:
        case Limit::ExtensionRequestsInFlight:
        case Limit::FramesAtExtension: FAIL() << "not kept by archives";
    }
    FAIL() << "no overflow for this limit";
}

std::vector<LimitRow> limitsOfArchives() {
    std::vector<LimitRow> rows(kLimits.begin(), kLimits.end());
    std::erase_if(rows, [](const LimitRow& row) { return row.keeper != LimitKeeper::Archives; });
    return rows;
}

INSTANTIATE_TEST_SUITE_P(
    Row, ArchiveLimitTest,
    ::testing::Combine(::testing::ValuesIn(limitsOfArchives()),
                       ::testing::Values(Maker([] { return std::make_unique<FakeKeyedArchive>(); }),
                                         Maker([] { return std::make_unique<LinuxKeyedArchive>(); }))));

/// What only the port's bytes can be: made by hand.
TEST(LinuxKeyedArchive, ObjectsInsideOthersAreNotThere) {
    LinuxKeyedArchive archive;
    // An object inside another is a dictionary like any other: it comes back as one, never as an object.
    const Dictionary inner{{"class", "Evil"}, {"fields", Dictionary{{"n", 1}}}};
    const auto data = archive.archivedData({"Class", {{"inner", inner}}});
    ASSERT_TRUE(data);
    EXPECT_FALSE(archive.unarchivedRoot(*data, "Evil"));
    const auto back = archive.unarchivedRoot(*data, "Class");
    ASSERT_TRUE(back);
    EXPECT_EQ(*back->fields.find("inner"), Value(inner));
}

}  // namespace
}  // namespace lumacast
