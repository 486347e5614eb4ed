// A process that plays tones, as an application would, and does what it is told line by line on its standard input.
//   play NAME HZ AMPLITUDE CHANNELS [SINK]   a new stream (left channel only where AMPLITUDE is negative)
//   beep NAME                         40 ms of nearly full height in the stream; answered by "beep NAME N", the host
//                                     time at which its first frame is heard
//   cork NAME | uncork NAME | move NAME SINK | stop NAME
//   connect                           to the server, once more (or for the first time, with --later)
//   quit
// Each is answered by one line when it is done, "failed" where it could not be. It ends with its input. It begins with
// "ready PID", when it is connected. With --child a child of the process plays; with --claim PID it says that it is PID.

#include <pulse/pulseaudio.h>
#include <sys/prctl.h>
#include <time.h>
#include <unistd.h>

#include <cmath>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <iostream>
#include <map>
#include <memory>
#include <numbers>
#include <sstream>
#include <string>
#include <vector>

namespace {

constexpr std::uint32_t kRate = 48000;

std::int64_t hostTime() {
    timespec time{};
    clock_gettime(CLOCK_MONOTONIC, &time);
    return static_cast<std::int64_t>(time.tv_sec) * 1'000'000'000 + time.tv_nsec;
}

struct Voice {
    pa_stream* stream = nullptr;
    double frequency = 0, amplitude = 0;
    bool leftOnly = false;
    std::uint32_t channels = 2;
    std::uint64_t frame = 0;
    std::int64_t loudUntil = 0;
    std::int64_t beepFrame = 0;
    bool beepAsked = false;
    std::string name;
};

void reply(const std::string& line) {
    std::printf("%s\n", line.c_str());
    std::fflush(stdout);
}

/// Says when the beep's first frame is heard: when what is before it has been played.
void tellWhen(pa_stream* stream, int success, void* pointer) {
    const auto& voice = *static_cast<const Voice*>(pointer);
    const pa_timing_info* const timing = success != 0 ? pa_stream_get_timing_info(stream) : nullptr;
    if (!timing) return reply("failed");
    const auto frameBytes = static_cast<std::int64_t>(voice.channels * sizeof(float));
    const double left = static_cast<double>(voice.beepFrame - timing->read_index / frameBytes) / kRate;
    timeval wallTime{};
    const auto age = static_cast<std::int64_t>(pa_timeval_diff(pa_gettimeofday(&wallTime), &timing->timestamp));
    const std::int64_t heard = hostTime() + static_cast<std::int64_t>(left * 1e9) +
                               (static_cast<std::int64_t>(timing->sink_usec) - age) * 1000;
    reply("beep " + voice.name + " " + std::to_string(heard));
}

void fill(pa_stream* stream, std::size_t bytes, void* pointer) {
    auto& voice = *static_cast<Voice*>(pointer);
    const std::size_t frameBytes = voice.channels * sizeof(float);
    std::vector<float> samples(bytes / frameBytes * voice.channels);
    const bool isBeep = voice.beepAsked;
    voice.beepAsked = false;
    if (isBeep) {
        voice.beepFrame = static_cast<std::int64_t>(voice.frame);
        voice.loudUntil = voice.beepFrame + kRate / 25;
    }
    for (std::size_t frame = 0; frame < bytes / frameBytes; ++frame, ++voice.frame) {
        const bool isLoud = static_cast<std::int64_t>(voice.frame) < voice.loudUntil;
        const double value = (isLoud ? 0.9 : voice.amplitude) *
                             std::sin(2 * std::numbers::pi * voice.frequency * static_cast<double>(voice.frame) / kRate);
        for (std::uint32_t channel = 0; channel < voice.channels; ++channel)
            samples[frame * voice.channels + channel] = voice.leftOnly && channel > 0 ? 0.0f : static_cast<float>(value);
    }
    pa_stream_write(stream, samples.data(), samples.size() * sizeof(float), nullptr, 0, PA_SEEK_RELATIVE);
    // Asked now, the server has just taken what it asks to be replaced: PipeWire's account is exact only then.
    if (!isBeep) return;
    if (pa_operation* const operation = pa_stream_update_timing_info(stream, tellWhen, pointer))
        pa_operation_unref(operation);
    else
        reply("failed");
}

class Player {
public:
    explicit Player(std::string claimedPid) : loop_(pa_threaded_mainloop_new()), claimedPid_(std::move(claimedPid)) {
        pa_threaded_mainloop_start(loop_);
    }

    /// To the server, anew; what was played has ended with the connection before.
    bool connect() {
        pa_threaded_mainloop_lock(loop_);
        while (!voices_.empty()) stop(*voices_.begin()->second);
        if (context_) {
            pa_context_set_state_callback(context_, nullptr, nullptr);
            pa_context_disconnect(context_);
            pa_context_unref(context_);
        }
        pa_proplist* const properties = pa_proplist_new();
        if (!claimedPid_.empty()) pa_proplist_sets(properties, PA_PROP_APPLICATION_PROCESS_ID, claimedPid_.c_str());
        context_ = pa_context_new_with_proplist(pa_threaded_mainloop_get_api(loop_), "tone_player", properties);
        pa_proplist_free(properties);
        pa_context_set_state_callback(
            context_, [](pa_context*, void* loop) { pa_threaded_mainloop_signal(static_cast<pa_threaded_mainloop*>(loop), 0); },
            loop_);
        pa_context_connect(context_, nullptr, PA_CONTEXT_NOAUTOSPAWN, nullptr);
        while (PA_CONTEXT_IS_GOOD(pa_context_get_state(context_)) && pa_context_get_state(context_) != PA_CONTEXT_READY)
            pa_threaded_mainloop_wait(loop_);
        const bool isReady = pa_context_get_state(context_) == PA_CONTEXT_READY;
        pa_threaded_mainloop_unlock(loop_);
        return isReady;
    }

