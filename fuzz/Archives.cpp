// Keyed archives, and the configuration that comes in one from a client or an extension. The first byte says what the
// rest is: 0 an archive, 1 what follows an archive's beginning, 2 the recipe of an object, 3 the recipe of a
// configuration (modulo 4).

#include "linux/ipc/LinuxKeyedArchive.h"

#include <algorithm>
#include <array>
#include <bit>
#include <string>

#include "base/Limits.h"
#include "broadcast/ConfigurationArchive.h"
#include "fuzz/Input.h"
#include "fuzz/Property.h"
#include "fuzz/ValueRecipe.h"

namespace lumacast::fuzz {

namespace {

constexpr std::string_view kOurs = LCBroadcastConfiguration::kClassName;

struct Shape {
    std::size_t levels = 0;  ///< of arrays and dictionaries
    bool hasErrors = false;
};

Shape shapeOf(const Value& value) {
    Shape shape;
    const auto add = [&shape](const Value& item) {
        const Shape inner = shapeOf(item);
        shape.levels = std::max(shape.levels, inner.levels);
        shape.hasErrors = shape.hasErrors || inner.hasErrors;
    };
    const auto* items = value.as<Array>();
    const auto* entries = value.as<Dictionary>();
    if (items) std::for_each(items->begin(), items->end(), add);
    if (entries)
        for (const auto& [key, item] : entries->entries()) add(item);
    if (items || entries) ++shape.levels;
    shape.hasErrors = shape.hasErrors || value.asError();
    return shape;
}

/// Sixteen levels deep is the transport's business; what an archive may hold is less.
bool isArchivable(const ArchivedObject& object) {
    const Value fields(object.fields);
    const Measure measure =
        measureOf(Dictionary{{"root", Dictionary{{"class", object.className}, {"fields", fields}}}});
    const Shape shape = shapeOf(fields);
    constexpr std::uint64_t kHead = 12;
    return isWithinLimits(measure) && measure.handles == 0 && !shape.hasErrors &&
           shape.levels <= limitOf(Limit::ArchiveDepth) && measure.bytes + kHead <= limitOf(Limit::ArchiveBytes);
}

std::optional<double> numberOf(const Value& value) {
    if (const auto* number = value.as<double>()) return *number;
    if (const auto* number = value.as<std::int64_t>()) return static_cast<double>(*number);
    if (const auto* number = value.as<std::uint64_t>()) return static_cast<double>(*number);
    if (const auto* truth = value.as<bool>()) return *truth ? 1 : 0;
    return std::nullopt;
}

void checkConfiguration(LinuxKeyedArchive& archives, const Data& archive, const Dictionary& fields) {
    const Value* duration = fields.find("clipDuration");
    const Value* properties = fields.find("videoCompressionProperties");
    const bool hasDuration = duration && !duration->isNull(), hasProperties = properties && !properties->isNull();
    const bool isGood = (!hasDuration || numberOf(*duration)) && (!hasProperties || properties->as<Dictionary>());
    const auto configuration = configurationIn(archives, archive);
    require(configuration.has_value() == isGood, "a configuration's members are of their classes, or it is none");
    if (!configuration) return;
    const double seconds = hasDuration ? *numberOf(*duration) : 0;
    require(std::bit_cast<std::uint64_t>(configuration->clipDuration) == std::bit_cast<std::uint64_t>(seconds),
            "a configuration's length is the one that was given");
    require(configuration->videoCompressionProperties.has_value() == hasProperties,
            "its properties are what was given");
    const auto again = archiveOf(archives, *configuration);
    require(again.has_value(), "a configuration that was read can be archived");
    const auto same = configurationIn(archives, *again);
    require(same && std::bit_cast<std::uint64_t>(same->clipDuration) == std::bit_cast<std::uint64_t>(seconds),
            "an archived configuration reads as the same one");
    require(same->videoCompressionProperties.has_value() == (hasProperties && !properties->as<Dictionary>()->empty()),
            "no properties are the same as none");
    require(archiveOf(archives, *same) == again, "archiving and reading change nothing");
}

void checkArchive(const Data& archive) {
    LinuxKeyedArchive archives;
    require(!archives.unarchivedRoot(archive, "") || archive.size() <= limitOf(Limit::ArchiveBytes),
            "a long archive is none, whatever its class");
    const auto object = archives.unarchivedRoot(archive, kOurs);
    if (!object) return require(!configurationIn(archives, archive), "a configuration is an object of its class");
    require(archive.size() <= limitOf(Limit::ArchiveBytes), "an archive is no longer than the limit");
    require(object->className == kOurs, "an object is of the class that is allowed");
    require(isArchivable(*object), "what is read is what may be in an archive");
    require(!archives.unarchivedRoot(archive, "LCSharedPlaneObject"), "no object is of two classes");
    const auto written = archives.archivedData(*object);
    require(written && written->size() <= archive.size(), "what was read can be written, and is no longer");
    const auto again = archives.unarchivedRoot(*written, kOurs);
    require(again && archives.archivedData(*again) == written, "writing and reading change nothing");
    constexpr std::size_t kHead = 12;
    const std::array parts{archive.size() - 1, archive.size() / 2, kHead};
    for (const std::size_t size : parts) {
        const Data part(archive.begin(), archive.begin() + static_cast<std::ptrdiff_t>(size));
        require(!archives.unarchivedRoot(part, kOurs), "a part of an archive is none");
    }
    Data longer = archive;
    longer.push_back(0);
    require(!archives.unarchivedRoot(longer, kOurs), "nothing follows an archive");
    checkConfiguration(archives, archive, object->fields);
}

Dictionary fieldsOf(Input& in) {
    Dictionary fields;
    for (unsigned count = in.below(5); count > 0; --count) {
        const std::string key(textOf(in.bytes(in.below(12))));
        fields.set(key, valueOf(in));
    }
    return fields;
}

void checkObject(const ArchivedObject& object) {
    LinuxKeyedArchive archives;
    const auto archive = archives.archivedData(object);
    require(archive.has_value() == isArchivable(object), "what is within the limits is archived, and nothing else");
    if (!archive) return;
    const auto back = archives.unarchivedRoot(*archive, object.className);
    require(back && back->className == object.className && back->fields == object.fields,
            "what is archived reads as the same object");
    require(!archives.unarchivedRoot(*archive, object.className + "2"), "a class is its whole name");
    checkArchive(*archive);
}

}  // namespace

void archives(Bytes input) {
    constexpr std::array<std::uint8_t, 12> kHead{'L', 'C', 'A', 'R', 'C', 'H', 'I', 'V', 1, 0, 0, 0};
    Input in(input);
    switch (in.below(4)) {
        case 0: {
            const Bytes bytes = in.rest();
            return checkArchive(Data(bytes.begin(), bytes.end()));
        }
        case 1: {
            const Bytes bytes = in.rest();
            Data archive(kHead.size() + bytes.size());
            std::copy(bytes.begin(), bytes.end(), std::copy(kHead.begin(), kHead.end(), archive.begin()));
            return checkArchive(archive);
        }
        case 2: {
            const std::string className(textOf(in.bytes(in.below(12))));
            return checkObject({className, fieldsOf(in)});
        }
        default: {
            Dictionary fields;
            if (in.flag()) fields.set("clipDuration", valueOf(in));
            if (in.flag()) fields.set("videoCompressionProperties", in.flag() ? Value(fieldsOf(in)) : valueOf(in));
            const Dictionary more = fieldsOf(in);
            for (const auto& [key, value] : more.entries()) fields.set(key, value);
            return checkObject({std::string(kOurs), fields});
        }
    }
}

}  // namespace lumacast::fuzz
