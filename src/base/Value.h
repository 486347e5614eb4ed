#pragma once
// What messages, dictionaries and errors are made of.

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "base/Date.h"
#include "base/URL.h"

namespace lumacast {

class IpcEndpoint;
class SharedPlane;
class Value;
class Error;

using Data = std::vector<std::uint8_t>;
using Array = std::vector<Value>;

/// A dictionary that keeps its entries in the order in which they were first set. Small: look-up is linear.
class Dictionary {
public:
    Dictionary();
    Dictionary(std::initializer_list<std::pair<std::string, Value>> entries);
    Dictionary(const Dictionary&);
    Dictionary(Dictionary&&) noexcept;
    Dictionary& operator=(const Dictionary&);
    Dictionary& operator=(Dictionary&&) noexcept;
    ~Dictionary();

    /// Adds the entry, or replaces the value of an entry with this key at its place.
    void set(std::string key, Value value);
    /// Adds an entry without looking whether its key is there, which takes as long as there are entries. For whoever
    /// knows that it is not.
    void addNew(std::string key, Value value);

    /// The value under `key`, or null. Valid until the dictionary changes.
    const Value* find(std::string_view key) const;

    const std::vector<std::pair<std::string, Value>>& entries() const { return entries_; }
    std::size_t size() const;
    bool empty() const;

private:
    std::vector<std::pair<std::string, Value>> entries_;
};

/// One value of the kinds that a message can carry. A value type; endpoints and planes are shared handles, errors
/// immutable shared objects.
class Value {
public:
    using EndpointRef = std::shared_ptr<IpcEndpoint>;
    using PlaneRef = std::shared_ptr<SharedPlane>;
    using ErrorRef = std::shared_ptr<const Error>;

    /// The order of the alternatives is the order of the wire's tags.
    using Storage = std::variant<std::monostate, bool, std::int64_t, std::uint64_t, double, std::string, Data, Date,
                                 URL, Array, Dictionary, ErrorRef, EndpointRef, PlaneRef>;

    Value() = default;
    Value(bool value) : storage_(value) {}
    Value(std::int32_t value) : storage_(static_cast<std::int64_t>(value)) {}
    Value(std::uint32_t value) : storage_(static_cast<std::uint64_t>(value)) {}
    Value(std::int64_t value) : storage_(value) {}
    Value(std::uint64_t value) : storage_(value) {}
    Value(double value) : storage_(value) {}
    Value(const char* value) : storage_(std::string(value)) {}
    Value(std::string value) : storage_(std::move(value)) {}
    Value(std::string_view value) : storage_(std::string(value)) {}
    Value(Data value) : storage_(std::move(value)) {}
    Value(Date value) : storage_(value) {}
    Value(URL value) : storage_(std::move(value)) {}
    Value(Array value) : storage_(std::move(value)) {}
    Value(Dictionary value) : storage_(std::move(value)) {}
    Value(Error value);
    Value(ErrorRef value);
    Value(EndpointRef value);
    Value(PlaneRef value);
    /// An absent optional becomes null.
    template <class T>
    Value(std::optional<T> value) {
        if (value) *this = Value(std::move(*value));
    }

    bool isNull() const { return std::holds_alternative<std::monostate>(storage_); }

    /// The value as T, one of Storage's alternatives, or null when it is of another kind. No conversion is made.
    template <class T>
    const T* as() const {
        return std::get_if<T>(&storage_);
    }
    const Error* asError() const;

    const Storage& storage() const { return storage_; }

    /// Deep equality; endpoints and planes are equal when they are the same object.
    friend bool operator==(const Value& a, const Value& b);

private:
    Storage storage_;
};

bool operator==(const Dictionary& a, const Dictionary& b);

/// The key under which an error's user info holds its localised description.
inline constexpr std::string_view kLocalizedDescriptionKey = "LocalizedDescription";

/// An error: who says so (domain), what (code), and details. Immutable after it was built.
class Error {
public:
    Error(std::string domain, std::int64_t code, Dictionary userInfo = {})
        : domain_(std::move(domain)), code_(code), userInfo_(std::move(userInfo)) {}

    const std::string& domain() const { return domain_; }
    std::int64_t code() const { return code_; }
    const Dictionary& userInfo() const { return userInfo_; }

    /// The localised description, or null when the error carries none.
    const std::string* localizedDescription() const {
        const Value* text = userInfo_.find(kLocalizedDescriptionKey);
        return text ? text->as<std::string>() : nullptr;
    }

    friend bool operator==(const Error& a, const Error& b) {
        return a.domain_ == b.domain_ && a.code_ == b.code_ && a.userInfo_ == b.userInfo_;
    }

private:
    std::string domain_;
    std::int64_t code_;
    Dictionary userInfo_;
};

/// The domain of failures of the system below: the code is the system's error number.
inline constexpr std::string_view kSystemErrorDomain = "com.orvane.lumacastd.system";

/// Human-readable form, for logs and tools: `{"key" = 1; ...}`.
std::string describe(const Value& value);
std::string describe(const Error& error);

}  // namespace lumacast
