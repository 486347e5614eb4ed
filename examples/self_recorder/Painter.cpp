#include "examples/self_recorder/Painter.h"

#include <sys/timerfd.h>
#include <unistd.h>

#include <algorithm>
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
    : loop_(loop),
      window_(window),
      motion_(options.motion),
      still_(options.still),
      interval_(kSecond / options.framesPerSecond),
      marks_(options.markEvery, interval_),
      onMark_(options.onMark) {
    if (!options.framesLog.empty()) {
        log_.reset(std::fopen(options.framesLog.c_str(), "we"));
        if (!log_) error_ = "can't write " + options.framesLog + ": " + std::strerror(errno);
    }
    if (error_.empty()) startTimer();
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

void Painter::startTimer() {
    timer_ = UniqueFd(::timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC));
    tickAt_ = hostTime();
    const timespec interval{interval_ / kSecond, interval_ % kSecond};
    const itimerspec steady{interval, {(tickAt_ + interval_) / kSecond, (tickAt_ + interval_) % kSecond}};
    if (!timer_.valid() || ::timerfd_settime(timer_.get(), TFD_TIMER_ABSTIME, &steady, nullptr) != 0)
        error_ = std::string("no timer: ") + std::strerror(errno);
}

void Painter::tick() {
    std::uint64_t ticks = 0;
    if (::read(timer_.get(), &ticks, sizeof ticks) != sizeof ticks) return;
    tickAt_ += static_cast<std::int64_t>(ticks) * interval_;
    // Ticks missed are left out; drawing never tries to catch up. A still painter draws its very first frame.
    if (still_ && drawnNumber_ != 0) return;
    if (window_.busy() || !window_.mapped()) return;
    const std::uint32_t number = drawnNumber_ + 1;
    // The sound is due when the frame can be seen, not when its drawing begins.
    if (const auto mark = marks_.tick(tickAt_, number); mark && onMark_) onMark_(*mark + showingTakes_);
    isFirstMarked_ = drawnMark_ == scene::Mark::None && marks_.isMarked(tickAt_);
    draw(number, marks_.isMarked(tickAt_) ? scene::Mark::Border : scene::Mark::None);
}

void Painter::redraw() {
    scene_.reset();  // the next frame is drawn whole
    // A moving scene repairs itself with that frame; a still one shows its last frame again.
    if (!still_ || drawnNumber_ == 0 || !window_.mapped()) return;
    redrawWhenShown_ = window_.busy();
    if (!redrawWhenShown_) draw(drawnNumber_, drawnMark_);
}

void Painter::draw(std::uint32_t number, scene::Mark mark) {
    const scene::Picture picture = window_.picture();
    if (picture.width < scene::kMinimumWidth || picture.height < scene::kMinimumHeight) return;
    if (!scene_) scene_ = std::make_unique<scene::Scene>(picture.width, picture.height, motion_);
    const auto changed = scene_->draw(picture, number, localTime(), mark);
    drawnNumber_ = number;
    drawnMark_ = mark;
    sentAt_ = hostTime();
    window_.put(changed);
}

void Painter::shown() {
    if (shownNumber_ != drawnNumber_) {
        shownNumber_ = drawnNumber_;
        const std::int64_t now = hostTime();
        // An eighth of what is new: one frame that was held up does not count for much.
        const std::int64_t took = std::min(now - tickAt_, interval_);
        showingTakes_ = showingTakes_ == 0 ? took : showingTakes_ + (took - showingTakes_) / 8;
        if (log_) {
            std::fprintf(log_.get(), "%" PRIu32 " %" PRId64 " %" PRId64 "%s\n", shownNumber_, now, sentAt_,
                         isFirstMarked_ ? " mark" : "");
            std::fflush(log_.get());
        }
    }
    if (redrawWhenShown_) redraw();
}

}  // namespace lumacast::example
