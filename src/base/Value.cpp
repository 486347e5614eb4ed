#include "base/Value.h"

#include <algorithm>
#include <cstdio>
#include <type_traits>

namespace lumacast {

Dictionary::Dictionary() = default;
Dictionary::Dictionary(std::initializer_list<std::pair<std::string, Value>> entries) {
    for (const auto& [key, value] : entries) set(key, value);
}
Dictionary::Dictionary(const Dictionary&) = default;
Dictionary::Dictionary(Dictionary&&) noexcept = default;
Dictionary& Dictionary::operator=(const Dictionary&) = default;
Dictionary& Dictionary::operator=(Dictionary&&) noexcept = default;
Dictionary::~Dictionary() = default;

void Dictionary::set(std::string key, Value value) {
    auto found = std::find_if(entries_.begin(), entries_.end(), [&](const auto& entry) { return entry.first == key; });
    if (found != entries_.end())
        found->second = std::move(value);
    else
        entries_.emplace_back(std::move(key), std::move(value));
}

void Dictionary::addNew(std::string key, Value value) { entries_.emplace_back(std::move(key), std::move(value)); }

const Value* Dictionary::find(std::string_view key) const {
    for (const auto& entry : entries_)
        if (entry.first == key) return &entry.second;
    return nullptr;
}

std::size_t Dictionary::size() const { return entries_.size(); }
bool Dictionary::empty() const { return entries_.empty(); }

Value::Value(Error value) : storage_(std::make_shared<const Error>(std::move(value))) {}
Value::Value(ErrorRef value) {
    if (value) storage_ = std::move(value);
}
Value::Value(EndpointRef value) {
    if (value) storage_ = std::move(value);
}
Value::Value(PlaneRef value) {
    if (value) storage_ = std::move(value);
}

const Error* Value::asError() const {
    const auto* ref = as<ErrorRef>();
    return ref ? ref->get() : nullptr;
}

bool operator==(const Value& a, const Value& b) {
    if (a.storage_.index() != b.storage_.index()) return false;
    if (const Error* error = a.asError()) return *error == *b.asError();
    return std::visit(
        [&](const auto& left) { return left == std::get<std::decay_t<decltype(left)>>(b.storage_); }, a.storage_);
}

bool operator==(const Dictionary& a, const Dictionary& b) { return a.entries() == b.entries(); }

namespace {

struct Describer {
    std::string operator()(std::monostate) const { return "(null)"; }
    std::string operator()(bool value) const { return value ? "1" : "0"; }
    std::string operator()(std::int64_t value) const { return std::to_string(value); }
    std::string operator()(std::uint64_t value) const { return std::to_string(value); }
    std::string operator()(double value) const {
        char text[64];
        std::snprintf(text, sizeof text, "%g", value);
        return text;
    }
    std::string operator()(const std::string& value) const { return '"' + value + '"'; }
    std::string operator()(const Data& value) const { return "<" + std::to_string(value.size()) + " bytes>"; }
    std::string operator()(Date value) const { return "date " + (*this)(value.secondsSince1970); }
    std::string operator()(const URL& value) const { return value.text(); }
    std::string operator()(const Array& value) const {
        std::string text = "(";
        for (const Value& item : value) text += (text.size() > 1 ? ", " : "") + describe(item);
        return text + ")";
    }
    std::string operator()(const Dictionary& value) const {
        std::string text = "{";
        for (const auto& [key, item] : value.entries()) text += '"' + key + "\" = " + describe(item) + "; ";
        return text + "}";
    }
    std::string operator()(const Value::ErrorRef& value) const { return describe(*value); }
    std::string operator()(const Value::EndpointRef&) const { return "<endpoint>"; }
    std::string operator()(const Value::PlaneRef&) const { return "<shared plane>"; }
};

}  // namespace

std::string describe(const Value& value) { return std::visit(Describer{}, value.storage()); }

std::string describe(const Error& error) {
    return "Error " + error.domain() + " " + std::to_string(error.code()) + " " + Describer{}(error.userInfo());
}

}  // namespace lumacast
