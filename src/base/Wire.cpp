#include "base/Wire.h"

#include <bit>
#include <cstring>
#include <unordered_set>

#include "base/Limits.h"
#include "base/Utf8.h"

namespace lumacast {

namespace {

enum Tag : std::uint8_t {
    kNull, kBool, kInt64, kUInt64, kDouble, kText, kBytes, kDate, kURL, kArray, kDictionary, kError, kEndpoint, kPlane,
};

/// Dictionaries look up linearly; more entries than this in one dictionary would let a peer make that slow.
constexpr std::size_t kMaximumEntries = 1024;

class Encoder {
public:
    explicit Encoder(WireBody& body) : body_(body) {}

    bool array(const Array& items) {
        ++values_;
        tag(kArray);
        return write(items, 0);
    }

    bool value(const Value& item, unsigned depth) {
        if (depth > limitOf(Limit::MessageDepth) || body_.bytes.size() > limitOf(Limit::MessageBytes)) return false;
        if (++values_ > limitOf(Limit::MessageValues)) return false;
        tag(static_cast<Tag>(item.storage().index()));
        return std::visit([&](const auto& contents) { return write(contents, depth); }, item.storage());
    }

private:
    bool write(std::monostate, unsigned) { return true; }
    bool write(bool flag, unsigned) { body_.bytes.push_back(flag ? 1 : 0); return true; }
    bool write(std::int64_t number, unsigned) { return fixed(static_cast<std::uint64_t>(number), 8); }
    bool write(std::uint64_t number, unsigned) { return fixed(number, 8); }
    bool write(double number, unsigned) { return fixed(std::bit_cast<std::uint64_t>(number), 8); }
    bool write(const std::string& text, unsigned) { return string(text); }
    bool write(const Data& data, unsigned) { return bytes(data.data(), data.size()); }
    bool write(Date date, unsigned depth) { return write(date.secondsSince1970, depth); }
    bool write(const URL& url, unsigned depth) { return write(url.text(), depth); }
    bool write(const Array& items, unsigned depth) {
        if (!fixed(items.size(), 4)) return false;
        for (const Value& item : items)
            if (!value(item, depth + 1)) return false;
        return true;
    }
    bool write(const Dictionary& dictionary, unsigned depth) {
        if (dictionary.size() > kMaximumEntries || !fixed(dictionary.size(), 4)) return false;
        for (const auto& [key, item] : dictionary.entries())
            if (!string(key) || !value(item, depth + 1)) return false;
        return true;
    }
    bool write(const Value::ErrorRef& error, unsigned depth) {
        return string(error->domain()) && fixed(static_cast<std::uint64_t>(error->code()), 8) &&
               write(error->userInfo(), depth);
    }
    bool write(const Value::EndpointRef& endpoint, unsigned) { return handle(endpoint); }
    bool write(const Value::PlaneRef& plane, unsigned) { return handle(plane); }

    bool handle(Value item) {
        if (body_.handles.size() >= limitOf(Limit::HandlesPerMessage)) return false;
        body_.bytes.push_back(static_cast<std::uint8_t>(body_.handles.size()));
        body_.handles.push_back(std::move(item));
        return true;
    }
    bool string(const std::string& text) { return isValidUtf8(text) && bytes(text.data(), text.size()); }
    void tag(Tag tag) { body_.bytes.push_back(tag); }
    bool fixed(std::uint64_t number, unsigned size) {
        for (unsigned i = 0; i < size; ++i) body_.bytes.push_back(static_cast<std::uint8_t>(number >> (8 * i)));
        return true;
    }
    bool bytes(const void* data, std::size_t size) {
        if (size > limitOf(Limit::MessageBytes)) return false;
        fixed(size, 4);
        const auto* first = static_cast<const std::uint8_t*>(data);
        body_.bytes.insert(body_.bytes.end(), first, first + size);
        return body_.bytes.size() <= limitOf(Limit::MessageBytes);
    }

    WireBody& body_;
    std::uint64_t values_ = 0;
};

class Decoder {
public:
    Decoder(std::span<const std::uint8_t> bytes, std::span<const Value> handles) : rest_(bytes), handles_(handles) {}

    bool done() const { return rest_.empty(); }

    bool value(Value& out, unsigned depth) {
        std::uint8_t tag = 0;
        if (depth > limitOf(Limit::MessageDepth) || ++values_ > limitOf(Limit::MessageValues) || !byte(tag))
            return false;
        switch (tag) {
            case kNull: out = Value(); return true;
            case kBool: return boolean(out);
            case kInt64: return number<std::int64_t>(out);
            case kUInt64: return number<std::uint64_t>(out);
            case kDouble: return number<double>(out);
            case kText: return text<std::string>(out);
            case kBytes: return bytes(out);
            case kDate: return date(out);
            case kURL: return text<URL>(out);
            case kArray: return array(out, depth);
            case kDictionary: return dictionary(out, depth);
            case kError: return error(out, depth);
            case kEndpoint: return handle<Value::EndpointRef>(out);
            case kPlane: return handle<Value::PlaneRef>(out);
            default: return false;
        }
    }

