#pragma once

#include <pulse/pulseaudio.h>

#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <vector>

namespace lumacast::example {

class CommandTable;

/// Plays short tones, each beginning to be heard at a given moment: a stream to the sound server that never ends, silent
/// between the tones and written just ahead of its playing, so that where a tone begins in it is decided as late as can
/// be, from how long the server says that what is written now will take to be heard. Without a server it says so once on
/// standard error; it keeps asking, and beeps once there is one. Callable from one thread; nothing blocks but the
/// destructor, which waits for its own thread.
class Beeper final {
public:
    /// A `steady` one hums at its frequency all the time instead; nothing is to be played at any moment then.
    explicit Beeper(double frequency, bool steady = false);
    ~Beeper();
    Beeper(const Beeper&) = delete;
    Beeper& operator=(const Beeper&) = delete;

    /// A tone begins to be heard at `hostTime` (ns, of CLOCK_MONOTONIC), which should be MarkPlan::kLead ahead. One that
    /// can't be in time any more begins at once; one that is late by more than its own length is left out.
    void playAt(std::int64_t hostTime);

    /// What became of the tones, and how many times the server ran out of sound.
    struct Report {
        int played = 0;
        int late = 0;  ///< of those played
        int leftOut = 0;
        int underflows = 0;
    };
    [[nodiscard]] Report report() const;

private:
    struct FreeLoop {
        void operator()(pa_threaded_mainloop* loop) const { pa_threaded_mainloop_free(loop); }
    };
    struct Lock;

    // All of these run on the loop's thread or under its lock.
    void connect();
    void disconnect();
    void reconnectLater();
    void contextChanged();
    void streamChanged();
    void openStream();
    void write(std::size_t bytes);
    void placeTones(std::int64_t frames);
    void render(float* samples, std::int64_t frames) const;
    void complain(const char* what);

    const double frequency_;
    const bool steady_;
    std::unique_ptr<pa_threaded_mainloop, FreeLoop> loop_;
    pa_context* context_ = nullptr;
    pa_stream* stream_ = nullptr;
    pa_time_event* again_ = nullptr;
    bool hasComplained_ = false;
    std::int64_t written_ = 0;            ///< frames of this stream
    std::deque<std::int64_t> due_;        ///< host times of tones that have no place in the stream yet
    std::vector<std::int64_t> begins_;    ///< frames at which tones begin that are not wholly written
    Report report_;
};

/// "beeps" answers the report as words and numbers.
void addBeepCommands(CommandTable& commands, const Beeper& beeper);

}  // namespace lumacast::example
