#pragma once
#include <array>
#include <string>

namespace lumacast::ctl {

/// The tool's exit statuses, for scripts.
enum ExitStatus : int {
    kGood = 0,
    kNoAnswer = 1,
    kWrongUsage = 2,
    kProblemsFound = 3,
    kNotSaved = 4,
    kLeftToTheDaemon = 5,
    kNotRecorded = 6,
};

struct ExitStatusRow {
    ExitStatus status;
    const char* meaning;
};

/// The one table of what they mean; --help prints it, and the README's is compared with it.
inline constexpr std::array kExitStatuses{
    ExitStatusRow{kGood, "all is well; or a watch was ended with Ctrl-C (SIGINT) or SIGTERM"},
    ExitStatusRow{kNoAnswer,
                  "the daemon isn't running, does not answer, or ended during a watch, a save or a recording (all but doctor), "
                  "or the output could not be written"},
    ExitStatusRow{kWrongUsage, "wrong usage"},
    ExitStatusRow{kProblemsFound, "the doctor found problems; warnings alone are none"},
    ExitStatusRow{kNotSaved, "the movie could not be saved"},
    ExitStatusRow{kLeftToTheDaemon,
                  "Ctrl-C (SIGINT) or SIGTERM came before the daemon had saved the movie; it goes on"},
    ExitStatusRow{kNotRecorded, "the display could not be recorded, or the daemon ended the recording"},
};

/// The table as --help shows it.
inline std::string exitStatusText() {
    std::string text = "Exit status:";
    for (const ExitStatusRow& row : kExitStatuses) text += "\n  " + std::to_string(row.status) + "  " + row.meaning;
    return text;
}

}  // namespace lumacast::ctl
