#pragma once
#include <map>
#include <mutex>
#include <string>
#include <utility>

#include "platform/Preferences.h"

namespace lumacast {

/// Preferences in memory; what the test sets is answered from the next question on. Thread-safe.
class FakePreferences final : public Preferences {
public:
    std::optional<Value> value(std::string_view domain, std::string_view key) const override {
        const std::lock_guard lock(mutex_);
        const auto found = values_.find({std::string(domain), std::string(key)});
        return found == values_.end() ? std::nullopt : std::optional(found->second);
    }

    void set(std::string_view domain, std::string_view key, Value value) {
        const std::lock_guard lock(mutex_);
        values_.insert_or_assign({std::string(domain), std::string(key)}, std::move(value));
    }
    void erase(std::string_view domain, std::string_view key) {
        const std::lock_guard lock(mutex_);
        values_.erase({std::string(domain), std::string(key)});
    }

private:
    mutable std::mutex mutex_;
    std::map<std::pair<std::string, std::string>, Value> values_;
};

}  // namespace lumacast
