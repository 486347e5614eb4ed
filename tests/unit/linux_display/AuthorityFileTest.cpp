#include "linux/display/AuthorityFile.h"

#include <gtest/gtest.h>

namespace lumacast::x11 {
namespace {

using Bytes = std::vector<std::uint8_t>;

void addText(Bytes& file, std::string_view text) {
    file.push_back(static_cast<std::uint8_t>(text.size() >> 8));
    file.push_back(static_cast<std::uint8_t>(text.size()));
    file.insert(file.end(), text.begin(), text.end());
}

void addEntry(Bytes& file, int family, std::string_view host, std::string_view number, std::string_view method,
              std::string_view secret) {
    file.push_back(static_cast<std::uint8_t>(family >> 8));
    file.push_back(static_cast<std::uint8_t>(family));
    for (const std::string_view text : {host, number, method, secret}) addText(file, text);
}

constexpr std::string_view kCookie = "MIT-MAGIC-COOKIE-1";

AuthorityKey key(std::string_view secret) { return {std::string(kCookie), {secret.begin(), secret.end()}}; }

TEST(AuthorityFile, FindsTheKeyOfThisMachinesDisplay) {
    Bytes file;
    addEntry(file, 0, "\x7f\0\0\1", "0", kCookie, "over the network");
    addEntry(file, 256, "other", "0", kCookie, "another machine");
    addEntry(file, 256, "here", "1", kCookie, "another display");
    addEntry(file, 256, "here", "0", "XDM-AUTHORIZATION-1", "another method");
    addEntry(file, 256, "here", "0", kCookie, "the one");
    EXPECT_EQ(findKey(file, "here", "0"), key("the one"));
    EXPECT_EQ(findKey(file, "here", "1"), key("another display"));
    EXPECT_EQ(findKey(file, "here", "2"), std::nullopt);
}

TEST(AuthorityFile, TakesEntriesForAnyMachineAndAnyDisplay) {
    Bytes file;
    addEntry(file, 65535, "whatever", "", kCookie, "wild");
    EXPECT_EQ(findKey(file, "here", "7"), key("wild"));
}

TEST(AuthorityFile, StopsAtABrokenEntryWhereverItBreaks) {
    Bytes file;
    addEntry(file, 256, "here", "0", kCookie, "the one");
    for (std::size_t length = 0; length < file.size(); ++length)
        EXPECT_EQ(findKey(Bytes(file.begin(), file.begin() + static_cast<std::ptrdiff_t>(length)), "here", "0"),
                  std::nullopt);
    Bytes lying{1, 0, 0xff, 0xff, 'h'};
    EXPECT_EQ(findKey(lying, "here", "0"), std::nullopt);
}

}  // namespace
}  // namespace lumacast::x11
