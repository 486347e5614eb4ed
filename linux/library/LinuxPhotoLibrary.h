#pragma once
#include <time.h>

#include <string>

#include "linux/library/CopyBytes.h"
#include "linux/library/NewFile.h"
#include "linux/system/UserRights.h"
#include "platform/PhotoLibrary.h"

namespace lumacast {

/// The folder Lumacast in the user's Videos folder. Each movie is copied on a thread of its own, at low priority, with
/// the rights of the user; any number at a time. EPERM for a user this process can't act for; EINVAL for what is not a
/// file URL; what is not a regular file, or is reached through somebody else's link, is refused (EACCES, ELOOP). Its
/// name has the local time of the movie's last change.
class LinuxPhotoLibrary final : public PhotoLibrary {
public:
    struct Options {
        std::string home;             ///< of this process's user
        std::string configHome;       ///< the same user's; another one's is ~/.config
        std::string videosDirectory;  ///< $XDG_VIDEOS_DIR of this process; empty for none
        AccountLookup accounts = systemAccount;
        // What is tried first; tests take the detours.
        Unseen unseen = Unseen::WithoutName;
        CopyBy copyBy = CopyBy::Clone;
    };
    explicit LinuxPhotoLibrary(Options options);

    Result<URL> addVideo(const URL& movie, UserID user) override;

    /// Removes from this user's own library what a process that was killed has left there: hidden files of saves that
    /// began before this object was made. Makes no folder. Blocks as long as the disk does.
    void removeUnfinished();

private:
    const Options options_;
    const timespec start_;
};

}  // namespace lumacast
