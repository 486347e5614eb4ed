#include "base/Value.h"

#include <gtest/gtest.h>
#include "tests/unit/base/NamelessEndpoint.h"


namespace lumacast {
namespace {

TEST(Value, ItHoldsOneKindAndConvertsNothing) {
    const Value number(std::int32_t{5});
    EXPECT_TRUE(number.as<std::int64_t>());
    EXPECT_FALSE(number.as<std::uint64_t>());
    EXPECT_FALSE(number.as<double>());
    EXPECT_FALSE(number.as<bool>());
    EXPECT_TRUE(Value(std::uint32_t{5}).as<std::uint64_t>());
    EXPECT_TRUE(Value("text").as<std::string>()) << "a literal is text, not a truth";
    EXPECT_TRUE(Value(true).as<bool>());
    EXPECT_FALSE(Value(URL("a")).as<std::string>());
}

TEST(Value, NothingIsNull) {
    EXPECT_TRUE(Value().isNull());
    EXPECT_TRUE(Value(std::optional<std::string>()).isNull());
    EXPECT_TRUE(Value(Value::ErrorRef()).isNull());
    EXPECT_TRUE(Value(Value::EndpointRef()).isNull());
    EXPECT_TRUE(Value(Value::PlaneRef()).isNull());
    EXPECT_FALSE(Value(std::optional<bool>(false)).isNull());
    EXPECT_FALSE(Value("").isNull());
}

TEST(Value, EqualityIsDeep) {
    const auto make = [](double last) { return Value(Dictionary{{"k", Array{1, "x", Dictionary{{"z", last}}}}}); };
    EXPECT_EQ(make(1), make(1));
    EXPECT_FALSE(make(1) == make(2));
    EXPECT_FALSE(Value(std::int64_t{1}) == Value(std::uint64_t{1}));
    EXPECT_EQ(Value(Error("d", 1, {{"k", 1}})), Value(Error("d", 1, {{"k", 1}})));
    EXPECT_FALSE(Value(Error("d", 1)) == Value(Error("d", 2)));
    const auto endpoint = std::make_shared<NamelessEndpoint>();
    EXPECT_EQ(Value(Value::EndpointRef(endpoint)), Value(Value::EndpointRef(endpoint)));
    EXPECT_FALSE(Value(Value::EndpointRef(endpoint)) == Value(Value::EndpointRef(std::make_shared<NamelessEndpoint>())));
}

TEST(Dictionary, EntriesKeepTheirFirstOrderAndAReplacedOneItsPlace) {
    Dictionary dictionary{{"b", 1}, {"a", 2}, {"b", 3}};
    dictionary.set("c", 4);
    dictionary.set("a", 5);
    ASSERT_EQ(dictionary.size(), 3u);
    EXPECT_EQ(dictionary.entries()[0], (std::pair<std::string, Value>("b", 3)));
    EXPECT_EQ(dictionary.entries()[1], (std::pair<std::string, Value>("a", 5)));
    EXPECT_EQ(dictionary.entries()[2].first, "c");
    EXPECT_EQ(*dictionary.find("a"), Value(5));
    EXPECT_FALSE(dictionary.find("d"));
    EXPECT_TRUE(Dictionary().empty());
}

TEST(Dictionary, ANewEntryIsTheLast) {
    Dictionary dictionary{{"b", 1}};
    dictionary.addNew("a", 2);
    EXPECT_EQ(dictionary, (Dictionary{{"b", 1}, {"a", 2}}));
}

TEST(Error, ItsDescriptionIsInItsUserInfo) {
    EXPECT_FALSE(Error("domain", 1).localizedDescription());
    EXPECT_FALSE(Error("domain", 1, {{std::string(kLocalizedDescriptionKey), 5}}).localizedDescription());
    const Error error("domain", -5803, {{std::string(kLocalizedDescriptionKey), "text"}});
    ASSERT_TRUE(error.localizedDescription());
    EXPECT_EQ(*error.localizedDescription(), "text");
}

TEST(Value, DescriptionsAreForPeople) {
    EXPECT_EQ(describe(Value()), "(null)");
    EXPECT_EQ(describe(Value(Array{1, true, "x", 0.5, Data{1, 2}, URL("file:///a")})),
              "(1, 1, \"x\", 0.5, <2 bytes>, file:///a)");
    EXPECT_EQ(describe(Value(Dictionary{{"k", Value()}})), "{\"k\" = (null); }");
    EXPECT_EQ(describe(Error("d", -1, {{"k", 1}})), "Error d -1 {\"k\" = 1; }");
}

TEST(URL, AFileUrlHasAPathAndOthersHaveNone) {
    EXPECT_EQ(URL::file("/a/b c.mp4").text(), "file:///a/b c.mp4");
    EXPECT_EQ(URL::file("/a//b").path(), "/a//b");
    EXPECT_EQ(URL("https://example.org/x").path(), "");
    EXPECT_EQ(URL().path(), "");
    EXPECT_EQ(URL("file:///a%20b").path(), "/a%20b");
}

}  // namespace
}  // namespace lumacast
