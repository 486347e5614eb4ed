#pragma once
// What a test hears of a recorder.

#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "client/Recorder.h"

namespace lumacast::test {

/// Counts the answers to one question each, and keeps the last.
template <class Answer>
class Answers {
public:
    /// A handler for question `number`.
    std::function<void(Answer)> handler(std::size_t number = 0) {
        const std::lock_guard lock(held_->mutex);
        if (held_->counts.size() <= number) held_->counts.resize(number + 1);
        return [held = held_, number](Answer answer) {
            const std::lock_guard lock2(held->mutex);
            ++held->counts[number];
            held->last = std::move(answer);
        };
    }
    std::vector<int> counts() const {
        const std::lock_guard lock(held_->mutex);
        return held_->counts;
    }
    int total() const {
        int sum = 0;
        for (const int count : counts()) sum += count;
        return sum;
    }
    bool eachOnce() const {
        for (const int count : counts())
            if (count != 1) return false;
        return true;
    }
    Answer last() const {
        const std::lock_guard lock(held_->mutex);
        return held_->last;
    }

private:
    struct Held {
        mutable std::mutex mutex;
        std::vector<int> counts;
        Answer last;
    };
    std::shared_ptr<Held> held_ = std::make_shared<Held>();
};

/// "connected" and "disconnected", in the order they came.
class Comings {
public:
    client::Events events() {
        client::Events events;
        events.connected = [held = held_] { held->add("connected"); };
        events.disconnected = [held = held_] { held->add("disconnected"); };
        return events;
    }
    std::vector<std::string> all() const {
        const std::lock_guard lock(held_->mutex);
        return held_->words;
    }

private:
    struct Held {
        void add(const char* word) {
            const std::lock_guard lock(mutex);
            words.emplace_back(word);
        }
        std::mutex mutex;
        std::vector<std::string> words;
    };
    std::shared_ptr<Held> held_ = std::make_shared<Held>();
};

inline std::string keyIn(const std::optional<Error>& error) {
    return error ? std::string(client::keyOf(*error)) : std::string("no error");
}

}  // namespace lumacast::test
