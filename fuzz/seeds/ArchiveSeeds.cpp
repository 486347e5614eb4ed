#include <stdexcept>

#include "base/Wire.h"
#include "broadcast/ConfigurationArchive.h"
#include "fuzz/seeds/Seeds.h"
#include "linux/ipc/LinuxKeyedArchive.h"

namespace lumacast::fuzz {

namespace {

Data archived(const ArchivedObject& object) {
    LinuxKeyedArchive archives;
    const auto archive = archives.archivedData(object);
    if (!archive) throw std::logic_error("a seed is over a limit");
    return *archive;
}

Data configuration(const LCBroadcastConfiguration& configuration) {
    DictionaryCoder coder;
    configuration.encodeWithCoder(coder);
    return archived({std::string(LCBroadcastConfiguration::kClassName), coder.fields()});
}

}  // namespace

void writeArchiveSeeds(const std::filesystem::path& corpora) {
    const auto write = [&](const char* name, const Data& bytes) { writeSeed(corpora, "archives", name, bytes); };
    const auto writeArchive = [&](const char* name, const Data& archive) {
        Data bytes{0};
        bytes.insert(bytes.end(), archive.begin(), archive.end());
        write(name, bytes);
        // The same without its beginning.
        Data rest{1};
        rest.insert(rest.end(), archive.begin() + 12, archive.end());
        write((std::string(name) + "-rest").c_str(), rest);
    };
    const std::string ours(LCBroadcastConfiguration::kClassName);
    writeArchive("configuration", configuration({2.5, Dictionary{{"AverageBitRate", 800'000}, {"Profile", "High"}}}));
    writeArchive("no-properties", configuration({0, {}}));
    writeArchive("other-class", archived({"LCSharedPlaneObject", {{"clipDuration", 1.0}}}));
    writeArchive("text-as-length", archived({ours, {{"clipDuration", "5"}}}));
    writeArchive("array-as-properties", archived({ours, {{"videoCompressionProperties", Array{1}}}}));
    writeArchive("nothing", archived({ours, {{"clipDuration", Value()}, {"videoCompressionProperties", Value()}}}));
    // One level more than an archive may have, which no encoder of ours writes.
    Value deep(1);
    for (int i = 0; i < 8; ++i) deep = Value(Array{deep});
    WireBody body;
    body.bytes = {'L', 'C', 'A', 'R', 'C', 'H', 'I', 'V', 1, 0, 0, 0};
    const Dictionary object{{"class", ours}, {"fields", Dictionary{{"deep", deep}}}};
    if (!encode(Dictionary{{"root", object}}, body)) throw std::logic_error("a seed is over a limit");
    writeArchive("too-deep", body.bytes);
    // Recipes: an object with a dictionary, a configuration with a whole number and with one of many entries, a deep
    // one.
    write("recipe-object", Data{2, 3, 'A', 'b', 'c', 1, 1, 'k', 10, 1, 1, 'e', 0, 1, 0});
    write("recipe-configuration", Data{3, 1, 1, 5, 0, 0, 0, 0, 0, 0, 0, 1, 1, 1, 1, 'k', 4, 2, 'v', 'w', 0});
    write("recipe-many", Data{3, 1, 3, 20, 1, 1, 1, 1, 'p', 10, 0, 255, 200, 0});
    write("recipe-deep", Data{3, 0, 1, 0, 12, 18, 9, 1, 0, 1, 0, 1, 0, 1, 0, 1, 0});
    write("recipe-long", Data{2, 1, 'L', 1, 1, 'd', 5, 255, 0x40, 0x00});
}

}  // namespace lumacast::fuzz
