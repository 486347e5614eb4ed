#include "linux/system/Json.h"

#include <cmath>
#include <nlohmann/json.hpp>
#include <utility>
#include <vector>

namespace lumacast {

namespace {

using Json = nlohmann::ordered_json;

Json jsonOf(const Value& value);

struct JsonWriter {
    Json operator()(std::monostate) const { return nullptr; }
    Json operator()(bool value) const { return value; }
    Json operator()(std::int64_t value) const { return value; }
    Json operator()(std::uint64_t value) const { return value; }
    Json operator()(double value) const { return std::isfinite(value) ? Json(value) : Json(nullptr); }
    Json operator()(const std::string& value) const { return value; }
    Json operator()(const Data& value) const { return "<" + std::to_string(value.size()) + " bytes>"; }
    Json operator()(Date value) const { return (*this)(value.secondsSince1970); }
    Json operator()(const URL& value) const { return value.text(); }
    Json operator()(const Array& value) const {
        Json array = Json::array();
        for (const Value& item : value) array.push_back(jsonOf(item));
        return array;
    }
    Json operator()(const Dictionary& value) const {
        Json object = Json::object();
        for (const auto& [key, item] : value.entries()) object[key] = jsonOf(item);
        return object;
    }
    Json operator()(const Value::ErrorRef& value) const {
        return Json{{"domain", value->domain()}, {"code", value->code()}, {"userInfo", (*this)(value->userInfo())}};
    }
    Json operator()(const Value::EndpointRef&) const { return nullptr; }
    Json operator()(const Value::PlaneRef&) const { return nullptr; }
};

Json jsonOf(const Value& value) { return std::visit(JsonWriter{}, value.storage()); }

/// Builds a Value event by event, so that the depth is checked before anything is built.
class ValueBuilder {
public:
    explicit ValueBuilder(std::size_t maximumDepth) : maximumDepth_(maximumDepth) {}

    bool null() { return add(Value()); }
    bool boolean(bool value) { return add(value); }
    bool number_integer(std::int64_t value) { return add(value); }
    bool number_unsigned(std::uint64_t value) {
        return value <= INT64_MAX ? add(static_cast<std::int64_t>(value)) : add(value);
    }
    bool number_float(double value, const std::string&) { return add(value); }
    bool string(std::string& value) { return add(std::move(value)); }
    bool binary(nlohmann::json::binary_t&) { return false; }
    bool start_object(std::size_t) { return open(Value(Dictionary())); }
    bool key(std::string& value) {
        open_.back().key = std::move(value);
        return true;
    }
    bool end_object() { return close(); }
    bool start_array(std::size_t) { return open(Value(Array())); }
    bool end_array() { return close(); }
    bool parse_error(std::size_t, const std::string&, const nlohmann::detail::exception&) { return false; }

    Value takeResult() { return std::move(result_); }

private:
    struct Open {
        Array items;
        Dictionary entries;
        bool isObject = false;
        std::string key;
    };

    bool open(const Value& kind) {
        if (open_.size() == maximumDepth_) return false;
        open_.emplace_back();
        open_.back().isObject = kind.as<Dictionary>() != nullptr;
        return true;
    }
    bool close() {
        Open finished = std::move(open_.back());
        open_.pop_back();
        return add(finished.isObject ? Value(std::move(finished.entries)) : Value(std::move(finished.items)));
    }
    bool add(Value value) {
        if (open_.empty())
            result_ = std::move(value);
        else if (open_.back().isObject)
            open_.back().entries.set(std::move(open_.back().key), std::move(value));
        else
            open_.back().items.push_back(std::move(value));
        return true;
    }

    const std::size_t maximumDepth_;
    std::vector<Open> open_;
    Value result_;
};

}  // namespace

std::string jsonText(const Value& value) {
    return jsonOf(value).dump(-1, ' ', false, Json::error_handler_t::replace);
}

std::optional<Value> valueFromJson(std::string_view text, std::size_t maximumDepth) {
    ValueBuilder builder(maximumDepth);
    if (!nlohmann::json::sax_parse(text.begin(), text.end(), &builder)) return std::nullopt;
    return builder.takeResult();
}

}  // namespace lumacast
