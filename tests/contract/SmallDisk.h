#pragma once
#include <sched.h>
#include <sys/mount.h>

#include <cerrno>
#include <cstring>
#include <functional>
#include <string>
#include <thread>

#include <gtest/gtest.h>

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

}  // namespace lumacast
