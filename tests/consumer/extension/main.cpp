// The smallest upload extension: keeps every clip of a broadcast in a folder.

// [extension]
#include <fcntl.h>
#include <sys/sendfile.h>

#include <string>

#include "client/extension/Extension.h"

using namespace lumacast;

/// Copies clips into the folder that the broadcasting application names: clip-1.mp4, clip-2.mp4, ...
class ClipKeeper final : public extension::Handler {
    void clip(extension::Clip clip) override {
        const Value* folder = clip.userInfo ? clip.userInfo->find("directory") : nullptr;
        const std::string* path = folder ? folder->as<std::string>() : nullptr;
        if (!path) return clip.answer.fail(Error("org.example.clip-keeper", 1));
        const std::string name = *path + "/clip-" + std::to_string(clip.number) + ".mp4";
        const Fd copy(::open(name.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
        ssize_t sent = 0;
        do sent = ::sendfile(copy.get(), clip.movie.get(), nullptr, 1 << 20);
        while (sent > 0);
        if (sent < 0) return clip.answer.fail(Error("org.example.clip-keeper", 2));
        if (clip.number > 1) return;
        // Shorter clips from now on, and a word to the application.
        extension::BroadcastConfiguration configuration;
        configuration.clipDuration = 2;
        clip.answer.setConfiguration(configuration);
        clip.answer.setServiceInfo({{"state", "keeping clips"}});
    }  // here the clip is answered, and the daemon removes its own file
};

int main() {
    ClipKeeper keeper;
    return extension::run(keeper);
}
// [/extension]
