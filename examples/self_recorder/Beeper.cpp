#include "examples/self_recorder/Beeper.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <ctime>
#include <numbers>
#include <string>

#include "examples/self_recorder/CommandTable.h"

namespace lumacast::example {
namespace {

constexpr int kRate = 48'000;
constexpr int kChannels = 2;
constexpr std::int64_t kToneFrames = kRate / 20;  // 50 ms
constexpr std::int64_t kFadeFrames = kRate / 500;  // only at the end: it begins sharply
constexpr float kAmplitude = 0.4F;
constexpr pa_usec_t kAhead = 30'000;      // what is kept written
constexpr pa_usec_t kAtATime = 5'000;     // what is asked for
constexpr pa_usec_t kAgainAfter = 500'000;

std::int64_t hostTime() {
    timespec now{};
    ::clock_gettime(CLOCK_MONOTONIC, &now);
    return now.tv_sec * 1'000'000'000LL + now.tv_nsec;
}

constexpr std::uint32_t bytesOf(pa_usec_t time) {
    return static_cast<std::uint32_t>(time * kRate / 1'000'000 * kChannels * sizeof(float));
}

}  // namespace

struct Beeper::Lock {
    explicit Lock(pa_threaded_mainloop* theLoop) : loop(theLoop) { pa_threaded_mainloop_lock(loop); }
    ~Lock() { pa_threaded_mainloop_unlock(loop); }
    Lock(const Lock&) = delete;
    Lock& operator=(const Lock&) = delete;
    pa_threaded_mainloop* loop;
};

Beeper::Beeper(double frequency, bool steady) : frequency_(frequency), steady_(steady), loop_(pa_threaded_mainloop_new()) {
    if (!loop_ || pa_threaded_mainloop_start(loop_.get()) < 0) {
        loop_.reset();
        complain("no thread for the sound");
        return;
    }
    const Lock lock(loop_.get());
    connect();
}

Beeper::~Beeper() {
    if (!loop_) return;
    {
        const Lock lock(loop_.get());
        disconnect();
        if (again_) pa_threaded_mainloop_get_api(loop_.get())->time_free(again_);
    }
    pa_threaded_mainloop_stop(loop_.get());
}

void Beeper::complain(const char* what) {
    if (!hasComplained_) std::fprintf(stderr, "self_recorder: no beeps for now: %s\n", what);
    hasComplained_ = true;
}

void Beeper::playAt(std::int64_t hostTime) {
    if (!loop_) return;
    const Lock lock(loop_.get());
    due_.push_back(hostTime);
}

Beeper::Report Beeper::report() const {
    if (!loop_) return {};
    const Lock lock(loop_.get());
    return report_;
}

void Beeper::connect() {
    context_ = pa_context_new(pa_threaded_mainloop_get_api(loop_.get()), "self recorder");
    if (!context_) return complain("out of memory");
    pa_context_set_state_callback(context_, [](pa_context*, void* me) { static_cast<Beeper*>(me)->contextChanged(); },
                                  this);
    if (pa_context_connect(context_, nullptr, PA_CONTEXT_NOAUTOSPAWN, nullptr) < 0) {
        complain(pa_strerror(pa_context_errno(context_)));
        reconnectLater();
    }
}

void Beeper::disconnect() {
    if (stream_) {
        pa_stream_set_state_callback(stream_, nullptr, nullptr);
        pa_stream_set_write_callback(stream_, nullptr, nullptr);
        pa_stream_set_underflow_callback(stream_, nullptr, nullptr);
        pa_stream_disconnect(stream_);
        pa_stream_unref(stream_);
        stream_ = nullptr;
    }
    if (context_) {
        pa_context_set_state_callback(context_, nullptr, nullptr);
        pa_context_disconnect(context_);
        pa_context_unref(context_);
        context_ = nullptr;
    }
}

void Beeper::reconnectLater() {
    // Not from within the callback of what is to be taken down.
    pa_mainloop_api* const api = pa_threaded_mainloop_get_api(loop_.get());
    timeval when{};
    pa_timeval_add(pa_gettimeofday(&when), kAgainAfter);
    if (again_) {
        api->time_restart(again_, &when);
        return;
    }
    again_ = api->time_new(
        api, &when,
        [](pa_mainloop_api*, pa_time_event*, const timeval*, void* me) {
            static_cast<Beeper*>(me)->disconnect();
            static_cast<Beeper*>(me)->connect();
        },
        this);
}

void Beeper::contextChanged() {
    switch (pa_context_get_state(context_)) {
        case PA_CONTEXT_READY: openStream(); break;
        case PA_CONTEXT_FAILED:
        case PA_CONTEXT_TERMINATED:
            complain(pa_strerror(pa_context_errno(context_)));
            reconnectLater();
            break;
        default: break;
    }
}

void Beeper::streamChanged() {
    if (pa_stream_get_state(stream_) != PA_STREAM_FAILED) return;
    complain(pa_strerror(pa_context_errno(context_)));
    reconnectLater();
}

void Beeper::openStream() {
    const pa_sample_spec format{PA_SAMPLE_FLOAT32NE, kRate, kChannels};
    stream_ = pa_stream_new(context_, "beeps", &format, nullptr);
    if (!stream_) return complain(pa_strerror(pa_context_errno(context_)));
    written_ = 0;
    begins_.clear();
    pa_stream_set_state_callback(stream_, [](pa_stream*, void* me) { static_cast<Beeper*>(me)->streamChanged(); },
                                 this);
    pa_stream_set_write_callback(
        stream_, [](pa_stream*, std::size_t bytes, void* me) { static_cast<Beeper*>(me)->write(bytes); }, this);
    pa_stream_set_underflow_callback(
        stream_, [](pa_stream*, void* me) { ++static_cast<Beeper*>(me)->report_.underflows; }, this);
    const pa_buffer_attr buffer{static_cast<std::uint32_t>(-1), bytesOf(kAhead), 0, bytesOf(kAtATime),
                                static_cast<std::uint32_t>(-1)};
    constexpr auto kFlags = static_cast<pa_stream_flags_t>(PA_STREAM_INTERPOLATE_TIMING | PA_STREAM_AUTO_TIMING_UPDATE |
                                                           PA_STREAM_ADJUST_LATENCY);
    if (pa_stream_connect_playback(stream_, nullptr, &buffer, kFlags, nullptr, nullptr) < 0) {
        complain(pa_strerror(pa_context_errno(context_)));
        reconnectLater();
    }
}

void Beeper::placeTones(std::int64_t frames) {
    if (due_.empty()) return;
    pa_usec_t latency = 0;
    int isNegative = 0;
    if (pa_stream_get_latency(stream_, &latency, &isNegative) < 0) return;  // not known yet
    const std::int64_t heardAt = hostTime() + (isNegative ? -1 : 1) * static_cast<std::int64_t>(latency) * 1000;
    while (!due_.empty()) {
        const auto offset = static_cast<std::int64_t>(std::llround(static_cast<double>(due_.front() - heardAt) * kRate / 1e9));
        if (offset >= frames) return;  // the next time is early enough
        due_.pop_front();
        if (offset <= -kToneFrames) {
            ++report_.leftOut;
            continue;
        }
        ++report_.played;
        if (offset < 0) ++report_.late;
        begins_.push_back(written_ + std::max<std::int64_t>(0, offset));
    }
}

void Beeper::render(float* samples, std::int64_t frames) const {
    for (std::int64_t frame = 0; frame < frames; ++frame) {
        const double turns = std::fmod(frequency_ * static_cast<double>(written_ + frame) / kRate, 1.0);
        const float value = steady_ ? kAmplitude * static_cast<float>(std::sin(2 * std::numbers::pi * turns)) : 0.0F;
        std::fill_n(samples + frame * kChannels, kChannels, value);
    }
    for (const std::int64_t begin : begins_) {
        const std::int64_t first = std::max<std::int64_t>(0, begin - written_);
        const std::int64_t end = std::min(frames, begin + kToneFrames - written_);
        for (std::int64_t frame = first; frame < end; ++frame) {
            const std::int64_t place = written_ + frame - begin;
            const double fade = std::min(1.0, static_cast<double>(kToneFrames - place) / kFadeFrames);
            // A cosine is loud at once.
            const double angle = 2 * std::numbers::pi * frequency_ * static_cast<double>(place) / kRate;
            const auto value = static_cast<float>(kAmplitude * fade * std::cos(angle));
            for (int channel = 0; channel < kChannels; ++channel) samples[frame * kChannels + channel] += value;
        }
    }
}

void Beeper::write(std::size_t bytes) {
    while (bytes > 0) {
        void* space = nullptr;
        std::size_t size = bytes;
        if (pa_stream_begin_write(stream_, &space, &size) < 0 || !space) return;
        const auto frames = static_cast<std::int64_t>(size / (kChannels * sizeof(float)));
        if (frames == 0) {
            pa_stream_cancel_write(stream_);
            return;
        }
        size = static_cast<std::size_t>(frames) * kChannels * sizeof(float);
        placeTones(frames);
        render(static_cast<float*>(space), frames);
        if (pa_stream_write(stream_, space, size, nullptr, 0, PA_SEEK_RELATIVE) < 0) return;
        written_ += frames;
        bytes -= std::min(bytes, size);
        std::erase_if(begins_, [this](std::int64_t begin) { return begin + kToneFrames <= written_; });
    }
}

void addBeepCommands(CommandTable& commands, const Beeper& beeper) {
    commands.add("beeps", "print what became of the beeps", [&beeper](const Arguments&, const Reply& reply) {
        const Beeper::Report report = beeper.report();
        reply("beeps " + std::to_string(report.played) + " late " + std::to_string(report.late) + " left-out " +
              std::to_string(report.leftOut) + " underflows " + std::to_string(report.underflows));
    });
}

}  // namespace lumacast::example
