#pragma once
#include <string_view>

#include "base/Value.h"

namespace lumacast {

/// What an object writes itself to and reads itself from, value by value under a key.
class Coder {
public:
    virtual ~Coder() = default;
    /// `encodeObject:forKey:`
    virtual void encodeObject(Value object, std::string_view key) = 0;
    /// `decodeObjectForKey:` — null when there is none under the key.
    virtual Value decodeObject(std::string_view key) const = 0;
    /// Whether the values travel over a connection, so that handles to memory can travel with them.
    virtual bool isIpcConnectionCoder() const { return false; }
};

/// A coder over a dictionary that it owns: what an archive, or a message, holds of one object.
class DictionaryCoder : public Coder {
public:
    DictionaryCoder() = default;
    explicit DictionaryCoder(Dictionary fields) : fields_(std::move(fields)) {}

    void encodeObject(Value object, std::string_view key) override { fields_.set(std::string(key), std::move(object)); }
    Value decodeObject(std::string_view key) const override {
        const Value* found = fields_.find(key);
        return found ? *found : Value();
    }
    const Dictionary& fields() const { return fields_; }

private:
    Dictionary fields_;
};

/// The coder of an object that is part of a message.
class IpcConnectionCoder final : public DictionaryCoder {
public:
    using DictionaryCoder::DictionaryCoder;
    bool isIpcConnectionCoder() const override { return true; }
};

}  // namespace lumacast
