#pragma once
#include <optional>
#include <string>
#include <string_view>

#include "base/Value.h"

namespace lumacast {

/// One object of an archive: its class and what it wrote of itself under its keys.
struct ArchivedObject {
    std::string className;
    Dictionary fields;
};

/// Objects as bytes that another process can read. Any lane; does not block.
class KeyedArchive {
public:
    virtual ~KeyedArchive() = default;
    /// `archivedDataWithRootObject:requiringSecureCoding:error:` — none when the object is over a limit or holds what no
    /// archive can (endpoints, planes, errors).
    virtual std::optional<Data> archivedData(const ArchivedObject& root) = 0;
    /// `decodeObjectOfClass:forKey:` of the root object, secure coding required. None for anything malformed, over a
    /// limit, or whose root is of another class.
    virtual std::optional<ArchivedObject> unarchivedRoot(const Data& archive, std::string_view allowedClass) = 0;
};

}  // namespace lumacast
