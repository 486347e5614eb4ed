#pragma once
#include <cerrno>
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
/// is ENOENT. Thread-safe; never waits.
class FakePhotoLibrary final : public PhotoLibrary {
public:
    struct Asset {
        URL movie;  ///< what it is a copy of
        UserID user{};
        std::shared_ptr<const FakeMovie> content;
    };

    FakePhotoLibrary(FakeFileSystem& files, FaultPlan& faults) : files_(files), faults_(faults) {}

    Result<URL> addVideo(const URL& movie, UserID user) override {
        if (faults_.fails("PhotoLibrary.addVideo")) return fakeSystemError(ENOSPC);
        if (!files_.isThere(movie.path())) return fakeSystemError(ENOENT);
        const std::lock_guard lock(mutex_);
        assets_.push_back({movie, user, files_.movie(movie.path())});
        return URL("file:///library/" + std::to_string(assets_.size()) + ".mp4");
    }
    std::vector<Asset> assets() const {
        const std::lock_guard lock(mutex_);
        return assets_;
    }

private:
    FakeFileSystem& files_;
    FaultPlan& faults_;
    mutable std::mutex mutex_;
    std::vector<Asset> assets_;
};

}  // namespace lumacast
