#pragma once
#include <cerrno>
#include <functional>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "platform/PhotoLibrary.h"
#include "tests/fakes/FakeError.h"
#include "tests/fakes/FakeFileSystem.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {

/// Movies in a list. A failing call ("PhotoLibrary.addVideo") is a full disk; a movie that is not in the FakeFileSystem
/// is ENOENT. It can act for every user but kNoUser. Thread-safe; waits only where the test makes it.
class FakePhotoLibrary final : public PhotoLibrary {
public:
    struct Asset {
        URL movie;  ///< what it is a copy of
        URL file;   ///< where it is
        UserID user{};
        std::shared_ptr<const FakeMovie> content;
    };

    FakePhotoLibrary(FakeFileSystem& files, FaultPlan& faults) : files_(files), faults_(faults) {}

    Result<URL> addVideo(const URL& movie, UserID user) override {
        if (faults_.fails("PhotoLibrary.addVideo")) return fakeSystemError(ENOSPC);
        if (!movie.path().starts_with('/')) return fakeSystemError(EINVAL);
        if (user == kNoUser) return fakeSystemError(EPERM);
        if (!files_.isThere(movie.path())) return fakeSystemError(ENOENT);
        if (files_.isFolder(movie.path())) return fakeSystemError(EISDIR);
        auto content = files_.movie(movie.path());
        if (whenCopying_) whenCopying_(movie);
        const std::lock_guard lock(mutex_);
        if (isReadOnly_) return fakeSystemError(EACCES);
        const URL file("file:///library/" + std::to_string(assets_.size() + 1) + ".mp4");
        assets_.push_back({movie, file, user, std::move(content)});
        return file;
    }
    /// Called with each movie that was found and is being copied, on the lane that adds it: a copy that takes as long as
    /// that does. Set before the lanes run.
    void setWhenCopying(std::function<void(const URL&)> copying) { whenCopying_ = std::move(copying); }
    /// From now on nothing can be written into it.
    void takeRightsAway() {
        const std::lock_guard lock(mutex_);
        isReadOnly_ = true;
    }
    std::vector<Asset> assets() const {
        const std::lock_guard lock(mutex_);
        return assets_;
    }

private:
    FakeFileSystem& files_;
    FaultPlan& faults_;
    std::function<void(const URL&)> whenCopying_;
    mutable std::mutex mutex_;
    std::vector<Asset> assets_;
    bool isReadOnly_ = false;
};

}  // namespace lumacast
