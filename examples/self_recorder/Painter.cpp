#include "examples/self_recorder/Painter.h"

#include <sys/timerfd.h>
#include <unistd.h>

#include <cerrno>
#include <cinttypes>
#include <cstring>
#include <ctime>

namespace lumacast::example {
namespace {

constexpr std::int64_t kSecond = 1'000'000'000;

std::int64_t hostTime() {
    timespec now{};
    ::clock_gettime(CLOCK_MONOTONIC, &now);
    return now.tv_sec * kSecond + now.tv_nsec;
}

scene::WallTime localTime() {
    timespec now{};
    ::clock_gettime(CLOCK_REALTIME, &now);
    std::tm fields{};
    ::localtime_r(&now.tv_sec, &fields);
    return {fields.tm_hour, fields.tm_min, fields.tm_sec, static_cast<int>(now.tv_nsec / 1'000'000)};
}

}  // namespace

Painter::Painter(Loop& loop, SceneWindow& window, const Options& options)
    : loop_(loop), window_(window), motion_(options.motion), still_(options.still) {
    if (!options.framesLog.empty()) {
        log_.reset(std::fopen(options.framesLog.c_str(), "we"));
        if (!log_) error_ = "can't write " + options.framesLog + ": " + std::strerror(errno);
    }
    if (error_.empty()) startTimer(options.framesPerSecond);
    if (!error_.empty()) return;
    window_.events.shown = [this] { shown(); };
    window_.events.exposed = [this] { redraw(); };
    window_.events.resized = [this] { redraw(); };
    loop_.watch(timer_.get(), [this] { tick(); });
}

Painter::~Painter() {
    if (timer_.valid()) loop_.unwatch(timer_.get());
    window_.events = {};
}

void Painter::startTimer(int framesPerSecond) {
    timer_ = UniqueFd(::timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC));
    const timespec interval{framesPerSecond == 1 ? 1 : 0, framesPerSecond == 1 ? 0 : kSecond / framesPerSecond};
    const itimerspec steady{interval, interval};
    if (!timer_.valid() || ::timerfd_settime(timer_.get(), 0, &steady, nullptr) != 0)
        error_ = std::string("no timer: ") + std::strerror(errno);
}

void Painter::tick() {
    std::uint64_t ticks = 0;
    if (::read(timer_.get(), &ticks, sizeof ticks) != sizeof ticks) return;
    // Ticks missed are left out; drawing never tries to catch up. A still painter draws its very first frame.
    if (still_ && drawnNumber_ != 0) return;
    if (window_.busy() || !window_.mapped()) return;
    draw(drawnNumber_ + 1);
}

void Painter::redraw() {
    scene_.reset();  // the next frame is drawn whole
    // A moving scene repairs itself with that frame; a still one shows its last frame again.
    if (!still_ || drawnNumber_ == 0 || !window_.mapped()) return;
    redrawWhenShown_ = window_.busy();
    if (!redrawWhenShown_) draw(drawnNumber_);
}

void Painter::draw(std::uint32_t number) {
    const scene::Picture picture = window_.picture();
    if (picture.width < scene::kMinimumWidth || picture.height < scene::kMinimumHeight) return;
    if (!scene_) scene_ = std::make_unique<scene::Scene>(picture.width, picture.height, motion_);
    const auto changed = scene_->draw(picture, number, localTime());
    drawnNumber_ = number;
    sentAt_ = hostTime();
    window_.put(changed);
}

void Painter::shown() {
    if (shownNumber_ != drawnNumber_) {
        shownNumber_ = drawnNumber_;
        if (log_) {
            std::fprintf(log_.get(), "%" PRIu32 " %" PRId64 " %" PRId64 "\n", shownNumber_, hostTime(), sentAt_);
            std::fflush(log_.get());
        }
    }
    if (redrawWhenShown_) redraw();
}

}  // namespace lumacast::example