    bool array(Array& out) {
        std::uint8_t tag = 0;
        ++values_;
        return byte(tag) && tag == kArray && items(out, 0);
    }

private:
    bool byte(std::uint8_t& out) {
        if (rest_.empty()) return false;
        out = rest_.front();
        rest_ = rest_.subspan(1);
        return true;
    }
    bool fixed(std::uint64_t& out, unsigned size) {
        if (rest_.size() < size) return false;
        out = 0;
        for (unsigned i = 0; i < size; ++i) out |= std::uint64_t{rest_[i]} << (8 * i);
        rest_ = rest_.subspan(size);
        return true;
    }
    bool boolean(Value& out) {
        std::uint8_t flag = 0;
        if (!byte(flag) || flag > 1) return false;
        out = Value(flag == 1);
        return true;
    }
    template <class T>
    bool number(Value& out) {
        std::uint64_t bits = 0;
        if (!fixed(bits, 8)) return false;
        out = Value(std::bit_cast<T>(bits));
        return true;
    }
    bool date(Value& out) {
        std::uint64_t bits = 0;
        if (!fixed(bits, 8)) return false;
        out = Value(Date{std::bit_cast<double>(bits)});
        return true;
    }
    bool string(std::string& out) {
        std::uint64_t size = 0;
        if (!fixed(size, 4) || size > rest_.size()) return false;
        out.assign(reinterpret_cast<const char*>(rest_.data()), size);
        rest_ = rest_.subspan(size);
        return isValidUtf8(out);
    }
    template <class T>
    bool text(Value& out) {
        std::string contents;
        if (!string(contents)) return false;
        out = Value(T(std::move(contents)));
        return true;
    }
    bool bytes(Value& out) {
        std::uint64_t size = 0;
        if (!fixed(size, 4) || size > rest_.size()) return false;
        out = Value(Data(rest_.begin(), rest_.begin() + static_cast<std::ptrdiff_t>(size)));
        rest_ = rest_.subspan(size);
        return true;
    }
    bool items(Array& out, unsigned depth) {
        std::uint64_t count = 0;
        if (!fixed(count, 4) || count > rest_.size()) return false;
        for (std::uint64_t i = 0; i < count; ++i) {
            Value item;
            if (!value(item, depth + 1)) return false;
            out.push_back(std::move(item));
        }
        return true;
    }
    bool array(Value& out, unsigned depth) {
        Array contents;
        if (!items(contents, depth)) return false;
        out = Value(std::move(contents));
        return true;
    }
    bool entries(Dictionary& out, unsigned depth) {
        std::uint64_t count = 0;
        if (!fixed(count, 4) || count > rest_.size() / 5) return false;
        std::unordered_set<std::string> seen;
        for (std::uint64_t i = 0; i < count; ++i) {
            std::string key;
            Value item;
            if (!string(key) || !seen.insert(key).second || !value(item, depth + 1)) return false;
            if (seen.size() > kMaximumEntries) return false;
            out.addNew(std::move(key), std::move(item));
        }
        return true;
    }
    bool dictionary(Value& out, unsigned depth) {
        Dictionary contents;
        if (!entries(contents, depth)) return false;
        out = Value(std::move(contents));
        return true;
    }
    bool error(Value& out, unsigned depth) {
        std::string domain;
        std::uint64_t code = 0;
        Dictionary userInfo;
        if (!string(domain) || !fixed(code, 8) || !entries(userInfo, depth)) return false;
        out = Value(Error(std::move(domain), static_cast<std::int64_t>(code), std::move(userInfo)));
        return true;
    }
    template <class T>
    bool handle(Value& out) {
        std::uint8_t index = 0;
        if (!byte(index) || index >= handles_.size() || !handles_[index].as<T>()) return false;
        out = handles_[index];
        return true;
    }

    std::span<const std::uint8_t> rest_;
    std::span<const Value> handles_;
    std::uint64_t values_ = 0;
};

}  // namespace

// The last value may be one that goes over the limit without having been looked at.

bool encode(const Value& value, WireBody& body) {
    return Encoder(body).value(value, 0) && body.bytes.size() <= limitOf(Limit::MessageBytes);
}

bool encodeArray(const Array& items, WireBody& body) {
    return Encoder(body).array(items) && body.bytes.size() <= limitOf(Limit::MessageBytes);
}

std::optional<Value> decode(std::span<const std::uint8_t> bytes, std::span<const Value> handles) {
    Decoder decoder(bytes, handles);
    Value value;
    if (!decoder.value(value, 0) || !decoder.done()) return std::nullopt;
    return value;
}

std::optional<Array> decodeArray(std::span<const std::uint8_t> bytes, std::span<const Value> handles) {
    Decoder decoder(bytes, handles);
    Array items;
    if (!decoder.array(items) || !decoder.done()) return std::nullopt;
    return items;
}

}  // namespace lumacast