    /// False at the end.
    bool obey(const std::string& line) {
        std::istringstream words(line);
        std::string command, name;
        words >> command >> name;
        if (command == "quit") return false;
        if (command == "connect") {
            reply(connect() ? "connected" : "failed");
            return true;
        }
        pa_threaded_mainloop_lock(loop_);
        const bool done = command == "play" ? context_ && play(name, words) : voices_.count(name) != 0 && change(command, *voices_[name], words);
        pa_threaded_mainloop_unlock(loop_);
        if (command != "beep" || !done) reply(done ? command + " " + name : "failed");
        return true;
    }

private:
    bool play(const std::string& name, std::istringstream& words) {
        auto voice = std::make_unique<Voice>();
        words >> voice->frequency >> voice->amplitude >> voice->channels;
        voice->leftOnly = voice->amplitude < 0;
        voice->amplitude = std::abs(voice->amplitude);
        voice->name = name;
        std::string sink;
        words >> sink;
        const pa_sample_spec format{PA_SAMPLE_FLOAT32NE, kRate, static_cast<std::uint8_t>(voice->channels)};
        voice->stream = pa_stream_new(context_, name.c_str(), &format, nullptr);
        if (!voice->stream) return false;
        pa_stream_set_state_callback(
            voice->stream, [](pa_stream*, void* loop) { pa_threaded_mainloop_signal(static_cast<pa_threaded_mainloop*>(loop), 0); },
            loop_);
        pa_stream_set_write_callback(voice->stream, fill, voice.get());
        pa_buffer_attr buffer{};
        buffer.maxlength = buffer.prebuf = buffer.minreq = buffer.fragsize = static_cast<std::uint32_t>(-1);
        buffer.tlength = static_cast<std::uint32_t>(pa_usec_to_bytes(50'000, &format));
        const int flags = PA_STREAM_ADJUST_LATENCY | PA_STREAM_AUTO_TIMING_UPDATE | PA_STREAM_INTERPOLATE_TIMING;
        if (pa_stream_connect_playback(voice->stream, sink.empty() ? nullptr : sink.c_str(), &buffer,
                                       static_cast<pa_stream_flags_t>(flags), nullptr, nullptr) < 0)
            return false;
        while (PA_STREAM_IS_GOOD(pa_stream_get_state(voice->stream)) &&
               pa_stream_get_state(voice->stream) != PA_STREAM_READY)
            pa_threaded_mainloop_wait(loop_);
        const bool isReady = pa_stream_get_state(voice->stream) == PA_STREAM_READY;
        voices_[name] = std::move(voice);
        return isReady;
    }

    bool change(const std::string& command, Voice& voice, std::istringstream& words) {
        if (command == "beep") {
            voice.beepAsked = true;
            return true;
        }
        if (command == "cork" || command == "uncork")
            return finish(pa_stream_cork(voice.stream, command == "cork" ? 1 : 0, succeeded<pa_stream>, this));
        if (command == "move") {
            std::string sink;
            words >> sink;
            return finish(pa_context_move_sink_input_by_name(context_, pa_stream_get_index(voice.stream), sink.c_str(),
                                                             succeeded<pa_context>, this));
        }
        if (command != "stop") return false;
        stop(voice);
        return true;
    }

    void stop(const Voice& voice) {
        pa_stream_set_state_callback(voice.stream, nullptr, nullptr);
        pa_stream_set_write_callback(voice.stream, nullptr, nullptr);
        pa_stream_disconnect(voice.stream);
        pa_stream_unref(voice.stream);
        voices_.erase(std::string(voice.name));
    }

    template <class Of>
    static void succeeded(Of*, int success, void* self) {
        static_cast<Player*>(self)->success_ = success != 0;
        pa_threaded_mainloop_signal(static_cast<Player*>(self)->loop_, 0);
    }

    bool finish(pa_operation* operation) {
        if (!operation) return false;
        success_ = false;
        while (pa_operation_get_state(operation) == PA_OPERATION_RUNNING) pa_threaded_mainloop_wait(loop_);
        pa_operation_unref(operation);
        return success_;
    }

    pa_threaded_mainloop* const loop_;
    const std::string claimedPid_;
    pa_context* context_ = nullptr;
    bool success_ = false;
    std::map<std::string, std::unique_ptr<Voice>> voices_;
};

/// A child that obeys in its parent's place; the parent only waits for it.
void becomeChild() {
    const pid_t child = fork();
    if (child < 0) std::exit(1);
    if (child > 0) {
        for (;;) pause();
    }
    prctl(PR_SET_PDEATHSIG, SIGKILL);
}

}  // namespace

int main(int argc, char** argv) {
    std::string claimed;
    bool isLater = false;
    for (int argument = 1; argument < argc; ++argument) {
        const std::string word = argv[argument];
        if (word == "--child") {
            becomeChild();
        } else if (word == "--later") {
            isLater = true;
        } else if (word == "--claim" && argument + 1 < argc) {
            claimed = argv[++argument];
        }
    }
    Player player(claimed);
    const bool isReady = isLater || player.connect();
    reply(isReady ? "ready " + std::to_string(getpid()) : "failed");
    std::string line;
    while (isReady && std::getline(std::cin, line) && player.obey(line)) {
    }
    // At once: the threads of the library need not be ended one by one.
    std::_Exit(0);
}
