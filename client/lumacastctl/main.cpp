// lumacastctl: the tool of the daemon's administrator and of those who develop applications for it.

#include <signal.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <array>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "client/lumacastctl/ExitStatus.h"
#include "client/lumacastctl/broadcast/ExtensionsCommand.h"
#include "client/lumacastctl/doctor/Display.h"
#include "client/lumacastctl/doctor/Doctor.h"
#include "client/lumacastctl/doctor/Identity.h"
#include "client/lumacastctl/record/RecordCommand.h"
#include "client/lumacastctl/record/StopWish.h"
#include "client/lumacastctl/save/SaveCommand.h"
#include "client/lumacastctl/status/StatusCommand.h"
#include "client/lumacastctl/storage/StorageCommand.h"
#include "client/lumacastctl/usage/UsageCommand.h"
#include "linux/system/IniFile.h"

namespace {

using namespace lumacast;
using namespace lumacast::ctl;

std::optional<std::string> variable(std::string_view name) {
    const char* value = std::getenv(std::string(name).c_str());
    return value ? std::optional<std::string>(value) : std::nullopt;
}

/// Empty for the number of a process.
std::string whyNoPid(const std::string& text) {
    const auto number = wholeNumber(text);
    return number && *number > 0 && *number <= INT32_MAX ? "" : text + " is no process's number";
}

/// For a watch: each block was written whole before, so there is nothing to end but the process.
extern "C" void endWatch(int) {
    ::_exit(kGood);
}

void onEndSignals(void (*handler)(int)) {
    struct sigaction action {};
    action.sa_handler = handler;
    for (const int signal : {SIGINT, SIGTERM}) ::sigaction(signal, &action, nullptr);
}

int runWatch(const std::string& directory, Form form) {
    onEndSignals(endWatch);
    // A block, short enough, is one write.
    std::setvbuf(stdout, nullptr, _IOFBF, 1 << 16);
    auto next = std::chrono::steady_clock::now();
    const auto nextRound = [&] {
        // At whole seconds from the start; those that have passed meanwhile are left out.
        while (next <= std::chrono::steady_clock::now()) next += std::chrono::seconds(1);
        std::this_thread::sleep_until(next);
        return true;
    };
    const Screen screen = ::isatty(STDOUT_FILENO) == 1 ? Screen::Terminal : Screen::Plain;
    return watchStatus(directory, form, screen, stdout, stderr, nextRound);
}

extern "C" void leaveSave(int) {
    static constexpr char kText[] =
        "lumacastctl: the daemon goes on saving the movie; `lumacastctl status --json` tells how far it is.\n";
    (void)!::write(STDERR_FILENO, kText, sizeof kText - 1);
    ::_exit(kLeftToTheDaemon);
}

/// The line with the bar stays, and ends.
extern "C" void leaveSaveOnTerminal(int signal) {
    (void)!::write(STDERR_FILENO, "\n", 1);
    leaveSave(signal);
}

int runSave(const std::string& directory, const std::string& file, Form form) {
    const Screen screen = ::isatty(STDERR_FILENO) == 1 ? Screen::Terminal : Screen::Plain;
    const auto begun = [screen] { onEndSignals(screen == Screen::Terminal ? leaveSaveOnTerminal : leaveSave); };
    const auto nextRound = [] {
        std::this_thread::sleep_for(std::chrono::milliseconds(200));
        return true;
    };
    return saveMovie(directory, moviePath(file), form, screen, stdout, stderr, begun, nextRound);
}

int runRecord(const std::string& directory, RecordRequest request) {
    if (!request.output.empty()) request.output = moviePath(request.output);
    if (request.size.width < 1) {
        const DisplayFacts display = probeDisplay(variable, std::chrono::seconds(5));
        if (display.width == 0) {
            std::fprintf(stderr,
                         "lumacastctl: the display can't be asked for its size; `lumacastctl doctor` says why.\n");
            return kNotRecorded;
        }
        request.size = {static_cast<double>(display.width), static_cast<double>(display.height)};
    }
    const Screen screen = ::isatty(STDERR_FILENO) == 1 ? Screen::Terminal : Screen::Plain;
    std::optional<StopWish> wish(std::in_place);
    return recordDisplay(
        directory, request, screen, stdout, stderr, [&](std::chrono::milliseconds limit) { return wish->came(limit); },
        [&](const std::string& movie) {
            wish.reset();
            return runSave(directory, movie, Form::Text);
        });
}

/// What "title=Game night" says; a text without "=" is a flag that is true.
std::pair<std::string, Value> entryIn(const std::string& text) {
    const auto at = text.find('=');
    if (at == std::string::npos) return {text, true};
    return {text.substr(0, at), text.substr(at + 1)};
}

int runBroadcast(RecordRequest request, const std::string& extension, const std::vector<std::string>& entries,
                 double clipSeconds) {
    const LinuxEnvironment environment = LinuxEnvironment::ofThisProcess();
    const LinuxBundles::Options options = LinuxBundles::optionsFrom(environment);
    LinuxBundles bundles(options);
    const IdentityFacts own = probeIdentity(bundles, options, {.pid = ProcessID{::getpid()}});
    if (!own.identifier) {
        std::fprintf(stderr, "lumacastctl: the tool is no installed application; `lumacastctl doctor` says more.\n");
        return kNotRecorded;
    }
    // The last component of what is set up does not count: the extension itself is named.
    client::BroadcastSetup setup{BundleIdentifier(*own.identifier), extension + ".x", std::nullopt, {}};
    for (const std::string& text : entries) {
        auto [key, value] = entryIn(text);
        setup.userInfo.set(std::move(key), std::move(value));
    }
    if (clipSeconds > 0) setup.configuration = LCBroadcastConfiguration{clipSeconds, {}};
    request.broadcast = std::move(setup);
    return runRecord(environment.runtimeDirectory, std::move(request));
}

int runDoctor(const IdentityQuestion& question) {
    const Findings findings = examine(LinuxEnvironment::ofThisProcess(), variable, question);
    std::fputs(findingsText(findings).c_str(), stdout);
    return hasProblem(findings) ? kProblemsFound : kGood;
}

/// One of the tool's commands, and what it does once the command line was read.
struct Command {
    CLI::App* app;  ///< the whole command line's
    std::function<int()> run;
};

Form formOf(bool json) {
    return json ? Form::Json : Form::Text;
}

std::string runtimeDirectory() {
    return LinuxEnvironment::ofThisProcess().runtimeDirectory;
}

CLI::App* addCommand(CLI::App& to, const char* name, const char* description) {
    CLI::App* const command = to.add_subcommand(name, description);
    command->footer(exitStatusText());
    return command;
}

Command statusCommand(CLI::App& app) {
    struct Options {
        bool json = false, watch = false;
    };
    const auto options = std::make_shared<Options>();
    CLI::App* const command =
        addCommand(app, "status", "Show the applications that the daemon knows and the running recording");
    command->add_flag("--json", options->json, "Answer one line of JSON");
    command->add_flag("--watch", options->watch,
                      "Show the running recordings, anew each second, until Ctrl-C or the daemon's end");
    return {command, [options] {
                const Form form = formOf(options->json);
                return options->watch ? runWatch(runtimeDirectory(), form)
                                      : showStatus(runtimeDirectory(), form, stdout, stderr);
            }};
}

Command doctorCommand(CLI::App& app) {
    struct Options {
        std::int32_t pid = 0;
        std::string executable;
    };
    const auto options = std::make_shared<Options>();
    CLI::App* const command = addCommand(
        app, "doctor", "Look at all that recording takes; a line each: ok, warning or problem, and what to do");
    CLI::Option* const byPid =
        command->add_option("--pid", options->pid, "Tell which application this process counts as")
            ->type_name("N")
            ->check(CLI::Validator(whyNoPid, ""));
    CLI::Option* const byProgram =
        command->add_option("--exe", options->executable, "Tell which application this program counts as")
            ->type_name("PATH")
            ->excludes(byPid);
    return {command, [options, byPid, byProgram] {
                IdentityQuestion question;
                if (byProgram->count() > 0)
                    question.executable = options->executable;
                else
                    question.pid = ProcessID{byPid->count() > 0 ? options->pid : ::getppid()};
                question.isExample = byProgram->count() == 0 && byPid->count() == 0;
                return runDoctor(question);
            }};
}

Command storageCommand(CLI::App& app) {
    struct Options {
        bool json = false;
        std::int32_t urgency = 0;
    };
    const auto options = std::make_shared<Options>();
    CLI::App* const command = addCommand(app, "storage", "Show the temporary movies, or have old ones deleted");
    command->require_subcommand(0, 1);
    CLI::App* const list = addCommand(*command, "list", "Show the movies: size, date, age, length and state");
    CLI::App* const purgeable = addCommand(*command, "purgeable", "Show what a purge could give back");
    CLI::App* const purge =
        addCommand(*command, "purge",
                   "Delete as if space were so short: from urgency 3 on a running recording is stopped and every movie "
                   "deleted; below 3 nothing goes but where a recording has just ended");
    for (CLI::App* const one : {command, list, purgeable, purge})
        one->add_flag("--json", options->json, "Answer one line of JSON");
    purge->add_option("URGENCY", options->urgency, "How short space is: 1, 2 or 3")
        ->required()
        ->check(CLI::Range(1, 1000));
    return {command, [options, list, purgeable, purge] {
                const Form form = formOf(options->json);
                if (purge->parsed()) return purgeStorage(runtimeDirectory(), options->urgency, form, stdout, stderr);
                const StoragePart part = list->parsed()        ? StoragePart::List
                                         : purgeable->parsed() ? StoragePart::Purgeable
                                                               : StoragePart::All;
                return showStorage(runtimeDirectory(), part, form, stdout, stderr);
            }};
}

Command saveCommand(CLI::App& app) {
    struct Options {
        std::string movie;
        bool json = false;
    };
    const auto options = std::make_shared<Options>();
    CLI::App* const command = addCommand(
        app, "save", "Save a movie to the Videos folder, its sounds mixed into one; the file that is given is removed");
    command->add_option("FILE", options->movie, "The movie")->required();
    command->add_flag("--json", options->json, "Answer lines of JSON");
    return {command, [options] { return runSave(runtimeDirectory(), options->movie, formOf(options->json)); }};
}

Command usageCommand(CLI::App& app) {
    const auto json = std::make_shared<bool>(false);
    CLI::App* const command =
        addCommand(app, "usage", "Show the recordings that have ended, and why each did; newest last");
    command->add_flag("--json", *json, "Answer one line of JSON");
    return {command, [json] { return showUsage(runtimeDirectory(), formOf(*json), stdout, stderr); }};
}

/// What recording and broadcasting the display have in common.
struct DisplayOptions {
    bool display = false;  ///< named, as something else may be recorded one day
    double duration = 0;   ///< seconds; 0: until the user ends it
    RecordRequest wanted;

