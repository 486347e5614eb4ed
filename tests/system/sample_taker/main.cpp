// An upload extension that notes what it gets, a line each, in "samples.log" of its home:
//   started | paused | resumed | finished | ended
//   frame NUMBER PTS ARRIVED INODE     nanoseconds; the number that the picture shows, 0 when it can't be read
//   sound SOURCE FRAMES PTS            source 2 application, 3 microphone
// The broadcast's user info may say "slow" (milliseconds for each frame) and "view" (an address to report).

#include <sys/stat.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <thread>
#include <vector>

#include "client/extension/Extension.h"
#include "examples/scene/FramePattern.h"

namespace {

using namespace lumacast;

/// The number that the scene shows in a picture; the green of a pixel will do for its brightness.
std::uint32_t numberIn(const SharedPlane& plane) {
    const auto pixels = plane.pixels();
    const auto width = static_cast<std::size_t>(plane.width()), height = static_cast<std::size_t>(plane.height());
    std::vector<std::uint8_t> luma(width * height);
    for (std::size_t y = 0; y < height; ++y)
        for (std::size_t x = 0; x < width; ++x) luma[y * width + x] = pixels[y * plane.stride() + 4 * x + 1];
    return scene::readFrameNumber(luma.data(), plane.width(), plane.height(), width).value_or(0);
}

std::string textIn(const Dictionary& info, const char* key) {
    const Value* value = info.find(key);
    const std::string* text = value ? value->as<std::string>() : nullptr;
    return text ? *text : std::string();
}

class Taker final : public extension::Handler {
public:
    explicit Taker(std::FILE* log) : log_(log) {}

    void connected(extension::Broadcast& broadcast) override { broadcast_ = &broadcast; }
    void started(std::optional<Dictionary> info, extension::Completion) override {
        note("started");
        if (!info) return;
        slowness_ = std::chrono::milliseconds(std::atoi(textIn(*info, "slow").c_str()));
        if (const auto view = textIn(*info, "view"); !view.empty()) broadcast_->updateBroadcastURL(URL(view));
        broadcast_->updateServiceInfo({{"state", "taking samples"}});
    }
    void paused(extension::Completion) override { note("paused"); }
    void resumed(extension::Completion) override { note("resumed"); }
    void finished(extension::Completion) override { note("finished"); }
    void ended() override { note("ended"); }
    void frame(extension::Frame frame) override {
        const auto arrived = std::chrono::steady_clock::now().time_since_epoch();
        struct stat memory {};
        ::fstat(frame.plane->descriptor(), &memory);
        std::this_thread::sleep_for(slowness_);
        std::fprintf(log_, "frame %u %lld %lld %llu\n", numberIn(*frame.plane),
                     static_cast<long long>(frame.timing.presentation.seconds() * 1e9),
                     static_cast<long long>(std::chrono::nanoseconds(arrived).count()),
                     static_cast<unsigned long long>(memory.st_ino));
        std::fflush(log_);
    }
    void sound(extension::Sound sound) override {
        std::fprintf(log_, "sound %d %lld %lld\n", sound.source == extension::Sound::Source::Application ? 2 : 3,
                     static_cast<long long>(sound.frames),
                     static_cast<long long>(sound.timing.presentation.seconds() * 1e9));
    }

private:
    void note(const char* what) {
        std::fprintf(log_, "%s\n", what);
        std::fflush(log_);
    }

    std::FILE* const log_;
    extension::Broadcast* broadcast_ = nullptr;
    std::chrono::milliseconds slowness_{0};
};

}  // namespace

int main() {
    const char* home = std::getenv("HOME");
    std::FILE* log = std::fopen((std::string(home ? home : ".") + "/samples.log").c_str(), "a");
    if (!log) return 1;
    Taker taker(log);
    return lumacast::extension::run(taker);
}
