// The broadcast configuration and its archives.

#include <gtest/gtest.h>

#include "broadcast/ConfigurationArchive.h"
#include "session/LCSharedPlaneObject.h"
#include "tests/fakes/FakeKeyedArchive.h"
#include "tests/fakes/FakePlane.h"

namespace lumacast {
namespace {

class Configuration : public ::testing::Test {
protected:
    Data archive(const std::string& className, Dictionary fields) {
        return *archives_.archivedData({className, std::move(fields)});
    }
    std::optional<LCBroadcastConfiguration> decoded(Dictionary fields) {
        return configurationIn(archives_, archive("LCBroadcastConfiguration", std::move(fields)));
    }
    FakeKeyedArchive archives_;
};

TEST_F(Configuration, IsNoLengthAndNoPropertiesAtFirst) {
    EXPECT_EQ(LCBroadcastConfiguration().clipDuration, 0.0);
    EXPECT_FALSE(LCBroadcastConfiguration().videoCompressionProperties);
}

TEST_F(Configuration, ComesBackAsItWas) {
    const auto back = configurationIn(archives_, *archiveOf(archives_, {2.5, Dictionary{{"AverageBitRate", 800000}}}));
    ASSERT_TRUE(back);
    EXPECT_EQ(back->clipDuration, 2.5);
    EXPECT_EQ(back->videoCompressionProperties, (Dictionary{{"AverageBitRate", 800000}}));
}

TEST_F(Configuration, AnEmptyDictionaryIsLeftOutAndTheLengthAlwaysWritten) {
    DictionaryCoder coder;
    LCBroadcastConfiguration{0.0, Dictionary()}.encodeWithCoder(coder);
    EXPECT_EQ(coder.fields(), (Dictionary{{"clipDuration", 0.0}}));
    const auto back = configurationIn(archives_, *archiveOf(archives_, {1.0, Dictionary()}));
    ASSERT_TRUE(back);
    EXPECT_FALSE(back->videoCompressionProperties);
}

TEST_F(Configuration, WithoutALengthItIsZero) {
    const auto back = decoded({{"videoCompressionProperties", Dictionary{{"a", 1}}}});
    ASSERT_TRUE(back);
    EXPECT_EQ(back->clipDuration, 0.0);
    EXPECT_TRUE(back->videoCompressionProperties);
}

TEST_F(Configuration, AnyNumberObjectIsALength) {
    EXPECT_EQ(decoded({{"clipDuration", 3}})->clipDuration, 3.0);
    EXPECT_EQ(decoded({{"clipDuration", std::uint64_t{4}}})->clipDuration, 4.0);
}

TEST_F(Configuration, AnotherClassOfTheRootOrOfAMemberIsNone) {
    EXPECT_FALSE(configurationIn(archives_, archive("LCSharedPlaneObject", {{"clipDuration", 1.0}})));
    EXPECT_FALSE(configurationIn(archives_, Data{1, 2, 3}));
    EXPECT_FALSE(decoded({{"clipDuration", "5"}}));
    EXPECT_FALSE(decoded({{"clipDuration", 1.0}, {"videoCompressionProperties", Array{1}}}));
}

TEST(SharedPlaneObject, OnlyAConnectionsCoderCarriesItsPlane) {
    const auto plane = std::make_shared<FakePlane>(8, 4, 1, std::vector<PixelRect>{});
    const LCSharedPlaneObject object(plane);
    DictionaryCoder archive;
    object.encodeWithCoder(archive);
    EXPECT_TRUE(archive.fields().empty());
    IpcConnectionCoder wire;
    object.encodeWithCoder(wire);
    EXPECT_EQ(LCSharedPlaneObject::initWithCoder(wire).sharedPlane(), plane.get());
    EXPECT_EQ(LCSharedPlaneObject::initWithCoder(DictionaryCoder(wire.fields())).sharedPlane(), nullptr);
    EXPECT_EQ(LCSharedPlaneObject::initWithCoder(IpcConnectionCoder()).sharedPlane(), nullptr);
    IpcConnectionCoder empty;
    LCSharedPlaneObject().encodeWithCoder(empty);
    EXPECT_TRUE(empty.fields().empty());
}

TEST(SharedPlaneObject, HoldsOnePlaneAndLetsTheOldOneGo) {
    const auto first = std::make_shared<FakePlane>(8, 4, 1, std::vector<PixelRect>{});
    const auto second = std::make_shared<FakePlane>(8, 4, 2, std::vector<PixelRect>{});
    LCSharedPlaneObject object(first);
    EXPECT_EQ(first.use_count(), 2);
    object.setSharedPlane(first);
    EXPECT_EQ(first.use_count(), 2);
    object.setSharedPlane(second);
    EXPECT_EQ(first.use_count(), 1);
    object.setSharedPlane(nullptr);
    EXPECT_EQ(second.use_count(), 1);
    EXPECT_EQ(object.sharedPlane(), nullptr);
}

}  // namespace
}  // namespace lumacast