    /// With what was read.
    RecordRequest request() const {
        RecordRequest result = wanted;
        result.duration = std::chrono::milliseconds(std::llround(duration * 1000));
        return result;
    }
};

void addDuration(CLI::App& command, DisplayOptions& options) {
    command.add_option("--duration", options.duration, "End after so many seconds")
        ->type_name("SECONDS")
        ->check(CLI::Range(0.1, 86'400.0));
}

void addMicrophone(CLI::App& command, DisplayOptions& options) {
    command.add_flag("--microphone", options.wanted.microphone, "Ask for the microphone too; it is never recorded");
}

Command recordCommand(CLI::App& app) {
    const auto options = std::make_shared<DisplayOptions>();
    CLI::App* const command = addCommand(
        app, "record",
        "Record the whole display, with the sound of what is in front, until q, Enter, the space bar or Ctrl-C");
    command->add_flag("--display", options->display, "What to record: the whole display")->required();
    addDuration(*command, *options);
    command
        ->add_option("--output", options->wanted.output,
                     "Where the movie goes; by default the Videos folder, sounds mixed")
        ->type_name("FILE");
    addMicrophone(*command, *options);
    return {command, [options] { return runRecord(runtimeDirectory(), options->request()); }};
}

Command extensionsCommand(CLI::App& app) {
    const auto json = std::make_shared<bool>(false);
    CLI::App* const command =
        addCommand(app, "extensions", "Show the upload extensions that a broadcast can go through");
    command->add_flag("--json", *json, "Answer one line of JSON");
    return {command, [json] { return showExtensions(runtimeDirectory(), formOf(*json), stdout, stderr); }};
}

Command broadcastCommand(CLI::App& app) {
    struct Options : DisplayOptions {
        std::string extension;
        std::vector<std::string> entries;
        double clipSeconds = 0;
    };
    const auto options = std::make_shared<Options>();
    CLI::App* const command =
        addCommand(app, "broadcast",
                   "Broadcast the whole display through an upload extension, until q, Enter, the space bar or Ctrl-C");
    command->add_flag("--display", options->display, "What to broadcast: the whole display")->required();
    command->add_option("--extension", options->extension, "The extension, as `extensions` shows it")
        ->type_name("IDENTIFIER")
        ->required();
    command
        ->add_option("--set", options->entries,
                     "What the extension is to know, once for each; its documentation says what")
        ->type_name("KEY=VALUE");
    command->add_option("--clip", options->clipSeconds, "How long a clip is, where the extension takes clips")
        ->type_name("SECONDS")
        ->check(CLI::Range(0.5, 600.0));
    addDuration(*command, *options);
    addMicrophone(*command, *options);
    return {command, [options] {
                return runBroadcast(options->request(), options->extension, options->entries, options->clipSeconds);
            }};
}

}  // namespace

int main(int argc, char** argv) {
    CLI::App app("Asks the screen recording daemon how it is, and looks for what keeps it from recording.",
                 "lumacastctl");
    app.footer(exitStatusText());
    app.require_subcommand(1);
    // In the order of the help.
    const std::array commands{statusCommand(app), doctorCommand(app), storageCommand(app),    saveCommand(app),
                              usageCommand(app),  recordCommand(app), extensionsCommand(app), broadcastCommand(app)};

    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return app.exit(error) == 0 ? kGood : kWrongUsage;  // --help comes this way too
    }

    int result = kWrongUsage;
    for (const Command& command : commands)
        if (command.app->parsed()) result = command.run();
    if (std::fflush(stdout) != 0 || std::ferror(stdout) != 0) {
        std::fprintf(stderr, "lumacastctl: the output could not be written.\n");
        return kNoAnswer;
    }
    return result;
}
