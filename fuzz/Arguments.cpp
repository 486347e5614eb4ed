#include "fuzz/Arguments.h"

#include <array>
#include <bit>
#include <limits>

#include "base/Limits.h"
#include "base/Utf8.h"
#include "platform/IpcEndpoint.h"
#include "tests/fakes/FakePlane.h"

namespace lumacast::fuzz {

namespace {

class Endpoint final : public IpcEndpoint {};

double real(Input& in) {
    using Limits = std::numeric_limits<double>;
    static constexpr std::array kOdd{0.0,
                                     -0.0,
                                     0.5,
                                     1.0,
                                     -1.0,
                                     2.0,
                                     640.0,
                                     360.0,
                                     1080.0,
                                     1920.0,
                                     1921.0,
                                     4096.0,
                                     65536.0,
                                     1e9,
                                     2147483648.0,
                                     9.3e18,
                                     1e19,
                                     1e300,
                                     Limits::max(),
                                     Limits::min(),
                                     Limits::denorm_min(),
                                     Limits::infinity(),
                                     -Limits::infinity(),
                                     Limits::quiet_NaN()};
    const unsigned which = in.byte();
    if (which < kOdd.size()) return kOdd[which];
    if (which < 0xC0) return which / 16.0;
    return std::bit_cast<double>(in.number(8));
}

std::string text(Input& in) {
    const std::string_view bytes = textOf(in.bytes(in.below(24)));
    return isValidUtf8(bytes) ? std::string(bytes) : std::string();
}

ContextID window(std::span<const ContextID> windows, Input& in) {
    const unsigned which = in.byte();
    if (which < 0xE0) return windows[which % windows.size()];
    return ContextID{static_cast<std::uint32_t>(in.number(4))};
}

Value contextIDs(std::span<const ContextID> windows, Input& in) {
    Array ids;
    const unsigned count = in.byte();
    if (count >= 0xF0) return Value(Array(limitOf(Limit::ContextIdentifiersPerRequest), number(window(windows, in))));
    for (unsigned i = 0; i < count % 4; ++i) ids.emplace_back(number(window(windows, in)));
    return Value(std::move(ids));
}

Dictionary dictionary(Input& in) {
    Dictionary entries;
    for (unsigned count = in.below(4); count > 0; --count) {
        std::string key = text(in);
        entries.set(std::move(key), in.flag() ? Value(text(in)) : Value(static_cast<std::int64_t>(in.number(8))));
    }
    return entries;
}

Value argument(ArgumentType type, std::span<const ContextID> windows, Input& in) {
    using A = ArgumentType;
    switch (type) {
        case A::Bool: return Value(in.flag());
        case A::Int32: return Value(static_cast<std::int32_t>(in.number(4)));
        case A::UInt32: return Value(number(window(windows, in)));
        case A::Int64: return Value(static_cast<std::int64_t>(in.number(8)));
        case A::Double: return Value(real(in));
        case A::Size: {
            const double width = real(in);
            return Value(Array{width, real(in)});
        }
        case A::ContextIDs: return contextIDs(windows, in);
        case A::Text: return Value(text(in));
        case A::Data: return Value(Data(in.byte(), in.byte()));
        case A::NullableData: return in.flag() ? Value(Data(in.byte(), 1)) : Value();
        case A::Dictionary: return Value(dictionary(in));
        case A::NullableDictionary: return in.flag() ? Value(dictionary(in)) : Value();
        case A::Array: return Value(Array{text(in), in.flag()});
        case A::URL: return Value(URL(text(in)));
        case A::NullableURL: return in.flag() ? Value(URL(text(in))) : Value();
        case A::NullableEndpoint: return in.flag() ? Value(Value::EndpointRef(std::make_shared<Endpoint>())) : Value();
        case A::NullableError: return in.flag() ? Value(Error(text(in), in.byte(), dictionary(in))) : Value();
        case A::SharedPlaneObject:
            return Value(Value::PlaneRef(std::make_shared<FakePlane>(1, 1, 1, std::vector<PixelRect>())));
        case A::Plain: return in.flag() ? Value(dictionary(in)) : Value(text(in));
        case A::Any: return Value(text(in));
    }
    return Value();
}

}  // namespace

Array argumentsFor(const MessageDeclaration& declaration, std::span<const ContextID> windows, Input& in) {
    Array arguments;
    for (const ArgumentType type : declaration.arguments) arguments.push_back(argument(type, windows, in));
    return arguments;
}

}  // namespace lumacast::fuzz
