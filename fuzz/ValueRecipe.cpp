#include "fuzz/ValueRecipe.h"

#include <algorithm>
#include <memory>
#include <utility>

#include "base/Limits.h"
#include "base/Utf8.h"
#include "platform/IpcEndpoint.h"
#include "tests/fakes/FakePlane.h"

namespace lumacast::fuzz {

namespace {

class Endpoint final : public IpcEndpoint {};

class Measurer {
public:
    Measure measure(const Value& value) {
        walk(value, 0);
        return measure_;
    }

private:
    void text(const std::string& contents) {
        measure_.bytes += 4 + contents.size();
        measure_.isUtf8 = measure_.isUtf8 && isValidUtf8(contents);
    }
    void entries(const Dictionary& dictionary, std::uint64_t depth) {
        measure_.bytes += 4;
        measure_.mostEntries = std::max<std::uint64_t>(measure_.mostEntries, dictionary.size());
        for (const auto& [key, item] : dictionary.entries()) {
            text(key);
            walk(item, depth + 1);
        }
    }
    void walk(const Value& value, std::uint64_t depth) {
        ++measure_.values;
        ++measure_.bytes;
        measure_.depth = std::max(measure_.depth, depth);
        if (value.as<bool>()) measure_.bytes += 1;
        if (value.as<std::int64_t>() || value.as<std::uint64_t>() || value.as<double>() || value.as<Date>())
            measure_.bytes += 8;
        if (const auto* contents = value.as<std::string>()) text(*contents);
        if (const auto* url = value.as<URL>()) text(url->text());
        if (const auto* data = value.as<Data>()) measure_.bytes += 4 + data->size();
        if (value.as<Value::EndpointRef>() || value.as<Value::PlaneRef>()) {
            ++measure_.handles;
            ++measure_.bytes;
        }
        if (const Error* error = value.asError()) {
            text(error->domain());
            measure_.bytes += 8;
            entries(error->userInfo(), depth);
        }
        if (const auto* dictionary = value.as<Dictionary>()) entries(*dictionary, depth);
        if (const auto* items = value.as<Array>()) {
            measure_.bytes += 4;
            for (const Value& item : *items) walk(item, depth + 1);
        }
    }

    Measure measure_;
};

/// The table has no row for it: it is the code's.
constexpr std::uint64_t kMaximumEntries = 1024;

/// Makes a value from a recipe. What it may make is bounded: a few times the limits.
class Maker {
public:
    explicit Maker(Input& in) : in_(in) {}

    Value value(unsigned depth) {
        if (depth > 24 || budget_ == 0) return Value();
        --budget_;
        switch (in_.below(20)) {
            case 0: return Value(in_.flag());
            case 1: return Value(static_cast<std::int64_t>(in_.number(8)));
            case 2: return Value(in_.number(8));
            case 3: return Value(static_cast<double>(static_cast<std::int8_t>(in_.byte())) / 4);
            case 4: return Value(text());
            case 5: return Value(data());
            case 6: return Value(Date{static_cast<double>(in_.byte())});
            case 7: return Value(URL("file:///" + text()));
            case 8: return Value(Error(text(), in_.byte(), dictionary(depth)));
            case 9: return makeHandle(in_.flag());
            case 10: return Value(dictionary(depth));
            case 11: return Value(longText());
            case 12: return nested(depth);
            case 13:
            case 14: return many(depth);
            case 15:
            case 16:
            case 17: return Value(array(depth));
            default: return Value();
        }
    }

private:
    std::string text() { return std::string(textOf(in_.bytes(in_.below(32)))); }
    std::string longText() {
        const std::string part = text();
        std::string result;
        for (unsigned times = in_.byte(); times > 0; --times) result += part;
        return result;
    }
    /// Once in a value something is about as large as a limit; more would only be slow.
    bool wantsHuge() { return in_.byte() == 255 && !std::exchange(hadHuge_, true); }
    Data data() {
        const std::uint64_t size = wantsHuge() ? limitOf(Limit::MessageBytes) + 64 - in_.number(2) : in_.byte();
        return Data(size, 7);
    }
    Array array(unsigned depth) {
        Array items;
        for (unsigned count = in_.below(6); count > 0; --count) items.push_back(value(depth + 1));
        return items;
    }
    /// Sometimes with more entries than one may have.
    Dictionary dictionary(unsigned depth) {
        Dictionary entries;
        const unsigned few = in_.below(5);
        for (unsigned i = 0; i < few; ++i) entries.set(text(), value(depth + 1));
        if (!wantsHuge()) return entries;
        const std::uint64_t many = 900 + in_.byte();
        for (std::uint64_t i = 0; i < many && budget_ > 0; ++i, --budget_)
            entries.set("k" + std::to_string(i), Value());
        return entries;
    }
    Value nested(unsigned depth) {
        Value inner = value(depth + 1);
        for (unsigned count = in_.below(24); count > 0; --count)
            inner = in_.flag() ? Value(Array{std::move(inner)}) : Value(Dictionary{{"", std::move(inner)}});
        return inner;
    }
    Value many(unsigned depth) {
        const Value one = value(depth + 1);
        const std::uint64_t cost = std::max<std::uint64_t>(1, measureOf(one).bytes / 16);
        Array items;
        std::uint64_t count = wantsHuge() ? in_.number(2) : in_.byte();
        for (; count > 0 && budget_ >= cost; --count, budget_ -= cost) items.push_back(one);
        return Value(std::move(items));
    }

    Input& in_;
    std::uint64_t budget_ = 18'000;
    bool hadHuge_ = false;
};

}  // namespace

Value makeHandle(bool isPlane) {
    if (isPlane) return Value(Value::PlaneRef(std::make_shared<FakePlane>(1, 1, 1, std::vector<PixelRect>())));
    return Value(Value::EndpointRef(std::make_shared<Endpoint>()));
}

Measure measureOf(const Value& value) {
    return Measurer().measure(value);
}

bool isWithinLimits(const Measure& m) {
    return m.isUtf8 && m.bytes <= limitOf(Limit::MessageBytes) && m.values <= limitOf(Limit::MessageValues) &&
           m.depth <= limitOf(Limit::MessageDepth) && m.handles <= limitOf(Limit::HandlesPerMessage) &&
           m.mostEntries <= kMaximumEntries;
}

Value valueOf(Input& in) {
    return Maker(in).value(0);
}

}  // namespace lumacast::fuzz
