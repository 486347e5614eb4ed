#include "client/lumacastctl/broadcast/ExtensionsCommand.h"

#include <gtest/gtest.h>

#include "client/lumacastctl/record/RecordCommand.h"

namespace lumacast::ctl {
namespace {

TEST(Extensions, AreATableOfIdentifiersAndNames) {
    const client::BroadcastExtensionsAnswer answer{
        {{"HLS clips", BundleIdentifier("org.example.hls"), Data{1}}, {"\x1b[31mRed", BundleIdentifier("org.x"), {}}},
        std::nullopt};
    EXPECT_EQ(extensionsText(answer),
              "IDENTIFIER       NAME\n"
              "org.example.hls  HLS clips\n"
              "org.x            ?[31mRed\n");
    EXPECT_EQ(extensionsJson(answer),
              "{\"extensions\":[{\"displayName\":\"HLS clips\",\"iconBytes\":1,\"identifier\":\"org.example.hls\"},"
              "{\"displayName\":\"\\u001b[31mRed\",\"iconBytes\":0,\"identifier\":\"org.x\"}]}\n");
}

TEST(Extensions, WithoutOneTheTextSaysWhereTheyGo) {
    EXPECT_NE(extensionsText({}).find("lumacast/extensions"), std::string::npos);
    EXPECT_EQ(extensionsJson({}), "{\"extensions\":[]}\n");
}

TEST(Extensions, AViewURLIsWhatTheServiceInformationSays) {
    EXPECT_EQ(viewURLIn(Dictionary{{"viewURL", "https://example.org/live"}}), "https://example.org/live");
    EXPECT_EQ(viewURLIn(Dictionary{{"viewURL", URL("https://example.org/live")}}), "https://example.org/live");
    EXPECT_EQ(viewURLIn(Dictionary{{"viewURL", 7}}), "");
    EXPECT_EQ(viewURLIn(Value("https://example.org")), "");
}

}  // namespace
}  // namespace lumacast::ctl
