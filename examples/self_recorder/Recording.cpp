#include "examples/self_recorder/Recording.h"

#include <sys/eventfd.h>
#include <unistd.h>

#include <sstream>
#include <utility>

#include "examples/self_recorder/CommandReader.h"

namespace lumacast::example {
namespace {

std::string inWords(const Error& error) {
    const std::string* text = error.localizedDescription();
    return std::to_string(error.code()) + (text ? " " + *text : "");
}

/// "a=b,c=d" as texts under their keys; "-" is none.
Dictionary entriesIn(const std::string& text) {
    Dictionary entries;
    std::istringstream stream(text == "-" ? "" : text);
    for (std::string entry; std::getline(stream, entry, ',');)
        if (const auto at = entry.find('='); at != std::string::npos) entries.set(entry.substr(0, at), entry.substr(at + 1));
    return entries;
}

}  // namespace

Recording::Recording(Loop& loop, CommandTable& commands, SceneWindow& window, Painter& painter)
    : loop_(loop), window_(window), painter_(painter), wake_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
    loop_.watch(wake_.get(), [this] { runPosted(); });

    commands.add("start", "record this window", [this](const Arguments&, const Reply& reply) { start({}, reply); });
    commands.add("broadcast HOST EXTENSION INFO",
                 "broadcast this window through an extension; INFO is key=value,key=value or -",
                 [this](const Arguments& arguments, const Reply& reply) {
                     client::BroadcastSetup setup{BundleIdentifier(arguments[0]), arguments[1] + ".x", std::nullopt,
                                                  entriesIn(arguments[2])};
                     recorder().setUpBroadcast(setup, [this, reply](const std::optional<Error>& error) {
                         onLoop([this, reply, error] {
                             if (error) return reply("error " + inWords(*error));
                             client::StartOptions options;
                             options.broadcast = true;
                             start(options, reply);
                         });
                     });
                 });
    commands.add("capture", "be handed the pictures and sounds of this window",
                 [this](const Arguments&, const Reply& reply) {
                     client::StartOptions options;
                     options.capture = true;
                     start(options, reply);
                 });
    commands.add("captured", "print how many pictures and sounds have been handed over",
                 [this](const Arguments&, const Reply& reply) {
                     reply("captured " + std::to_string(pictures_) + " pictures " + std::to_string(sounds_) + " sounds");
                 });
    commands.add("pause", "pause the recording", [this](const Arguments&, const Reply& reply) {
        recorder().pause();
        replyWhenHandled("paused", reply);
    });
    commands.add("resume", "go on with it", [this](const Arguments&, const Reply& reply) {
        recorder().resume(ContextID{window_.identifier()});
        replyWhenHandled("resumed", reply);
    });
    commands.add("stop", "end it and keep the movie", [this](const Arguments&, const Reply& reply) {
        recorder().stop([this, reply](const client::StopAnswer& answer) { replyStopped(answer, reply); });
    });
    commands.add("clip A B", "end it and keep the movie without its first A and last B seconds",
                 [this](const Arguments& arguments, const Reply& reply) {
                     const auto start = wholeNumber(arguments[0]), end = wholeNumber(arguments[1]);
                     if (!start || !end || *start < 1 || *end < 1) return reply("error both must be at least 1");
                     recorder().stopWithClip(*start, *end, [this, reply](const client::StopAnswer& answer) {
                         replyStopped(answer, reply);
                     });
                 });
    commands.add("discard", "delete the last movie", [this](const Arguments&, const Reply& reply) {
        recorder().discard([this, reply](const std::optional<Error>& error) {
            onLoop([reply, error] { reply(error ? "error " + inWords(*error) : "discarded"); });
        });
    });
    commands.add("state", "print what the daemon knows of this application",
                 [this](const Arguments&, const Reply& reply) {
                     recorder().state([this, reply](const client::StateAnswer& answer) {
                         onLoop([reply, answer] {
                             if (answer.error) return reply("error " + inWords(*answer.error));
                             reply("state " + (answer.state ? describe(Value(*answer.state)) : std::string("none")));
                         });
                     });
                 });
}

void Recording::start(client::StartOptions options, const Reply& reply) {
    options.windows = {ContextID{window_.identifier()}};
    const auto picture = window_.picture();
    options.size = {static_cast<double>(picture.width), static_cast<double>(picture.height)};
    recorder().start(options, [this, reply](const client::StartAnswer& answer) {
        onLoop([this, reply, answer] {
            reply(answer.error ? "error " + inWords(*answer.error)
                               : "started frame " + std::to_string(painter_.frame()));
        });
    });
}

Recording::~Recording() {
    recorder_.reset();  // its thread posts no more
    loop_.unwatch(wake_.get());
}

client::Recorder& Recording::recorder() {
    if (!recorder_) {
        client::Recorder::Events events;
        events.stopped = [this](const std::optional<Error>& error, const std::optional<URL>& movie) {
            onLoop([error, movie] {
                printLine("event stopped " + (error ? inWords(*error) : std::string("without error")) +
                          (movie ? " " + movie->path() : ""));
            });
        };
        events.broadcastServiceInfo = [this](const Value& info) {
            onLoop([info] { printLine("event service info " + describe(info)); });
        };
        events.broadcastURL = [this](const std::optional<URL>& url) {
            onLoop([url] { printLine("event broadcast URL " + (url ? url->text() : "none")); });
        };
        events.videoSample = [this](const client::VideoSample&) { ++pictures_; };
        events.audioSample = [this](const client::AudioSample&) { ++sounds_; };
        events.disconnected = [this] { onLoop([] { printLine("event disconnected"); }); };
        recorder_ = std::make_unique<client::Recorder>(std::move(events));
    }
    return *recorder_;
}

void Recording::replyWhenHandled(const char* word, const Reply& reply) {
    recorder().state([this, word, reply](const client::StateAnswer& answer) {
        onLoop([this, word, reply, answer] {
            reply(answer.error ? "error " + inWords(*answer.error)
                               : std::string(word) + " frame " + std::to_string(painter_.frame()));
        });
    });
}

void Recording::replyStopped(const client::StopAnswer& answer, const Reply& reply) {
    onLoop([this, answer, reply] {
        if (answer.error) return reply("error " + inWords(*answer.error));
        reply("stopped frame " + std::to_string(painter_.frame()) + " " +
              (answer.movie ? answer.movie->path() : "without movie"));
    });
}

void Recording::onLoop(std::function<void()> task) {
    {
        const std::lock_guard lock(mutex_);
        posted_.push_back(std::move(task));
    }
    const std::uint64_t one = 1;
    [[maybe_unused]] const auto written = ::write(wake_.get(), &one, sizeof one);  // full means: already awake
}

void Recording::runPosted() {
    std::uint64_t count = 0;
    [[maybe_unused]] const auto taken = ::read(wake_.get(), &count, sizeof count);
    for (;;) {
        std::function<void()> task;
        {
            const std::lock_guard lock(mutex_);
            if (posted_.empty()) return;
            task = std::move(posted_.front());
            posted_.pop_front();
        }
        task();
    }
}

}  // namespace lumacast::example
