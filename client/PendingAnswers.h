#pragma once
#include <cstdint>
#include <functional>
#include <map>
#include <utility>

#include "base/Value.h"

namespace lumacast::client {

/// The questions that have not been answered. Each is answered once, whatever happens: an answer takes the question out
/// first, so that a second one finds nothing. On the library's thread.
class PendingAnswers {
public:
    /// `error` is null for an answer of the daemon's, whose values are then what the message declares.
    using Answered = std::function<void(const Error* error, const Array& values)>;

    std::uint64_t add(Answered answered) {
        pending_.emplace(++last_, std::move(answered));
        return last_;
    }

    void answer(std::uint64_t question, const Array& values) { finish(question, nullptr, values); }
    void fail(std::uint64_t question, const Error& error) { finish(question, &error, {}); }

    /// Answers all that were asked up to now; those that an answer's handler asks in turn stay.
    void failAll(const Error& error) {
        for (const std::uint64_t last = last_; !pending_.empty() && pending_.begin()->first <= last;)
            fail(pending_.begin()->first, error);
    }

    bool empty() const { return pending_.empty(); }

private:
    void finish(std::uint64_t question, const Error* error, const Array& values) {
        const auto found = pending_.find(question);
        if (found == pending_.end()) return;
        const Answered answered = std::move(found->second);
        pending_.erase(found);
        answered(error, values);
    }

    std::uint64_t last_ = 0;
    std::map<std::uint64_t, Answered> pending_;
};

}  // namespace lumacast::client
