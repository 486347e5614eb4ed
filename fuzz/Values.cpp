// The wire's encoding of values. An input that begins with an even byte is a message from a peer: the kinds of the
// handles that came beside it, then its bytes. Any other is the recipe of a value of ours, which may be longer and
// deeper than anything that fits into an input: parts of it can be asked for many times.

#include "base/Limits.h"
#include "base/Wire.h"
#include "fuzz/Input.h"
#include "fuzz/Property.h"
#include "fuzz/ValueRecipe.h"

namespace lumacast::fuzz {

namespace {

void checkMessage(Input in) {
    std::vector<Value> handles;
    const unsigned kinds = in.byte(), count = in.below(9);
    for (unsigned i = 0; i < count; ++i) handles.push_back(makeHandle((kinds >> i & 1) != 0));
    const Bytes bytes = in.rest();
    const auto value = decode(bytes, handles);
    require(decodeArray(bytes, handles).has_value() == (value && value->as<Array>()),
            "an array is read like any other value");
    if (!value) return;
    const Measure measure = measureOf(*value);
    require(measure.bytes == bytes.size(), "a message is no more than its values");
    // The only thing that may be read and not written: one handle named several times counts as several on the way out.
    require(isWithinLimits(measure) || measure.handles > limitOf(Limit::HandlesPerMessage),
            "what is read is within the limits");
    (void)describe(*value);
    WireBody body;
    if (!encode(*value, body)) {
        require(!isWithinLimits(measure), "what was read can be written");
        return;
    }
    require(body.bytes.size() == bytes.size(), "what was read is written as long as it was");
    if (measure.handles == 0)
        require(std::equal(bytes.begin(), bytes.end(), body.bytes.begin()), "what was read is written as it was");
    const auto again = decode(body.bytes, body.handles);
    require(again.has_value(), "what was written can be read");
    WireBody bodyAgain;
    require(encode(*again, bodyAgain) && bodyAgain.bytes == body.bytes && bodyAgain.handles == body.handles,
            "reading and writing change nothing");
}

void checkOurs(Input in) {
    const Value value = valueOf(in);
    const Measure measure = measureOf(value);
    WireBody body;
    const bool isWritten = encode(value, body);
    require(isWritten == isWithinLimits(measure), "what is within the limits is written, and nothing else");
    if (const auto* items = value.as<Array>()) {
        WireBody asArray;
        require(encodeArray(*items, asArray) == isWritten, "an array is written like any other value");
        require(!isWritten || (asArray.bytes == body.bytes && asArray.handles == body.handles),
                "an array is written like any other value");
    }
    if (!isWritten) return;
    require(body.bytes.size() == measure.bytes, "a message is no more than its values");
    require(body.handles.size() == measure.handles, "every handle travels");
    const auto back = decode(body.bytes, body.handles);
    require(back && *back == value, "what is written reads as the same value");
}

}  // namespace

void values(Bytes input) {
    Input in(input);
    if ((in.byte() & 1) == 0)
        checkMessage(in);
    else
        checkOurs(in);
}

}  // namespace lumacast::fuzz
