#include "support/FileRemovals.h"

#include <cerrno>
#include <utility>

namespace lumacast {

namespace {

/// Paths that name the same place are the same: files are addressed with a doubled slash here and a single one there.
std::string keyOf(const std::string& path) {
    std::string key;
    for (const char c : path)
        if (c != '/' || !key.ends_with('/')) key += c;
    return key;
}

/// Nothing is there: told from a disk that does not answer.
bool saysNothingIsThere(const Error& error) {
    return error.domain() == kSystemErrorDomain && (error.code() == ENOENT || error.code() == ENOTDIR);
}

}  // namespace

bool FileRemovals::isSamePath(const std::string& path, const std::string& other) { return keyOf(path) == keyOf(other); }

void FileRemovals::remove(std::string path, std::optional<std::uint64_t> claim, Completion completion,
                          std::optional<UserID> user) {
    const std::string key = keyOf(path);
    bool isFirst = false;
    {
        const std::lock_guard lock(mutex_);
        // Until its turn: whoever writes there now may have gone by then, and its file is still not the removal's.
        if (claim) ++claims_[key].remembered;
        const auto [place, isNew] = waiting_.try_emplace(key);
        place->second.push_back({std::move(path), claim, std::move(completion), user});
        isFirst = isNew && makeReady(key);
    }
    if (isFirst) submitTask();
}

bool FileRemovals::makeReady(const std::string& key) {
    ready_.push_back(key);
    if (tasks_ == kMaximumAtATime) return false;
    ++tasks_;
    return true;
}

void FileRemovals::submitTask() {
    background_.async([self = shared_from_this()] { self->work(); });
}

void FileRemovals::work() {
    for (;;) {
        std::string key;
        {
            Removal next;
            {
                const std::lock_guard lock(mutex_);
                if (ready_.empty()) {
                    --tasks_;
                    return;
                }
                key = std::move(ready_.front());
                ready_.pop_front();
                auto& ofThisPath = waiting_.at(key);
                next = std::move(ofThisPath.front());
                ofThisPath.pop_front();
            }
            auto error = perform(key, next);
            if (next.completion) next.completion(std::move(error));
        }  // what the completion held ends here, before the path's next removal
        const std::lock_guard lock(mutex_);
        const auto place = waiting_.find(key);
        if (place->second.empty())
            waiting_.erase(place);
        else
            ready_.push_back(key);  // behind the other paths
    }
}

std::optional<Error> FileRemovals::perform(const std::string& key, const Removal& removal) {
    if (removal.claim) {
        const std::lock_guard lock(mutex_);
        const bool isLaterOnes = isClaimedAfterLocked(key, *removal.claim);
        --claims_.at(key).remembered;
        forgetIfUnused(key);
        if (isLaterOnes) return std::nullopt;
    }
    auto error =
        removal.user ? fileSystem_.removeForUser(*removal.user, removal.path) : fileSystem_.remove(removal.path);
    if (error && saysNothingIsThere(*error)) return std::nullopt;
    // Deliberately another prefix than the operation's.
    if (error) log_.line("_lxRemoveFile error: %i", error->code());
    return error;
}

std::uint64_t FileRemovals::claim(const std::string& path) {
    const std::lock_guard lock(mutex_);
    Claims& claims = claims_[keyOf(path)];
    claims.held.insert(++lastClaim_);
    return claims.latest = lastClaim_;
}

std::uint64_t FileRemovals::lastClaim() const {
    const std::lock_guard lock(mutex_);
    return lastClaim_;
}

std::shared_ptr<void> FileRemovals::holdClaim(const std::string& path, std::uint64_t claim) {
    return {static_cast<void*>(this), [self = shared_from_this(), key = keyOf(path), claim](void*) {
                const std::lock_guard lock(self->mutex_);
                const auto found = self->claims_.find(key);
                if (found == self->claims_.end()) return;
                found->second.held.erase(claim);
                self->forgetIfUnused(key);
            }};
}

std::shared_ptr<void> FileRemovals::rememberClaims(const std::string& path) {
    const std::string key = keyOf(path);
    const std::lock_guard lock(mutex_);
    ++claims_[key].remembered;
    return {static_cast<void*>(this), [self = shared_from_this(), key](void*) {
                const std::lock_guard releaseLock(self->mutex_);
                --self->claims_[key].remembered;
                self->forgetIfUnused(key);
            }};
}

void FileRemovals::forgetIfUnused(const std::string& key) {
    const auto found = claims_.find(key);
    if (found->second.held.empty() && found->second.remembered == 0) claims_.erase(found);
}

std::size_t FileRemovals::claimedPathCount() const {
    const std::lock_guard lock(mutex_);
    return claims_.size();
}

bool FileRemovals::isClaimedAfter(const std::string& path, std::uint64_t claim) const {
    const std::lock_guard lock(mutex_);
    return isClaimedAfterLocked(keyOf(path), claim);
}

bool FileRemovals::isClaimedAfterLocked(const std::string& key, std::uint64_t claim) const {
    const auto found = claims_.find(key);
    return found != claims_.end() && found->second.latest > claim;
}

std::shared_ptr<void> FileRemovals::takeTurn(const std::string& path, std::uint64_t lastClaim) {
    const std::string key = keyOf(path);
    const std::lock_guard lock(mutex_);
    if (isClaimedAfterLocked(key, lastClaim)) return nullptr;
    const bool hasTheTurn = waiting_.try_emplace(key).second;
    return {static_cast<void*>(this), [self = shared_from_this(), key, hasTheTurn](void*) {
                if (hasTheTurn) self->endTurn(key);
            }};
}

void FileRemovals::endTurn(const std::string& key) {
    bool needsTask = false;
    {
        const std::lock_guard lock(mutex_);
        const auto place = waiting_.find(key);
        if (place->second.empty())
            waiting_.erase(place);
        else
            needsTask = makeReady(key);
    }
    if (needsTask) submitTask();
}

}  // namespace lumacast
