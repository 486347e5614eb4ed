#pragma once
#include <gtest/gtest.h>
#include <sched.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/resource.h>

#include <functional>
#include <string>
#include <thread>

namespace lumacast {

/// Runs `action` on a thread that has a small file system of its own over `directory`, which only it and the threads it
/// starts see, and which ends with it. False where this process may not mount anything (it takes CAP_SYS_ADMIN); then
/// nothing ran.
inline bool withSmallDisk(const std::string& directory, const std::string& size, const std::function<void()>& action) {
    bool mounted = false;
    std::thread([&] {
        if (::unshare(CLONE_NEWNS) != 0) return;
        if (::mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0) return;
        if (::mount("tmpfs", directory.c_str(), "tmpfs", MS_NOSUID | MS_NODEV, ("size=" + size).c_str()) != 0) return;
        mounted = true;
        action();
    }).join();
    return mounted;
}

/// The most that a file of this process may grow to, for as long as this lives.
class SmallFilesOnly final {
public:
    explicit SmallFilesOnly(rlim_t bytes) : before_(::signal(SIGXFSZ, SIG_IGN)) {
        EXPECT_EQ(::getrlimit(RLIMIT_FSIZE, &limit_), 0);
        const rlimit small{bytes, limit_.rlim_max};
        EXPECT_EQ(::setrlimit(RLIMIT_FSIZE, &small), 0);
    }
    ~SmallFilesOnly() {
        ::setrlimit(RLIMIT_FSIZE, &limit_);
        ::signal(SIGXFSZ, before_);
    }
    SmallFilesOnly(const SmallFilesOnly&) = delete;
    SmallFilesOnly& operator=(const SmallFilesOnly&) = delete;

private:
    void (*before_)(int);
    rlimit limit_{};
};

}  // namespace lumacast
