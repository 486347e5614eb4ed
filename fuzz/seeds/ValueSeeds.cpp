#include <stdexcept>

#include "base/Wire.h"
#include "fuzz/seeds/Seeds.h"

namespace lumacast::fuzz {

namespace {

/// A message without handles.
Data message(const Value& value) {
    WireBody body;
    if (!encode(value, body)) throw std::logic_error("a seed is over a limit");
    Data bytes{0, 0, 0};
    bytes.insert(bytes.end(), body.bytes.begin(), body.bytes.end());
    return bytes;
}

}  // namespace

void writeValueSeeds(const std::filesystem::path& corpora) {
    const auto write = [&](const char* name, const Data& bytes) { writeSeed(corpora, "values", name, bytes); };
    write("numbers", message(Array{true, false, std::int64_t{-2}, std::uint64_t{2}, 0.1, Date{-12.5}, Value()}));
    write("texts",
          message(Array{"sch\u00f6n \U0001F600", "", std::string("a\0b", 3), Data{0, 255}, URL("file:///a%20b")}));
    write("dictionary", message(Dictionary{{"z", 1}, {"a", Dictionary{{"", Array{}}}}, {"text", "ab"}}));
    write("error", message(Array{Error("domain", -5803, {{"LocalizedDescription", "why"}, {"k", Array{1}}})}));
    // Two endpoints and a plane, in the order of their numbers and twice the same.
    write("handles", Data{0, 4, 3, 9, 4, 0, 0, 0, 12, 0, 12, 1, 13, 2, 12, 0});
    Value deep(1);
    for (int i = 0; i < 16; ++i) deep = i % 2 ? Value(Array{deep}) : Value(Dictionary{{"d", deep}});
    write("deep", message(deep));
    // Recipes: a dictionary with many keys, many of one value, something as long as a message may be, handles.
    write("recipe-dictionary", Data{1, 10, 1, 2, 'k', 'k', 1, 1, 255, 200});
    write("recipe-many", Data{1, 13, 0, 255, 0x00, 0x40, 0});
    write("recipe-long", Data{1, 5, 255, 0x46, 0x00});
    write("recipe-handles", Data{1, 15, 5, 9, 0, 9, 1, 9, 0, 4, 1, 'a', 7, 1, 'b'});
    write("recipe-nested", Data{1, 12, 19, 17, 0, 1, 0, 1, 0, 1, 0, 1, 0, 1, 0, 1});
}

}  // namespace lumacast::fuzz
